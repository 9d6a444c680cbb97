#!/usr/bin/env python3
"""The main job over the air, in an emulated machine with simulated radios. Exits 1 when the way back did not lead
back."""
import difflib
import pprint
import subprocess
import sys
import time
import urllib.request
from pathlib import Path

PRINTER = "Printer Setup"
SHOW = """
iw dev wlan0 link
ip -brief -4 address show wlan0
ip route
nmcli -f DEVICE,STATE,CONNECTION device status | grep -v ^lo
"""


def say(text):
    print(f"\n# {text}", flush=True)


def indented(text):
    print("".join(f"    {line}\n" for line in text.strip("\n").split("\n")), end="", flush=True)


def show(commands):
    for command in commands.strip().split("\n"):
        print(f"  $ {command}")
        indented(subprocess.run(["sh", "-c", command], capture_output=True, text=True, check=False).stdout)


def expect(condition, text, host):
    if not condition:
        print(f"\nNOT SO: {text}")
        indented("\n".join(host.syslog))
        sys.exit(1)


def scan(air):
    for name, address, kind in sorted(air.heard()):
        print(f"    {name:<16} {address}  {kind}")


def tool(host, *words):
    print(f"  $ location-assistant {' '.join(words)}")
    trace, seconds = host.tool(*words)
    indented(trace)
    print(f"    ({seconds:.1f} s)")


def demonstrate(host, air):
    print("To a printer's own wireless network and back, over the air")
    network = air.Network(PRINTER)
    say("On the air: the home network, with WPA2, and a printer that nobody has configured yet")
    scan(air)
    say("The machine: its card is on the home network")
    show(SHOW)
    before, air_before = host.state(), air.heard()

    say("To the printer")
    tool(host, "create", "from_intro", PRINTER)
    show(SHOW)
    expect(host.joined() == (PRINTER, "access point"), f"the card is on {host.joined()}", host)
    expect(host.addresses() == ["192.0.0.199/24"], f"the card has {host.addresses()}", host)
    say("The printer answers")
    direct = urllib.request.build_opener(urllib.request.ProxyHandler({}))
    page = direct.open("http://192.0.0.192/", timeout=5).read().decode()
    indented(page)
    expect("Demonstration printer" in page, "the printer's page", host)

    say("And back")
    tool(host, "remove")
    time.sleep(1)
    show(SHOW)
    scan(air)
    difference = difflib.ndiff(*(pprint.pformat(state).split("\n") for state in (before, host.state())))
    difference = "\n".join(line for line in difference if line[0] != " ")
    expect(not difference, f"as before\n{difference}", host)
    expect(air.heard() == air_before, "on the air is what was there before", host)
    say("Network, addresses, routes, name servers and NetworkManager's profiles are exactly as before")
    network.stop()


def main():
    sys.path.insert(0, str(Path(__file__).resolve().parents[1] / "tests/system"))
    import radio

    sys.argv = [sys.argv[0], "run", __file__, "networkmanager"]
    radio.main()


if "host" in globals():
    demonstrate(globals()["host"], globals()["air"])
elif __name__ == "__main__":
    main()
