#!/usr/bin/env python3
"""The way there and back through the real NetworkManager, whatever happens in between.

Each row: how the wired card is before, where the tool takes it, what happens then. "auto" takes the wired card to a
DHCP server and switches the other one off; "from_intro" gives the other one a fixed address and switches the wired
one off.
"""
import contextlib
import os
import re
import shutil
import signal
import socket
import subprocess
import threading
import time
from pathlib import Path

import lab
from lab import ip, sh, wait_until

SOCKET = Path("/run/dbus/system_bus_socket")
ROOM = "type ethernet ifname wlan0 con-name room ipv4.method manual ip4 10.20.0.7/16 gw4 10.20.0.1"
STATIC = "ipv4.method manual ip4 192.168.77.10/24 gw4 192.168.77.1"
CREATED = {"auto": ("eth0", "192.168.77."), "from_intro": ("wlan0", "192.0.0.199/24")}

# How the wired card is before: the profiles on it, and what the user did last.
EARLIER = {
    "automatic": (["con-name desk"], None),
    "static": ([f"con-name desk {STATIC}"], None),
    # By itself the daemon would choose the other one.
    "manual": ([f"con-name desk autoconnect no {STATIC}", "con-name best connection.autoconnect-priority 5"],
               "connection up desk"),
    "idle": ([], None),
    "off": (["con-name desk"], "device disconnect eth0"),
}


class Counter:
    """Stands between the tool and the bus, counts what it passes on of the tool's, and ends the tool right after the last
    of that."""

    def __init__(self, last):
        self.victim, self.last, self.calls = None, last, 0

    def __enter__(self):
        self.real = SOCKET.with_name("real_socket")
        SOCKET.rename(self.real)
        self.server = socket.socket(socket.AF_UNIX)
        self.server.bind(str(SOCKET))
        self.server.listen()
        threading.Thread(target=self._accept, daemon=True).start()
        return self

    def __exit__(self, *_):
        self.server.shutdown(socket.SHUT_RDWR)
        self.server.close()
        self.real.rename(SOCKET)

    def _accept(self):
        with contextlib.suppress(OSError):
            while True:
                client, _ = self.server.accept()
                bus = socket.socket(socket.AF_UNIX)
                bus.connect(str(self.real))
                for ends in (bus, client, 0), (client, bus, 1):
                    threading.Thread(target=self._copy, args=ends, daemon=True).start()

    def _copy(self, source, target, counted):
        with contextlib.suppress(OSError):
            while data := source.recv(65536):
                target.sendall(data)
                self.calls += counted
                if counted and self.calls == self.last:
                    wait_until(lambda: self.victim)
                    os.kill(self.victim.pid, signal.SIGKILL)
            target.shutdown(socket.SHUT_RDWR)


class Matrix(lab.LabTest):
    options = {"dhcp": "eth0", "daemon": True}

    def nmcli(self, arguments):
        out = subprocess.run(f"nmcli -w 20 {arguments}", shell=True, capture_output=True, text=True, check=False)
        self.assertEqual(out.returncode, 0, f"{arguments}: {out.stderr}")

    def view(self):
        """All that has to be the same before and after, as lines that each tell one thing."""
        # The kernel takes its own route for multicast away with IPv6, and brings it back with the next address.
        return {f"{what}: {line}" for what, lines in self.lab.network().items()
                for line in (lines.items() if isinstance(lines, dict) else lines) if '"dst": "ff00::/8"' not in line}

    def on(self, card):
        return lab.nmcli(f"-g GENERAL.CONNECTION device show {card}").strip()

    def stop_daemon(self, sign=signal.SIGTERM):
        self.lab.network_manager.send_signal(sign)
        self.lab.network_manager.wait()
        self.lab.daemons.remove(self.lab.network_manager)

    def start_daemon(self):
        self.lab.network_manager = self.lab.daemon("NetworkManager", "--debug")
        wait_until(lambda: lab.nmcli("-g STARTUP general") == "started\n", 20)

    def unplug(self):
        for card in self.lab.cards:
            ip(f"link set {card} down")
            ip(f"addr flush dev {card}")

    def fresh(self, earlier):
        """A machine that was just started, with these profiles."""
        self.stop_daemon(signal.SIGKILL)
        for folder in (lab.CONNECTIONS, Path("/run/NetworkManager"), Path("/var/lib/NetworkManager"), lab.RUNTIME):
            shutil.rmtree(folder, ignore_errors=True)
        shutil.rmtree(lab.STORE.parent, ignore_errors=True)
        sh("rm -f /tmp/*.orig")
        lab.CONNECTIONS.mkdir()
        self.unplug()
        self.start_daemon()
        profiles, last = EARLIER[earlier]
        for profile in profiles:
            self.nmcli(f"connection add type ethernet ifname eth0 {profile}")
        if profiles:
            wait_until(lambda: self.on("eth0"))
        if last:
            self.nmcli(last)
        self.nmcli("connection add " + ROOM)
        wait_until(lambda: self.on("wlan0") == "room")
        return self.settled()

    def settled(self):
        """The view once nothing in it changes any more: IPv6 goes on for a while after a card is up."""
        wait_until(lambda: "tentative" not in ip("-6 addr") and ":connecting" not in lab.nmcli("-f DEVICE,STATE dev"))
        return self.view()

    @staticmethod
    def without_metrics(view):
        """A daemon that finds a card in use gives it a number of its own, and the next ones higher ones: what stays is
        the order of the routes."""
        metrics = sorted({match for line in view for match in re.findall(r'"metric": (\d{3}),', line)})
        return {re.sub(r'"metric": (\d{3}),', lambda match: f"number {metrics.index(match[1])}", line) for line in view}

    def create(self, mode):
        status, trace = self.lab.tool("create", mode)
        self.assertEqual(status, 0)
        card, address = CREATED[mode]
        self.assertTrue((self.lab.ipv4(card) or [""])[0].startswith(address), trace + "\n".join(self.lab.syslog))
        self.assertEqual(self.on(card), f"location-assistant {card}")

    def remove(self):
        self.assertEqual(self.lab.tool("remove")[0], 0)

    def assert_back(self, before, restarted=False, where=""):
        after = self.settled()
        if restarted:
            before, after = self.without_metrics(before), self.without_metrics(after)
        self.assertEqual((sorted(before - after), sorted(after - before)), ([], []),
                         "\n".join([where, *self.lab.syslog[-5:]]))
        self.assertFalse((lab.RUNTIME / "applied.plist").exists())

    # What happens between the way there and the way back. Each returns what is to be there afterwards.

    def none(self, before):
        return before

    def restart(self, before):
        self.stop_daemon()
        self.start_daemon()
        return before

    def crash(self, before):
        self.stop_daemon(signal.SIGKILL)
        self.start_daemon()
        return before

    def edit(self, before):
        self.nmcli("connection modify desk ipv4.dns-search edited.example")
        edited = {line for line in self.view() if "edited.example" in line}
        self.assertEqual(len(edited), 1)
        return {line for line in before if not line.startswith("files:") or "id=desk" not in line} | edited

    def unplugged(self, before):
        ip("-n far link set far-eth0 down")
        time.sleep(10)
        self.assertIn("unavailable", lab.nmcli("-g GENERAL.STATE device show eth0"))
        ip("-n far link set far-eth0 up")
        wait_until(lambda: self.on("eth0") == "location-assistant eth0", 20)
        return before

    def stopped(self, before):
        self.lab.network_manager.send_signal(signal.SIGSTOP)
        self.remove()
        self.lab.network_manager.send_signal(signal.SIGCONT)
        return before

    def dead(self, before):
        self.stop_daemon(signal.SIGKILL)
        self.remove()
        self.start_daemon()
        return before

    def test_matrix(self):
        rows = [(earlier, mode, event) for earlier in EARLIER for mode in CREATED for event in ("none", "crash")]
        rows += [(earlier, "auto", "restart") for earlier in EARLIER]
        rows += [("automatic", "from_intro", "edit"), ("static", "auto", "edit"), ("manual", "auto", "unplugged"),
                 ("static", "from_intro", "stopped"), ("static", "from_intro", "dead")]
        for earlier, mode, event in rows:
            with self.subTest(earlier=earlier, mode=mode, event=event):
                before = self.fresh(earlier)
                self.create(mode)
                after = getattr(self, event)(before)
                self.remove()
                self.assert_back(after, event in ("crash", "restart", "dead"))

    def run_to(self, call, *words):
        """Runs the tool to its n-th call on the bus. Whether it was ended there, and not done before."""
        with Counter(call) as counter:
            counter.victim = process = self.lab.start(*words)
            process.communicate()
        return process.returncode == -signal.SIGKILL

    def test_ended_at_every_call(self):
        for earlier, mode, step in (("automatic", "auto", 1), ("manual", "from_intro", 4), ("off", "auto", 6)):
            before = self.fresh(earlier)
            for going in (True, False):
                ended, call = True, 0
                while ended:
                    call += step
                    if not going:
                        self.create(mode)
                    ended = self.run_to(call, *(("create", mode) if going else ("remove",)))
                    self.remove()
                    self.assert_back(before, where=f"{earlier}, {mode}, {'going' if going else 'back'}, call {call}")
                self.assertGreater(call, 20)

    def test_somebody_else_takes_over(self):
        self.fresh("automatic")
        self.nmcli(f"connection add type ethernet ifname eth0 con-name mine autoconnect no {STATIC}")
        for mode in CREATED:
            with self.subTest(mode):
                self.create(mode)
                if mode == "from_intro":
                    self.nmcli("device set eth0 managed yes")
                self.nmcli("connection up mine")
                self.remove()
                self.assertEqual((self.on("eth0"), self.on("wlan0")), ("mine", "room"))
                self.assertNotIn("location-assistant", "".join(self.view()))
                self.nmcli("connection up desk")

    def test_restart_of_the_machine(self):
        before = self.fresh("static")
        self.create("auto")
        self.stop_daemon(signal.SIGKILL)
        for folder in (lab.RUNTIME, Path("/run/NetworkManager")):
            shutil.rmtree(folder)
        self.unplug()
        self.start_daemon()
        wait_until(lambda: self.on("eth0") and self.on("wlan0"))
        self.remove()
        self.assert_back(before)

    def assert_fails(self, reason, within, *words):
        """The run ends in time and the system log has one line about it."""
        process = self.lab.start(*words)
        process.communicate(timeout=within)
        wait_until(lambda: any(reason in line for line in self.lab.syslog))
        self.assertEqual(sum(reason in line for line in self.lab.syslog), 1)
        self.lab.syslog.clear()

    def test_nobody_answers(self):
        before = self.fresh("automatic")
        with self.subTest("a mute bus"):
            SOCKET.rename("/run/dbus/real")
            with socket.socket(socket.AF_UNIX) as mute:
                mute.bind(str(SOCKET))
                mute.listen()
                self.assert_fails("no answer in 1 s", 5, "create", "auto")
            Path("/run/dbus/real").rename(SOCKET)
            self.remove()
            self.assert_back(before)
        with self.subTest("a stopped daemon"):
            self.lab.network_manager.send_signal(signal.SIGSTOP)
            self.assert_fails("no answer in 5 s", 10, "create", "auto")
            self.lab.network_manager.send_signal(signal.SIGCONT)
            self.remove()
            self.assert_back(before)
        with self.subTest("a daemon that is killed while it is waited for"):
            ip("-n far addr del 192.168.77.1/24 dev far-eth0")
            threading.Timer(3, lambda: self.lab.network_manager.kill()).start()
            self.assert_fails("left the bus", 10, "create", "auto")
            ip("-n far addr add 192.168.77.1/24 dev far-eth0")
            self.stop_daemon(signal.SIGKILL)
            self.start_daemon()
            self.remove()
            self.assert_back(before, restarted=True)

    def test_profiles(self):
        """The daemon takes every profile that the unit tests make."""
        self.fresh("idle")
        run = subprocess.run([lab.BUILD / "tests/unit/networkmanager/test_networkmanager", "--gtest_filter=Profile.*"],
                             capture_output=True, text=True, check=False,
                             env=lab.ENVIRONMENT | {"LA_NETWORKMANAGER_BUS": str(SOCKET)})
        self.assertEqual(run.returncode, 0, run.stdout[-3000:] + run.stderr)
        self.assertRegex(run.stdout, r"PASSED.* [1-9]\d* tests?")

    def test_unmanaged_card(self):
        """What the daemon is told to leave alone is led without it."""
        self.fresh("idle")
        self.nmcli("device set eth0 managed no")
        ip("addr add 192.168.77.10/24 dev eth0")
        ip("route add default via 192.168.77.1 dev eth0 metric 50")
        before = self.settled()
        for mode in CREATED:
            with self.subTest(mode):
                self.lab.tool("create", mode)
                self.assertEqual((self.lab.ipv4("eth0") or [""])[0].startswith("192.168.77."), mode == "auto")
                self.assertIn("unmanaged", lab.nmcli("-g GENERAL.STATE device show eth0"))
                self.remove()
                self.assert_back(before)


if __name__ == "__main__":
    lab.main()
