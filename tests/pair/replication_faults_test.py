"""Faults while snapshots are sent: afterwards no data is lost, nothing stays locked, and the next sending succeeds or says why not."""
import os
import random
import signal
import sqlite3
import time

from cases import MIB, checksum, checksum_at, image, main, write
from pair import VOLUME, is_alive, run, wait_until
from replication_cases import SIZE_MIB, ReplicationTest

LONG = bool(os.environ.get("ISCSIWEBAPI_LONG"))
KILLS = 120 if LONG else 12
CUTS = (1, 10, 60) if LONG else (1, 10)
READ_WRITE, READ_ONLY = 3261, 3262


def argument_of(pid, text):
    with open(f"/proc/{pid}/cmdline", encoding="utf-8", errors="replace") as file:
        return text in file.read()


class Faults(ReplicationTest):
    def store(self, appliance):
        """The appliance's state as its own programs see it."""
        connection = sqlite3.connect(f"{appliance.disk}/state/state.db", isolation_level=None, timeout=20)
        self.addCleanup(connection.close)
        return connection

    def senders(self):
        """The source's processes that send; its other ones wait for them."""
        def sends(pid):
            try:
                return any(os.readlink(f"/proc/{pid}/fd/{fd}").endswith(f"sending-{self.task}") for fd in os.listdir(f"/proc/{pid}/fd"))
            except FileNotFoundError:
                return False
        return [pid for pid in self.one.processes("iscsictl") if sends(pid)]

    def workers(self):
        senders = self.senders()
        return [pid for pid in self.one.processes("iscsictl") if pid not in senders]

    def daemon(self, port):
        return [pid for pid in self.two.processes("tgtd") if argument_of(pid, f":{port}")]

    def killed(self, pids):
        for pid in pids:
            os.kill(pid, signal.SIGKILL)
        wait_until(lambda: not any(map(is_alive, pids)), "they are dead")
        return len(pids)

    def give_up(self):
        """Ends a sending whose next try is half a minute away."""
        wait_until(lambda: not self.senders(), "the sender ends", 90)
        self.killed(self.workers())
        self.wait_idle()

    def services_back(self):
        """What kills daemons is followed by their return."""
        wait_until(lambda: self.daemon(READ_WRITE) and self.daemon(READ_ONLY), "both daemons run")
        self.two.host("status")
        if not self.two.processes("lighttpd"):
            self.two.start_web()

    def expect_unlocked(self):
        wait_until(lambda: not self.one.processes("iscsictl"), "no worker is left", 60)
        for appliance in (self.one, self.two):
            wait_until(lambda: not self.sending(appliance)["is_locked"], f"the task is not locked on {appliance.name}")
            lun = appliance.json("lun", "show", self.lun)
            self.assertFalse(lun["is_action_locked"], lun)
            for snapshot in appliance.json("snapshot", "list", self.lun):
                self.assertFalse(appliance.json("snapshot", "show", snapshot["uuid"])["is_action_locked"], snapshot)

    def expect_whole(self, snapshot):
        """A sending of this snapshot makes the destination what the source is."""
        self.full_speed()
        self.expect_unlocked()
        self.send(snapshot)
        self.expect_unlocked()
        self.expect_replica(snapshot)

    def delete_snapshots(self, but):
        for appliance in (self.one, self.two):
            for snapshot in appliance.json("snapshot", "list", self.lun):
                if snapshot["version"] != but:
                    appliance.iscsictl("snapshot", "delete", snapshot["uuid"], "--yes")

    def test_kills(self):
        """At random moments; now and then the next snapshot is sent in place of the disturbed one."""
        seed = random.randrange(1 << 32)
        dice = random.Random(seed)
        victims = {
            "worker": self.workers,
            "sender": self.senders,
            "read-write daemon": lambda: self.daemon(READ_WRITE),
            "read-only daemon": lambda: self.daemon(READ_ONLY),
            "web server": lambda: self.two.processes("lighttpd"),
        }
        self.send(self.take("start"))
        kills = round_ = 0
        while kills < KILLS:
            round_ += 1
            victim = list(victims)[round_ % len(victims)]
            with self.subTest(seed=seed, round=round_, victim=victim):
                run("qemu-io", "--image-opts", image(self.one, "data"),
                    *(part for _ in range(6) for part in ("-c", f"write -P {dice.randrange(256)} {dice.randrange(SIZE_MIB - 2)}M 2M")))
                snapshot = self.take(f"round {round_}")
                self.slow()
                self.one.run("iscsictl", "replication", "send", self.task, snapshot)
                time.sleep(dice.uniform(0, 1.5))  # the moment, not a wait
                kills += self.killed(victims[victim]())
                self.full_speed()
                self.services_back()
                wait_until(lambda: not self.senders(), "the sender ends", 90)
                if self.sending()["error"]:
                    self.give_up()
                self.wait_idle()
                self.expect_whole(snapshot)
                self.delete_snapshots(but=snapshot)


if __name__ == "__main__":
    main()
