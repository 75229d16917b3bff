"""iscsi-host as its users and their programs meet it, without daemons. Needs no root."""

import json
import os
import subprocess
import unittest

from appliance import ISCSI_HOST, Appliance

SECRET = "a good password"


class Host(Appliance):
    def host(self, *args, status=0):
        result = subprocess.run([ISCSI_HOST, *args], env=self.env, capture_output=True, text=True, timeout=60, check=False)
        self.assertEqual(result.returncode, status, (args, result.stderr))
        return result

    def json(self, *args):
        return json.loads(self.host(*args, "--json").stdout)

    def path(self, name):
        return os.path.join(self.folder, name)

    def test_volumes_and_status_for_programs(self):
        for name in ("kept", "gone"):
            self.create(name)
        os.remove(next(path for path in self.files() if "gone" in path))
        self.assertEqual([(volume["path"], volume["luns"]) for volume in self.json("volume", "list")], [(self.volume, 2)])
        self.host("portal", "set", "127.0.0.1", "::1")
        status = self.json("status")
        self.assertEqual((status["service_alive"], status["portal"]), (False, "127.0.0.1 ::1"))
        self.assertEqual([lun["name"] for lun in status["unhealthy"]], ["gone"])

    def test_accounts_whose_passwords_are_never_arguments(self):
        file = self.path("password")
        with open(file, "w", encoding="ascii") as password:
            password.write(SECRET + "\nanother line\n")
        added = self.host("account", "add", "alice", "--role", "admin", "--otp", "--password-file", file)
        self.assertRegex(added.stdout, "^otpauth://totp/")
        self.assertNotIn(SECRET, added.stdout + added.stderr)
        self.host("account", "add", "bob", "--password-file", file)
        self.host("account", "add", "bob", "--password-file", file, status=1)
        self.host("account", "add", "carol", "--password-file", self.path("missing"), status=1)
        self.host("account", "add", "carol", SECRET, status=2)
        self.host("account", "add", "carol", "--role", "boss", "--password-file", file, status=2)
        self.host("account", "passwd", "bob", "--password-file", file)
        self.assertEqual([(account["role"], account["one_time_codes"]) for account in self.json("account", "list")],
                         [("admin", True), ("viewer", False)])
        self.assertEqual(self.json("session", "list"), [])
        self.host("account", "remove", "bob")
        self.host("account", "remove", "bob", status=1)

    def test_failure_is_told_from_wrong_usage(self):
        self.create("x")
        for args in (["volume", "add", self.path("nothing")], ["volume", "remove", self.volume],
                     ["volume", "create", self.path("v"), "--size", "10M"], ["portal", "set", "nowhere"]):
            result = self.host(*args, status=1)
            self.assertEqual(result.stdout, "")
            self.assertIn("failed: error 1899", result.stderr)
        for args in ([], ["volume"], ["volume", "add"], ["portal", "set"], ["boot", "now"],
                     ["volume", "create", self.path("v"), "--size", "big"], ["volume", "create", self.path("v")]):
            self.host(*args, status=2)
        self.assertFalse(os.path.exists(self.path("v")))
        self.host("--help")


if __name__ == "__main__":
    unittest.main()
