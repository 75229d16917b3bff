"""Two appliances on one machine, each in namespaces of its own, on a network that reaches nothing else.

Works inside demo/world.sh only, whose installed build, processes and network it uses: the world is the third machine, where
initiators run, at 192.0.2.1. Everything ends with the world.
"""
import contextlib
import glob
import json
import os
import re
import secrets
import signal
import socket
import subprocess
import sys
import threading
import time

HERE = os.path.dirname(os.path.abspath(__file__))
MACHINES = "/run/world/machines"  # NAME -> the process to enter the machine by
DISKS = "/run/world/disks"  # NAME -> what the machine keeps when it is off
BRIDGE, BRIDGE_ADDRESS = "lan", "192.0.2.1"
VOLUME = "/mnt/volume1"
ACCOUNT = "admin"
WEB_PORT = 5443


class Failed(Exception):
    """A program ended with another exit status than 0. `.result` is its subprocess.CompletedProcess."""

    def __init__(self, result):
        command = result.args if isinstance(result.args, str) else " ".join(result.args)
        super().__init__(f"{command}: exit status {result.returncode}\n{result.stdout}{result.stderr}")
        self.result = result


def run(*command, check=True, timeout=120, stdin="", **options):
    """The finished program, with its output as text; Failed when its exit status is not 0."""
    result = subprocess.run(command, input=stdin, capture_output=True, text=True, timeout=timeout, errors="replace", **options)
    if check and result.returncode:
        raise Failed(result)
    return result


def wait_until(true, what, seconds=120):
    """Returns what `true()` returned, once that is true. What takes longer hangs: a busy machine may be slow."""
    end = time.monotonic() + seconds
    while True:
        if outcome := true():
            return outcome
        if time.monotonic() > end:
            raise AssertionError(f"not within {seconds} s: {what}")
        time.sleep(0.02)


def is_alive(pid):
    """Whether there is such a process, and it is not merely waiting to be forgotten. Its first thread may end before the others,
    which still have its files open."""
    try:
        with open(f"/proc/{pid}/stat", encoding="utf-8") as stat:
            return stat.read().rpartition(")")[2].split()[0] not in "ZX" or len(os.listdir(f"/proc/{pid}/task")) > 1
    except (FileNotFoundError, ProcessLookupError):
        return False


def kill(pids, sig=signal.SIGKILL):
    """Sends the signal to those that still run."""
    for pid in pids:
        with contextlib.suppress(ProcessLookupError):
            os.kill(pid, sig)


class Machine:
    """A machine with nothing running on it, plugged into the bridge."""

    def __init__(self, name, address):
        self.name, self.address = name, address
        self.disk = f"{DISKS}/{name}"
        self.log_lines = []
        self.services = []
        os.makedirs(self.disk, exist_ok=True)
        run("umount", "--quiet", self.disk, check=False)  # of an earlier machine of the name
        run("mount", "-t", "tmpfs", "-o", "mode=0755", "tmpfs", self.disk)
        self.power_on()

    def power_on(self):
        self.holder = subprocess.Popen(
            ["unshare", "--mount", "--uts", "--ipc", "--net", "--pid", "--fork", "--kill-child", "--mount-proc",
             f"{HERE}/machine.sh", self.name, self.disk],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True, start_new_session=True)
        self._expect("made")
        with open(f"/proc/{self.holder.pid}/task/{self.holder.pid}/children", encoding="ascii") as children:
            self.pid = int(children.read())
        self.environment = {key: value for key, value in os.environ.items() if not key.startswith("ISCSI_HOST_")}
        self._plug_in()
        self.holder.stdin.write(self.address + "\n")
        self.holder.stdin.flush()
        self._expect("ready")
        self._take_log()
        os.makedirs(MACHINES, exist_ok=True)
        with open(f"{MACHINES}/{self.name}", "w", encoding="ascii") as file:
            file.write(f"{self.pid}\n")

    def _expect(self, word):
        if (said := self.holder.stdout.readline().strip()) != word:
            raise SystemExit(f"the machine '{self.name}' did not start: {said or 'see above'}")

    def _plug_in(self):
        if run("ip", "link", "show", BRIDGE, check=False).returncode:
            run("ip", "link", "add", BRIDGE, "type", "bridge")
            run("ip", "address", "add", f"{BRIDGE_ADDRESS}/24", "dev", BRIDGE)
            run("ip", "link", "set", BRIDGE, "up")
        card = "02:00:00:00:00:%02x" % int(self.address.rpartition(".")[2])  # the same after a restart
        run("ip", "link", "add", self.name, "type", "veth", "peer", "name", "eth0", "address", card, "netns", str(self.pid))
        run("ip", "link", "set", self.name, "master", BRIDGE, "up")

    def _take_log(self):
        receiver = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        receiver.bind(f"/proc/{self.pid}/root/dev/log")

        # Also for whoever looks for it on the machine.
        log = open(f"/proc/{self.pid}/root/var/log/syslog", "a", encoding="utf-8", buffering=1)

        def take():
            while True:
                self.log_lines.append(receiver.recv(8192).decode(errors="replace"))
                log.write(self.log_lines[-1].partition(">")[2] + "\n")

        threading.Thread(target=take, daemon=True).start()

    def power_off(self):
        """The machine and everything on it is gone, at once; its disk stays."""
        run("ip", "link", "delete", self.name, check=False)
        self.holder.kill()
        self.holder.wait()
        wait_until(lambda: not is_alive(self.pid), f"{self.name} is off")
        while self.services:
            self.services.pop().wait()
        self.holder.stdin.close()
        self.holder.stdout.close()
        os.unlink(f"{MACHINES}/{self.name}")

    def entering(self, *command):
        return ["nsenter", "-t", str(self.pid), "-m", "-u", "-i", "-n", "-p", "--wd=/", "--", *command]

    def run(self, *command, **options):
        return run(*self.entering(*command), env=self.environment, **options)

    def start(self, *command, **options):
        """A program in the background: subprocess.Popen with output as text."""
        return subprocess.Popen(self.entering(*command), env=self.environment, text=True, errors="replace", **options)

    def processes(self, name=None):
        """Process IDs, as the world sees them, of the machine's processes of this name, or of all."""
        space, found = os.readlink(f"/proc/{self.pid}/ns/pid"), []
        for entry in filter(str.isdigit, os.listdir("/proc")):
            try:
                with open(f"/proc/{entry}/comm", encoding="utf-8") as comm:
                    if name in (None, comm.read().strip()) and is_alive(entry) and os.readlink(f"/proc/{entry}/ns/pid") == space:
                        found.append(int(entry))
            except (FileNotFoundError, ProcessLookupError):
                pass
        return found

    def kill(self, name, sig=signal.SIGKILL):
        """Sends the signal to the machine's processes of this name; their IDs."""
        pids = self.processes(name)
        assert pids, f"no {name} runs on {self.name}"
        kill(pids, sig)
        return pids

    def set_clock(self, seconds):
        """What starts on the machine from now on sees the time of day so much ahead."""
        # The machine's /etc is its own, and on its disk.
        library, = glob.glob("/usr/lib/*/faketime/libfaketime.so.1")
        self.run("tee", "/etc/faketimerc", stdin=f"{seconds:+d}\n")
        self.run("tee", "/etc/ld.so.preload", stdin=library + "\n")

    def cut_link(self):
        run("ip", "link", "set", self.name, "down")

    def mend_link(self):
        run("ip", "link", "set", self.name, "up")

    def received_bytes(self):
        """That came to the machine over its link."""
        link = json.loads(run("ip", "-json", "-statistics", "link", "show", self.name).stdout)[0]
        return link["stats64"]["tx"]["bytes"]


class Appliance(Machine):
    """A machine with a booted and supervised appliance: one volume, the web API, one account in it."""

    def __init__(self, name, address, volume_size="4G"):
        super().__init__(name, address)
        self.password = secrets.token_hex(8)
        self.host("portal", "set", "127.0.0.1", address)
        self.host("volume", "create", VOLUME, "--size", volume_size)
        self.host("account", "add", ACCOUNT, "--role", "admin", "--password-file", "-", stdin=self.password + "\n")
        self.boot()

    def boot(self):
        self.host("boot")
        self._serve("iscsi-host", "run")
        self.start_web()

    def restart(self):
        """The power fails, and comes back: what was not flushed to the volume is lost."""
        stays = self.processes("sleep") + [self.pid]

        def nothing_runs():
            runs = [pid for pid in self.processes() if pid not in stays]
            kill(runs)
            return not runs

        wait_until(nothing_runs, f"nothing runs on {self.name}")
        self.run("xfs_io", "-x", "-c", "shutdown", VOLUME)
        self.run("umount", VOLUME)
        self.power_off()
        self.power_on()
        self.boot()

    def _serve(self, *command):
        """A program that runs in the foreground, as a service manager would start it."""
        with open(f"{MACHINES}/{self.name}.log", "a", encoding="utf-8") as log:
            self.services.append(self.start(*command, stdin=subprocess.DEVNULL, stdout=log, stderr=log, start_new_session=True))
        return self.services[-1]

    def start_web(self):
        web = self._serve("iscsi-host", "web", "run")
        wait_until(lambda: self._web_answers() or web.poll() is not None, f"the web server of {self.name} answers")
        if web.poll() is not None:
            with open(f"{MACHINES}/{self.name}.log", encoding="utf-8") as log:
                raise SystemExit(f"the web server of {self.name} ended:\n{log.read()}")

    def stop_web(self):
        self.kill("lighttpd", signal.SIGTERM)
        wait_until(lambda: not self.processes("lighttpd"), f"the web server of {self.name} stops")

    def _web_answers(self):
        with socket.socket() as probe:
            return probe.connect_ex((self.address, WEB_PORT)) == 0

    def iscsictl(self, *arguments, **options):
        """iscsictl's standard output; Failed when it fails."""
        return self.run("iscsictl", *arguments, **options).stdout

    def json(self, *arguments, **options):
        return json.loads(self.iscsictl(*arguments, "--json", **options))

    def host(self, *arguments, **options):
        return self.run("iscsi-host", *arguments, **options).stdout

    def fingerprint(self):
        """Of the web server's key."""
        return re.search(r"sha256//\S+", self.host("certificate", "show"))[0]

    def join(self, peer):
        self.iscsictl("node", "join", peer.address, "--account", ACCOUNT, "--password-file", "-",
                      "--fingerprint", peer.fingerprint(), stdin=peer.password + "\n")


def pair(volume_size="4G"):
    return Appliance("one", "192.0.2.11", volume_size), Appliance("two", "192.0.2.12", volume_size)


def stay():
    while True:
        signal.pause()


def hold_pair():
    """For pair.sh. Standard input ending means that nobody wants the pair any more."""
    for appliance in pair():
        print(appliance.name, appliance.address, appliance.password, flush=True)
    if sys.stdin.readline().strip() == "stay":
        stay()


def main():
    if len(sys.argv) == 4 and sys.argv[1] == "machine":
        Machine(*sys.argv[2:])
        print("ready", flush=True)
        stay()
    hold_pair()


if __name__ == "__main__":
    main()
