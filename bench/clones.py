"""Remote clones between a pair of appliances, beside plain writes to the same portal."""
import json
import os
import sys
import time

from machines import MIB, run
from report import alternate, heading, row

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, f"{HERE}/../tests/pair")
from pair import VOLUME, pair  # noqa: E402  (its folder is in the path only now)

NOISE = "/tmp/noise"


def iqn(lun):
    return f"iqn.2026-01.com.example:{lun}"


def add_lun(appliance, name, size):
    """A mapped LUN; its URL."""
    appliance.iscsictl("lun", "create", name, "--location", VOLUME, "--size", str(size), "--type", "adv")
    appliance.iscsictl("target", "create", name, "--iqn", iqn(name))
    appliance.iscsictl("lun", "map", name, name)
    return f"iscsi://{appliance.address}/{iqn(name)}/1"


def write_noise(url):
    """Seconds that it takes."""
    return float(run(f"{HERE}/sequential_write", url, NOISE))


def plain_write(appliance, size):
    """Seconds that writing the noise to a new LUN takes."""
    taken = write_noise(add_lun(appliance, "plain", size))
    appliance.iscsictl("target", "delete", "plain", "--yes")
    appliance.iscsictl("lun", "delete", "plain", "--yes")
    return taken


def clone(one, two, lun):
    """Seconds that a remote clone takes, from the command to its end."""
    start = time.perf_counter()
    made = one.json("lun", "remote-clone", lun, "--node", two.address, "--name", "copy", "--location", VOLUME, "--watch",
                    timeout=600)
    taken = time.perf_counter() - start
    two.iscsictl("lun", "delete", made["dst_lun_uuid"], "--yes")
    return taken


def sent_to(appliance):
    """Bytes that went over the network to the appliance so far."""
    return json.loads(run("ip", "-json", "-stats", "link", "show", appliance.name))[0]["stats64"]["tx"]["bytes"]


def make_noise(size):
    with open(NOISE, "wb") as file:
        for _ in range(size // MIB):
            file.write(os.urandom(MIB))


def remote_clones(size=1024 * MIB, thin_size=65536 * MIB, thin_data=64 * MIB):
    heading("Remote clone, beside writes of the same through libiscsi (256 KiB, 64 in flight, flushed)")
    one, two = pair("5G")
    one.join(two)

    make_noise(size)
    write_noise(add_lun(one, "source", size))
    ours, peer = alternate(lambda: clone(one, two, "source"), lambda: plain_write(two, size), rounds=5)
    row(f"{size // MIB} MiB of noise", ours, peer, "s", ours / peer, 1 / 0.9)

    make_noise(thin_data)
    write_noise(add_lun(one, "thin", thin_size))
    before = sent_to(two)
    taken = clone(one, two, "thin")
    moved = sent_to(two) - before
    row(f"bytes sent for {thin_data // MIB} MiB in {thin_size // MIB} MiB", moved / MIB, thin_data / MIB, "MiB", moved / thin_data, 1.1)
    print(f"  ... in {taken:.2f} s")
