"""What the machines of both laboratories have in common: the tool and its log, who sits at the computer, and what is
compared before and after."""
import json
import os
import re
import shlex
import socket
import subprocess
import threading
import time
from pathlib import Path

STORE = Path("/var/lib/location-assistant/preferences.plist")
RUNTIME = Path("/run/location-assistant")
CONNECTIONS = Path("/etc/NetworkManager/system-connections")
RESIDENT = 4242  # the user who sits at the computer
RESIDENT_LINE = f"resident:x:{RESIDENT}:{RESIDENT}::/:/bin/sh"
ENVIRONMENT = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin"} | {
    key: value for key, value in os.environ.items() if key.endswith("SAN_OPTIONS")}


def run(*words, **options):
    """Runs a command and returns what it printed; an error tells what it printed on standard error."""
    result = subprocess.run([*map(str, words)], capture_output=True, text=True, check=False, **options)
    if result.returncode != 0:
        raise RuntimeError(f"{shlex.join(map(str, words))}: {result.stderr.strip() or result.returncode}")
    return result.stdout


def sh(script):
    return run("sh", "-ec", script)


def wait_until(condition, seconds=10, what="so", pause=0.01):
    """Waits for a condition and returns its value."""
    start = time.monotonic()
    while not (value := condition()):
        waited = time.monotonic() - start
        if waited > seconds:
            raise TimeoutError(f"not within {seconds} s: {what}")
        time.sleep(pause + waited / 10)
    return value


def listen(lines):
    """Stands for the system log and keeps the tool's lines; returns the socket and the thread that reads it."""
    listener = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
    listener.bind("/dev/log")
    os.chmod("/dev/log", 0o666)

    def take():
        while data := listener.recv(65536):
            _, tool, line = data.decode("utf-8", "replace").partition("location-assistant")
            if tool:
                lines.append(line)

    thread = threading.Thread(target=take, daemon=True)
    thread.start()
    return listener, thread


def start_tool(program, *words, **options):
    """The tool as a process; words are strings or bytes."""
    options = {"env": ENVIRONMENT, "stdin": subprocess.DEVNULL, "stdout": subprocess.PIPE, "stderr": subprocess.PIPE,
               "cwd": "/"} | options
    return subprocess.Popen(["location-assistant", *words], executable=program, **options)


def sit_down():
    """Lets the resident sit at the computer, as the service manager would tell it."""
    for path, fields in {"seats/seat0": f"ACTIVE=1\nACTIVE_UID={RESIDENT}\n", "sessions/1":
                         f"UID={RESIDENT}\nCLASS=user\nSTATE=active\nTYPE=x11\nDISPLAY=:0\n"}.items():
        (file := Path("/run/systemd", path)).parent.mkdir(parents=True, exist_ok=True)
        file.write_text(fields)


def state():
    """What has to be the same before and after: name servers, cards, addresses, routes; nothing in it tells of time."""
    def timeless(key, value):
        return ("for ever" if value > 1 << 31 else "for a while") if key.endswith("life_time") else value

    found = {"resolv.conf": [line for line in Path("/etc/resolv.conf").read_text().splitlines() if line[:1] != "#"]}
    for link in json.loads(sh("ip -j addr")):
        if re.fullmatch("(eth|en|wlan)[0-9]", link["ifname"]):
            found[link["ifname"]] = {
                "up": "UP" in link["flags"], "hardware": link["address"], "mtu": link["mtu"],
                "addresses": sorted(" ".join(f"{key}={timeless(key, value)}" for key, value in address.items()
                                             if key != "tentative") for address in link["addr_info"])}
    # The way to a card's own link-local address comes a second after the address, when no neighbour has objected.
    found["routes"] = sorted(json.dumps(route) for family in "46"
                             for route in json.loads(sh(f"ip -{family} -j route show table all"))
                             if not (route.get("type") == "local" and route["dst"].startswith("fe80:")))
    return found


def nmcli(arguments):
    return subprocess.run(["nmcli", "-t", *shlex.split(arguments)], capture_output=True, text=True, env=ENVIRONMENT,
                          check=False).stdout


def daemon_state(cards):
    """The same of NetworkManager: its devices, its profiles and their files."""
    fields = "GENERAL.DEVICE,GENERAL.STATE,GENERAL.CONNECTION,GENERAL.AUTOCONNECT,GENERAL.NM-MANAGED"
    # A card that is being connected goes through states by itself.
    underway = r"GENERAL.STATE:(?:[4-9]0|120) .*"
    return {
        "devices": [re.sub(underway, "GENERAL.STATE:connecting", nmcli(f"-f {fields} device show {card}")).splitlines()
                    for card in cards],
        "profiles": [line for line in nmcli("-f NAME,UUID,AUTOCONNECT,DEVICE,FILENAME connection").splitlines()
                     if not line.startswith("lo:")],
        "files": {str(path): path.read_text() for folder in ("/etc", "/run") for path in
                  Path(folder, "NetworkManager/system-connections").glob("*") if "lo.nm" not in str(path)}}
