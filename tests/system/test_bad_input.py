#!/usr/bin/env python3
"""What others put in the tool's way: broken files, odd arguments, full disks, kills, two runs at once."""
import os
import plistlib
import random
import signal
import subprocess
import time
from pathlib import Path

import lab

REFUSED = """Creating the temporary set
AT START OF CreateTemporarySet():err == {0}, foundAirPortCard == 0
MoreSCClose() failed -> err == {0}
AT END OF CreateTemporarySet():"""
SET_FILE = Path("/tmp/set.orig")
HEAD = b'<?xml version="1.0" encoding="UTF-8"?>\n<plist version="1.0">'


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

    def put_store(self, content):
        """Puts content (bytes, or a function of the path) in the place of the preferences file."""
        lab.sh(f"rm -rf {lab.STORE}; mkdir -p -m 700 {lab.STORE.parent}")
        if callable(content):
            content(lab.STORE)
        else:
            lab.STORE.write_bytes(content)

    def test_unusable_store(self):
        # What makes a document, and a file, one that cannot be used, the unit tests show.
        cases = {"empty": b"", "cut off": HEAD + b"<dict><key>Sets</key>", "not a dictionary": HEAD + b"<array/></plist>",
                 "gigabyte": lambda path: lab.sh(f"truncate -s 1G {path}"), "FIFO": os.mkfifo,
                 "link to nowhere": lambda path: path.symlink_to("/var/lib/nowhere")}
        for name, content in cases.items():
            with self.subTest(name):
                self.put_store(content)
                state = [os.lstat(lab.STORE).st_mode, os.lstat(lab.STORE).st_size, os.lstat(lab.STORE).st_mtime_ns]
                self.lab.syslog.clear()
                self.assertEqual((0, REFUSED.format(1001)), self.lab.tool("create"))
                self.assertEqual((0, ""), self.lab.tool("remove"))
                now = os.lstat(lab.STORE)
                self.assertEqual(state, [now.st_mode, now.st_size, now.st_mtime_ns])
                lab.wait_until(lambda: any("preferences" in line for line in self.lab.syslog))
                self.assert_as_before()

    def test_wrong_types(self):
        self.lab.tool("create")
        self.lab.tool("remove")
        good = self.lab.store()
        paths = [["Sets"], ["Sets", "0"], ["Sets", "0", "Network"], ["Sets", "0", "Network", "Service"],
                 ["Sets", "0", "Network", "Service", "0"], ["Sets", "0", "Network", "Global", "IPv4"],
                 ["Sets", "0", "Network", "Global", "IPv4", "ServiceOrder"], ["NetworkServices"],
                 ["NetworkServices", "0"], ["NetworkServices", "0", "Interface"], ["Sets", "0", "UserDefinedName"],
                 ["CurrentSet"]]
        for path in paths:
            for wrong in "text", [1], {"a": 2}, 7, b"data":
                tree = plistlib.loads(plistlib.dumps(good))
                parent = tree
                for key in path[:-1]:
                    parent = parent[key]
                if type(parent[path[-1]]) is type(wrong) and path != ["CurrentSet"]:
                    continue
                parent[path[-1]] = wrong
                with self.subTest("/".join(path), wrong=wrong):
                    self.put_store(plistlib.dumps(tree))
                    for words in ["create"], ["save"], ["saveZAT"], ["remove"], ["restoreZAT"]:
                        status, trace = self.lab.tool(*words)
                        self.assertEqual(0, status)
                        self.assertTrue(trace or words[0] != "create")
                    self.assertIsInstance(self.lab.store(), dict)
        self.put_store(plistlib.dumps(good))
        self.lab.tool("create")
        self.lab.tool("remove")
        self.assert_as_before()

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

    def put_set_file(self, kind):
        lab.sh(f"rm -rf {SET_FILE} /tmp/target")
        Path("/tmp/target").write_text("0")
        {"link": lambda: SET_FILE.symlink_to("/tmp/target"), "hard link": lambda: os.link("/tmp/target", SET_FILE),
         "FIFO": lambda: os.mkfifo(SET_FILE), "directory": SET_FILE.mkdir, "missing": lambda: None,
         "other user": lambda: SET_FILE.write_text("0") and os.chown(SET_FILE, lab.NOBODY, -1),
         }.get(kind, lambda: SET_FILE.write_text(kind))()

    def test_remembered_location_unusable(self):
        missing = 'File "/tmp/set.orig" doesn\'t exist, so this->originalSet could not be loaded.\n'
        rows = {kind: (missing, "", "1") for kind in ("link", "hard link", "FIFO", "directory", "missing")}
        if lab.other_users():
            rows["other user"] = rows["link"]
        rows |= {"": ("", "", "1"), "77": ("", "77", "77"), "0\n": ("", "0\n", "0\n"),
                 "9" * 3000: ("", "9" * 1023, "9" * 1023)}
        for kind, (line, shown, current) in rows.items():
            with self.subTest(kind[:20]):
                lab.sh(f"rm -rf {lab.STORE} {SET_FILE}")
                self.lab.tool("create")
                self.put_set_file(kind)
                _, trace = self.lab.tool("remove")
                self.assertIn(f'"/tmp/set.orig"\n{line}Activating the original set: "{shown}"\n', trace)
                self.assertEqual(f"/Sets/{current}", self.lab.store()["CurrentSet"])
                if current == "1":
                    self.put_set_file("0")
                    self.lab.tool("remove")
                self.assert_as_before()

    def test_remembered_location_is_replaced(self):
        for kind in ["link", "hard link", "FIFO", "directory"] + ["other user"] * lab.other_users():
            with self.subTest(kind):
                self.lab.syslog.clear()
                self.put_set_file(kind)
                self.lab.tool("create")
                self.assertEqual("0", Path("/tmp/target").read_text())
                if kind == "directory":
                    lab.wait_until(lambda: any("cannot be remembered" in line for line in self.lab.syslog))
                    self.put_set_file("0")
                self.assertEqual((0o100600, "0"), (SET_FILE.lstat().st_mode & ~0o44, SET_FILE.read_text()))
                self.lab.tool("remove")
                self.assert_as_before()
        self.assertEqual([], list(Path("/tmp").glob("set.orig.*")))

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
        rounds = [("create", "create"), ("create", "remove"), ("remove", "remove"), ("create", "save"),
                  ("save", "restoreZAT")] * 6
        self.lab.tool("saveZAT")
        for number, words in enumerate(rounds):
            with self.subTest(words, round=number):
                runs = [self.lab.start(word) for word in words]
                for run in runs:
                    out, errors = run.communicate(timeout=120)
                    self.assertEqual((0, b""), (run.returncode, errors), out)
                self.assert_whole()
        self.lab.tool("restoreZAT")
        self.lab.tool("remove")
        self.assert_as_before()

    def test_killed(self):
        def duration(word):
            start = time.monotonic()
            self.lab.tool(word)
            return time.monotonic() - start
        times = {"create": duration("create"), "remove": duration("remove")}
        random.seed(1)
        for step in range(30):
            for word, seconds in times.items():
                with self.subTest(word, step=step):
                    if word == "remove":
                        self.lab.tool("create")
                    run = self.lab.start(word, stdout=subprocess.DEVNULL)
                    time.sleep(seconds * 1.1 * (step + random.random()) / 30)
                    run.send_signal(signal.SIGKILL)
                    run.communicate()
                    self.lab.tool("remove")
                    self.assert_as_before()
                    if lab.STORE.exists():
                        self.assert_whole()
                        self.assertEqual(({"0": "Automatic"}, "0"), self.set_names())


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
            self.assertNotIn(forms[0], out + seen + "".join(self.lab.syslog).encode())
            # A checkout that lies under one of the folders names the password itself.
            passed_over = {lab.STORE, lab.LAB, Path("/run/netns"), lab.PROJECT, lab.BINARY.parent}
            for folder in "/tmp", "/run", "/var/lib", "/etc":
                for path in Path(folder).rglob("*"):
                    if path.is_file() and os.access(path, os.R_OK) and not passed_over & {path, *path.parents}:
                        content = path.read_bytes()
                        self.assertFalse(any(form in content for form in forms), path)


if __name__ == "__main__":
    lab.main()
