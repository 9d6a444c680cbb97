#!/usr/bin/env python3
"""What can go wrong on an ordinary day. After each a plain create reaches the printer, and remove leads home, within the
time that a person waits. usage: test_troubles.py [--networkmanager]"""
import os
import signal
import subprocess
import time
from pathlib import Path

import lab
from lab import ip, sh, wait_until

SET_FILE = Path("/tmp/set.orig")


class Troubles(lab.LabTest):
    def setUp(self):
        pass

    def machine(self, **options):
        self.lab = lab.Lab(daemon=lab.DAEMON, **options)
        self.lab.transcript = ""

    def timed(self, *words):
        """Runs the tool; how long it took. Nothing but a network stood against it: every commit is a success."""
        begin = time.monotonic()
        _, trace = self.lab.tool(*words)
        seconds = time.monotonic() - begin
        self.assertNotIn("MoreSCClose() failed", trace, self.lab.syslog)
        print(f"    {' '.join(words)}: {seconds:.1f} s", flush=True)
        return seconds

    def there_and_back(self, before):
        self.assertLess(self.timed("create"), 12)
        self.assertEqual(self.lab.ipv4("wlan0"), ["192.0.0.199/24"], "\n".join(self.lab.syslog))
        self.assertIn("Demonstration printer", self.lab.fetch())
        self.assertLess(self.timed("remove"), 10)
        self.assert_home(before)

    def assert_home(self, before):
        after = self.lab.network()
        for state in before, after:
            # A card on which nothing is active keeps IPv6 off after a profile without it, as after every such profile.
            state["routes"] = [route for route in state["routes"] if '"dst": "ff00::/8"' not in route]
        self.assertEqual(before, after, "\n".join(self.lab.syslog))
        self.assertFalse((lab.RUNTIME / "applied.plist").exists())

    # Each trouble, and what the log says about it.

    def no_server_twice(self):
        before = self.lab.network()
        for _ in range(2):
            self.assertLess(self.timed("create", "auto"), 21)
        self.assertLess(self.timed("remove"), 15)
        self.assert_home(before)
        return "eth0: no DHCP server answered"

    def location_that_is_gone(self):
        self.timed("create")
        SET_FILE.write_text("0\n")
        self.timed("remove")
        return '"CurrentSet" names no location'

    def card_pulled_out(self):
        self.timed("create", "auto")
        ip("link del eth1")
        self.timed("create", "auto")
        return "eth1: "

    def ctrl_c_twice(self):
        for seconds in 0.3, 3:
            for words in ("create", "auto"), ("remove",):
                run = self.lab.start(*words, start_new_session=True, stdout=subprocess.DEVNULL)
                time.sleep(seconds if words[0] == "create" else 0.05)
                os.killpg(run.pid, signal.SIGINT)  # as a terminal does, to all that belongs to the run
                run.communicate(timeout=5)
        # First it sets going again what was begun, with a short wait for the server that is not there.
        self.assertLess(self.timed("remove"), 6)
        return ""

    def test_every_trouble(self):
        cards = {"no_server_twice": ("eth1", "eth2", "eth3"), "card_pulled_out": ("eth1",)}
        for row in "no_server_twice", "location_that_is_gone", "card_pulled_out", "ctrl_c_twice":
            with self.subTest(row):
                self.machine(cards=("eth0", "wlan0", *cards.get(row, ())))
                try:
                    before = self.lab.network()
                    reason = getattr(self, row)()
                    wait_until(lambda: not reason or any(reason in line for line in self.lab.syslog))
                    if row == "card_pulled_out":
                        self.lab.cards = self.lab.cards[:2]
                        self.timed("remove")
                        before = self.lab.network()
                    self.there_and_back(before)
                finally:
                    self.lab.close()

    # What is full in the middle: remove alone leads home.

    def test_full_folders(self):
        for folder in lab.RUNTIME, Path("/tmp"):
            for moment in "before", "between":
                with self.subTest(folder=folder, moment=moment):
                    self.machine()
                    try:
                        before = self.lab.network()
                        self.lab.tool("saveZAT")
                        folder.mkdir(mode=0o700, exist_ok=True)
                        sh(f"mount -t tmpfs -o size=64k,mode={'700' if folder == lab.RUNTIME else '1777'} tmpfs {folder}")
                        SET_FILE.write_text("0")
                        SET_FILE.chmod(0o600)
                        if moment == "between":
                            self.lab.tool("create")
                        sh(f"cat /dev/zero >{folder}/filler || :")
                        if moment == "before":
                            self.lab.tool("create")
                        self.lab.tool("remove")
                        self.assert_home(before)
                        sh(f"rm -f {folder}/filler")
                        self.there_and_back(before)
                    finally:
                        sh(f"umount {folder}")
                        self.lab.close()


if __name__ == "__main__":
    lab.main()
