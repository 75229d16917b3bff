"""The two things that are compared: an appliance of ours and a plain tgtd, both on this (throw-away) machine."""
import os
import subprocess
import time
from contextlib import contextmanager

ADDRESS = "192.0.2.10"
VOLUME = "/mnt/volume1"
PLAIN_PORT = 3270
PLAIN_TARGET = "iqn.2026-01.com.example:plain"
MIB = 1 << 20


def run(*command, **options):
    """A command's standard output; CalledProcessError, with its standard error shown, when it fails."""
    done = subprocess.run(command, stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True, **options)
    if done.returncode:
        raise SystemExit(f"{' '.join(command)}: exit status {done.returncode}\n{done.stdout}{done.stderr}")
    return done.stdout


@contextmanager
def appliance(volume_size="4G"):
    """A booted appliance with one volume."""
    run("ip", "address", "replace", f"{ADDRESS}/32", "dev", "lo")
    run("iscsi-host", "portal", "set", ADDRESS)
    run("iscsi-host", "volume", "create", VOLUME, "--size", volume_size)
    run("iscsi-host", "boot")
    try:
        yield
    finally:
        run("iscsi-host", "stop")


def make_lun(name, size, target, iqn):
    """A mapped LUN of ours, through iscsictl; its URL."""
    run("iscsictl", "lun", "create", name, "--location", VOLUME, "--size", str(size))
    run("iscsictl", "target", "create", target, "--iqn", iqn)
    run("iscsictl", "lun", "map", name, target)
    return f"iscsi://{ADDRESS}/{iqn}/1"


class PlainTgtd:
    """A tgtd set up by hand, with the number of threads that the appliance's daemons have."""

    def __init__(self):
        self.environment = dict(os.environ, TGT_IPC_SOCKET="/run/plain-tgtd.sock")
        self.daemon = subprocess.Popen(
            ["tgtd", "-f", "-t", "2", "--iscsi", f"portal={ADDRESS}:{PLAIN_PORT}"],
            env=self.environment, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL,
            # Ours is in a session of its own: the scheduler shares the processor between sessions.
            start_new_session=True)
        for _ in range(100):
            if subprocess.run(["tgtadm", "--op", "show", "--mode", "sys"], env=self.environment,
                              stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL).returncode == 0:
                break
            time.sleep(0.05)
        self.admin("--op", "new", "--mode", "target", "--tid", "1", "-T", PLAIN_TARGET)
        self.admin("--op", "bind", "--mode", "target", "--tid", "1", "-I", "ALL")

    def admin(self, *arguments):
        return run("tgtadm", "--lld", "iscsi", *arguments, env=self.environment)

    def add(self, path, size, number=1):
        """A sparse file as a LU that gives discarded blocks back; its URL."""
        with open(path, "wb") as file:
            file.truncate(size)
        unit = ("--mode", "logicalunit", "--tid", "1", "--lun", str(number))
        self.admin("--op", "new", *unit, "-b", path)
        self.admin("--op", "update", *unit, "--params", "thin_provisioning=1")
        return f"iscsi://{ADDRESS}:{PLAIN_PORT}/{PLAIN_TARGET}/{number}"

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.daemon.terminate()
        try:
            self.daemon.wait(5)
        except subprocess.TimeoutExpired:
            self.daemon.kill()
            self.daemon.wait()
