#!/usr/bin/env python3
"""Every command word from the first run on: the whole trace, the machine's network and the store."""
import stat
from pathlib import Path

import lab

SET_FILE = Path("/tmp/set.orig")
MANUAL = ["192.0.0.199/24"]


class Transcripts(lab.LabTest):
    options = {"dhcp": "eth0"}

    def setUp(self):
        super().setUp()
        self.before = self.lab.network()

    def assert_as_before(self):
        self.assertEqual(self.before, self.lab.network())

    def assert_only_wireless(self, addresses):
        self.assertEqual((None, addresses), (self.lab.ipv4("eth0"), self.lab.ipv4("wlan0")))
        self.assertIn("default via 192.0.0.192 dev wlan0", lab.ip("route"))
        self.assertIn("Demonstration printer", self.lab.fetch())

    def test_usage(self):
        for words in [], ["Remove"], ["creat"], [""], ["--help"], ["create", "auto", "name", "password", "more"]:
            self.lab.tool(*words)
        self.assert_golden("usage")
        self.assert_as_before()
        written = [path for path in (lab.STORE.parent, lab.RUNTIME, SET_FILE) if path.exists()]
        self.assertEqual([], written + list(Path("/run").glob("location*")))

    def test_fixed_address(self):
        for words in ["create"], ["create", "from_intro"], ["create", "foo"]:
            with self.subTest(words):
                self.lab.transcript = ""
                self.lab.tool(*words)
                self.assert_only_wireless(MANUAL)
                self.assertEqual(({"0": "Automatic", "1": "kv zat temp set"}, "1"), self.set_names())
                self.assertEqual(("0", 0o600), (SET_FILE.read_text(), stat.S_IMODE(SET_FILE.stat().st_mode)))
                self.lab.tool("remove")
                self.assert_as_before()
                self.assertEqual(({"0": "Automatic"}, "0"), self.set_names())
                if "foo" in words:
                    self.lab.tool("remove")
                    self.assert_as_before()
                self.assert_golden("_".join(words))

    def test_twice(self):
        self.lab.tool("create")
        self.lab.tool("create", "auto")
        self.assertEqual(({"0": "Automatic", "2": "kv zat temp set"}, "2"), self.set_names())
        self.assertIsNone(self.lab.ipv4("wlan0"))
        self.lab.tool("remove")
        self.assert_as_before()
        self.assert_golden("create_twice")

    def test_save(self):
        self.lab.tool("save")
        self.lab.tool("create")
        self.lab.tool("save")
        self.assertEqual("1", SET_FILE.read_text())
        self.lab.tool("remove")
        self.assert_only_wireless(MANUAL)
        self.assertEqual(({"0": "Automatic", "1": "Current Configured Location"}, "1"), self.set_names())
        self.assert_golden("save")

    def test_zat(self):
        for words in "saveZAT", "create", "save", "restoreZAT", "restoreZAT":
            self.lab.tool(words)
        self.assertEqual("0", Path("/tmp/zat.orig").read_text())
        self.assert_as_before()
        self.assertEqual(({"0": "Automatic"}, "0"), self.set_names())
        self.assert_golden("zat")

    @lab.needs_other_users
    def test_not_root(self):
        for store_there in False, True:
            with self.subTest(store_there=store_there):
                if store_there:
                    self.lab.tool("create")
                    SET_FILE.unlink()
                self.lab.transcript = ""
                before = self.lab.network(), store_there and lab.STORE.read_bytes()
                for words in "create", "remove", "save", "saveZAT", "restoreZAT":
                    self.lab.tool(words, user=lab.NOBODY)
                self.assert_golden("not_root")
                self.assertEqual(before, (self.lab.network(), store_there and lab.STORE.read_bytes()))
                self.assertEqual((store_there, False), (lab.STORE.exists(), SET_FILE.exists()))

    def test_store(self):
        self.lab.tool("create", "from_intro")
        modes = [stat.S_IMODE(path.stat().st_mode) for path in (lab.STORE.parent, lab.STORE)]
        self.assertEqual([0o700, 0o600], modes)
        tree = self.lab.store()
        order = tree["Sets"]["1"]["Network"]["Global"]["IPv4"]["ServiceOrder"]
        wired, wireless = (tree["NetworkServices"][key] for key in order)
        self.assertEqual((1, None), (wired.get("__INACTIVE__"), wireless.get("__INACTIVE__")))
        self.assertEqual(("eth0", "wlan0"), tuple(each["Interface"]["DeviceName"] for each in (wired, wireless)))
        self.assertEqual({"ConfigMethod": "Manual", "Addresses": ["192.0.0.199"], "SubnetMasks": ["255.255.255.0"],
                          "Router": "192.0.0.192"}, wireless["IPv4"])
        self.assertEqual((True, "Preferred"), (wireless["AirPort"]["PowerEnabled"], wireless["AirPort"]["JoinMode"]))


class WithServer(lab.LabTest):
    """An address by DHCP, from a real server."""

    def play(self, card, mode, other):
        self.lab = lab.Lab(dhcp=card)
        self.addCleanup(self.lab.close)
        before = self.lab.network()
        self.lab.tool("create", mode)
        (address,) = self.lab.ipv4(card)
        self.assertRegex(address, r"^192\.(168\.77|0\.0)\.[5-9][0-9]/24$")
        self.assertIn(address.split("/")[0], self.lab.file("leases"))
        self.assertIn("nameserver 192.", self.lab.file("/etc/resolv.conf"))
        self.assertIsNone(self.lab.ipv4(other))
        self.lab.tool("remove")
        self.assertEqual(before, self.lab.network())
        self.assert_golden("create_" + mode)

    def setUp(self):
        pass

    def test_wired(self):
        self.play("eth0", "auto", "wlan0")

    def test_wireless(self):
        self.play("wlan0", "wirelessAuto", "eth0")


class WithoutCard(lab.LabTest):
    options = {"cards": ["eth0"]}

    def test_no_airport_card(self):
        before = self.lab.network()
        self.lab.tool("create")
        self.assert_golden("no_airport_card")
        self.assertEqual(before, self.lab.network())
        self.assertEqual(({"0": "Automatic"}, "0"), self.set_names())
        self.assertEqual(1, len(self.lab.store()["NetworkServices"]))
        self.lab.transcript = ""
        self.lab.tool("test")
        self.assert_golden("test_no_airport_card")


if __name__ == "__main__":
    lab.main()
