"""Clones of LUNs on the other appliance, as initiators see them, and what becomes of them when something dies on the way."""
import json
import os
import re
import signal
import subprocess
import time

from cases import ALICE, MIB, PairTest, checksum, checksum_at, image, iqn, main, random_file, write
from pair import VOLUME, run, wait_until

SIZE_MIB = 48
SLOW = "200mbit"  # the same takes two seconds then
SLOWEST = "16mbit"  # what is to be disturbed is under way for half a minute


class RemoteClone(PairTest):
    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.make_lun(cls, "source", SIZE_MIB, cls.one)
        write(cls.one, "source", random_file("/tmp/noise", SIZE_MIB))
        cls.noise = checksum("/tmp/noise")

    def setUp(self):
        self.luns_before = self.luns()
        wait_until(lambda: not self.one.processes("iscsictl"), "the clones of before end")

    def tearDown(self):
        self.full_speed()
        self.one.mend_link()
        self.two.mend_link()

    def luns(self):
        return sorted(lun["name"] for lun in self.two.json("lun", "list"))

    def full_speed(self):
        run("tc", "qdisc", "del", "dev", self.two.name, "root", check=False)

    def slow(self, rate=SLOW):
        run("tc", "qdisc", "replace", "dev", self.two.name, "root", "tbf", "rate", rate, "burst", "256k", "latency", "100ms")

    def command(self, name, lun="source"):
        return "lun", "remote-clone", lun, "--node", self.two.address, "--name", name, "--location", VOLUME

    def clone(self, name, lun="source"):
        return self.one.json(*self.command(name, lun), "--watch")["dst_lun_uuid"]

    def start_slow_clone(self, name):
        """`iscsictl ... --watch` in the background, once data flows."""
        wait_until(lambda: self.one.json("vlun", "list") == [], "the virtual LUN of the clone before goes")
        self.slow(SLOWEST)
        watching = self.one.start("iscsictl", *self.command(name), "--watch", stdin=subprocess.DEVNULL,
                                  stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        wait_until(lambda: self.moved() > 0 or watching.poll() is not None, "data flows")
        if watching.poll() is not None:
            self.fail(f"the clone ended before it could be disturbed: {watching.communicate()}")
        return watching

    def transfer(self):
        """The latest one of the LUN."""
        vluns = self.one.json("vlun", "list")
        return vluns[-1] if vluns else None

    def moved(self):
        transfer = self.transfer()
        return transfer["first"] if transfer else 0

    def workers(self):
        """The processes of a clone that has got going: who watches for the user, who sends, who watches to tidy up."""
        def settled():
            """Who asked for the clone is a child of who watches, and goes when the others are there."""
            found = sorted(self.one.processes("iscsictl"))
            if len(found) != 3:
                return None
            with open(f"/proc/{found[0]}/task/{found[0]}/children", encoding="ascii") as children:
                return None if children.read() else found
        return wait_until(settled, "a clone's three processes")

    def outcome(self, watching, seconds=120):
        said = watching.communicate(timeout=seconds)
        return watching.returncode, "".join(said)

    def nothing_is_left(self):
        """No virtual LUN, no process, no half-made LUN, nothing locked; and the next clone is whole."""
        wait_until(lambda: self.one.json("vlun", "list") == [], "the virtual LUN goes")
        wait_until(lambda: not self.one.processes("iscsictl"), "its processes end")
        self.assertEqual(self.luns(), self.luns_before)
        self.full_speed()
        self.whole("again")

    def whole(self, name, made=False):
        """The clone of this name, made now unless it is there, reads as the source; it goes."""
        if not made:
            self.clone(name)
        self.show(name, self.two)
        self.assertEqual(checksum_at(self.two, name), self.noise)
        self.two.iscsictl("target", "delete", name, "--yes")
        self.two.iscsictl("lun", "delete", name, "--yes")

    def test_clone_is_an_ordinary_lun(self):
        uuid = self.clone("copy")
        lun = self.two.json("lun", "show", uuid)
        self.assertEqual((lun["name"], lun["type"], lun["size"]), ("copy", 15, SIZE_MIB * MIB))
        self.show("copy", self.two)
        self.assertEqual(checksum_at(self.two, "copy"), self.noise)
        run("qemu-io", "--image-opts", image(self.two, "copy"), "-c", "write -P 0x55 0 1M")
        self.assertNotEqual(checksum_at(self.two, "copy"), self.noise)
        self.assertEqual(checksum_at(self.one, "source"), self.noise)
        self.two.iscsictl("target", "delete", "copy", "--yes")
        self.two.iscsictl("lun", "delete", "copy", "--yes")
        self.nothing_is_left()

    def test_one_point_in_time(self):
        """A writer goes round and round over 64 places, one after the other, each with the number of the round: at any point in time
        some first places hold a round's number and the others the one before."""
        places, gap = 64, SIZE_MIB * MIB // 64
        self.make_lun("written", SIZE_MIB)
        write(self.one, "written", "/tmp/noise")
        run("qemu-io", "--image-opts", image(self.one, "written"), stdin="".join(f"write -q -P 0 {place * gap} 4k\n" for place in range(places)))
        with open("/tmp/rounds", "w", encoding="ascii") as script:
            for number in range(1, 250):
                script.writelines(f"write -q -P {number} {place * gap} 4k\n" for place in range(places))
                script.write("sleep 100\n")  # or a quick disk would have them all before the clone ends
        with open("/tmp/rounds", encoding="ascii") as script:
            writer = subprocess.Popen(["qemu-io", "--image-opts", image(self.one, "written")], stdin=script,
                                      stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        self.addCleanup(writer.wait)
        self.addCleanup(writer.kill)
        wait_until(lambda: self.first_bytes(self.one, "written", [0])[0] >= 2, "two rounds are written")
        self.slow()
        self.clone("snapped", "written")
        self.assertIsNone(writer.poll(), "the writer ended before the clone did")
        self.show("snapped", self.two)
        numbers = self.first_bytes(self.two, "snapped", [place * gap for place in range(places)])
        self.assertEqual(numbers, sorted(numbers, reverse=True), "a later write is there, an earlier one is not")
        self.assertLessEqual(numbers[0] - numbers[-1], 1, numbers)

    @staticmethod
    def first_bytes(appliance, target, offsets):
        script = "".join(f"read -v {offset} 512\n" for offset in offsets)
        dump = run("qemu-io", "-r", "--image-opts", image(appliance, target), stdin=script).stdout
        return [int(byte, 16) for line, byte in re.findall(r"^(?:qemu-io> )*([0-9a-f]+):\s+([0-9a-f]{2})", dump, re.M)
                if int(line, 16) in offsets]

    def sink_targets(self):
        """Names of the targets of sinks, which only the daemon itself tells."""
        shown = self.two.run("env", "TGT_IPC_SOCKET=/run/iscsi-host/tgtd-rw.sock", "tgtadm", "--op", "show", "--mode", "target").stdout
        known = {target["iqn"] for target in self.two.json("target", "list")}
        return set(re.findall(r"^Target \d+: (\S+)", shown, re.M)) - known

    def test_sink_is_closed_to_initiators(self):
        """While it fills, no initiator writes to it; nobody but the peer finds its target or gets in."""
        self.make_lun("known", 16, self.two)
        watching = self.start_slow_clone("filling")
        discovered = run("iscsi-ls", "-s", "-i", ALICE, f"iscsi://{self.two.address}").stdout
        self.assertIn(iqn("known"), discovered)
        self.assertNotIn("sink", discovered)
        sinks = self.sink_targets()
        self.assertEqual(len(sinks), 1)
        for target in sinks:
            for port in (3260, 3261, 3262):
                entered = run("iscsi-inq", "-i", ALICE, f"iscsi://{self.two.address}:{port}/{target}/1", check=False)
                self.assertNotEqual(entered.returncode, 0, (target, port))
        self.two.run("iscsictl", "lun", "map", "filling", "known", check=False)
        written = run("qemu-io", "--image-opts", image(self.two, "known", 2), "-c", "write 0 64k", check=False)
        self.assertNotEqual(written.returncode, 0)
        self.full_speed()
        code, said = self.outcome(watching)
        self.assertEqual(code, 0, said)
        self.two.run("iscsictl", "lun", "unmap", "filling", "known", check=False)
        self.whole("filling", made=True)
        self.two.iscsictl("target", "delete", "known", "--yes")
        self.two.iscsictl("lun", "delete", "known", "--yes")
        self.nothing_is_left()

    def test_two_at_once(self):
        self.slow()
        clones = [self.one.start("iscsictl", *self.command(name), "--watch", stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                                 stderr=subprocess.PIPE) for name in ("first", "second")]
        outcomes = [self.outcome(clone) for clone in clones]
        self.full_speed()
        succeeded = [name for name, (code, _) in zip(("first", "second"), outcomes) if code == 0]
        self.assertTrue(succeeded, outcomes)
        for code, said in outcomes:
            self.assertTrue(code == 0 or re.search(r"(?i)another action|lock", said), said)
        for name in succeeded:
            self.whole(name, made=True)
        self.nothing_is_left()

    def test_link_cut_for_a_moment(self):
        watching = self.start_slow_clone("through")
        self.two.cut_link()
        time.sleep(3)  # shorter than any of the time limits
        self.two.mend_link()
        self.full_speed()
        code, said = self.outcome(watching)
        self.assertEqual(code, 0, said)
        self.whole("through", made=True)
        self.nothing_is_left()

    def test_user_killed(self):
        watching = self.start_slow_clone("goeson")
        os.kill(self.workers()[0], signal.SIGKILL)
        self.outcome(watching)
        self.full_speed()
        wait_until(lambda: not self.one.processes("iscsictl"), "the clone ends")
        self.whole("goeson", made=True)
        self.nothing_is_left()

    def test_sender_killed(self):
        watching = self.start_slow_clone("halfway")
        os.kill(self.workers()[1], signal.SIGKILL)
        code, said = self.outcome(watching)
        self.assertEqual(code, 1, said)
        self.assertRegex(said, "18990552")
        self.nothing_is_left()

    def test_watcher_killed(self):
        """The data arrives all the same; the virtual LUN stays, and can be seen and removed."""
        watching = self.start_slow_clone("arrives")
        os.kill(self.workers()[2], signal.SIGKILL)
        self.full_speed()
        code, said = self.outcome(watching)
        self.assertEqual(code, 0, said)
        self.assertEqual(self.transfer()["status"], "complete")
        self.one.iscsictl("vlun", "delete", self.transfer()["uuid"])
        self.whole("arrives", made=True)
        self.nothing_is_left()

    def test_peer_daemons_killed(self):
        for daemon in ("tgtd", "lighttpd"):
            with self.subTest(daemon=daemon):
                watching = self.start_slow_clone("victim")
                self.two.kill(daemon)
                if daemon == "lighttpd":
                    self.two.start_web()
                self.full_speed()
                code, said = self.outcome(watching)
                wait_until(lambda: len(self.two.processes("tgtd")) == 2, "the daemons are back")
                if code == 0:
                    self.whole("victim", made=True)
                else:
                    self.assertRegex(said, "18990552|reset|refused|answer")
                self.nothing_is_left()

    def test_peer_fails(self):
        """While the peer is down nothing can be tidied up there; it says so when it is back."""
        watching = self.start_slow_clone("lost")
        self.two.restart()
        code, said = self.outcome(watching)
        self.assertEqual(code, 1, said)
        self.assertRegex(said, "18990552")
        wait_until(lambda: not self.one.processes("iscsictl"), "the clone ends")
        for lun in self.two.json("lun", "list", "--status"):
            self.assertTrue(lun["name"] != "lost" or lun["type"] == 31, lun)
        self.two.run("iscsictl", "lun", "delete", "lost", "--yes", check=False)
        self.nothing_is_left()

    def test_volume_full(self):
        free = json.loads(self.two.host("volume", "list", "--json"))[0]["free_bytes"]
        self.two.iscsictl("lun", "create", "fat", "--location", VOLUME, "--size", str((free // MIB - SIZE_MIB // 2) * MIB), "--type", "file")
        self.refused(self.one, *self.command("toomuch"), "--watch", says=r"(?i)no space")
        self.two.iscsictl("lun", "delete", "fat", "--yes")
        self.nothing_is_left()


if __name__ == "__main__":
    main()
