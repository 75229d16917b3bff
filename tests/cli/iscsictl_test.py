"""iscsictl as its users meet it, on an appliance whose daemons do not run. Needs no root."""

import json
import os
import subprocess
import unittest

from appliance import ISCSI_HOST, ISCSICTL, Appliance

LUN_KEYS = {"lun_id", "type", "restored_time", "size", "uuid", "name", "location", "is_mapped", "extent_size"}
STATUS_KEYS = {"status", "allocated_size", "is_action_locked"}
MIB = 1 << 20


def commands(program):
    """The commands of a program that its help lists, "volume add", down to the last."""
    help_text = subprocess.run([*program, "--help"], capture_output=True, text=True, check=True).stdout
    names = [line.split()[0] for line in help_text.partition("Subcommands:\n")[2].partition("\n\n")[0].splitlines()]
    return [" ".join([name, *rest]).strip() for name in names for rest in
            ([[below] for below in commands([*program, name])] or [[]])]


class Luns(Appliance):
    def test_life_of_a_lun(self):
        self.assertEqual(self.luns(), [])
        out = self.ok("lun", "create", "vol1", "--size", "1.5G", "--location", self.volume, "--type", "thin")
        (lun,) = self.luns()
        self.assertEqual(out, f"Created LUN vol1: thin, 1.5G, {lun['uuid']}\n")
        self.assertEqual(set(lun), LUN_KEYS)
        self.assertEqual((lun["name"], lun["type"], lun["size"], lun["location"], lun["is_mapped"]),
                         ("vol1", 7, 1536 * MIB, self.volume, False))

        shown = json.loads(self.ok("lun", "show", "vol1", "--json"))
        self.assertEqual(set(shown), LUN_KEYS | STATUS_KEYS | {"targets", "sync_progress"})
        self.assertEqual(shown["targets"], [])
        text = self.ok("lun", "show", "vol1")
        self.assertRegex(text, r"(?m)^Size: +1\.5G \(1610612736 bytes\)$")
        self.assertRegex(text, r"(?m)^UUID: +" + lun["uuid"] + "$")

        for selector in (lun["uuid"], "lun#1", "LUN#1"):
            self.assertEqual(json.loads(self.ok("lun", "show", "--json", selector))["uuid"], lun["uuid"])

        self.ok("lun", "update", "vol1", "--name", "list", "--size", "2G")
        self.assertEqual([(l["name"], l["size"]) for l in self.luns()], [("list", 2048 * MIB)])
        status = json.loads(self.ok("lun", "list", "--status", "--json"))
        self.assertEqual(set(status[0]), LUN_KEYS | STATUS_KEYS)
        # A name that is also a verb is a name where a name belongs.
        self.ok("lun", "delete", "list", "--yes")
        self.assertEqual((self.luns(), self.files()), ([], []))

    def test_lun_whose_data_is_gone_is_still_shown(self):
        self.create("kept")
        self.create("lost")
        os.remove(next(path for path in self.files() if "lost" in path))
        kept, lost = json.loads(self.ok("lun", "list", "--status", "--json"))
        self.assertIn("allocated_size", kept)
        self.assertNotIn("allocated_size", lost)
        self.assertRegex(self.ok("lun", "list", "--status"), r"(?m)^2  lost .* unknown ")

    def test_bad_names(self):
        for name in ("a/b", "..", ".", "../../etc/passwd", "a\nb", "'", '"', "a#b", "lun#1", "x" * 256, "", "\x1b[2J",
                     "a\u202eb", "$(id)", "a;b", "a*b", "\udcff"):
            with self.subTest(name=name):
                error = self.fails(1, "lun", "create", "--size", "16M", "--location", self.volume, "--", name,
                                   says=r"^iscsictl: lun create: Bad LUN name \(18990503\): .")
                self.assertTrue(all(c.isprintable() for line in error.splitlines() for c in line), error)
        self.assertEqual((self.luns(), self.files()), ([], []))
        names = ["größe", "数据", "a b", "-x", "n" * 200]
        for name in names:
            self.create(name)
        self.assertEqual([lun["name"] for lun in self.luns()], names)
        self.fails(1, "lun", "create", "--size", "16M", "--location", self.volume, "a b",
                   says=r"Duplicated LUN name \(18990538\)")
        self.assertEqual(len(self.luns()), len(names))

    def test_bad_sizes_and_places(self):
        code = r"^iscsictl: lun create: Bad LUN size \(18990502\): ."
        for size in ("0", "1", str(16 * MIB + 1), "9223372036854775808", "18446744073709551615"):
            self.fails(1, "lun", "create", "x", "--size", size, "--location", self.volume, says=code)
        self.fails(1, "lun", "create", "x", "--size", "4E", "--type", "file", "--location", self.volume,
                   says=r"Out of free space \(18990002\): .")
        for place in ("/nowhere", "relative", "/", self.volume + "/..", ""):
            self.fails(1, "lun", "create", "x", "--size", "16M", "--location", place,
                       says=r"Bad LUN location \(18990501\): .*\n.*hint: .*volume list")
        self.assertEqual((self.luns(), self.files()), ([], []))

        self.create("x")
        self.fails(1, "lun", "update", "x", "--size", "8M", says=r"Bad LUN size \(18990502\): .*shrink")
        self.fails(1, "lun", "update", "x", says="nothing to change")
        self.fails(1, "lun", "update", "x", "--name", "x", says=r"Duplicated LUN name \(18990538\): name: ")
        self.fails(1, "lun", "update", "x", "--name", "../y", says=r"Bad LUN name \(18990503\)")
        self.assertEqual([(lun["name"], lun["size"]) for lun in self.luns()], [("x", 16 * MIB)])

    def test_unknown_luns(self):
        self.create("x")
        for selector in ("y", "lun#0", "lun#2", "lun#1x", "../x", "a/b", "%41", "x%"):
            self.fails(1, "lun", "delete", "--yes", selector,
                       says=r"Bad LUN UUID \(18990505\): no LUN has .*\n.*hint: 'iscsictl lun list'")
        self.fails(1, "lun", "show", "00000000-1111-2222-3333-444444444444", says=r"No such LUN \(18990531\)")
        self.fails(1, "lun", "delete", "--yes", "", says=r"No LUN UUID \(18990530\)")
        self.assertEqual(len(self.luns()), 1)

    def test_one_of_many_creators_of_a_name_wins(self):
        command = [ISCSICTL, "lun", "create", "same", "--size", "16M", "--location", self.volume]
        creators = [subprocess.Popen(command, env=self.env, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True)
                    for _ in range(8)]
        losers = [error for error in (creator.communicate()[1] for creator in creators) if error]
        self.assertEqual([creator.returncode for creator in creators].count(0), 1)
        self.assertEqual(len(losers), 7)
        for error in losers:
            self.assertIn("Duplicated LUN name (18990538)", error)
        self.assertEqual((len(self.luns()), len(self.files())), (1, 1))


class Words(Appliance):
    def test_usage_errors(self):
        cases = [
            ([], "subcommand"),
            (["lnu"], "'lnu'"),
            (["lun"], "subcommand"),
            (["lun", "crate"], "'crate'"),
            (["lun", "create"], "NAME"),
            (["lun", "create", "x", "--size", "1G"], "--location"),
            (["lun", "create", "x", "--location", "/v"], "--size"),
            (["lun", "create", "x", "y", "--size", "1G", "--location", "/v"], "y"),
            (["lun", "create", "x", "--size", "1G", "--location", "/v", "--type", "fat"], "--type: 'fat'"),
            (["lun", "list", "--colour"], "--colour"),
            (["lun", "map", "x"], "TARGET"),
            (["target", "create", "t", "--max-sessions", "-1"], "--max-sessions"),
            (["target", "create", "t", "--chap-secret-file", "-"], "--chap-user"),
            (["target", "create", "t", "--chap-secret", "abc"], "--chap-secret"),
            (["target", "create", "t", "--chap-user", "u"], "no terminal"),
            (["target", "masks", "t", "--set", "a=r", "--add", "b=r"], "--add"),
            (["target", "masks", "t", "--set", "rw"], "--set: 'rw'"),
            (["lun", "delete", "x"], "--yes"),
            (["completion", "fish"], "'fish'"),
        ]
        for size in ("10X", "-1", "1.5", "16E", "99999999999999999999", "0x10", "1 G"):
            cases.append((["lun", "create", "x", "--location", "/v", "--size=" + size], "--size: '%s'" % size))
        for args, names in cases:
            with self.subTest(args=args):
                error = self.fails(2, *args, says="(?m)^Try 'iscsictl .*--help'")
                self.assertIn(names, error.splitlines()[0])
        self.assertFalse(os.path.exists(self.env["ISCSI_HOST_RUN"]) and self.luns())

    def test_help_and_version(self):
        self.assertIn("lun#1", self.ok("--help"))
        self.assertIn("--location DIR (required)", self.ok("lun", "create", "-h"))
        self.assertRegex(self.ok("--version"), r"^iscsictl \d")

    def test_output_that_cannot_be_written_is_a_failure(self):
        with open("/dev/full", "w") as full:
            result = subprocess.run([ISCSICTL, "lun", "list"], env=self.env, stdout=full, stderr=subprocess.PIPE, text=True)
        self.assertEqual(result.returncode, 1)
        self.assertIn("standard output", result.stderr)

    def test_json_survives_any_terminal_and_any_locale(self):
        self.create("größe 数据卷")
        self.assertTrue(self.ok("lun", "list", "--json").isascii())


class Terminal(Appliance):
    def test_deleting_asks(self):
        self.create("x")
        status, screen = self.on_terminal("lun", "delete", "x", answers=["n"])
        self.assertEqual((status, len(self.luns())), (0, 1))
        self.assertIn("Delete LUN x (16M) and all its data? [y/N]", screen)
        self.assertEqual(self.on_terminal("lun", "delete", "lun#1", answers=["y"])[0], 0)
        self.assertEqual(self.luns(), [])

    def test_secrets_are_asked_for_and_never_shown(self):
        secret = "s3cret-of-16-byte"
        status, screen = self.on_terminal("target", "create", "t", "--chap-user", "u", answers=[secret, secret + "x"])
        self.assertEqual(status, 1)
        self.assertIn("CHAP secret, again: ", screen)
        self.assertIn("differ", screen)
        self.assertNotIn(secret, screen)


class Targets(Appliance):
    """Without daemons a target can be refused, never made."""

    def test_bad_input_is_refused_before_anything_is_done(self):
        secret = "s" * 64
        cases = [
            (["create", "数据"], r"Bad target iqn \(18990701\): iqn: ", ""),
            (["create", "t", "--max-send-seg", "16M"], r"max_send_seq_bytes: must be", ""),
            (["create", "t", "--chap-user", "u", "--chap-secret-file", "-"], r"Bad target password \(18990705\)", secret),
            (["create", "t", "--chap-user", "u", "--chap-secret-file", "-"], r"Bad target password \(18990705\)", "\n"),
            (["create", "t", "--chap-user", "u", "--chap-secret-file", "-"], r"no secret", ""),
            (["create", "t", "--chap-user", "u", "--chap-secret-file", "/nowhere"], r"/nowhere: No such file", ""),
            (["show", "nosuch"], r"Bad target ID \(18990710\): no target has", ""),
            (["show", "7"], r"Failed to load target \(18990722\): no target has the ID 7", ""),
            (["delete", "7up", "--yes"], r"No such target \(18990713\): .*'7up'", ""),
            (["masks", "7", "--set", "iqn.2020-01.org.x:a=RW"], r"Bad target auth info \(18990708\): masks\[0\]", ""),
            (["masks", "7", "--set", "a=rw", "--set", "a=r"], r"Invalid input \(18990201\): masks: holds a twice", ""),
            (["list", "--lun", "nosuch"], r"Bad LUN UUID \(18990505\)", ""),
        ]
        for args, says, stdin in cases:
            with self.subTest(args=args):
                error = self.fails(1, "target", *args, says=says, stdin=stdin)
                self.assertNotIn(secret, error)
        self.assertEqual(json.loads(self.ok("target", "list", "--json")), [])


class Completion(Appliance):
    def setUp(self):
        super().setUp()
        self.script = os.path.join(self.folder, "completion.bash")
        with open(self.script, "w") as script:
            script.write(self.ok("completion", "bash"))

    def complete(self, *words):
        """What bash would offer for the last word."""
        program = 'source "$1"; shift; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _iscsictl; printf "%s\\n" "${COMPREPLY[@]}"'
        result = subprocess.run(["bash", "-c", program, "bash", self.script, ISCSICTL, *words], env=self.env,
                                capture_output=True, text=True, check=True)
        return [line for line in result.stdout.splitlines() if line]

    def test_words_come_from_the_definitions(self):
        self.assertEqual(self.complete(""), ["lun", "snapshot", "retention", "schedule", "events", "target", "node", "vlun",
                                             "replication", "login", "logout", "completion"])
        self.assertEqual(self.complete("lun", "un"), ["unmap", "unload"])
        self.assertEqual(self.complete("lun", "create", "--s"), ["--size"])
        self.assertEqual(self.complete("lun", "create", "--type", "t"), ["thin"])
        self.assertEqual(self.complete("lun", "create", "--type", "=", "t"), ["thin"])
        self.assertEqual(self.complete("lun", "list", ""), [])

    def test_names_come_from_the_appliance(self):
        for name in ("vol1", "vol2", "other (x)"):
            self.create(name)
        self.assertEqual(self.complete("lun", "show", ""), ["vol1", "vol2", r"other\ \(x\)"])
        self.assertEqual(self.complete("lun", "delete", "--yes", "v"), ["vol1", "vol2"])
        self.assertEqual(self.complete("lun", "show", r"other\ \("), [r"other\ \(x\)"])
        self.assertEqual(self.complete("lun", "show", "'other"), ["other (x)"])
        self.assertEqual(self.complete("target", "list", "--lun", "vol2"), ["vol2"])
        self.assertEqual(self.complete("lun", "map", "vol1", ""), [])
        self.assertEqual(self.complete("lun", "show", "vol1", ""), [])


class Manual(Appliance):
    def test_every_verb_and_option_is_described(self):
        source = os.path.join(self.folder, "manual.in")
        with open(source, "w") as file:
            file.write("before\n@COMMANDS@\nafter\n")
        text = self.ok("__manual", source)
        self.assertTrue(text.startswith("before\n.SS ") and text.endswith("after\n"))
        verbs = commands([ISCSICTL])
        self.assertGreaterEqual(len(verbs), 16)
        for verb in verbs:
            self.assertIn(f"\n.SS {verb}\n".replace("-", r"\-"), text)
        page = os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../docs/man/iscsi-host.8")
        with open(page) as file:
            written = file.read().replace("\\-", "-").replace("\\fB", "").replace("\\fR", "").replace(".B ", "")
        for command in commands([ISCSI_HOST]):
            self.assertRegex(written, rf"(?m)^{command}\b")
        self.assertIn("\\fB\\-\\-chap\\-secret\\-file\\fR \\fIFILE\\fR\n", text)


if __name__ == "__main__":
    unittest.main()
