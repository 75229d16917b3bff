"""iscsictl on targets, with the daemons running in a network and a process namespace of their own. Needs root."""

import json
import re

from appliance import Appliance, main_in_namespaces

SECRET = "s3cret-of-16-byte"
MUTUAL = "mutual-of-16-byte"
A, B, C = (f"iqn.2024-05.org.example:{name}" for name in "abc")


class Targets(Appliance):
    def setUp(self):
        super().setUp()
        self.run_host("boot")
        self.addCleanup(self.run_host, "stop")

    def target(self, name):
        return json.loads(self.ok("target", "show", "--json", name))

    def masks(self, *change):
        return {mask["iqn"]: mask["permission"] for mask in json.loads(self.ok("target", "masks", "t", "--json", *change))}

    def test_life_of_a_target(self):
        self.assertRegex(self.ok("target", "create", "My Web"),
                         r"^Created target My Web: ID 1, iqn\.2001-01\.[a-z0-9.-]+:my-web\n$")
        self.fails(1, "target", "create", "My Web", says=r"Failed to create target \(18990714\): another target")
        self.fails(1, "target", "create", "x", "--iqn", "no name", says=r"\(18990714\): target IQN: ")
        self.ok("target", "create", "7up", "--iqn", A, "--header-digest", "--data-digest", "--max-recv-seg", "64K",
                "--max-sessions", "4")
        shown = self.target("7up")
        self.assertEqual({key: shown[key] for key in ("target_id", "iqn", "has_header_checksum", "max_recv_seq_bytes",
                                                      "max_send_seq_bytes", "max_sessions", "auth_type")},
                         {"target_id": 2, "iqn": A, "has_header_checksum": True, "max_recv_seq_bytes": 65536,
                          "max_send_seq_bytes": 262144, "max_sessions": 4, "auth_type": 0})
        self.assertEqual([self.target(selector)["name"] for selector in ("2", "tg#1", "TG#2")], ["7up", "My Web", "7up"])

        # A number with something behind it is a name: "1x" must never delete target 1.
        self.fails(1, "target", "delete", "--yes", "1x", says=r"No such target \(18990713\)")
        self.ok("target", "delete", "--yes", "7up")
        self.assertEqual([target["name"] for target in json.loads(self.ok("target", "list", "--json"))], ["My Web"])

    def test_mapping(self):
        for name in ("one", "two"):
            self.create(name)
            self.ok("target", "create", name)
        self.assertEqual(self.ok("lun", "map", "one", "one", "2"), "LUN one is mapped to one as LUN 1, two as LUN 1\n")
        self.assertEqual(self.ok("lun", "map", "two", "two"), "LUN two is mapped to two as LUN 2\n")
        self.assertEqual([(lun["name"], lun["mapping_index"]) for lun in self.target("two")["luns"]], [("one", 1), ("two", 2)])
        listed = json.loads(self.ok("target", "list", "--lun", "two", "--json"))
        self.assertEqual([(target["name"], target["mapping_index"]) for target in listed], [("two", 2)])
        self.assertTrue(all(lun["is_mapped"] for lun in self.luns()))

        self.fails(1, "lun", "map", "one", "one", "nosuch", says=r"Bad target ID \(18990710\): no target has")
        self.fails(1, "lun", "map", "one", "99", says=r"Failed to map target \(18990570\): .*99")
        self.fails(1, "lun", "delete", "one", "--yes", says=r"LUN is mapped \(18990534\)\n.*hint: ")
        self.ok("lun", "update", "one", "--size", "32M")
        self.assertEqual(self.ok("lun", "unmap", "one", "one", "two"), "LUN one is mapped to no target\n")
        self.fails(1, "lun", "unmap", "one", "one", says=r"not mapped")
        self.ok("lun", "delete", "one", "--yes")
        self.assertEqual([lun["name"] for lun in self.target("two")["luns"]], ["two"])

    def test_masking(self):
        self.ok("target", "create", "t")
        self.assertEqual(self.masks(), {"default": "rw"})
        self.assertEqual(self.masks("--set", A + "=rw", "--set", B + "=r", "--set", "default=-"),
                         {A: "rw", B: "r", "default": "-"})
        self.assertEqual(self.masks("--add", C + "=rw", "--add", B + "=rw", "--remove", "default"),
                         {A: "rw", B: "rw", C: "rw"})
        for args, says in ((["--remove", "default"], r"\(18990701\): remove: the masking does not hold default"),
                           (["--add", A + "=r", "--add", "nobody=rw"], r"'nobody' is no iSCSI name"),
                           (["--set", A + "=r", "--set", A + "=rw"], "twice"),
                           (["--add", A + "=x"], r"\(18990708\): add\[0\]\.permission")):
            self.fails(1, "target", "masks", "t", *args, says=says)
            self.assertEqual(self.masks(), {A: "rw", B: "rw", C: "rw"}, args)
        self.assertEqual(self.masks("--clear"), {})
        self.assertRegex(self.ok("target", "masks", "t", "--add", "default=r"), r"^INITIATOR +PERMISSION\ndefault +r\n$")

    def test_secrets_stay_secret(self):
        chap = ("--chap-user", "alice", "--chap-secret-file", "-")
        mutual = ("--mutual-chap-user", "bob", "--mutual-chap-secret-file", "-")
        said = self.ok("target", "create", "t", *chap, *mutual, stdin=f"{SECRET}\r\n{MUTUAL}\n")
        said += self.ok("target", "create", "--json", "u", *chap, stdin=SECRET)
        said += self.fails(1, "target", "create", "t", *chap, stdin=SECRET, says=r"\(18990714\)")
        self.fails(1, "target", "create", "v", *chap, stdin="short", says=r"\(18990714\): CHAP secret: ")
        for name in ("t", "u"):
            said += self.ok("target", "show", name) + self.ok("target", "show", "--json", name)
        said += self.ok("target", "list") + self.ok("target", "list", "--json")
        self.assertRegex(said, r"Authentication: +mutual CHAP\nCHAP user: +alice\nMutual CHAP user: +bob")
        self.assertIsNone(re.search(f"{SECRET}|{MUTUAL}|password", said))


if __name__ == "__main__":
    main_in_namespaces()
