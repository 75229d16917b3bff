"""iscsictl on snapshots, on a volume that shares blocks, in mount and process namespaces of its own. Needs root."""

import glob
import json
import os
import pwd
import re
import shutil
import signal
import subprocess
import time

from appliance import ISCSICTL, Appliance, main_in_namespaces

KEYS = {"snapshot_id", "parent_lun_id", "total_size", "mapped_size", "create_time", "snapshot_time", "is_app_consistent",
        "is_user_locked", "name", "status", "description", "root_path", "taken_by", "uuid", "version", "is_action_locked",
        "locked_app_keys", "lun_name"}
MIB = 1 << 20


class Snapshots(Appliance):
    def setUp(self):
        super().setUp()
        # Workers that commands left behind use the folder to their end.
        running = ["pgrep", "--runstates", "R,S,D", "-x", "iscsictl"]
        self.addCleanup(self.wait_for, "the end of the workers",
                        lambda: subprocess.run(running, stdout=subprocess.DEVNULL, check=False).returncode)
        self.volume = self.make_volume("reflink")
        self.create("vm", "--type", "thin")

    def make_volume(self, name):
        path = os.path.join(self.folder, name)
        self.run_host("volume", "create", path, "--size", "512M")
        # Lazily: a worker may be about to end.
        self.addCleanup(subprocess.run, ["umount", "--lazy", path], check=True)
        return path

    def data(self, lun="vm"):
        """The LUN's file."""
        return next(path for path in glob.glob(self.volume + "/@iSCSITrg/*_*_*") if f"_{lun}_" in path)

    def write(self, byte, megabytes=4, lun="vm"):
        with open(self.data(lun), "r+b") as file:
            file.write(byte * megabytes * MIB)
            os.fsync(file.fileno())

    def first_byte(self, lun="vm"):
        with open(self.data(lun), "rb") as file:
            return file.read(1)

    def take(self, *args, lun="vm"):
        return json.loads(self.ok("snapshot", "take", lun, "--json", *args))

    def list(self, *args):
        return json.loads(self.ok("snapshot", "list", "--json", *args))

    def wait_for(self, what, condition):
        deadline = time.monotonic() + 120
        while not condition():
            self.assertLess(time.monotonic(), deadline, what)
            time.sleep(0.05)

    def test_take_list_lock_restore_delete(self):
        self.assertEqual(self.list(), [])
        self.write(b"1")
        one = self.take("--name", "one", "--note", "größe\x1b[2J", "--taken-by", "me", "--app-consistent")
        self.assertEqual(set(one), KEYS | {"sync_progress", "loaded_number"})
        self.assertEqual({key: one[key] for key in ("name", "lun_name", "description", "taken_by", "is_app_consistent",
                                                    "is_user_locked", "total_size", "mapped_size", "locked_app_keys")},
                         {"name": "one", "lun_name": "vm", "description": "größe\x1b[2J", "taken_by": "me",
                          "is_app_consistent": True, "is_user_locked": False, "total_size": 16 * MIB,
                          "mapped_size": 4 * MIB, "locked_app_keys": []})
        two = json.loads(self.ok("snapshot", "take", "vm", "--json", "--lock"))
        self.assertEqual(two["taken_by"], pwd.getpwuid(os.geteuid()).pw_name)
        self.create("other")
        self.take("--name", "one", lun="other")
        self.assertEqual([(s["lun_name"], s["name"]) for s in self.list()],
                         [("vm", "one"), ("vm", two["name"]), ("other", "one")])
        self.assertEqual([snapshot | {"sync_progress": 0, "loaded_number": 0} for snapshot in self.list("vm")], [one, two])
        text = self.ok("snapshot", "show", "vm_one")
        self.assertIn(r"größe\x1b[2J", text)
        self.assertNotIn("Export:", text)
        for selector in (one["uuid"], "sn#1", "SN#1", "vm_one"):
            self.assertEqual(json.loads(self.ok("snapshot", "show", "--json", selector)), one)
        for selector in ("vm_none", "sn#0", "sn#4", "one", "../x", ""):
            self.fails(1, "snapshot", "show", selector, says=r"\(18990520\): no snapshot has .*\n.*hint: .*snapshot list")
        self.fails(1, "snapshot", "take", "vm", "--name", "one", says=r"Bad snapshot_name \(18990513\): another")
        self.fails(1, "snapshot", "take", "vm", "--note", "x" * 1024, says=r"\(18990518\): description: ")
        self.fails(1, "snapshot", "take", "vm", "--taken-by", "x" * 32, says="taken_by: ")

        # Nothing is deleted unless every selector means a snapshot; places do not move while they are deleted.
        locked = r"Cannot delete locked snapshot \(18990540\).*\n.*hint: .*snapshot unlock"
        self.fails(1, "snapshot", "delete", "--yes", two["uuid"], says=locked)
        self.fails(1, "snapshot", "delete", "--yes", "vm_one", "vm_none", says=r"\(18990520\)")
        self.fails(2, "snapshot", "delete", "vm_one", says="--yes")
        self.ok("snapshot", "lock", "vm_one", "--app-key", "backup")
        self.assertRegex(self.ok("snapshot", "list"), r"(?m)^1 +vm +one .* backup +me ")
        self.fails(1, "snapshot", "delete", "--yes", "vm_one", says=r"Snapshot is locked \(18990547\): .*'backup'")
        self.ok("snapshot", "unlock", "vm_one", "--app-key", "backup")

        number = re.search(r"^Loaded snapshot one .*, read as LUN (\d+) of", self.ok("snapshot", "load", "vm_one"))[1]
        self.assertRegex(self.ok("snapshot", "show", "vm_one"), rf"(?m)^Loaded as LUN:? +{number}$")
        self.assertNotIn("LUN " + number, self.ok("snapshot", "unload", "vm_one"))

        self.write(b"2")
        self.fails(2, "snapshot", "restore", "vm_one", says="--yes")
        self.assertEqual(self.first_byte(), b"2")
        said = self.ok("snapshot", "restore", "vm_one", "--yes")
        self.assertRegex(said, "^Restoring LUN vm to snapshot one; .*iscsictl lun show")
        self.wait_for("the event of the restore", lambda: "The LUN vm was restored" in self.ok("events"))
        self.assertEqual(self.first_byte(), b"1")

        self.ok("snapshot", "unlock", two["uuid"])
        self.assertEqual(self.ok("snapshot", "delete", "--yes", "sn#1", "sn#2", "sn#1").count("Deleted snapshot"), 2)
        self.assertEqual([s["lun_name"] for s in self.list()], ["other"])

    def test_copies(self):
        self.write(b"1")
        self.take("--name", "one")
        self.write(b"2")
        result = self.run_cli("snapshot", "clone", "vm_one", "copy", "--watch")
        self.assertEqual((result.returncode, result.stderr.splitlines()[0]), (0, "Cloning to LUN copy: 0:00"))
        self.assertRegex(result.stdout, r"^Cloned to LUN copy: [0-9a-f-]{36}\n$")
        self.assertEqual((self.first_byte("copy"), self.first_byte()), (b"1", b"2"))
        self.fails(1, "snapshot", "clone", "vm_one", "copy", says=r"Duplicated LUN name \(18990538\)")
        self.create("adv")
        self.ok("lun", "clone", "adv", "adv2")
        self.fails(1, "lun", "clone", "vm", "vm2", says=r"Bad LUN type \(18990500\): .*clone a snapshot")
        self.assertEqual([lun["name"] for lun in self.luns()], ["vm", "copy", "adv", "adv2"])

    def test_watched_without_a_terminal(self):
        self.write(b"1", megabytes=12)
        result = self.run_cli("snapshot", "take", "vm", "--name", "one", "--watch")
        self.assertEqual((result.returncode, result.stderr), (0, "Taking a snapshot of vm: 0:00\n"))
        self.assertRegex(result.stdout, "^Took snapshot one of LUN vm: ")
        exported = os.path.join(self.folder, "exported")
        result = self.run_cli("snapshot", "export", "vm_one", exported, "--watch")
        self.assertEqual((result.returncode, result.stdout), (0, f"Exported vm_one to {exported}\n"), result.stderr)
        for line in result.stderr.splitlines():
            self.assertRegex(line, rf"^Exporting vm_one to {re.escape(exported)}: (\d+:\d\d|\d+% of 12M(, .*/s, .* left)?)$")
        self.write(b"2", megabytes=12)
        result = self.run_cli("lun", "import", "vm", exported, "--watch", "--json")
        self.assertEqual(result.returncode, 0, result.stderr)
        self.assertIn("100% of 12M", result.stderr)
        self.assertEqual(json.loads(result.stdout)["total_bytes"], 12 * MIB)
        self.assertEqual(self.first_byte(), b"1")
        # The import ends with a snapshot of its own.
        self.wait_for("the closing snapshot", lambda: len(self.list("vm")) == 2)

        self.fails(1, "snapshot", "export", "vm_one", exported, says=r"\(\d+\): ")
        self.fails(1, "snapshot", "export-cancel", "vm_one", says=r"Now is not exporting \(18990592\)")
        self.fails(1, "lun", "import-cancel", "vm", says=r"Now is not importing \(18990593\)")
        self.fails(1, "lun", "import", "vm", self.folder, says=r"\(\d+\): ")

    def test_a_transfer_that_fails_underway_is_a_failure(self):
        self.write(b"1", megabytes=12)
        self.take("--name", "one")
        exported = os.path.join(self.folder, "exported")
        self.assertEqual(self.run_cli("snapshot", "export", "vm_one", exported, "--watch").returncode, 0)
        self.create("full", "--type", "thin")
        room = os.statvfs(self.volume)
        subprocess.run(["fallocate", "--length", str(room.f_bavail * room.f_frsize - 6 * MIB), self.volume + "/filler"],
                       check=True)
        result = self.run_cli("lun", "import", "full", exported, "--watch")
        self.assertEqual((result.returncode, result.stdout), (1, ""))
        self.assertRegex(result.stderr, r"(?m)^iscsictl: lun import: Out of free space \(18990002\)")

    def test_interrupted_watching_leaves_the_action_running(self):
        self.write(b"1")
        self.take("--name", "one")
        volume = self.make_volume("exports")
        # Nothing can be written there until it thaws: the export cannot end before.
        subprocess.run(["fsfreeze", "--freeze", volume], check=True)
        thaw = ["fsfreeze", "--unfreeze", volume]
        self.addCleanup(subprocess.run, thaw, check=False, stderr=subprocess.DEVNULL)
        watcher = subprocess.Popen([ISCSICTL, "snapshot", "export", "vm_one", volume + "/one", "--watch"], env=self.env,
                                   stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)
        self.assertEqual(watcher.stderr.readline(), f"Exporting vm_one to {volume}/one: 0:00\n")
        os.kill(watcher.pid, signal.SIGINT)
        said, error = watcher.communicate(timeout=120)
        self.assertEqual((watcher.returncode, said), (-signal.SIGINT, ""))
        self.assertRegex(error, "goes on; 'iscsictl snapshot show'")
        subprocess.run(thaw, check=True)
        self.wait_for("the end of the export", lambda: os.path.exists(volume + "/one/export.record"))

    def test_a_bar_on_a_terminal(self):
        self.write(b"1", megabytes=12)
        self.take("--name", "one")
        exported = os.path.join(self.folder, "exported")
        self.assertEqual(self.run_cli("snapshot", "export", "vm_one", exported, "--watch").returncode, 0)
        status, screen = self.on_terminal("lun", "import", "vm", exported, "--watch")
        self.assertEqual(status, 0, screen)
        self.assertRegex(screen, r"\[#{30}\] 100% of 12M")
        self.assertTrue(screen.endswith(f"\r\x1b[KImported {exported} into LUN vm\r\n"), screen)

    def test_retention(self):
        self.fails(2, "retention", "set", "vm", says="--keep")
        self.fails(1, "retention", "set", "vm", "--keep", "0", says=r"\(18990004\)")
        self.assertEqual(self.ok("retention", "show", "vm"), "Kept: all\n")
        for name in ("0", "a", "b", "c"):
            self.take("--name", name)
        self.ok("snapshot", "lock", "vm_0", "--app-key", "backup")
        self.ok("snapshot", "lock", "vm_a")
        table = self.ok("retention", "dry-run", "vm", "--keep", "1")
        self.assertRegex(table, r"^ID +NAME +TIME +VERDICT +REASON\n *4 +c .* stays +newest 1 of 1\n"
                                r" *3 +b .* goes +no rule keeps it\n *2 +a .* stays +locked by the user\n"
                                r" *1 +0 .* stays +locked by backup\n$")
        self.assertEqual(len(self.list("vm")), 4)
        self.assertEqual(self.ok("retention", "set", "vm", "--keep", "2", "--daily", "7"), "Kept: 2 newest, 7 daily\n")
        verdicts = json.loads(self.ok("retention", "dry-run", "vm", "--json"))
        self.assertEqual([(v["name"], v["is_kept"]) for v in verdicts], [("c", True), ("b", True), ("a", True), ("0", True)])
        # It runs after each snapshot.
        self.take("--name", "d")
        self.wait_for("b to go", lambda: [s["name"] for s in self.list("vm")] == ["0", "a", "c", "d"])
        self.ok("retention", "remove", "vm")
        self.assertEqual(json.loads(self.ok("retention", "show", "vm", "--json")),
                         {"newest": 0, "hourly": 0, "daily": 0, "weekly": 0})

    def test_schedules(self):
        self.fails(2, "schedule", "add", "--lun", "vm", says="--every or --cron")
        self.fails(2, "schedule", "add", "--lun", "vm", "--every", "1h", "--cron", "daily", says="--cron")
        self.fails(2, "schedule", "add", "--lun", "vm", "--every", "daily", says="--every: 'daily' is no interval.*--cron")
        self.fails(2, "schedule", "add", "--lun", "vm", "--cron", "1h", says="--cron: '1h' is an interval.*--every")
        self.fails(1, "schedule", "add", "--lun", "vm", "--cron", "61 * * * *", says=r"\(18990004\): minute: ")
        added = json.loads(self.ok("schedule", "add", "--lun", "vm", "--cron", "*/5 * * * *", "--json"))
        self.assertEqual((added["lun_name"], added["kind"], added["rule"], added["next_run"] % 300, added["last_run"]),
                         ("vm", "snapshot", "*/5 * * * *", 0, 0))
        self.assertEqual(json.loads(self.ok("schedule", "list", "--json")), [added])
        self.take("--name", "kept", "--lock")
        refused = r"Cannot delete locked snapshot \(18990540\): its snapshot 'kept' .* by its user\n.*snapshot unlock"
        self.fails(1, "lun", "delete", "vm", "--yes", says=refused)
        self.assertEqual(json.loads(self.ok("schedule", "list", "--json")), [added])
        for bad in ("x", "", "-", "99", "1" * 30, str(added["schedule_id"]) + "x"):
            self.fails(1, "schedule", "remove", "--", bad, says=r"\(18990004\)")
        self.ok("schedule", "remove", str(added["schedule_id"]))
        self.assertEqual(json.loads(self.ok("schedule", "list", "--json")), [])

    def test_events_can_be_followed(self):
        self.assertEqual(self.ok("events"), "")
        follower = subprocess.Popen([ISCSICTL, "events", "--follow", "--json"], env=self.env, stdout=subprocess.PIPE, text=True)
        self.addCleanup(follower.stdout.close)
        self.addCleanup(follower.wait)
        self.addCleanup(follower.kill)
        self.take("--name", "one")
        self.ok("snapshot", "clone", "vm_one", "copy")
        numbers = [json.loads(follower.stdout.readline())["number"] for _ in range(3)]
        self.assertEqual(numbers, [0x13000027, 0x13000037, 0x13d0000b])
        self.assertEqual(len(self.ok("events", "--last", "2").splitlines()), 2)

    def test_failures_are_events(self):
        self.take("--name", "one")
        shutil.rmtree(glob.glob(self.volume + "/@Snapshot/*_one")[0])
        self.fails(1, "snapshot", "restore", "vm_one", "--yes", says=r"\(\d+\): .*is not there")
        self.fails(1, "snapshot", "clone", "vm_one", "copy", says=r"\(\d+\): .*is not there")
        self.assertEqual([event["number"] for event in json.loads(self.ok("events", "--json"))],
                         [0x13d00005, 0x13000027, 0x13000038, 0x13d0000c])
        self.assertEqual(json.loads(self.ok("snapshot", "show", "vm_one", "--json"))["status"], "Unhealthy")
        self.ok("snapshot", "delete", "vm_one", "--yes")

    def test_completion(self):
        self.take("--name", "one")
        second = self.take("--name", "with blank")
        self.create("with_underscore")
        third = self.take("--name", "x", lun="with_underscore")
        self.assertEqual(self.ok("__complete", "snapshot", "show", "").split(), ["vm_one", second["uuid"], third["uuid"]])
        self.assertEqual(self.ok("__complete", "snapshot", "delete", "vm_one", "vm"), "vm_one\n")
        self.assertEqual(self.ok("__complete", "snapshot", "export", "vm_one", ""), ":DIR\n")


if __name__ == "__main__":
    main_in_namespaces()
