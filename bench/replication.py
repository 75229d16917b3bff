"""Sending snapshots between a pair of appliances, beside plain writes, rsync, and btrfs send and receive."""
import os
import random
import subprocess
import threading
import time

from clones import HERE, NOISE, add_lun, make_noise, plain_write, sent_to, write_noise
from machines import MIB, run
from pair import VOLUME, pair
from report import alternate, heading, row

BLOCK = 64 << 10
BTRFS = "/mnt/btrfs"


def wait_sent(one, task):
    """Until the destination has the state as its own; the status as it is then."""
    while True:
        status = one.json("replication", "status", task)
        if status["error"]:
            raise SystemExit(f"the sending failed: {status}")
        if status["sent_size"] == status["send_total_size"] != 0:
            return status
        time.sleep(0.02)  # asking takes a processor too


def wait_idle(one, task):
    while one.json("replication", "status", task)["is_locked"]:
        time.sleep(0.05)


def memory_of(one):
    """Peak resident memory of the processes that send, in bytes."""
    peak = 0
    for pid in one.processes("iscsictl"):
        try:
            with open(f"/proc/{pid}/status", encoding="ascii") as status:
                peak = max(peak, *(int(line.split()[1]) << 10 for line in status if line.startswith("VmHWM")), 0)
        except (FileNotFoundError, ProcessLookupError):
            pass
    return peak


class Replica:
    """A LUN of `one` that is replicated to `two`."""

    def __init__(self, one, two, name, size):
        self.one, self.two, self.name = one, two, name
        self.url = add_lun(one, name, size)
        self.task = one.json("replication", "create", name, "--node", two.address, "--location", VOLUME, "--name", name)["uuid"]
        self.number = 0
        self.memory = 0

    def take(self):
        self.number += 1
        return self.one.json("snapshot", "take", self.name, "--name", f"s{self.number}")["uuid"]

    def send(self, snapshot=None):
        """Seconds until the destination has a snapshot taken now, or the given one, as its own; and the bytes moved."""
        start = time.perf_counter()
        self.one.iscsictl("replication", "send", self.task, snapshot or self.take())
        self.memory = max(self.memory, memory_of(self.one))
        moved = wait_sent(self.one, self.task)["sent_size"]
        taken = time.perf_counter() - start
        wait_idle(self.one, self.task)
        return taken, moved

    def remove(self):
        self.one.iscsictl("replication", "remove", self.task)
        self.two.iscsictl("replication", "remove", self.task, "--delete-lun", check=False)
        self.one.iscsictl("target", "delete", self.name, "--yes")
        self.one.iscsictl("lun", "delete", self.name, "--yes")


def places(size, count, seed):
    """So many different blocks of the size, in any order."""
    return [BLOCK * at for at in random.Random(seed).sample(range(size // BLOCK), count)]


def change_lun(url, offsets):
    address, target, lun = url.removeprefix("iscsi://").split("/")
    image = f"driver=raw,file.driver=iscsi,file.transport=tcp,file.portal={address}:3260,file.target={target},file.lun={lun}"
    commands = [word for offset in offsets for word in ("-c", f"write -q -P {random.randrange(1, 255)} {offset} {BLOCK}")]
    run("qemu-io", "--image-opts", image, *commands, "-c", "flush")


def change_file(path, offsets):
    with open(path, "r+b") as file:
        for offset in offsets:
            file.seek(offset)
            file.write(os.urandom(BLOCK))
        file.flush()
        os.fsync(file.fileno())


class Rsync:
    """rsync's daemon on `two`, and its client on `one`."""

    def __init__(self, one, two):
        self.one, self.two = one, two
        two.run("sh", "-c", f"mkdir -p {VOLUME}/rsync && printf '[bench]\\npath = {VOLUME}/rsync\\nread only = no\\nuse chroot = no\\n"
                            "uid = root\\ngid = root\\n' >/tmp/rsyncd.conf")
        self.daemon = two.start("rsync", "--daemon", "--no-detach", "--config=/tmp/rsyncd.conf", "--port=8730",
                                stdin=subprocess.DEVNULL)
        while one.run("rsync", f"rsync://{two.address}:8730/", check=False).returncode:
            time.sleep(0.05)

    def send(self, path, *options):
        """Seconds until the file is there and on its disk."""
        start = time.perf_counter()
        self.one.run("rsync", "--inplace", *options, path, f"rsync://{self.two.address}:8730/bench/", timeout=600)
        self.two.run("sync", f"{VOLUME}/rsync/{os.path.basename(path)}")
        return time.perf_counter() - start

    def stop(self):
        self.two.kill("rsync")
        self.daemon.wait()
        self.two.run("rm", "-rf", f"{VOLUME}/rsync")


class Btrfs:
    """A btrfs on each appliance. What one sends the other receives through a pipe, which is quicker than any network."""

    def __init__(self, one, two, size):
        self.one, self.two, self.number = one, two, 0
        for appliance in (one, two):
            appliance.run("fstrim", VOLUME)  # both lie in memory
            appliance.run("sh", "-c", f"mkdir -p {BTRFS} && truncate -s {size} /tmp/btrfs.img && "
                                      f"mkfs.btrfs -q /tmp/btrfs.img && mount -o loop /tmp/btrfs.img {BTRFS}")
        one.run("btrfs", "subvolume", "create", f"{BTRFS}/data")

    def send(self):
        """Seconds that a snapshot and its sending take, until it is on the disk there."""
        start = time.perf_counter()
        self.number += 1
        self.one.run("btrfs", "subvolume", "snapshot", "-r", f"{BTRFS}/data", f"{BTRFS}/s{self.number}")
        base = ["-p", f"{BTRFS}/s{self.number - 1}"] if self.number > 1 else []
        send = self.one.start("btrfs", "send", "-q", *base, f"{BTRFS}/s{self.number}", stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)
        receive = self.two.start("btrfs", "receive", BTRFS, stdin=send.stdout, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        send.stdout.close()
        if send.wait() or receive.wait():
            raise SystemExit("btrfs send | receive failed")
        self.two.run("btrfs", "filesystem", "sync", BTRFS)
        return time.perf_counter() - start

    def stop(self):
        for appliance in (self.one, self.two):
            appliance.run("sh", "-c", f"umount {BTRFS} && rm /tmp/btrfs.img")


def sessions(two, size):
    """Whether more than one session would be quicker."""
    make_noise(size)

    def write_at_once(count):
        urls = [add_lun(two, f"plain{number}", size) for number in range(count)]
        start = time.perf_counter()
        writers = [threading.Thread(target=write_noise, args=(url,)) for url in urls]
        for writer in writers:
            writer.start()
        for writer in writers:
            writer.join()
        taken = (time.perf_counter() - start) / count
        for number in range(count):
            two.iscsictl("target", "delete", f"plain{number}", "--yes")
            two.iscsictl("lun", "delete", f"plain{number}", "--yes")
        return taken

    both, single = alternate(lambda: write_at_once(2), lambda: write_at_once(1), rounds=3)
    row("plain writes: two sessions, beside one", both, single, "s", both / single)


def full(one, two, size):
    """The whole of a LUN, beside plain writes of the same, rsync and btrfs."""
    make_noise(size)

    def send():
        replica = Replica(one, two, "full", size)
        write_noise(replica.url)
        taken, _ = replica.send(replica.take())
        replica.remove()
        return taken

    ours, plain = alternate(send, lambda: plain_write(two, size), rounds=3)
    row(f"all of {size // MIB} MiB, beside plain writes", ours, plain, "s", ours / plain, 1 / 0.95)

    run("cp", NOISE, f"/proc/{one.pid}/root{VOLUME}/file")
    rsync = Rsync(one, two)
    peer = rsync.send(f"{VOLUME}/file", "--whole-file")
    row("... beside rsync --inplace --whole-file", ours, peer, "s", ours / peer)
    rsync.stop()
    one.run("rm", f"{VOLUME}/file")


def count_unsynced(replica, base, newest):
    """Seconds that the library takes, asked by a program on the appliance."""
    run("cp", f"{HERE}/bench_snapshots", f"/proc/{replica.one.pid}/root/tmp/")
    return float(replica.one.run("/tmp/bench_snapshots", "count", replica.task, base, newest).stdout)


def ask_unsynced(replica, base, newest):
    start = time.perf_counter()
    replica.one.iscsictl("replication", "unsynced", replica.task, newest, "--base", base)
    return time.perf_counter() - start


def increments(one, two, size, rounds=3):
    """One hundredth of a LUN changed in scattered blocks."""
    replica = Replica(one, two, "changing", size)
    write_noise(replica.url)
    replica.send()
    count = size // 100 // BLOCK

    def send(seed):
        change_lun(replica.url, places(size, count, seed))
        before = sent_to(two)
        taken, moved = replica.send()
        return taken, moved, sent_to(two) - before

    ours, moved, wire = (sorted(column)[rounds // 2] for column in zip(*(send(seed) for seed in range(rounds))))
    changed = count * BLOCK
    row("bytes moved, beside bytes changed", moved / MIB, changed / MIB, "MiB", moved / changed, 1.1)
    row("bytes on the wire, beside bytes changed", wire / MIB, changed / MIB, "MiB", wire / changed)

    change_lun(replica.url, places(size, count, rounds))
    base = one.json("snapshot", "list", replica.name)[-1]["uuid"]
    newest = replica.take()
    counted, asked = alternate(lambda: count_unsynced(replica, base, newest), lambda: ask_unsynced(replica, base, newest), rounds=5)
    row("counting what to send, beside sending it", counted, ours, "s", counted / ours, 0.1)
    row("  the same through iscsictl", asked, ours, "s", asked / ours)
    replica.send(newest)
    row("memory of a sending, beside 64 MiB", replica.memory / MIB, 64, "MiB", replica.memory / (64 * MIB), 1)
    return replica, ours, count


def beside_rsync(one, two, size, ours, count):
    run("cp", NOISE, f"/proc/{one.pid}/root{VOLUME}/file")
    rsync = Rsync(one, two)
    rsync.send(f"{VOLUME}/file", "--whole-file")
    path = f"/proc/{one.pid}/root{VOLUME}/file"
    change_file(path, places(size, count, 99))
    peer = rsync.send(f"{VOLUME}/file", "-I", "--no-whole-file")
    row("snapshot and sending, beside rsync", ours, peer, "s", ours / peer, 0.1)
    rsync.stop()
    one.run("rm", f"{VOLUME}/file")


def beside_btrfs(one, two, size, ours, count):
    btrfs = Btrfs(one, two, size + 1024 * MIB)
    path = f"/proc/{one.pid}/root{BTRFS}/data/file"
    run("mv", NOISE, path)
    btrfs.send()

    def change_and_send(seed=iter(range(98, 200))):
        change_file(path, places(size, count, next(seed)))
        return btrfs.send()

    peer, = alternate(change_and_send, rounds=3)
    row("... beside btrfs send -p | receive", ours, peer, "s", ours / peer, 1)
    btrfs.stop()


def growth(one, two, small, large, count=160):
    """The same number of changed blocks in a small and in a large LUN."""
    def send(size, name):
        replica = Replica(one, two, name, size)
        change_lun(replica.url, places(size, 1000, 1))
        replica.send()
        change_lun(replica.url, places(size, count, 2))
        taken, _ = replica.send()
        replica.remove()
        return taken

    ours, peer = alternate(lambda: send(large, "large"), lambda: send(small, "small"), rounds=3)
    row(f"{count} blocks of {large // MIB} MiB, beside {small // MIB} MiB", ours, peer, "s", ours / peer)


def replications(full_size=2048 * MIB, size=4096 * MIB):
    heading("Replication, until the destination has the state as its own")
    one, two = pair("10G")
    one.join(two)
    sessions(two, full_size // 2)
    full(one, two, full_size)
    growth(one, two, 1024 * MIB, 8192 * MIB)
    make_noise(size)
    replica, ours, count = increments(one, two, size)
    replica.remove()
    beside_rsync(one, two, size, ours, count)
    beside_btrfs(one, two, size, ours, count)
    one.power_off()
    two.power_off()
