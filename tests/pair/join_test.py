"""Two appliances come to know each other, or are told why not."""
import base64

from cases import PairTest, main
from pair import ACCOUNT, VOLUME, Failed


class Join(PairTest):
    joined = False

    def nodes(self, appliance):
        """What `node list` says of the others, by address."""
        listed = appliance.json("node", "list")
        self.assertTrue(listed[0]["is_local_node"])
        return {node["hostname"]: node["uuid"] for node in listed[1:]}

    def join(self, host, *options, password=None, fingerprint=None):
        return ("node", "join", host, "--account", ACCOUNT, "--password-file", "-", "--fingerprint",
                fingerprint or self.two.fingerprint(), *options), {"stdin": (password or self.two.password) + "\n"}

    def refuses_to_join(self, says, host, **how):
        command, options = self.join(host, **how)
        self.refused(self.one, *command, says=says, **options)
        self.assertEqual((self.nodes(self.one), self.nodes(self.two)), ({}, {}), "a refused join left something")

    def test_1_refused(self):
        wrong_key = "sha256//" + base64.b64encode(bytes(32)).decode()
        self.refuses_to_join(r"(?i)fail.* log ?in|password|account", self.two.address, password="not the password")
        self.refuses_to_join(r"(?i)key|fingerprint", self.two.address, fingerprint=wrong_key)
        self.refuses_to_join(r"(?i)connect|reach|route", "192.0.2.99")
        self.refuses_to_join(r"(?i)connect|reach|refuse", f"{self.two.address}:5444")
        self.refuses_to_join(r"itself", self.one.address, fingerprint=self.one.fingerprint(), password=self.one.password)

    def test_2_joined(self):
        self.one.join(self.two)
        self.assertEqual(list(self.nodes(self.one)), [self.two.address])
        self.assertEqual(list(self.nodes(self.two)), [self.one.address])
        self.assertEqual(self.nodes(self.one)[self.two.address], self.two.json("node", "list")[0]["uuid"])
        self.assertEqual(self.nodes(self.two)[self.one.address], self.one.json("node", "list")[0]["uuid"])

        command, options = self.join(self.two.address)
        self.refused(self.one, *command, says=r"18991111.*paired already", **options)
        self.assertEqual(len(self.nodes(self.one)), 1)

        for appliance in (self.one, self.two):
            shown = appliance.run("iscsictl", "node", "list", "--json").stdout + appliance.run("iscsictl", "node", "show", "node#2").stdout
            self.assertNotRegex(shown, r"rod_key|session_id|password")

    def test_3_changed_key(self):
        """What answers at the peer's address has another key: nothing is sent there until somebody accepts it."""
        self.make_lun("secret", 16)
        self.two.host("certificate", "make")
        self.two.stop_web()
        self.two.start_web()
        clone = ("lun", "remote-clone", "secret", "--node", self.two.address, "--name", "copy", "--location", VOLUME, "--watch")
        self.refused(self.one, *clone, says=r"(?i)key|fingerprint")
        self.assertEqual(self.two.json("lun", "list"), [])

        self.one.iscsictl("node", "trust", self.two.address, "--fingerprint", self.two.fingerprint())
        self.one.iscsictl(*clone)
        self.assertEqual([lun["name"] for lun in self.two.json("lun", "list")], ["copy"])

    def test_4_removed(self):
        self.one.iscsictl("node", "remove", self.two.address, "--yes")
        self.assertEqual(self.nodes(self.one), {})
        with self.assertRaises(Failed):
            self.one.iscsictl("node", "show", self.two.address)
        self.two.iscsictl("node", "remove", self.one.address, "--yes")
        self.one.join(self.two)
        self.assertEqual(len(self.nodes(self.two)), 1)


if __name__ == "__main__":
    main()
