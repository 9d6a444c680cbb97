"""What has to work over the air, row by row: the printer's page, and everything as before on the way back.

A row is a function of (visit); `row` names the hosts on which it has to hold.
"""
import difflib
import pprint
import subprocess
import sys
import time
import traceback
import urllib.request
from pathlib import Path

import air
import hosts
from air import wait_until
from machine import sh

FIXED = ["192.0.0.199/24"]
OUT, BACK = 20 + 1.5, 15 + 1.5  # seconds; the rest is for the tool's own start and end
AGAIN = 150  # seconds after which a host has looked for its networks again
ROWS = {}


def row(*names):
    def add(function):
        ROWS[function.__name__] = (function, names or ("nobody", "supplicant", "networkmanager", "networkmanager-iwd"))
        return function
    return add


def rows_of(host):
    return [name for name, (_, names) in ROWS.items() if host in names]


class Visit:
    """One row's journey: what it puts on the air, what it does with the tool, and what was before."""

    def __init__(self, host, name):
        self.host, self.name = host, name.replace("_", " ").capitalize()
        self.networks = []
        self.lines = []
        self.begun = time.monotonic()
        self.heard_before = len(host.syslog)

    def say(self, text):
        self.lines.append(f"{time.monotonic() - self.begun:6.1f} s  {text}")

    def offer(self, *arguments, **options):
        network = air.Network(options.pop("name", self.name), *arguments, **options)
        self.networks.append(network)
        self.say(f"{network.name}: on the air, {network.kind}{', ad-hoc' if network.adhoc else ''}")
        return network

    def disturb(self, change, *arguments):
        """Changes the machine; it will be brought back to its start after this row."""
        self.host.untouched = False
        change(*arguments)

    def remember(self):
        self.before = self.host.pristine if self.host.untouched else self.host.state()
        self.host.untouched = False
        self.air_before = air.heard()

    def judge(self, words, trace, seconds, limit):
        self.say(f"location-assistant {' '.join(words)}: {seconds:.1f} s\n{trace}")
        assert "fail" not in trace, trace
        assert seconds <= limit, f"{words[0]} took {seconds:.1f} s, more than {limit}"

    def tool(self, *words, limit=OUT):
        trace, seconds = self.host.tool(*words)
        self.judge(words, trace, seconds, limit)

    def create(self, *key, mode="from_intro", limit=OUT):
        self.tool("create", mode, self.name, *key, limit=limit)

    def page(self, within=0):
        """The printer's page, fetched from a member of its network; within: seconds in which that has to come so."""
        direct = urllib.request.build_opener(urllib.request.ProxyHandler({}))
        start = time.monotonic()
        while True:
            try:
                page = direct.open(f"http://{air.ADDRESS['printer']}/", timeout=5).read().decode()
                break
            except OSError as error:
                if time.monotonic() > start + within:
                    raise AssertionError(f"no page from the printer: {error}") from None
                time.sleep(1)
        assert "Demonstration printer" in page
        network = self.networks[-1]
        joined = network.name, "ad-hoc" if network.adhoc else "access point"
        assert self.host.joined() == joined, self.host.joined()
        if network.dhcp:
            assert any(each.startswith("192.0.0.") and each not in FIXED for each in self.host.addresses())
        else:
            assert self.host.addresses() == FIXED, self.host.addresses()
        self.say(f"the printer's page came after {time.monotonic() - start:.1f} s")

    def as_before(self, within=3):
        def difference(before, now):
            lines = difflib.ndiff(*(pprint.pformat(each, width=200).splitlines() for each in (before, now)))
            return "\n".join(line for line in lines if line[0] != " ")

        start = time.monotonic()
        while self.host.joined() != self.before["network"] or (now := self.host.state()) != self.before:
            waited = time.monotonic() - start
            if waited > within:
                raise AssertionError(f"not as before:\n{difference(self.before, self.host.state())}")
            time.sleep(0.2 + waited / 10)
        self.say(f"as before after {time.monotonic() - start:.1f} s")
        self.host.untouched = now == self.host.pristine
        assert (now := air.heard()) == self.air_before, f"on the air:\n{difference(self.air_before, now)}"

    def back(self, limit=BACK, within=3):
        self.tool("remove", limit=limit)
        self.as_before(within)

    def told(self, *parts):
        """The log has a line with all these parts in it, about this row."""
        lines = self.host.syslog[self.heard_before:]
        assert any(all(part in line for part in parts) for line in lines), f"no log line with {parts}: {lines}"

    def on_no_network(self):
        assert self.host.joined() is None, self.host.joined()
        assert self.name not in {name for name, _, _ in air.heard() - self.air_before}, "a network was formed"

    def arrive(self, *key, mode="from_intro"):
        self.remember()
        self.create(*key, mode=mode)
        self.page()

    def there_and_back(self, *key, mode="from_intro"):
        self.arrive(*key, mode=mode)
        self.back()


@row()
def open_access_point(visit):
    visit.offer()
    visit.there_and_back()


@row("networkmanager", "supplicant", "nobody")
def open_ad_hoc(visit):
    visit.offer(adhoc=True)
    visit.there_and_back()


@row("networkmanager", "supplicant", "nobody")
def wep_access_point(visit):
    visit.offer("wep", "abcde")
    visit.there_and_back("abcde")


@row("networkmanager", "supplicant", "nobody")
def wep_ad_hoc(visit):
    visit.offer("wep", "abcdefghijklm", adhoc=True)
    visit.there_and_back("abcdefghijklm")


@row("networkmanager", "networkmanager-iwd", "supplicant")
def wpa2_wrong_key_then_right(visit):
    visit.offer("wpa2", "correct horse")
    visit.remember()
    visit.create("battery staple")
    visit.on_no_network()
    visit.told("wlan0", visit.host.wrong_key)
    visit.create("correct horse")
    visit.page()
    visit.back()


@row("nobody")
def wpa2_without_a_supplicant(visit):
    visit.offer("wpa2", "correct horse")
    visit.remember()
    visit.create("correct horse")
    visit.on_no_network()
    visit.told("wlan0", "supplicant")
    visit.back()


@row("networkmanager", "supplicant")
def wpa3(visit):
    visit.offer("wpa3", "correct horse")
    visit.there_and_back("correct horse")


@row("networkmanager", "supplicant", "nobody")
def hidden(visit):
    visit.offer(hidden=True)
    visit.there_and_back()


@row()
def address_by_dhcp(visit):
    visit.offer(dhcp="1h")
    visit.there_and_back(mode="wirelessAuto")


@row()
def name_that_nobody_offers(visit):
    visit.remember()
    visit.create()
    visit.on_no_network()
    visit.told("wlan0", visit.host.not_there)
    visit.back()


@row()
def switched_on_late(visit):
    visit.remember()
    words = "create", "from_intro", visit.name
    start = time.monotonic()
    run = visit.host.begin_tool(*words)
    time.sleep(10)
    visit.offer()
    trace = run.communicate(timeout=300)[0]
    visit.judge(words, trace, time.monotonic() - start, OUT)
    visit.page(within=30 - (time.monotonic() - start))
    visit.networks[-1].stop()
    visit.back()


@row("networkmanager", "networkmanager-iwd", "supplicant")
def goes_away_and_comes_back(visit):
    network = visit.offer()
    visit.arrive()
    time.sleep(10)  # until nobody scans any more: iwd would at once join what it has just heard
    network.stop()
    time.sleep(15)
    assert visit.host.joined() is None, visit.host.joined()
    network.start()
    visit.page(within=AGAIN)
    visit.back()


@row()
def radio_switched_off(visit):
    visit.offer()
    visit.disturb(visit.host.switch, True)
    wait_until(lambda: visit.host.joined() is None, 10, "the radio off")
    time.sleep(2)
    visit.remember()
    assert visit.before["rfkill"]
    visit.there_and_back()


@row("supplicant")
def switched_off_at_the_printer(visit):
    visit.offer()
    visit.arrive()
    visit.host.switch(True)
    visit.host.tool("remove")
    visit.told("radio was switched off meanwhile")
    visit.host.switch(False)
    visit.back(within=AGAIN)


@row("networkmanager", "networkmanager-iwd", "supplicant")
def home_is_gone(visit):
    visit.offer()
    visit.arrive()
    visit.host.home.stop()
    # Time for a scan or two; a home network that is to be waited for has longer.
    visit.tool("remove", limit=10)
    visit.on_no_network()
    visit.host.home.start()
    visit.as_before(within=AGAIN)


@row("nobody")
def home_joined_by_the_kernel(visit):
    visit.offer(name="Open home", place="home")
    visit.disturb(sh, "ip link set wlan0 up; iw dev wlan0 connect 'Open home'; "
                  "ip addr add 192.168.50.20/24 brd + dev wlan0; ip route add default via 192.168.50.1 dev wlan0")
    wait_until(lambda: visit.host.joined() == ("Open home", "access point"), 10, "at home")
    time.sleep(2)
    visit.offer()
    visit.there_and_back()


@row("networkmanager")
def assisted_run(visit):
    visit.offer()
    nmcli = visit.host.nmcli
    visit.disturb(nmcli, f"connection add type wifi ifname wlan0 con-name printer ssid '{visit.name}' "
                  "ipv4.method manual ipv4.addresses 192.0.0.7/24 ipv6.method disabled connection.autoconnect no")
    wait_until(lambda: "activated" in nmcli("-w 30 connection up printer"), 60, "the printer's network joined by hand")
    try:
        visit.remember()
        visit.host.start_desktop()
        words, start = ("test",), time.monotonic()
        run = visit.host.begin_tool(*words, stdin=subprocess.PIPE)
        trace = run.communicate("n\ny\n", timeout=300)[0]
        visit.judge(words, trace, time.monotonic() - start, OUT + 10)
        assert "Done yet? <y/n>" in trace
        assert "GET /mactestfoo.html" in air.log_of("printer"), "the printer was not looked for"
        visit.page()
        opened = Path("/tmp/browser")
        wait_until(opened.exists, 10, "a page opened")
        assert opened.read_text() == "resident opens http://192.0.0.192/dot11_config_start.htm\n", opened.read_text()
        visit.back()
    finally:
        nmcli("connection delete printer")
        nmcli("connection up Home")


@row("networkmanager")
def cable_to_nowhere_beside_it(visit):
    visit.offer()
    visit.disturb(air.wired_card, True)
    try:
        wait_until(lambda: "STATE:connecting" in str(visit.host.state()["devices"][-1]), 20, "the wired card asks")
        visit.remember()
        visit.create(limit=12)
        visit.page()
        visit.back(limit=10)
    finally:
        air.wired_card(False)


def play(host, name):
    """Plays one row; returns its log and whether it held."""
    visit = Visit(host, name)
    logged = len(host.log())
    held = False
    try:
        ROWS[name][0](visit)
        held = True
    except Exception:  # whatever it is, the other rows go on
        visit.say("NOT SO\n" + traceback.format_exc())
    visit.lines += ["the tool's log:", *host.syslog[visit.heard_before:]]
    if not held:
        try:
            visit.lines += ["the state:", pprint.pformat(host.state(), width=160), "on the air:", str(air.heard())]
        except Exception:
            visit.say(traceback.format_exc())
        visit.lines += ["the daemons' log:", host.log()[logged:][-20000:]]
    for network in visit.networks:
        network.stop()
    if host.home and not host.home.processes:
        host.home.start()
    return "\n".join(visit.lines) + "\n", held


def settle(host):
    """Gives the next row the machine as it was at the start."""
    try:
        host.untouched or wait_until(lambda: host.state() == host.pristine, 3, "as at the start")
    except (TimeoutError, RuntimeError):
        host.begin_again()
    host.untouched = True


def main():
    """usage: rows.py HOST [ROW ...]: plays these rows, or all of the host's, in one machine."""
    name, *chosen = sys.argv[1:]
    report = Path("/report")
    host = hosts.HOSTS[name]()
    print(f"{name}: ready after {Path('/proc/uptime').read_text().split()[0]} s", flush=True)
    for each in chosen or rows_of(name):
        start = time.monotonic()
        log, held = play(host, each)
        (report / f"{each}.log").write_text(log)
        (report / f"{each}.result").write_text("held" if held else "failed")
        print(f"{name} {each}: {'held' if held else 'FAILED'}, {time.monotonic() - start:.1f} s", flush=True)
        settle(host)


if __name__ == "__main__":
    main()
