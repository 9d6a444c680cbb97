#!/usr/bin/env python3
"""What others put in the tool's way: odd arguments, an output that is gone, two runs at once, eyes on a password. Broken
and planted files, and runs that are ended, the unit tests show."""
import os
import signal
import time
from pathlib import Path

import lab


class BadInput(lab.LabTest):
    def setUp(self):
        super().setUp()
        self.before = self.lab.network()

    def assert_as_before(self):
        self.assertEqual(self.before, self.lab.network())

    def assert_whole(self):
        """Every location has a name and every service that it lists, and the first one is still there."""
        tree = self.lab.store()
        self.assertEqual("Automatic", tree["Sets"]["0"]["UserDefinedName"])
        self.assertIn(tree["CurrentSet"][len("/Sets/"):], tree["Sets"])
        for one in tree["Sets"].values():
            self.assertTrue(one["UserDefinedName"])
            for service in one["Network"]["Global"]["IPv4"]["ServiceOrder"]:
                self.assertEqual({"__LINK__": f"/NetworkServices/{service}"}, one["Network"]["Service"][service])
                self.assertIn("Interface", tree["NetworkServices"][service])

    def test_names_and_passwords(self):
        texts = [b"", b"x", b"n" * 32, b"n" * 300, b"it's \"quoted\" & <b>bold</b> ]]>", " spaced ü 🖨️ ".encode(),
                 b"%s%n%d"]
        broken = [b"bell\x07", b"\xff\xfe", b"half \xf0\x9f"]
        for name in texts + broken:
            for password in [b"secret"] if name in broken else [texts[texts.index(name) - 1]]:
                with self.subTest(name):
                    status, trace = self.lab.tool("create", "from_intro", name, password)
                    self.assertEqual(0, status)
                    services = self.lab.store()["NetworkServices"].values() if lab.STORE.exists() else []
                    kept = [each["AirPort"] for each in services if "PowerEnabled" in each.get("AirPort", {})]
                    if name in broken:
                        self.assertEqual([], kept)
                        err = "-4960" if name != b"bell\x07" else "1001"
                        self.assertIn(f"MoreSCClose() failed -> err == {err}", trace)
                    else:
                        self.assertEqual([(name.decode(), password.decode().encode("utf-16-be"))],
                                         [(each["PreferredNetwork"], each["AuthPassword"]) for each in kept])
                    self.lab.tool("remove")
                    self.assert_as_before()

    def test_output_gone(self):
        read, write = os.pipe()
        os.close(read)
        outputs = {"full": {"stdout": os.open("/dev/full", os.O_WRONLY)}, "broken pipe": {"stdout": write},
                   "closed": {"stdout": None, "preexec_fn": lambda: os.close(1)},
                   "all closed": {"stdout": None, "preexec_fn": lambda: os.closerange(0, 3)}}
        for name, options in outputs.items():
            with self.subTest(name):
                self.assertEqual(0, self.lab.tool("create", **options)[0])
                self.assertEqual("1", self.set_names()[1])
                self.assertEqual(["192.0.0.199/24"], self.lab.ipv4("wlan0"))
                self.assertEqual(0, self.lab.tool("remove", **options)[0])
                self.assert_as_before()
                self.assert_whole()

    def test_two_at_once(self):
        def blocked():
            """The caller blocks alarms, and one has come."""
            signal.pthread_sigmask(signal.SIG_BLOCK, {signal.SIGALRM})
            signal.raise_signal(signal.SIGALRM)
        rounds = [("create", "create"), ("create", "remove"), ("remove", "remove"), ("create", "save"),
                  ("save", "restoreZAT")] * 6
        self.lab.tool("saveZAT")
        for number, words in enumerate(rounds):
            with self.subTest(words, round=number):
                runs = [self.lab.start(word, preexec_fn=blocked) for word in words]
                for run in runs:
                    out, errors = run.communicate(timeout=120)
                    self.assertEqual((0, b""), (run.returncode, errors), out)
                self.assert_whole()
        self.lab.tool("restoreZAT")
        self.lab.tool("remove")
        self.assert_as_before()


class Canary(lab.LabTest):
    options = {"dhcp": "eth0"}
    canary = "CaNaRy-77"

    def test_password_stays_private(self):
        forms = [self.canary.encode(form) for form in ("ascii", "utf-16-be", "utf-16-le")]
        for mode in "from_intro", "wirelessAuto", "auto":
            run = self.lab.start("create", mode, "Net", self.canary)
            out = run.stdout.readline()
            seen = b""
            while run.poll() is None:
                for entry in *Path("/proc").glob("[0-9]*/cmdline"), *Path("/proc").glob("[0-9]*/environ"):
                    try:
                        seen += entry.read_bytes()
                    except OSError:
                        pass
                time.sleep(0.005)
            out += run.stdout.read() + run.stderr.read()
            self.assertIn(b"location-assistant\0create", seen)
            if mode != "auto":
                self.assertIn(forms[1], b"".join(each.get("AirPort", {}).get("AuthPassword", b"")
                                                 for each in self.lab.store()["NetworkServices"].values()))
            logs = "".join(self.lab.syslog) + self.lab.file("networkmanager.log")
            self.assertNotIn(forms[0], out + seen + logs.encode())
            # A checkout that lies under one of the folders names the password itself.
            passed_over = {lab.STORE, lab.LAB, Path("/run/netns"), lab.PROJECT, lab.BINARY.parent}
            for folder in "/tmp", "/run", "/var/lib", "/etc":
                for path in Path(folder).rglob("*"):
                    if path.is_file() and os.access(path, os.R_OK) and not passed_over & {path, *path.parents}:
                        content = path.read_bytes()
                        self.assertFalse(any(form in content for form in forms), path)


class CanaryOfTheDaemon(Canary):
    options = Canary.options | {"daemon": True}


if __name__ == "__main__":
    lab.main()
