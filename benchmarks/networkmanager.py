#!/usr/bin/env python3
"""What a whole "create auto" and "remove" adds to NetworkManager's own work, beside nmcli doing the same steps, in the
private laboratory.

A relay on the bus parts the time: what ends with a message to a program was spent waiting for the daemon, everything
else is the program's own. Medians of several runs, taken in turn. Run it through scripts/benchmark.
"""
import selectors
import socket
import statistics
import subprocess
import sys
import threading
import time
from pathlib import Path

sys.path.insert(0, str(Path(__file__).resolve().parents[1] / "tests/system"))
import lab  # noqa: E402

RUNS = 15
SOCKET = Path("/run/dbus/system_bus_socket")
NMCLI = ("nmcli connection add type ethernet ifname eth0 con-name comparable autoconnect no ipv6.method disabled",
         "nmcli connection up comparable", "nmcli connection up office", "nmcli connection delete comparable")


class Relay:
    """Stands between the programs and the bus."""

    def __init__(self):
        self.real = SOCKET.with_name("real_socket")
        SOCKET.rename(self.real)
        server = socket.socket(socket.AF_UNIX)
        server.bind(str(SOCKET))
        server.listen()
        self.selector = selectors.DefaultSelector()
        self.selector.register(server, selectors.EVENT_READ)
        self.waited, self.last = 0.0, time.monotonic()
        threading.Thread(target=self._run, args=(server,), daemon=True).start()

    def _note(self, waiting):
        now = time.monotonic()
        self.waited += (now - self.last) if waiting else 0
        self.last = now

    def _run(self, server):
        while True:
            for key, _ in self.selector.select():
                if key.fileobj is server:
                    client, bus = server.accept()[0], socket.socket(socket.AF_UNIX)
                    bus.connect(str(self.real))
                    self.selector.register(client, selectors.EVENT_READ, (bus, False))
                    self.selector.register(bus, selectors.EVENT_READ, (client, True))
                elif key.fileobj.fileno() >= 0:
                    self._pass_on(key.fileobj, *key.data)

    def _pass_on(self, source, target, waiting):
        self._note(waiting)
        try:
            data = source.recv(1 << 20)
            if data:
                target.sendall(data)
        except OSError:
            data = b""
        if not data:
            for end in (source, target):
                self.selector.unregister(end)
                end.close()


def measured(relay, commands):
    """Seconds in all, and the program's own."""
    relay.waited, began = 0.0, time.monotonic()
    relay.last = began
    for words, program in commands:
        subprocess.run(words, executable=program, check=True, stdout=subprocess.DEVNULL, env=lab.ENVIRONMENT)
    whole = time.monotonic() - began
    return whole, whole - relay.waited


def main():
    lab.enter()
    machine = lab.Lab(cards=("eth0",), printer=None, dhcp="eth0", daemon=True)
    relay = Relay()
    ours = [(["location-assistant", *words], lab.TOOL) for words in (("create", "auto"), ("remove",))]
    theirs = [(command.split(), None) for command in NMCLI]
    samples = [measured(relay, ours) + measured(relay, theirs) for _ in range(RUNS)]
    if any(machine.syslog) or machine.ipv4("eth0") != ["192.168.77.10/24", "192.168.77.11/24"]:
        raise RuntimeError("the way back did not lead back: " + "\n".join(machine.syslog))
    whole, own, their_whole, their_own = (statistics.median(column) * 1000 for column in zip(*samples, strict=True))
    print(f"create and remove: {whole:.1f} ms, of which its own {own:.1f} ms")
    print(f"nmcli, the same steps: {their_whole:.1f} ms, of which its own {their_own:.1f} ms")
    print(f"ratio of the programs' own time: {own / their_own:.2f}; of all: {whole / their_whole:.2f}")
    machine.close()


if __name__ == "__main__":
    main()
