#!/usr/bin/env python3
"""To the printer's network and home again over the air, by the tool and by the same steps with nmcli, in one emulated
machine with NetworkManager: from the start to the printer's page, and from the start to the home network's address.

The seconds are the machine's own, whose clock does not depend on how busy this computer is. nmcli's profile is made
before it is timed. A network that was not heard before has been on the air for a moment only; nmcli is then told to
look for it first. Medians of several runs, taken in turn. Needs LA_BINARY.
"""
import os
import statistics
import subprocess
import sys
import time
import urllib.request
from pathlib import Path

RUNS = 3
LIMIT = 60
PROFILE = ("connection add type wifi ifname wlan0 con-name printer ssid '{}' wifi.mode {} autoconnect no "
           "ipv4.method manual ipv4.addresses 192.0.0.199/24 ipv4.gateway 192.0.0.192 ipv6.method disabled")


def seconds_until(reached, command):
    """Runs a command and returns the seconds from its start until the condition holds, by when it may still run."""
    start = time.monotonic()
    with subprocess.Popen(["sh", "-c", command], stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL):
        while not reached():
            if time.monotonic() > start + LIMIT:
                return None
            time.sleep(0.05)
        return time.monotonic() - start


def page():
    try:
        direct = urllib.request.build_opener(urllib.request.ProxyHandler({}))
        return b"Demonstration printer" in direct.open("http://192.0.0.192/", timeout=0.5).read()
    except OSError:
        return False


def measure(host, air):
    def heard(name):
        return f"{name}\n" in host.nmcli("-f SSID device wifi list --rescan no")

    def visit(name, adhoc, before, ours):
        network = air.Network(name, adhoc=adhoc)
        if before:
            air.wait_until(lambda: host.nmcli("device wifi rescan") or heard(name), LIMIT, f"{name} heard")
        elif heard(name):
            print(f"{name} was heard already", flush=True)
        if ours:
            there = seconds_until(page, f"$LA_BINARY create from_intro '{name}'")
            back = seconds_until(host.at_home, "$LA_BINARY remove")
        else:
            host.nmcli(PROFILE.format(name, "adhoc" if adhoc else "infrastructure"))
            up = "nmcli connection up printer"
            there = seconds_until(page, up if before or adhoc else
                                  f"until {up}; do nmcli device wifi list --rescan yes; done")
            back = seconds_until(host.at_home, "nmcli connection up Home")
            host.nmcli("connection delete printer")
        network.stop()
        air.wait_until(lambda: host.state() == host.pristine, LIMIT, "as before")
        return there, back

    visit("First", False, True, True)
    visit("Second", False, True, False)
    print(f"{'network':<16} {'heard before':<13} {'':<6} {'ours':>7} {'nmcli':>7} {'ratio':>6}", flush=True)
    number = 0
    for adhoc in False, True:
        for before in True, False:
            results = {True: [], False: []}
            for _ in range(RUNS):
                for ours in True, False:
                    number += 1
                    results[ours].append(visit(f"Network {number}", adhoc, before, ours))
            for index, way in enumerate(("page", "home")):
                times = [[run[index] for run in results[ours]] for ours in (True, False)]
                failed = [sum(each is None for each in column) for column in times]
                mine, theirs = (statistics.median(LIMIT if each is None else each for each in column)
                                for column in times)
                remark = f"   did not succeed: {failed[0]} and {failed[1]} of {RUNS}" if any(failed) else ""
                print(f"{'ad-hoc' if adhoc else 'access point':<16} {'yes' if before else 'no':<13} {way:<6} "
                      f"{mine:6.2f}s {theirs:6.2f}s {mine / theirs:6.2f}{remark}", flush=True)


def main():
    sys.path.insert(0, str(Path(__file__).resolve().parents[1] / "tests/system"))
    import radio

    os.environ.setdefault("RADIO_LIMIT", "1800")
    sys.argv = [sys.argv[0], "run", __file__, "networkmanager"]
    radio.main()


if "host" in globals():
    measure(globals()["host"], globals()["air"])
elif __name__ == "__main__":
    main()
