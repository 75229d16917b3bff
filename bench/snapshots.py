"""Snapshots on the host platform: taking beside a reflink copy, export beside a sparse copy. Runs inside demo/world.sh."""
import glob
import json
import os
import shutil

from machines import VOLUME, run
from report import alternate, heading, row, seconds

VOLUME2 = "/mnt/volume2"
HERE = os.path.dirname(os.path.abspath(__file__))


def lun_file(name):
    path, = glob.glob(f"{VOLUME}/@iSCSITrg/*_{name}_*")
    return path


def fill(name, extents, size=64 << 30, block=4096):
    """A LUN with so many data blocks, far from each other; its file."""
    run("iscsictl", "lun", "create", name, "--location", VOLUME, "--size", str(size), "--type", "thin")
    with open(lun_file(name), "r+b") as file:
        for extent in range(extents):
            os.pwrite(file.fileno(), (extent + 1).to_bytes(8, "little") * (block // 8), extent * (size // extents))
        os.fsync(file.fileno())
    return lun_file(name)


def settle():
    """What was written before is on disk, and what was deleted is gone: XFS does both later, unless it is frozen."""
    for path in filter(os.path.ismount, (VOLUME, VOLUME2)):
        run("fsfreeze", "--freeze", path)
        run("fsfreeze", "--unfreeze", path)


def taking():
    heading("Taking a snapshot through the library, beside cp --reflink=always of the LUN's file")
    copy = f"{VOLUME}/copy"

    def ours(name):
        def measure():
            settle()
            taken = float(run(f"{HERE}/bench_snapshots", "take", name))
            for snapshot in json.loads(run("iscsictl", "snapshot", "list", name, "--json")):
                run("iscsictl", "snapshot", "delete", snapshot["uuid"], "--yes")
            return taken * 1000
        return measure

    def peer(command, path):
        def measure():
            settle()
            taken = seconds("sh", "-c", command, path, copy)()
            os.unlink(copy)
            return taken * 1000
        return measure

    clone = 'cp --reflink=always "$0" "$1"'
    for what, name, extents in (("64 GiB, 1 extent", "one", 1),
                                ("64 GiB, 16,384 scattered extents", "scattered", 16384)):
        path = fill(name, extents)
        left, right = alternate(ours(name), peer(clone, path), rounds=15)
        row(what, left, right, "ms", left / right)
        left, right = alternate(ours(name), peer(clone + ' && sync "$1"', path), rounds=15)
        row("  beside cp and sync of the copy", left, right, "ms", left / right, 1.1, 5)
    fill("small", 1, 1 << 30)
    left, right = alternate(ours("one"), ours("small"), rounds=15)
    row("64 GiB, 1 extent; the same of 1 GiB, ours", left, right, "ms", left / right, 1.1, 5)


def exports(size=1 << 30):
    heading("Export to another volume, beside cp --sparse=always of the snapshot's file and sync of the copy")
    run("iscsi-host", "volume", "create", VOLUME2, "--size", "6G")
    fill("exported", 1024, 16 << 30, size // 1024)
    run("iscsictl", "snapshot", "take", "exported", "--name", "one")
    path, = glob.glob(f"{VOLUME}/@Snapshot/*_one/data")
    folder, copy = f"{VOLUME2}/export", f"{VOLUME2}/copy"

    def ours():
        settle()
        taken = float(run(f"{HERE}/bench_snapshots", "export", "exported_one", folder))
        used = os.stat(f"{folder}/export.data").st_blocks * 512
        assert size <= used < size * 1.01, f"the export of {size} bytes takes {used}"
        shutil.rmtree(folder)
        return taken

    def peer():
        settle()
        taken = seconds("sh", "-c", 'cp --sparse=always "$0" "$1" && sync "$1"', path, copy)()
        os.unlink(copy)
        return taken

    peer()  # the file's data is in memory from now on
    left, right = alternate(ours, peer, rounds=9)
    row("1 GiB in 1,024 extents of a 16 GiB LUN", left, right, "s", left / right)
