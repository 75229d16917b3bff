"""An appliance of a test's own, and iscsictl run on it. The programs come from the environment."""

import json
import os
import shutil
import subprocess
import tempfile
import unittest

ISCSICTL = os.environ["ISCSICTL"]
ISCSI_HOST = os.environ["ISCSI_HOST"]


class Appliance(unittest.TestCase):
    """A state folder and a volume; no daemon runs."""

    def setUp(self):
        self.folder = tempfile.mkdtemp(prefix="iscsictl-test.")
        self.addCleanup(shutil.rmtree, self.folder)
        self.volume = os.path.join(self.folder, "volume")
        os.mkdir(self.volume)
        self.env = dict(os.environ, ISCSI_HOST_STATE=os.path.join(self.folder, "state"),
                        ISCSI_HOST_RUN=os.path.join(self.folder, "run"))
        self.run_host("volume", "add", self.volume)

    def run_host(self, *args):
        subprocess.run([ISCSI_HOST, *args], env=self.env, check=True, stdout=subprocess.DEVNULL, timeout=60)

    def run_cli(self, *args, stdin=""):
        return subprocess.run([ISCSICTL, *args], env=self.env, input=stdin, capture_output=True, text=True,
                              errors="surrogateescape", timeout=60)

    def start(self, *args):
        return subprocess.Popen([ISCSICTL, *args], env=self.env, stdout=subprocess.DEVNULL)

    def ok(self, *args, **kwargs):
        result = self.run_cli(*args, **kwargs)
        self.assertEqual((result.returncode, result.stderr), (0, ""), args)
        return result.stdout

    def fails(self, status, *args, says, **kwargs):
        result = self.run_cli(*args, **kwargs)
        self.assertEqual(result.returncode, status, (args, result.stdout, result.stderr))
        self.assertEqual(result.stdout, "", args)
        self.assertRegex(result.stderr, says)
        return result.stderr

    def create(self, name, *args, size="16M"):
        return json.loads(self.ok("lun", "create", "--json", "--size", size, "--location", self.volume, *args, "--", name))

    def luns(self):
        return json.loads(self.ok("lun", "list", "--json"))

    def files(self):
        return sorted(os.path.join(folder, name) for folder, _, names in os.walk(self.volume) for name in names)
