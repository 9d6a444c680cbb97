#!/usr/bin/env python3
"""Nothing leaves the laboratory, and nothing of it outlives its first process."""
import json
import os
import subprocess
import sys
import unittest
from pathlib import Path

import lab


def inside():
    lab.enter()
    machine = lab.Lab(dhcp="eth0", daemon=True)
    machine.tool("create", "auto")
    assert machine.ipv4("eth0")[0].startswith("192.168.77."), machine.ipv4("eth0")
    machine.start("test")
    print(os.stat("/proc/self/ns/pid").st_ino, flush=True)
    sys.stdin.read()


def machine():
    links = subprocess.run(["ip", "-j", "addr"], capture_output=True, text=True, check=True).stdout
    for link in (links := json.loads(links)):
        for address in link["addr_info"]:
            address.pop("valid_life_time"), address.pop("preferred_life_time")
    routes = subprocess.run(["ip", "-j", "route"], capture_output=True, text=True, check=True).stdout
    paths = [Path(path) for path in ("/etc/resolv.conf", "/etc/NetworkManager", "/run/netns", "/dev/log", "/run/lab",
                                     lab.STORE.parent, lab.RUNTIME, "/tmp/set.orig", "/tmp/zat.orig")]
    return links, routes, [(str(path), path.lstat().st_mtime_ns) for path in paths if os.path.lexists(path)]


def processes_in(namespace):
    found = 0
    for entry in Path("/proc").glob("[0-9]*/ns/pid"):
        try:
            found += entry.stat().st_ino == namespace
        except OSError:
            pass
    return found


class Isolation(unittest.TestCase):
    def test_nothing_leaks(self):
        before = machine()
        with subprocess.Popen([sys.executable, "-B", __file__, "inside"], stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                              text=True) as run:
            namespace = int(run.stdout.readline())
            self.assertGreater(processes_in(namespace), 3)
            self.assertEqual(before, machine())
            run.kill()
        lab.wait_until(lambda: processes_in(namespace) == 0)
        self.assertEqual(before, machine())


if __name__ == "__main__":
    if "inside" in sys.argv:
        inside()
    else:
        unittest.main(verbosity=2)
