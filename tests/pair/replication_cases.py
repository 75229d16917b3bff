"""What the tests of replication share."""
from cases import MIB, PairTest, checksum_at, image, iqn, random_file, write
from pair import VOLUME, run, wait_until

SIZE_MIB = 64
SLOW = "80mbit"
SLOWEST = "16mbit"  # what is to be disturbed is under way for half a minute


class ReplicationTest(PairTest):
    """Tests with a replicated LUN each."""

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        for appliance in (cls.one, cls.two):
            appliance.iscsictl("target", "create", "data", "--iqn", iqn("data"))

    def setUp(self):
        """A replicated LUN of the test's own, shown at its source in the target 'data'."""
        self.lun = self.id().rpartition(".")[2]
        self.one.iscsictl("lun", "create", self.lun, "--location", VOLUME, "--size", f"{SIZE_MIB}M", "--type", "adv")
        self.one.iscsictl("lun", "map", self.lun, "data")
        write(self.one, "data", random_file("/tmp/data", SIZE_MIB))
        self.task = self.one.json("replication", "create", self.lun, "--node", self.two.address, "--location", VOLUME,
                                  "--name", self.lun)["uuid"]

    def tearDown(self):
        run("tc", "qdisc", "del", "dev", self.two.name, "root", check=False)
        self.two.mend_link()
        for appliance in (self.one, self.two):
            appliance.iscsictl("lun", "unmap", self.lun, "data", check=False)
            appliance.iscsictl("replication", "remove", self.task, "--delete-lun", check=False)

    def slow(self, rate=SLOW):
        run("tc", "qdisc", "replace", "dev", self.two.name, "root", "tbf", "rate", rate, "burst", "256k", "latency", "100ms")

    def full_speed(self):
        run("tc", "qdisc", "del", "dev", self.two.name, "root", check=False)

    def change(self, appliance, offset_mib, length_kib, pattern):
        run("qemu-io", "--image-opts", image(appliance, "data"), "-c", f"write -P {pattern} {offset_mib}M {length_kib}k")

    def take(self, name, appliance=None):
        return (appliance or self.one).json("snapshot", "take", self.lun, "--name", name)["uuid"]

    def send(self, snapshot, appliance=None):
        """Sends it and waits for the end; the bytes that were moved."""
        return (appliance or self.one).json("replication", "send", self.task, snapshot, "--watch", timeout=240)["sent_size"]

    def sending(self, appliance=None):
        return (appliance or self.one).json("replication", "status", self.task)

    def fail_over(self, old, new):
        """The LUN is written on the other appliance from now on."""
        old.iscsictl("lun", "unmap", self.lun, "data")
        new.iscsictl("replication", "promote", self.task)
        old.iscsictl("replication", "demote", self.task)
        new.iscsictl("lun", "map", self.lun, "data")

    def wait_idle(self, appliance=None):
        wait_until(lambda: not self.sending(appliance)["is_locked"], "the sending ends")

    def replica(self, appliance=None):
        """The checksum of the destination, as an initiator reads it there."""
        appliance = appliance or self.two
        appliance.iscsictl("lun", "map", self.lun, "data")
        try:
            return checksum_at(appliance, "data")
        finally:
            appliance.iscsictl("lun", "unmap", self.lun, "data")

    def there(self, snapshot):
        """The destination's snapshot of the state that this snapshot of the source has."""
        version = self.one.json("snapshot", "show", snapshot)["version"]
        found, = (one for one in self.two.json("snapshot", "list", self.lun) if one["version"] == version)
        return found

    def expect_replica(self, snapshot):
        """The destination has this snapshot of the source, once, with its data and its facts."""
        self.assertEqual(self.replica(), checksum_at(self.one, "data"))
        here = self.one.json("snapshot", "show", snapshot)
        there = self.there(snapshot)
        for fact in ("name", "version", "description", "taken_by", "snapshot_time", "is_app_consistent", "is_user_locked", "total_size"):
            self.assertEqual(there[fact], here[fact], fact)

    def begin(self, name="disturbed", after_mib=4, rate=SLOWEST):
        """A slow sending of a new snapshot, with data on its way; the snapshot."""
        snapshot = self.take(name)
        self.slow(rate)
        self.one.iscsictl("replication", "send", self.task, snapshot)
        wait_until(lambda: self.sending()["sent_size"] > after_mib * MIB, "data flows")
        self.assertTrue(self.sending()["is_locked"])
        return snapshot
