"""What the tests of the pair share."""
import hashlib
import os
import sys
import unittest

import pair
from pair import VOLUME, run, wait_until

MIB = 1 << 20
ALICE = "iqn.2026-01.com.example:alice"


def iqn(name):
    return f"iqn.2026-01.com.example:{name}"


def image(appliance, target, lun=1):
    """A LUN of the appliance as qemu's initiator is told of it, which runs on a third machine."""
    return (f"driver=raw,file.driver=iscsi,file.transport=tcp,file.portal={appliance.address}:3260,"
            f"file.initiator-name={ALICE},file.target={iqn(target)},file.lun={lun}")


def write(appliance, target, path):
    run("qemu-img", "convert", "-n", "-f", "raw", "--target-image-opts", path, image(appliance, target))


def checksum(path):
    with open(path, "rb") as file:
        return hashlib.file_digest(file, "sha256").hexdigest()


def checksum_at(appliance, target):
    """Of what an initiator reads."""
    run("qemu-img", "convert", "--image-opts", "-O", "raw", image(appliance, target), "/tmp/read")
    return checksum("/tmp/read")


def random_file(path, mib):
    with open(path, "wb") as file:
        for _ in range(mib):
            file.write(os.urandom(MIB))
    return path


class PairTest(unittest.TestCase):
    """Tests with a pair of their class's own."""

    joined = True

    @classmethod
    def setUpClass(cls):
        cls.one, cls.two = pair.pair("3G")
        if cls.joined:
            cls.one.join(cls.two)

    @classmethod
    def tearDownClass(cls):
        cls.one.power_off()
        cls.two.power_off()

    def run(self, result=None):
        """What the machines logged explains a failure."""
        def bad():
            return len(result.failures) + len(result.errors)
        before, said = bad(), [(machine, len(machine.log_lines)) for machine in (self.one, self.two)]
        outcome = super().run(result)
        if bad() > before:
            for machine, lines in said:
                print(f"--- log of {machine.name}", *machine.log_lines[lines:][-60:], sep="\n", file=sys.stderr)
        return outcome

    def refused(self, appliance, *command, says, **options):
        result = appliance.run("iscsictl", *command, check=False, **options)
        self.assertEqual((result.returncode, result.stdout), (1, ""), (command, result.stderr))
        self.assertRegex(result.stderr, says)

    def make_lun(self, name, size_mib, appliance=None):
        """An adv LUN, the only one of a target of the same name."""
        appliance = appliance or self.one
        appliance.iscsictl("lun", "create", name, "--location", VOLUME, "--size", f"{size_mib}M", "--type", "adv")
        self.show(name, appliance)

    @staticmethod
    def show(name, appliance):
        appliance.iscsictl("target", "create", name, "--iqn", iqn(name))
        appliance.iscsictl("lun", "map", name, name)


def main():
    if os.geteuid() != 0:
        sys.exit("this test makes namespaces and runs daemons: it needs root")
    if not os.path.isdir("/run/world/tree"):
        build = os.environ["BUILD_DIR"]
        os.execv(f"{pair.HERE}/../../demo/world.sh", ["world.sh", build, "python3", "-B", "tests/pair/" + os.path.basename(sys.argv[0]),
                                                      *sys.argv[1:]])
    unittest.main(verbosity=2)
