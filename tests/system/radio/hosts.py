"""Who runs the network inside the machine: nobody, a supplicant, NetworkManager with either of its supplicants."""
import json
import os
import plistlib
import re
import runpy
import signal
import struct
import subprocess
import sys
import time
from pathlib import Path

import air
import machine
from air import spawn, wait_until
from machine import run, sh

CARD = "wlan0"
ETC = Path(__file__).resolve().parent / "etc"


class Host:
    """The machine with nobody who runs its network, and what every machine has: the tool and the system log."""
    has_home = False
    not_there = "no network of that name was heard"  # what the log says of a name that nobody offers

    def __init__(self):
        self.syslog = []
        self.listen()
        air.make()
        self.home = air.home() if self.has_home else None
        self.daemons = []
        self.begin()
        self.pristine = self.state()
        self.untouched = True  # the state is still that, by the last look at it

    def listen(self):
        """Keeps the tool's log lines in `syslog`."""
        machine.listen(self.syslog)

    def begin(self):
        """Starts what runs the network and waits until the card is at home."""
        try:
            self.start()
            if self.home:
                wait_until(self.at_home, 90, "at home")
        except (RuntimeError, TimeoutError):
            print(self.log()[-20000:])
            raise

    def start(self):
        pass

    def at_home(self):
        return self.joined() == (air.HOME, "access point") and any(
            each.startswith("192.168.50.") for each in self.addresses())

    def begin_again(self):
        """Makes the machine what it was at its start, whatever was left behind."""
        for daemon in reversed(self.daemons):
            air.end(daemon)
        self.daemons.clear()
        self.switch(False)
        self._end_dhcp_client()
        sh(f"rm -rf {machine.STORE.parent} {machine.RUNTIME} /tmp/set.orig /tmp/zat.orig; echo nameserver 203.0.113.53 >/etc/resolv.conf")
        for command in (f"iw dev {CARD} disconnect", f"iw dev {CARD} ibss leave", f"ip link set {CARD} down",
                        f"iw dev {CARD} set type managed", f"ip addr flush dev {CARD}"):
            subprocess.run(command.split(), capture_output=True, check=False)
        self.begin()

    @staticmethod
    def _end_dhcp_client():
        """Ends the tool's own, which a row that failed may have left."""
        note = machine.RUNTIME / f"dhcp-{CARD}.plist"
        number = plistlib.loads(note.read_bytes())["Client"]["Number"] if note.exists() else None
        if number and (words := Path(f"/proc/{number}/cmdline")).exists() and b"udhcpc" in words.read_bytes():
            os.kill(number, signal.SIGTERM)

    def tool(self, *words, seconds=300, **options):
        """Runs the tool; returns its trace and the seconds that it took."""
        start = time.monotonic()
        run = self.begin_tool(*words, **options)
        trace = run.communicate(timeout=seconds)[0]
        if run.returncode != 0:
            raise AssertionError(f"exit status {run.returncode}: {trace}")
        return trace, time.monotonic() - start

    @staticmethod
    def begin_tool(*words, **options):
        return machine.start_tool(os.environ["LA_BINARY"], *words,
                                  **{"text": True, "stderr": subprocess.STDOUT} | options)

    def state(self):
        return machine.state() | {"network": self.joined(), "rfkill": self.switched_off()}

    @staticmethod
    def joined():
        """The name of the network that the card is on and as what, or None."""
        link = sh(f"iw dev {CARD} link")
        name = re.search(r"SSID: (.*)", link)
        return (name.group(1), "ad-hoc" if "Joined IBSS" in link else "access point") if name else None

    @staticmethod
    def _rfkill():
        (folder,) = Path("/sys/class/ieee80211/phy0").glob("rfkill*")
        return folder

    def switched_off(self):
        return (self._rfkill() / "soft").read_text() == "1\n"

    def switch(self, off):
        """The soft switch of the card's radio."""
        with open("/dev/rfkill", "wb", buffering=0) as device:
            device.write(struct.pack("=IBBBB", int(self._rfkill().name[6:]), 0, 2, off, 0))

    def addresses(self):
        # A card without an address is left out, or comes as an empty entry.
        return [f"{each['local']}/{each['prefixlen']}" for link in json.loads(sh(f"ip -j -4 addr show {CARD}"))
                for each in link.get("addr_info", ())]

    def log(self):
        """What the daemons said."""
        return ""


class Supplicant(Host):
    """A wpa_supplicant for the one card, with a network of its own; the address is the administrator's."""
    has_home = True
    not_there = "the network was not found"
    wrong_key = "the network refused the key"

    def start(self):
        self.daemons.append(spawn("wpa_supplicant", "-i", CARD, "-c", ETC / "supplicant.conf", "-t", log="supplicant"))
        sh(f"ip link set {CARD} up; ip addr add 192.168.50.20/24 brd + dev {CARD}; "
           f"ip route add default via {air.ADDRESS['home']} dev {CARD} metric 600")

    def ask(self, command):
        return sh(f"wpa_cli -p /run/wpa_supplicant -i {CARD} {command}")

    def state(self):
        status = dict(line.split("=", 1) for line in self.ask("status").splitlines() if "=" in line)
        networks = [re.sub(r"\t\S*$", lambda flags: flags.group().replace("[CURRENT]", ""), line)
                    for line in self.ask("list_networks").splitlines()[1:]]
        return super().state() | {"networks": networks, "status": {
            key: status.get(key) for key in ("wpa_state", "ssid", "mode", "key_mgmt")}}

    def log(self):
        return air.log_of("supplicant")


class NetworkManager(Host):
    """The desktop: NetworkManager on its bus, home by a profile that is on disk."""
    has_home = True
    not_there = "the network was not found"
    wrong_key = "the network's key is wrong or missing"
    backend = "wpa_supplicant"

    def start(self):
        sh("rm -rf /etc/NetworkManager/* /run/NetworkManager /var/lib/NetworkManager /run/dbus; mkdir /run/dbus")
        run("install", "-D", "-m", "600", ETC / "home.nmconnection", "-t", machine.CONNECTIONS)
        configuration = (ETC / "NetworkManager.conf").read_text()
        Path("/etc/NetworkManager/NetworkManager.conf").write_text(f"{configuration}wifi.backend={self.backend}\n")
        # udev tells NetworkManager of devices and switches.
        self.daemons.append(spawn("/usr/lib/systemd/systemd-udevd", log="udev"))
        wait_until(Path("/run/udev/control").exists, 20, "udev")
        sh("udevadm trigger --action=add --subsystem-match=net --subsystem-match=rfkill --subsystem-match=ieee80211; "
           "udevadm settle")
        self.daemons.append(spawn("dbus-daemon", f"--config-file={air.SYSTEM}/bus.conf", "--nofork", "--nopidfile"))
        wait_until(Path("/run/dbus/system_bus_socket").exists, 10, "the bus")
        self.start_supplicant()
        self.start_daemon()

    def start_supplicant(self):
        self.daemons.append(spawn("wpa_supplicant", "-u", "-t", log="supplicant"))

    def start_daemon(self):
        self.daemon = spawn("NetworkManager", "--debug", log="networkmanager")
        self.daemons.append(self.daemon)

    nmcli = staticmethod(machine.nmcli)

    def state(self):
        cards = [card for card in (CARD, "eth0") if Path("/sys/class/net", card).exists()]
        return super().state() | machine.daemon_state(cards)

    def start_desktop(self):
        """Lets the resident sit at the computer; what their browser is told goes to /tmp/browser."""
        sh(f"""
            id resident 2>/dev/null || echo '{machine.RESIDENT_LINE}' >>/etc/passwd
            printf '#!/bin/sh\\necho "$(id -un) opens $*" >>/tmp/browser\\n' >/usr/bin/xdg-open
            chmod 755 /usr/bin/xdg-open
        """)
        machine.sit_down()

    def log(self):
        return air.log_of("networkmanager")


class Iwd(NetworkManager):
    """The same with iwd, which wants the kernel's ciphers through sockets."""
    backend = "iwd"

    def start_supplicant(self):
        sh("modprobe -a af_alg algif_hash algif_skcipher algif_aead des_generic ecb md4 cmac ccm sha512_generic "
           "pkcs8_key_parser; rm -rf /var/lib/iwd; mkdir /var/lib/iwd; cd /var/lib/iwd; : >Elsewhere.open; "
           "printf '[Settings]\\nAutoConnect=false\\n' >Never.open")
        self.daemons.append(spawn("/usr/libexec/iwd", log="iwd"))

    def start_daemon(self):
        super().start_daemon()
        # iwd joins by itself what it has joined before, and NetworkManager leaves that to it. The first time counts:
        # NetworkManager gives iwd the key of a profile that was never activated, and asks for a new one afterwards.
        wait_until(lambda: f"{air.HOME}\n" in self.nmcli("-f SSID device wifi list"), 60, "home heard")
        self.nmcli(f"-w 60 connection up {air.HOME}")

    def state(self):
        # NetworkManager shows what iwd alone knows under new UUIDs at each start.
        state = super().state() | {"known, and joined unasked": {
            path.name: "AutoConnect=false" not in path.read_text() for path in Path("/var/lib/iwd").glob("[!.]*.*")}}
        state["profiles"] = [line for line in state["profiles"] if not line.startswith(("Elsewhere:", "Never:"))]
        state["files"] = {path: text for path, text in state["files"].items() if "/etc/" in path or "assistant" in path}
        return state

    def log(self):
        return air.log_of("iwd") + super().log()


HOSTS = {"nobody": Host, "supplicant": Supplicant, "networkmanager": NetworkManager, "networkmanager-iwd": Iwd}


def main():
    """usage: hosts.py HOST SCRIPT [ARGUMENT ...]: plays SCRIPT on that host, at home; a Python script finds the host
    as `host`."""
    host = HOSTS[sys.argv[1]]()
    sys.argv = sys.argv[2:]
    if sys.argv[0] == "python3":
        sys.argv.pop(0)
        runpy.run_path(sys.argv[0], {"host": host, "air": air}, "__main__")
    else:
        sys.exit(subprocess.run(sys.argv, check=False).returncode)


if __name__ == "__main__":
    main()
