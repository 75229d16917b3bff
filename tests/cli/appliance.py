"""An appliance of a test's own, and iscsictl run on it. The programs come from the environment."""

import json
import os
import pty
import shutil
import subprocess
import sys
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
        subprocess.run([ISCSI_HOST, *args], env=self.env, check=True, stdout=subprocess.DEVNULL, timeout=120)

    def run_cli(self, *args, stdin=""):
        return subprocess.run([ISCSICTL, *args], env=self.env, input=stdin, capture_output=True, text=True,
                              errors="surrogateescape", timeout=120)

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

    def on_terminal(self, *args, answers=()):
        """Runs iscsictl on a terminal and answers each of its questions; returns its status and all of the screen."""
        pid, terminal = pty.fork()
        if pid == 0:
            os.execve(ISCSICTL, [ISCSICTL, *args], self.env)
        screen = b""
        answers = list(answers)
        try:
            while chunk := os.read(terminal, 4096):
                screen += chunk
                if answers and screen.endswith((b"] ", b": ")):
                    os.write(terminal, answers.pop(0).encode() + b"\n")
        except OSError:  # the terminal's other end is closed
            pass
        os.close(terminal)
        return os.waitstatus_to_exitcode(os.waitpid(pid, 0)[1]), screen.decode()

    def create(self, name, *args, size="16M"):
        return json.loads(self.ok("lun", "create", "--json", "--size", size, "--location", self.volume, *args, "--", name))

    def luns(self):
        return json.loads(self.ok("lun", "list", "--json"))

    def files(self):
        return sorted(os.path.join(folder, name) for folder, _, names in os.walk(self.volume) for name in names)


def main_in_namespaces():
    """Runs the tests of the program in mount, network and process namespaces of their own."""
    if os.geteuid() != 0:
        sys.exit("this test makes namespaces, mounts volumes and runs daemons: it needs root")
    if sys.argv[-1:] != ["--inside"]:
        inside = ["unshare", "--mount", "--net", "--pid", "--fork", "--kill-child", "--mount-proc", sys.executable, *sys.argv,
                  "--inside"]
        os.execvp(inside[0], inside)
    # Progress files lie where every appliance of the machine has them.
    os.makedirs("/tmp/iscsi", exist_ok=True)
    subprocess.run(["mount", "-t", "tmpfs", "-o", "mode=0755", "tmpfs", "/tmp/iscsi"], check=True)
    subprocess.run(["ip", "link", "set", "lo", "up"], check=True)
    unittest.main(argv=sys.argv[:-1])
