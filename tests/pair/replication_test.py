"""Snapshots sent to the other appliance, as initiators see them: increments, failing over and back, and what goes wrong on the way."""
import signal
import subprocess
import time

from cases import MIB, PairTest, checksum, checksum_at, image, iqn, main, random_file, write
from pair import VOLUME, Failed, run, wait_until

SIZE_MIB = 64
SLOW = "200mbit"


class Replication(PairTest):
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

    def slow(self):
        run("tc", "qdisc", "replace", "dev", self.two.name, "root", "tbf", "rate", SLOW, "burst", "256k", "latency", "100ms")

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

    def wait_idle(self, appliance=None, seconds=90):
        wait_until(lambda: not self.sending(appliance)["is_locked"], "the sending ends", seconds)

    def replica(self, appliance=None):
        """The checksum of the newest snapshot on the destination, as an initiator reads it there."""
        appliance = appliance or self.two
        newest = appliance.json("snapshot", "list", self.lun)[-1]
        appliance.iscsictl("lun", "map", self.lun, "data")
        try:
            return newest, checksum_at(appliance, "data")
        finally:
            appliance.iscsictl("lun", "unmap", self.lun, "data")

    def expect_replica(self, snapshot):
        """The destination has this snapshot of the source, with its data and its facts."""
        run("qemu-img", "convert", "--image-opts", "-O", "raw", image(self.one, "data"), "/tmp/source")
        there, data = self.replica()
        self.assertEqual(data, checksum("/tmp/source"))
        here = self.one.json("snapshot", "show", snapshot)
        for fact in ("name", "version", "description", "taken_by", "snapshot_time", "is_app_consistent", "is_user_locked", "total_size"):
            self.assertEqual(there[fact], here[fact], fact)

    def test_increments_and_failover(self):
        self.assertEqual(self.send(first := self.take("first")), SIZE_MIB * MIB)
        self.expect_replica(first)

        self.change(self.one, 3, 64, 0x11)
        self.change(self.one, 40, 192, 0x22)
        second = self.one.json("snapshot", "take", self.lun, "--note", "after lunch", "--lock")["uuid"]
        unsynced = self.one.json("replication", "unsynced", self.task, second, "--base", first)["unsync_size"]
        self.assertEqual(unsynced, 256 << 10)
        self.assertEqual(self.send(second), 256 << 10)
        self.expect_replica(second)
        self.assertEqual(self.send(self.take("same again")), 512, "nothing changed")

        # An initiator cannot write to the destination.
        self.two.iscsictl("lun", "map", self.lun, "data")
        with self.assertRaises(Exception):
            self.change(self.two, 0, 64, 0x33)
        self.refused(self.two, "replication", "promote", self.task, says=r"18990534")
        self.two.iscsictl("lun", "unmap", self.lun, "data")

        # Fail over, write there, fail back: only what changed comes back, and what only the old source had is gone.
        self.change(self.one, 50, 64, 0x44)
        self.one.iscsictl("lun", "unmap", self.lun, "data")
        self.two.iscsictl("replication", "promote", self.task)
        self.two.iscsictl("lun", "map", self.lun, "data")
        self.change(self.two, 10, 128, 0x55)
        self.one.iscsictl("replication", "demote", self.task)
        self.refused(self.one, "replication", "send", self.task, second, says=r"18990800")
        self.assertEqual(self.send(self.take("over there", self.two), self.two), 128 << 10)
        wanted = checksum_at(self.two, "data")
        self.assertEqual(self.replica(self.one)[1], wanted)

        self.two.iscsictl("lun", "unmap", self.lun, "data")
        self.two.iscsictl("replication", "demote", self.task)
        self.one.iscsictl("replication", "promote", self.task)
        self.one.iscsictl("lun", "map", self.lun, "data")
        self.change(self.one, 20, 64, 0x66)
        self.assertEqual(self.send(third := self.take("back home")), 64 << 10)
        self.expect_replica(third)

    def interrupted(self, disturb):
        """Disturbs a slow sending, and expects that a later one of the same snapshot makes the destination whole."""
        snapshot = self.take("disturbed")
        self.slow()
        self.one.iscsictl("replication", "send", self.task, snapshot)
        wait_until(lambda: self.sending()["sent_size"] > 4 * MIB, "data flows")
        self.assertTrue(self.sending()["is_locked"])
        self.refused(self.one, "replication", "send", self.task, snapshot, says="Task is locked .18990808.")
        disturb()
        self.full_speed()
        self.wait_idle()
        self.send(snapshot)
        self.expect_replica(snapshot)

    def test_stopped(self):
        self.interrupted(lambda: self.one.iscsictl("replication", "stop", self.task))

    def test_worker_killed(self):
        self.interrupted(lambda: self.one.kill("iscsictl"))

    def test_link_cut(self):
        def cut():
            self.two.cut_link()
            time.sleep(3)  # how long it is cut, not a wait
            self.two.mend_link()
        self.interrupted(cut)

    def test_peer_daemon_killed(self):
        self.interrupted(lambda: self.two.kill("tgtd"))

    def test_removed(self):
        self.send(self.take("kept"))
        self.one.iscsictl("replication", "remove", self.task)
        self.two.iscsictl("replication", "remove", self.task)
        self.assertEqual(self.one.json("replication", "list"), [])
        self.assertEqual(self.two.json("lun", "show", self.lun)["type"], 15)
        self.two.iscsictl("lun", "map", self.lun, "data")
        self.assertEqual(checksum_at(self.two, "data"), checksum("/tmp/data"))


if __name__ == "__main__":
    main()
