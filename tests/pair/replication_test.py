"""Snapshots sent to the other appliance, as initiators see them: increments, failing over and back, stopping."""
from cases import MIB, checksum, checksum_at, main
from replication_cases import SIZE_MIB, ReplicationTest


class Replication(ReplicationTest):
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
        self.assertEqual(self.replica(self.one), wanted)

        self.two.iscsictl("lun", "unmap", self.lun, "data")
        self.two.iscsictl("replication", "demote", self.task)
        self.one.iscsictl("replication", "promote", self.task)
        self.one.iscsictl("lun", "map", self.lun, "data")
        self.change(self.one, 20, 64, 0x66)
        self.assertEqual(self.send(third := self.take("back home")), 64 << 10)
        self.expect_replica(third)

    def test_stopped(self):
        """A later sending of the same snapshot makes the destination whole."""
        snapshot = self.begin()
        self.refused(self.one, "replication", "send", self.task, snapshot, says="Task is locked .18990808.")
        self.one.iscsictl("replication", "stop", self.task)
        self.full_speed()
        self.wait_idle()
        self.assertEqual(self.sending()["error"], -19)
        self.assertEqual(self.two.json("snapshot", "list", self.lun), [])
        self.send(snapshot)
        self.expect_replica(snapshot)

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
