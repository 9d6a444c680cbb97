"""A whole Debian, booted with its service manager, and who runs the network there: rows that take their time.

The home network gives its addresses away for four minutes only, so that whoever has one comes to renew it.
"""
import sys
import time
from pathlib import Path

import air
import hosts
import rows
from hosts import CARD
from machine import RUNTIME, STORE, sh

LEASE = "4m"
AT_THE_PRINTER = 600  # seconds
ALL = "NetworkManager wpa_supplicant wpa_supplicant@wlan0 systemd-networkd.socket systemd-networkd networking"


class Debian(hosts.Host):
    """What the machines of this file have in common: units and the journal."""
    has_home = True
    files = {}
    units = ""

    def __init__(self):
        sh(f"systemctl stop {ALL} 2>/dev/null || :; ip addr flush dev {CARD} 2>/dev/null || :; "
           f"rm -rf {STORE.parent} {RUNTIME}; echo nameserver 203.0.113.53 >/etc/resolv.conf")
        super().__init__()

    def listen(self):
        self.since = time.time()

    @property
    def syslog(self):
        return sh(f"journalctl -q -t location-assistant -o cat --since=@{self.since:.0f}").splitlines()

    @syslog.setter
    def syslog(self, _):
        pass

    def start(self):
        self.home.stop()
        # Else an address that an earlier host held is kept from this one, and free when the lease has ended.
        (air.LOGS / "home.leases").unlink(missing_ok=True)
        self.home.dhcp = LEASE
        self.home.start()
        for path, text in self.files.items():
            Path(path).parent.mkdir(parents=True, exist_ok=True)
            Path(path).write_text(text)
            Path(path).chmod(0o600 if "networkd" not in self.units else 0o644)
        sh(f"systemctl daemon-reload; systemctl restart {self.units}")

    def end(self):
        self.home.stop()
        for path in self.files:
            Path(path).unlink()

    def state(self):
        listed = sh(f"systemctl list-units --all --plain --no-legend {ALL} dhclient* ifup*").splitlines()
        programs = [path.read_bytes().decode().split("\0") for path in Path("/proc").glob("[0-9]*/cmdline")]
        return super().state() | {
            "units": sorted(" ".join(line.split()[:4]) for line in listed),
            "programs": sorted(" ".join(words) for words in programs if Path(words[0]).name in
                               ("wpa_supplicant", "dhclient", "NetworkManager", "busybox", "systemd-networkd"))}

    def log(self):
        return sh(f"journalctl -q --since=@{self.since:.0f} -o short-monotonic")


class Desktop(Debian, hosts.NetworkManager):
    units = "NetworkManager"

    def start(self):
        super().start()
        air.wait_until(lambda: f"{air.HOME}\n" in self.nmcli("-f SSID device wifi list"), 60, "home heard")
        sh(f"nmcli device wifi connect {air.HOME} password '{air.HOME_KEY}'")


class Networkd(Debian):
    units = "systemd-networkd wpa_supplicant@wlan0"
    files = {"/etc/systemd/network/20-wlan0.network": f"[Match]\nName={CARD}\n[Network]\nDHCP=ipv4\n",
             "/etc/wpa_supplicant/wpa_supplicant-wlan0.conf": (hosts.ETC / "supplicant.conf").read_text()}


class Ifupdown(Debian):
    units = "networking"
    files = {"/etc/network/interfaces.d/wlan0":
             f"auto {CARD}\niface {CARD} inet dhcp\n    wpa-ssid {air.HOME}\n    wpa-psk {air.HOME_KEY}\n"}


HOSTS = {"networkmanager": Desktop, "systemd_networkd": Networkd, "ifupdown": Ifupdown}


def ten_minutes_at_the_printer(visit):
    visit.offer()
    visit.arrive()
    servers = Path("/etc/resolv.conf").read_text()
    routes = sh("ip route")
    for _ in range(AT_THE_PRINTER // 60):
        time.sleep(60)
        visit.page()
        assert Path("/etc/resolv.conf").read_text() == servers, "somebody else wrote the name servers"
        assert sh("ip route") == routes, "somebody else changed the routes:\n" + sh("ip route")
    visit.back()
    # The address was taken over by whoever had it before, who goes on renewing it.
    time.sleep(300)
    visit.as_before()


rows.ROWS["ten_minutes_at_the_printer"] = ten_minutes_at_the_printer, ()


def main():
    """usage: distribution.py [HOST ...]: plays the row on these hosts, or on all."""
    report = Path("/report")
    for name in sys.argv[1:] or HOSTS:
        try:
            host = HOSTS[name]()
        except (RuntimeError, TimeoutError) as error:
            print(f"debian {name}: {error}\n" + sh("journalctl -b -o short-monotonic | tail -80"), flush=True)
            continue
        start = time.monotonic()
        log, held = rows.play(host, "ten_minutes_at_the_printer")
        host.end()
        (report / f"{name}.log").write_text(log)
        (report / f"{name}.result").write_text("held" if held else "failed")
        print(f"debian {name}: {'held' if held else 'FAILED'}, {time.monotonic() - start:.1f} s", flush=True)


if __name__ == "__main__":
    main()
