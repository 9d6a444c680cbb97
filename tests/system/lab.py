"""A private laboratory: a machine's network that exists only for one process and dies with it.

A wired and a wireless card with live links, a printer and a DHCP server at their other ends, and own /etc, /run,
/tmp, /var/lib, /dev and /sys. Nothing in it reaches the machine's own network or files.

A test file ends with `lab.main()`, which moves the whole run into the laboratory.
"""
import json
import os
import plistlib
import shlex
import signal
import socket
import subprocess
import sys
import unittest
import urllib.request
from pathlib import Path

from machine import (CONNECTIONS, ENVIRONMENT, RESIDENT_LINE, RUNTIME, STORE, daemon_state, listen, nmcli, run, sh, sit_down,
                     start_tool, state, wait_until)

HERE = Path(__file__).resolve().parent
PROJECT = HERE.parents[1]
BINARY = Path(os.environ.get("LA_BINARY", PROJECT / "build/release/app/location-assistant")).resolve()
BUILD = Path(os.environ.get("LA_BUILD", BINARY.parents[1])).resolve()
LAB = Path("/run/lab")
TOOL = LAB / "bin" / BINARY.name
NOBODY = 65534
UPDATE = "--update" in sys.argv
DAEMON = "--networkmanager" in sys.argv  # for the tests that can do without it
FORBID_SKIPS = os.environ.get("LA_FORBID_SKIPS") == "1"

def ip(arguments):
    return sh("ip " + arguments)


def enter():
    """Goes on in the laboratory: the first call replaces this process by one that is inside."""
    if os.environ.pop("LA_LABORATORY", None) is None:
        unshare = ["unshare", "--net", "--mount", "--pid", "--fork", "--mount-proc", "--kill-child"]
        if os.geteuid() != 0:
            unshare += ["--user", "--map-root-user"]
        probe = subprocess.run([*unshare, "true"], capture_output=True, text=True, check=False)
        if probe.returncode != 0:
            skip_all("no namespaces here: " + probe.stderr.strip())
        os.environ["LA_LABORATORY"] = "inside"
        os.execvp(unshare[0], [*unshare, sys.executable, *sys.argv])
    assert os.getpid() == 1

    # What lies under a folder that the laboratory hides is held open and put back at its place.
    hidden = ("/tmp/", "/run/", "/var/lib/")
    kept = {path: os.open(path, os.O_PATH) for path in (PROJECT, BUILD, BINARY.parent) if str(path).startswith(hidden)}
    binaries = os.open(BINARY.parent, os.O_PATH)
    run("sh", HERE / "laboratory/prepare", LAB, binaries, PROJECT / ".lab/root", RESIDENT_LINE, pass_fds=[binaries], cwd="/")
    for path, descriptor in kept.items():
        path.mkdir(parents=True, exist_ok=True)
        run("mount", "-c", "--bind", f"/proc/self/fd/{descriptor}", path, pass_fds=[descriptor])


def skip_all(reason):
    print("LABORATORY SKIP:", reason)
    sys.exit(1 if FORBID_SKIPS else 77)


def main():
    enter()
    arguments = [argument for argument in sys.argv if argument not in ("--update", "--networkmanager")]
    result = unittest.main(module="__main__", argv=arguments, exit=False, verbosity=2, warnings="ignore").result
    if not result.wasSuccessful() or (result.skipped and FORBID_SKIPS):
        sys.exit(1)
    for test, reason in result.skipped:
        print("LABORATORY SKIP:", test, reason)


class Lab:
    """One fresh machine; only one at a time. printer is a manner of printer.py or None; dhcp names the card at whose
    other end a DHCP server answers; with daemon the network before is NetworkManager's work. A card's name ends in its
    number."""

    def __init__(self, cards=("eth0", "wlan0"), printer="well", dhcp=None, daemon=False):
        # Outside, the lines below would change the machine's own network and end its processes.
        if os.getpid() != 1 or not TOOL.exists():
            raise RuntimeError("not in the laboratory: call lab.enter() first")
        self.transcript = ""
        self.syslog = []
        self.daemons = []
        self.cards = cards
        self.by_daemon = daemon
        Path("/etc/resolv.conf").write_text("nameserver 203.0.113.53\n")
        self.listener, self.thread = listen(self.syslog)

        for card in cards:
            ip(f"link add {card} address 02:00:00:00:0{card[-1]}:{ord(card[0]):02x} type veth peer name far-{card} netns far")
            ip(f"-n far link set far-{card} up")
        # The machine before the tool comes: both cards in use, the wired one leads out.
        for card, far, own in (
                ("eth0", "192.168.77.1", ("addr add 192.168.77.10/24 brd + dev eth0", "addr add 192.168.77.11/24 dev eth0",
                                          "route add default via 192.168.77.1 dev eth0 metric 100")),
                ("wlan0", "192.0.0.192", ("addr add 10.20.0.7/16 dev wlan0",
                                          "route add 10.30.0.0/16 via 10.20.0.1 dev wlan0 metric 600"))):
            for command in (f"-n far addr add {far}/24 dev far-{card}",
                            *(() if daemon else (f"link set {card} up", *own))) if card in cards else ():
                ip(command)
        if printer and "wlan0" in cards:
            self.start_printer(printer)
        if dhcp:
            net, server = ("192.0.0", "192.0.0.192") if dhcp == "wlan0" else ("192.168.77", "192.168.77.1")
            self.daemon("dnsmasq", "--no-daemon", "--conf-file=/dev/null", "--port=0", f"--interface=far-{dhcp}",
                        "--bind-interfaces", f"--dhcp-range={net}.50,{net}.99,255.255.255.0,1h",
                        f"--dhcp-option=3,{server}", f"--dhcp-option=6,{server}", "--no-ping", "--pid-file=",
                        f"--dhcp-leasefile={LAB}/leases", "--dhcp-authoritative", "--user=root",
                        f"--log-facility={LAB}/dhcp.log", far=True)
            wait_until(lambda: "DHCP, IP range" in self.file("dhcp.log"))
        run("sh", HERE / "laboratory/make-sysfs", LAB, *cards)
        if daemon:
            self.start_bus()
            self.start_network_manager()
        # A link that is up gets an address of its own a moment later.
        for card in {"eth0", "wlan0"} & set(cards):
            wait_until(lambda card=card: "LOWER_UP" in ip(f"link show {card}") and (
                daemon or "fe80:" in ip(f"-6 addr show {card}")))

    def close(self):
        for process in Path("/proc").glob("[0-9]*"):
            if process.name != "1":
                try:
                    os.kill(int(process.name), signal.SIGKILL)
                except ProcessLookupError:
                    pass
        for process in self.daemons:
            process.wait()
        self.listener.shutdown(socket.SHUT_RDWR)
        self.thread.join()
        self.listener.close()
        sh(f"""
            for card in {' '.join(self.cards)}; do ip link del $card 2>/dev/null || ip -n far link del far-$card || :; done
            rm -rf /dev/log {STORE.parent} {RUNTIME} /run/location-assistant.lock {LAB}/made/* {LAB}/*.log {LAB}/leases /run/dbus
            rm -rf /etc/NetworkManager/* /run/NetworkManager /var/lib/NetworkManager
            find /tmp -xdev -mindepth 1 -not -type d -delete
        """)

    def daemon(self, *command, far=False, **options):
        """Starts a process that ends with this laboratory, at the other end of the cables when far."""
        prefix = ["nsenter", "--net=/run/netns/far"] if far else []
        process = subprocess.Popen([*prefix, *map(str, command)], env=ENVIRONMENT, stdin=subprocess.DEVNULL,
                                   **{"stdout": subprocess.DEVNULL, "stderr": subprocess.DEVNULL} | options)
        self.daemons.append(process)
        return process

    def start_printer(self, manner):
        self.printer = self.daemon(sys.executable, "-B", HERE / "printer.py", manner, LAB / "printer.log", far=True)
        wait_until(lambda: ":80 " in sh("nsenter --net=/run/netns/far ss -Hltn"))

    def stop(self, daemon):
        daemon.kill()
        daemon.wait()

    def start_bus(self):
        Path("/run/dbus").mkdir(exist_ok=True)
        self.daemon("dbus-daemon", f"--config-file={HERE}/bus.conf", "--nofork", "--nopidfile")
        wait_until(Path("/run/dbus/system_bus_socket").exists)

    def start_desktop(self):
        """Lets the resident sit at the computer; what their browser is told goes to /tmp/browser."""
        sit_down()

    def start_network_manager(self):
        if not CONNECTIONS.exists():
            run("cp", "-R", HERE / "laboratory/NetworkManager", "/etc")
            sh(f"chmod 600 {CONNECTIONS}/*")
        log = (LAB / "networkmanager.log").open("ab")
        self.network_manager = self.daemon("NetworkManager", "--debug", stdout=log, stderr=log)
        wait_until(lambda: nmcli("-f DEVICE,STATE device").count(":connected\n") >= len({"eth0", "wlan0"} & set(self.cards)), 20)

    def start(self, *words, **options):
        """The tool as a process, of another user on demand; words are strings or bytes."""
        if "user" in options:
            options |= {"group": options["user"], "extra_groups": []}
        return start_tool(TOOL, *words, **options)

    def tool(self, *words, typed=None, **options):
        """Runs the tool to its end, adds it to the transcript and returns (exit status, standard output)."""
        if typed is not None:
            options["stdin"] = subprocess.PIPE
        process = self.start(*words, **options)
        out, errors = process.communicate(typed, timeout=120)
        out = (out or b"").decode("utf-8", "surrogateescape")
        if errors:
            raise AssertionError(f"on standard error: {errors.decode('utf-8', 'replace')}")
        shown = [word if isinstance(word, str) else repr(word) for word in words]
        self.transcript += f"$ {shlex.join(['location-assistant', *shown])}    # exit {process.returncode}\n{out}"
        if not out.endswith("\n"):
            self.transcript += "\n"
        return process.returncode, out

    def network(self):
        """All that has to be the same before and after; with the daemon, its devices and profiles as well."""
        return state() | (daemon_state(self.cards) if self.by_daemon else {})

    def ipv4(self, card):
        """The card's IPv4 addresses as ADDRESS/PREFIX, or None when it is off."""
        (link,) = json.loads(ip(f"-j addr show {card}"))
        if "UP" not in link["flags"]:
            return None
        return [f"{each['local']}/{each['prefixlen']}" for each in link["addr_info"] if each["family"] == "inet"]

    def fetch(self, page="/"):
        """What the printer answers, fetched without anything of the project's."""
        direct = urllib.request.build_opener(urllib.request.ProxyHandler({}))
        with direct.open(f"http://192.0.0.192{page}", timeout=5) as answer:
            return answer.read().decode()

    @staticmethod
    def file(path):
        try:
            return (LAB / path).read_text()
        except FileNotFoundError:
            return ""

    @staticmethod
    def store():
        with STORE.open("rb") as file:
            return plistlib.load(file)


class LabTest(unittest.TestCase):
    """A test case with a fresh laboratory, made with `options`, for each test."""
    options = {}
    maxDiff = None

    def setUp(self):
        self.lab = Lab(**self.options)
        self.addCleanup(self.lab.close)

    def set_names(self):
        """Names of the locations by ID, and the current one's ID."""
        tree = self.lab.store()
        return {key: value.get("UserDefinedName") for key, value in tree["Sets"].items()}, tree["CurrentSet"][6:]

    def assert_golden(self, name):
        path = HERE / "golden" / (name + ".txt")
        if UPDATE:
            path.write_text(self.lab.transcript, encoding="utf-8", errors="surrogateescape")
        self.assertEqual(path.read_text(encoding="utf-8", errors="surrogateescape"), self.lab.transcript)


def other_users():
    """Whether a process here can be another user than root: not in a user namespace of one user."""
    return Path("/proc/self/uid_map").read_text().split()[2] != "1"


def needs_other_users(test):
    return unittest.skipUnless(other_users(), "only root can be another user here")(test)
