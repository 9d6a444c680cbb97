#!/usr/bin/env python3
"""The assisted run: the printer found, the prompt, the browser, and every way in which a printer can misbehave."""
import os
import re
import signal
import socket
import subprocess
import time

import lab

TYPED = b"\rn\n\nx\nYyy\n"  # what stands behind an answer is taken away, whatever it is
# What libraries below would obey: to ask a proxy, and to print what they parse.
ORDERS = {f"{name}_proxy": "http://192.0.0.1:1" for name in ("http", "all", "HTTP", "ALL")} | {
    "EXPAT_ACCOUNTING_DEBUG": "3", "EXPAT_ENTITY_DEBUG": "1"}


class Printer(lab.LabTest):
    def test_well(self):
        before = self.lab.network()
        self.lab.start_desktop()
        self.lab.tool("test", typed=TYPED, env=lab.ENVIRONMENT | ORDERS)
        self.assertEqual(["192.0.0.199/24"], self.lab.ipv4("wlan0"))
        self.assertEqual(({"0": "Automatic", "1": "kv zat temp set"}, "1"), self.set_names())
        self.assertEqual("GET /mactestfoo.html HTTP/1.1\n", self.lab.file("printer.log"))
        lab.STORE.write_bytes(lab.STORE.read_bytes() + b"<!-- for the reader of every form of XML -->\n")
        self.lab.tool("remove", env=lab.ENVIRONMENT | ORDERS)
        self.assertEqual(before, self.lab.network())
        self.assert_golden("test")
        if not lab.other_users():
            self.skipTest("only root can be another user here, so no page was opened")
        opened = "resident opens http://192.0.0.192/dot11_config_start.htm\n"
        lab.wait_until(lambda: self.lab.file("/tmp/browser") == opened)

    def test_end_of_input(self):
        run = self.lab.start("test")
        for _ in range(100_000):
            last = run.stdout.read(15)
        self.assertEqual((None, 15), (run.poll(), len(last)))
        run.stdout.close()
        self.assertEqual(-signal.SIGPIPE, run.wait(10))
        run.stderr.close()

    def test_log_that_nobody_reads(self):
        self.lab.tool("create", "from_intro", "Printer Setup")
        lab.wait_until(lambda: any(re.match(r"\[[0-9]+\]: wlan0", line) for line in self.lab.syslog))
        os.unlink("/dev/log")
        full, filler = (socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM | socket.SOCK_NONBLOCK) for _ in range(2))
        full.bind("/dev/log")
        with full, filler:
            with self.assertRaises(BlockingIOError):
                while filler.sendto(b"full", "/dev/log"):
                    pass
            self.lab.tool("create", "from_intro", "Printer Setup")
            with self.assertRaises(BlockingIOError):
                while full.recv(99) == b"full":
                    pass


class Misbehaving(lab.LabTest):
    options = {"printer": None}

    def test_wrong_answers(self):
        """Three tries, one second apart, and the trace goes on; the result is an HTTP status or a negative one."""
        for manner, result in (None, "-[0-9]+"), ("redirect", "302"), ("silent", "-[0-9]+"):
            with self.subTest(manner):
                if manner:
                    self.lab.start_printer(manner)
                self.lab.transcript = ""
                start = time.monotonic()
                self.lab.tool("test", stdin=subprocess.DEVNULL)
                self.assertTrue(2 <= time.monotonic() - start < 100)
                self.lab.transcript = re.sub(rf"(?<=NOT found \(result = ){result}\)", "RESULT)", self.lab.transcript)
                self.assert_golden("test_wrong_answers")
                self.lab.tool("remove")
                if manner:
                    self.lab.stop(self.lab.printer)
        self.assertNotIn("moved", self.lab.file("printer.log"))

    def test_switched_off(self):
        lab.ip("-n far link set far-wlan0 down")
        _, trace = self.lab.tool("test", stdin=subprocess.DEVNULL)
        self.assertEqual(5, trace.count("from SCNetworkCheckReachabilityByAddress(), flags = 0\n"))
        self.assertIn("IsWirelessPrinterReachableViaSCF(): reachable=0\nPrinter is reachable: FALSE\nDeleting", trace)
        self.lab.tool("remove")


if __name__ == "__main__":
    lab.main()
