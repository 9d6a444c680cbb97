"""The air inside the machine: its card wlan0, and three more radios that play a printer, the home network and an ear.

Each of the three lives in a network namespace of its own. Networks of one boot want names of their own: everybody
remembers for minutes what was heard.
"""
import functools
import re
import struct
import subprocess
from pathlib import Path

import machine
from machine import sh

SYSTEM = Path(__file__).resolve().parents[1]
LOGS = Path("/run/air")
SYSFS = LOGS / "sys"  # writable: the one at /sys need not be
PLACES = {"printer": "wlan1", "home": "wlan2", "ear": "wlan3"}
ADDRESS = {"printer": "192.0.0.192", "home": "192.168.50.1"}
HOME, HOME_KEY = "Home", "home sweet home"
CHANNEL = {"printer": 1, "home": 6}


# Asking is what costs in an emulator.
wait_until = functools.partial(machine.wait_until, pause=0.2)


def at(place, command):
    """Runs a command at one of the places."""
    return sh(f"nsenter --net=/run/netns/{place} {command}")


def spawn(*command, place=None, log="daemons"):
    prefix = ["nsenter", f"--net=/run/netns/{place}"] if place else []
    with (LOGS / f"{log}.log").open("ab") as file:
        return subprocess.Popen([*prefix, *map(str, command)], stdin=subprocess.DEVNULL, stdout=file, stderr=file)


def end(process):
    if process.poll() is None:
        process.terminate()
        try:
            process.wait(10)
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()


def log_of(name):
    path = LOGS / f"{name}.log"
    return path.read_text(errors="replace") if path.exists() else ""


def make():
    """Brings the radios and what answers at their places; no network is on the air yet."""
    if LOGS.exists():
        return
    LOGS.mkdir()
    sh(f"""
        modprobe mac80211_hwsim radios=4
        modprobe -a ccm cmac gcm ctr e1000
        mkdir {SYSFS}
        mount -t sysfs sysfs {SYSFS}
    """)
    for place, device in PLACES.items():
        sh(f"ip netns add {place}; iw phy phy{device[-1]} set netns name {place}; ip -n {place} link set lo up")
    # The other end of the wired card's cable: a carrier, and nobody who answers.
    sh("ip link set eth1 netns ear; ip -n ear link set eth1 up")
    wired_card(False)
    for place, address in ADDRESS.items():
        sh(f"ip -n {place} addr add {address}/24 dev {PLACES[place]}")
    spawn("python3", "-B", SYSTEM / "printer.py", "well", LOGS / "printer.log", place="printer")
    wait_until(lambda: ":80 " in at("printer", "ss -Hltn"), 20, "the printer's web server")


def wired_card(present):
    """Plugs the wired card eth0 in or out."""
    slots = {path.name for path in Path(SYSFS, "bus/pci/devices").iterdir()
             if (path / "device").read_text() == "0x100e\n" and (path / "net/eth0").exists() != present}
    bound = {path.name for path in Path(SYSFS, "bus/pci/drivers/e1000").iterdir()}
    slot = min(slots - bound if present else slots & bound)
    Path(SYSFS, "bus/pci/drivers/e1000", "bind" if present else "unbind").write_text(slot)


def heard():
    """Every network on the air as (name, address, kind), from a scan of this moment; the ear is nobody's card."""
    # A daemon that switches radios off switches off all there are, wherever they are.
    card = {folder.name for folder in Path("/sys/class/ieee80211/phy0").glob("rfkill*")}
    with open("/dev/rfkill", "wb", buffering=0) as device:
        for folder in Path("/sys/class/rfkill").glob("rfkill*"):
            if folder.name not in card:
                device.write(struct.pack("=IBBBB", int(folder.name[6:]), 0, 2, 0, 0))
    sh("ip -n ear link set wlan3 up")
    found = set()
    for block in re.split(r"^BSS ", at("ear", "iw dev wlan3 scan flush"), flags=re.M)[1:]:
        name = re.search(r"^\tSSID: ?(.*)$", block, re.M)
        kind = "ad-hoc" if "IBSS" in re.search(r"capability: (.*)", block).group(1) else "access point"
        # One that hides its name is of no row but its own, and its last beacon is heard for a while.
        if name and name.group(1):
            found.add((name.group(1), block[:17], kind))
    return found


class Network:
    """One network on the air, from the making on until stop(); with dhcp, addresses are to be had there. kind is
    open, wep, wpa2 or wpa3; place is who offers it; dhcp is how long an address is had."""

    def __init__(self, name, kind="open", key="", adhoc=False, hidden=False, dhcp=None, place="printer"):
        self.name, self.kind, self.key, self.adhoc, self.hidden, self.place = name, kind, key, adhoc, hidden, place
        self.device = PLACES[place]
        self.processes = []
        self.dhcp = dhcp
        self.start()

    def start(self):
        if self.adhoc:
            self._join_ad_hoc()
            wait_until(lambda: self.name in {name for name, _, _ in heard()}, 30, f"{self.name} on the air")
        else:
            self._offer()
        if self.dhcp:
            net = ADDRESS[self.place].rsplit(".", 1)[0]
            self.processes.append(spawn(
                "dnsmasq", "--no-daemon", "--conf-file=/dev/null", "--port=0", f"--interface={self.device}",
                "--bind-interfaces", f"--dhcp-range={net}.50,{net}.99,255.255.255.0,{self.dhcp}", "--no-ping",
                f"--dhcp-option=3,{ADDRESS[self.place]}", f"--dhcp-option=6,{ADDRESS[self.place]}", "--user=root",
                "--dhcp-authoritative", "--pid-file=", f"--dhcp-leasefile={LOGS}/{self.place}.leases",
                place=self.place, log="dhcp"))

    def _offer(self):
        lines = [f"interface={self.device}", "driver=nl80211", f"ssid={self.name}", "hw_mode=g",
                 f"channel={CHANNEL[self.place]}", f"ignore_broadcast_ssid={int(self.hidden)}"]
        lines += {
            "open": [],
            "wep": ["auth_algs=1", "wep_default_key=0", f'wep_key0="{self.key}"'],
            "wpa2": ["wpa=2", "wpa_key_mgmt=WPA-PSK", "rsn_pairwise=CCMP", f"wpa_passphrase={self.key}"],
            "wpa3": ["wpa=2", "wpa_key_mgmt=SAE", "rsn_pairwise=CCMP", f"sae_password={self.key}", "ieee80211w=2"],
        }[self.kind]
        path = LOGS / f"{self.place}.conf"
        path.write_text("\n".join(lines) + "\n")
        before = log_of("hostapd").count("AP-ENABLED")
        self.processes.append(spawn("hostapd", path, place=self.place, log="hostapd"))
        wait_until(lambda: log_of("hostapd").count("AP-ENABLED") > before, 20, f"{self.name} offered")

    def _join_ad_hoc(self):
        key = f" key d:0:{self.key}" if self.kind == "wep" else ""
        at(self.place, f"sh -ec 'ip link set {self.device} down; iw dev {self.device} set type ibss; "
                       f"ip link set {self.device} up; iw dev {self.device} ibss join \"{self.name}\" 2412{key}'")

    def stop(self):
        for process in self.processes:
            end(process)
        self.processes.clear()
        if self.adhoc:
            at(self.place, f"sh -c 'iw dev {self.device} ibss leave; ip link set {self.device} down; "
                           f"iw dev {self.device} set type managed'")

    def holds(self, address):
        """Whether a card is a member of this network, by what its other end says."""
        return address in at(self.place, f"iw dev {self.device} station dump")


def home(lease="1h"):
    return Network(HOME, "wpa2", HOME_KEY, dhcp=lease, place="home")
