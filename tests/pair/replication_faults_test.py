"""Faults while snapshots are sent: afterwards no data is lost, nothing stays locked, and the next sending succeeds or says why not."""
import contextlib
import json
import os
import random
import signal
import sqlite3
import subprocess
import time

from cases import MIB, checksum, checksum_at, image, main, random_file, write
from pair import VOLUME, is_alive, kill, run, wait_until
from replication_cases import SIZE_MIB, SLOWEST, ReplicationTest

LONG = bool(os.environ.get("ISCSIWEBAPI_LONG"))
KILLS = 120 if LONG else 12
CUTS = (1, 10, 60) if LONG else (1, 10)
SLOWER = "40mbit"  # there is time to flush
READ_WRITE, READ_ONLY = 3261, 3262


def argument_of(pid, text):
    with contextlib.suppress(FileNotFoundError, ProcessLookupError):
        with open(f"/proc/{pid}/cmdline", encoding="utf-8", errors="replace") as file:
            return text in file.read()
    return False


def has_open(pid, name):
    """Whether the process, which may end meanwhile, has a file open whose path ends so."""
    with contextlib.suppress(FileNotFoundError, ProcessLookupError):
        for file in os.listdir(f"/proc/{pid}/fd"):
            with contextlib.suppress(FileNotFoundError):
                if os.readlink(f"/proc/{pid}/fd/{file}").endswith(name):
                    return True
    return False


class Faults(ReplicationTest):
    def store(self, appliance):
        """The appliance's state as its own programs see it."""
        connection = sqlite3.connect(f"{appliance.disk}/state/state.db", isolation_level=None, timeout=20)
        self.addCleanup(connection.close)
        return connection

    def senders(self):
        """The source's processes that send; its other ones wait for them."""
        return [pid for pid in self.one.processes("iscsictl") if has_open(pid, f"sending-{self.task}")]

    def workers(self):
        senders = self.senders()
        return [pid for pid in self.one.processes("iscsictl") if pid not in senders]

    def daemon(self, port):
        return [pid for pid in self.two.processes("tgtd") if argument_of(pid, f":{port}")]

    def killed(self, pids):
        kill(pids)
        wait_until(lambda: not any(map(is_alive, pids)), "they are dead")
        return len(pids)

    def give_up(self):
        """Ends a sending whose next try is half a minute away."""
        wait_until(lambda: not self.senders(), "the sender ends")
        self.killed(self.workers())
        self.wait_idle()

    def services_back(self):
        """What kills daemons is followed by their return."""
        wait_until(lambda: self.daemon(READ_WRITE) and self.daemon(READ_ONLY), "both daemons run")
        self.two.host("status")
        if not self.two.processes("lighttpd"):
            self.two.start_web()

    def expect_unlocked(self):
        for appliance, program in ((self.one, "iscsictl"), (self.one, "iscsi-webapi"), (self.two, "iscsi-webapi")):
            wait_until(lambda: not appliance.processes(program), f"no {program} is left on {appliance.name}")
        for appliance in (self.one, self.two):
            wait_until(lambda: not self.sending(appliance)["is_locked"], f"the task is not locked on {appliance.name}")
            lun = appliance.json("lun", "show", self.lun)
            self.assertFalse(lun["is_action_locked"], lun)
            for snapshot in appliance.json("snapshot", "list", self.lun)[-2:]:
                self.assertFalse(appliance.json("snapshot", "show", snapshot["uuid"])["is_action_locked"], snapshot)

    def expect_whole(self, snapshot):
        """A sending of this snapshot makes the destination what the source is."""
        self.full_speed()
        self.wait_idle()
        self.send(snapshot)
        self.expect_unlocked()
        self.expect_replica(snapshot)

    def arrived(self):
        """Below which place of the destination all is flushed, as it has been told."""
        return self.store(self.two).execute("SELECT arrived FROM replication_tasks WHERE uuid = ?", (self.task,)).fetchone()[0]

    def change_much(self, dice):
        run("qemu-io", "--image-opts", image(self.one, "data"),
            *(part for _ in range(6) for part in ("-c", f"write -P {dice.randrange(256)} {dice.randrange(SIZE_MIB - 2)}M 2M")))

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
                self.change_much(dice)
                snapshot = self.take(f"round {round_}")
                self.slow()
                start = self.one.start("iscsictl", "replication", "send", self.task, snapshot,
                                       stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
                time.sleep(dice.uniform(0, 1.3))  # the moment, not a wait
                kills += self.killed(victims[victim]())
                self.full_speed()
                start.wait(timeout=120)
                self.services_back()
                wait_until(lambda: not self.senders(), "the sender ends")
                if self.sending()["error"]:
                    self.give_up()
                self.wait_idle()
                if dice.random() < 0.3:
                    self.change_much(dice)
                    snapshot = self.take(f"round {round_} again")
                self.expect_whole(snapshot)
                self.delete_snapshots(but=snapshot)

    def test_retried(self):
        """A sending that fails goes on by itself, from where its data was flushed; also from a base that came from the peer."""
        self.send(self.take("first"))
        self.fail_over(self.one, self.two)
        self.send(self.take("over there", self.two), self.two)
        self.fail_over(self.two, self.one)
        write(self.one, "data", random_file("/tmp/other", SIZE_MIB))
        snapshot = self.begin(rate=SLOWER)
        wait_until(lambda: self.arrived() > 0, "some of it is flushed")
        flushed = self.arrived()
        self.killed(self.senders())
        self.full_speed()
        received = self.two.received_bytes()
        wait_until(lambda: self.sending()["sent_size"] == SIZE_MIB * MIB, "the worker sends again")
        self.expect_unlocked()
        self.assertLess(self.two.received_bytes() - received, (SIZE_MIB + 2) * MIB - flushed)
        self.expect_replica(snapshot)

    def test_stopped_between_tries(self):
        self.begin()
        self.killed(self.senders())
        wait_until(lambda: self.sending()["error"] not in (0, -19), "the worker knows that it failed")
        self.one.iscsictl("replication", "stop", self.task)
        self.wait_idle()
        self.assertEqual(self.sending()["error"], -19)
        self.refused(self.one, "replication", "stop", self.task, says="not sending")
        self.expect_whole(self.take("later"))

    def test_link_cut(self):
        for number, seconds in enumerate(CUTS):
            with self.subTest(seconds=seconds):
                self.change_much(random.Random(number))
                snapshot = self.begin(f"cut for {seconds} s", after_mib=1, rate=SLOWEST)
                self.two.cut_link()
                time.sleep(seconds)  # how long it is cut, not a wait
                self.two.mend_link()
                self.full_speed()
                # A connection that found its way again may be through before anybody gives up.
                wait_until(lambda: not self.senders(), "the sender ends", 150)
                if self.sending()["error"]:
                    self.give_up()
                self.expect_whole(snapshot)

    def test_web_server_hangs(self):
        """Data flows on, and nothing is tried again."""
        snapshot = self.begin(after_mib=1, rate=SLOWER)
        servers = self.two.processes("lighttpd")
        for pid in servers:
            os.kill(pid, signal.SIGSTOP)
        try:
            wait_until(lambda: self.sending()["sent_size"] > (SIZE_MIB - 4) * MIB, "all of it is sent", 45)
        finally:
            for pid in servers + [service.pid for service in self.two.services]:  # what started one stops with it
                os.kill(pid, signal.SIGCONT)
        self.wait_idle()
        self.assertEqual(self.sending()["error"], 0)
        self.expect_replica(snapshot)

    def test_peer_restarted(self):
        snapshot = self.begin(rate=SLOWER)
        wait_until(lambda: self.arrived() > 0, "some of it is flushed")
        self.two.restart()
        flushed = self.arrived()
        self.assertGreater(flushed, 0)
        self.give_up()
        received = self.two.received_bytes()
        self.expect_whole(snapshot)
        self.assertLess(self.two.received_bytes() - received, (SIZE_MIB + 2) * MIB - flushed)
        self.two.restart()
        self.assertEqual(self.replica(), checksum("/tmp/data"), "what was sent has come to stay")
        self.change(self.one, 9, 64, 0x99)
        self.assertEqual(self.send(self.take("more")), 64 << 10)

    def test_source_restarted(self):
        """What its LUN had not flushed may be gone; its snapshots are whole."""
        snapshot = self.begin()
        self.one.restart()
        self.assertRegex(self.one.iscsictl("replication", "status", self.task), "killed")
        self.full_speed()
        self.expect_unlocked()
        self.send(snapshot)
        self.assertEqual(self.replica(), checksum("/tmp/data"))

    def test_volume_full(self):
        """In the middle of the data, and with no room for anything."""
        free = json.loads(self.two.host("volume", "list", "--json"))[0]["free_bytes"]
        self.two.iscsictl("lun", "create", "fat", "--location", VOLUME, "--size", str((free // MIB - SIZE_MIB // 2) * MIB), "--type", "file")
        snapshot = self.take("too much")
        self.one.iscsictl("replication", "send", self.task, snapshot)
        wait_until(lambda: self.sending()["error"], "the sending fails")
        self.assertEqual(self.sending()["error"], 18990002)
        self.assertIn("Out of volume space", self.one.iscsictl("events"))
        self.give_up()
        self.two.iscsictl("lun", "delete", "fat", "--yes")
        self.expect_whole(snapshot)

        filler = f"{VOLUME}/filler"
        self.two.run("sh", "-c", f"touch {filler}; for size in 67108864 1048576 4096; do"
                     f" while fallocate --offset $(stat --format %s {filler}) --length $size {filler}; do :; done; done 2>/dev/null")
        snapshot = self.take("no more")
        self.one.iscsictl("replication", "send", self.task, snapshot)
        wait_until(lambda: self.sending()["error"], "the sending fails")
        self.assertEqual(self.sending()["error"], 18990002)
        self.give_up()
        self.two.run("rm", filler)
        self.expect_whole(snapshot)

    def test_too_many_snapshots(self):
        self.send(self.take("first"))
        store = self.store(self.two)
        lid, = store.execute("SELECT lid FROM luns WHERE name = ?", (self.lun,)).fetchone()
        store.execute("""
            WITH RECURSIVE number (n) AS (SELECT 2 UNION ALL SELECT n + 1 FROM number WHERE n < 256)
            INSERT INTO snapshots SELECT lid, n, printf('%08x-0000-0000-0000-%012x', lid, n), 'filler ' || n, '', '', uuid, create_time,
                snap_time, flags, 0, 0, total_size, 0, NULL FROM snapshots, number WHERE lid = ?""", (lid,))
        self.change(self.one, 7, 64, 0x77)
        snapshot = self.take("one too many")
        self.refused(self.one, "replication", "send", self.task, snapshot, "--watch", says="18990543", timeout=120)
        self.assertEqual(self.sending()["error"], 18990543)
        self.assertIn("Maximum snapshot count reached", self.one.iscsictl("events"))
        store.execute("DELETE FROM snapshots WHERE lid = ? AND name LIKE 'filler %'", (lid,))
        self.expect_unlocked()
        self.assertEqual(self.send(snapshot), 512, "the data is there already")
        self.expect_replica(snapshot)

    def test_base_deleted(self):
        self.send(first := self.take("first"))
        self.change(self.one, 1, 64, 0x11)
        self.two.iscsictl("snapshot", "delete", self.there(first)["uuid"], "--yes")
        self.assertEqual(self.send(second := self.take("second")), 64 << 10, "the destination itself is the base")
        self.expect_replica(second)
        self.assertEqual(self.there(first)["name"], "first", "it was taken again before it was overwritten")

        self.change_much(random.Random(1))
        third = self.begin("third", after_mib=1, rate=SLOWEST)
        self.refused(self.one, "snapshot", "delete", second, "--yes", says="locked")
        self.killed(self.senders())
        self.give_up()
        first_there, second_there = (self.there(snapshot)["uuid"] for snapshot in (first, second))
        self.refused(self.two, "snapshot", "delete", second_there, "--yes", says="last whole state")
        self.two.iscsictl("snapshot", "delete", first_there, "--yes")
        for snapshot in (first, second, third):
            self.one.iscsictl("snapshot", "delete", snapshot, "--yes")
        self.expect_whole(self.take("nothing in common"))

    def test_written_on_destination(self):
        self.send(first := self.take("first"))
        self.change(self.one, 1, 64, 0x11)
        second = self.take("second")
        path = self.two.run("find", VOLUME, "-name", f"*_{self.lun}_*", "-path", "*Extent*").stdout.split()[0]
        self.two.run("dd", "if=/dev/urandom", f"of={path}", "bs=1M", "seek=30", "count=1", "conv=notrunc,fsync")
        self.assertEqual(self.send(second), 64 << 10, "set back to the common snapshot first")
        self.expect_replica(second)

        self.two.iscsictl("replication", "promote", self.task)
        self.two.iscsictl("lun", "map", self.lun, "data")
        self.change(self.two, 20, 128, 0x22)
        self.refused(self.one, "replication", "send", self.task, second, says="Not a destination task")
        self.two.iscsictl("lun", "unmap", self.lun, "data")
        self.two.iscsictl("replication", "demote", self.task)
        self.change(self.one, 2, 64, 0x33)
        self.assertEqual(self.send(third := self.take("third")), 64 << 10)
        self.expect_replica(third)

        # Nothing to set it back to.
        self.two.iscsictl("replication", "promote", self.task)
        for snapshot in self.two.json("snapshot", "list", self.lun):
            self.two.iscsictl("snapshot", "delete", snapshot["uuid"], "--yes")
        self.two.iscsictl("lun", "map", self.lun, "data")
        self.change(self.two, 40, 128, 0x44)
        self.two.iscsictl("lun", "unmap", self.lun, "data")
        self.two.iscsictl("replication", "demote", self.task)
        self.expect_whole(third)

    def test_promoted_while_sending(self):
        self.send(first := self.take("first"))
        wanted = checksum_at(self.one, "data")
        self.change_much(random.Random(2))
        self.begin(after_mib=1, rate=SLOWEST)
        self.two.iscsictl("replication", "promote", self.task)
        self.full_speed()
        self.wait_idle()
        self.expect_unlocked()
        self.assertEqual(self.sending()["error"], -71, "nothing to try again")
        self.assertIn("is a source here", self.sending()["reason"])
        self.refused(self.one, "replication", "send", self.task, first, says="Not a destination task")
        self.two.iscsictl("lun", "map", self.lun, "data")
        self.assertEqual(checksum_at(self.two, "data"), wanted, "the last whole state")
        self.change(self.two, 5, 64, 0x55)
        self.one.iscsictl("lun", "unmap", self.lun, "data")
        self.one.iscsictl("replication", "demote", self.task)
        self.assertEqual(self.send(self.take("over there", self.two), self.two), 64 << 10)
        self.assertEqual(self.replica(self.one), checksum_at(self.two, "data"))

    def test_removed_while_sending(self):
        snapshot = self.begin()
        self.two.iscsictl("replication", "remove", self.task, "--delete-lun")
        self.assertNotIn(self.lun, [lun["name"] for lun in self.two.json("lun", "list")])
        self.wait_idle()
        self.assertEqual(self.sending()["error"], -71, "nothing to try again")
        self.refused(self.one, "replication", "send", self.task, snapshot, says="18990810")

    def test_wrong_key(self):
        store = self.store(self.one)
        peer = self.two.json("node", "list")[0]["uuid"]
        key, = store.execute("SELECT value FROM node_attributes WHERE uuid = ? AND key = 'rod_key'", (peer,)).fetchone()
        store.execute("UPDATE node_attributes SET value = ? WHERE uuid = ? AND key = 'rod_key'", (key[::-1], peer))
        snapshot = self.take("first")
        self.one.iscsictl("replication", "send", self.task, snapshot)
        wait_until(lambda: self.sending()["error"], "the sending fails")
        self.assertRegex(self.one.iscsictl("replication", "status", self.task), "cannot log in")
        self.assertNotIn(key, "".join(self.one.log_lines + self.two.log_lines))
        self.give_up()
        self.one.iscsictl("node", "check", self.two.address, "--address", self.two.address)  # asks for the key
        self.expect_whole(snapshot)

    def test_clocks_apart(self):
        """The destination's clock is an hour off, either way."""
        self.send(self.take("first"))
        self.addCleanup(self.two.restart)
        self.addCleanup(self.two.set_clock, 0)
        for hours in (-1, 1):
            with self.subTest(hours=hours):
                self.two.set_clock(hours * 3600)
                self.two.restart()
                self.change(self.one, 1, 64, 0x10 + hours)
                self.send(self.take(f"common {hours}"))
                self.fail_over(self.one, self.two)
                self.change(self.two, 2, 64, 0x20 + hours)
                there = self.take(f"over there {hours}", self.two)
                off = self.two.json("snapshot", "show", there)["snapshot_time"] - time.time()
                self.assertAlmostEqual(off, hours * 3600, delta=600)
                self.assertEqual(self.send(there, self.two), 64 << 10)
                self.assertEqual(self.replica(self.one), checksum_at(self.two, "data"))
                self.change(self.two, 3, 64, 0x30 + hours)
                self.fail_over(self.two, self.one)
                self.change(self.one, 4, 64, 0x40 + hours)
                # The common snapshot that looks newest may be an older one: more is sent, nothing is lost.
                self.assertLessEqual(self.send(back := self.take(f"back {hours}")), 128 << 10)
                self.expect_replica(back)


if __name__ == "__main__":
    main()
