#!/usr/bin/env python3
"""The main job, shown to somebody who has never seen it. Exits 1 when the way back did not lead back."""
import difflib
import pprint
import subprocess
import sys
from pathlib import Path

sys.path.insert(0, str(Path(__file__).resolve().parents[1] / "tests/system"))
import lab  # noqa: E402

BOLD, PLAIN = ("\033[1m", "\033[0m") if sys.stdout.isatty() else ("", "")
PROMPT = "Done yet? <y/n>"
DAEMON = "--networkmanager" in sys.argv


def say(text):
    print(f"\n{BOLD}# {text}{PLAIN}", flush=True)


def indented(text):
    print("".join(f"    {line}\n" for line in text.rstrip("\n").split("\n")), end="", flush=True)


def show(command, shown=None):
    print(f"  $ {shown or command}")
    indented(subprocess.run(["sh", "-c", command], capture_output=True, text=True, check=True).stdout)


class Demonstration:
    def __init__(self, title, **options):
        print(f"\n{BOLD}{'=' * 100}\n{title}\n{'=' * 100}{PLAIN}")
        self.machine = lab.Lab(daemon=DAEMON, **options)
        say("The machine: a wired and a wireless card, both in use")
        self.show_network()
        self.before = self.machine.network()

    def show_network(self):
        show("ip -brief link | grep -v ^lo")
        show("ip -brief -4 address | grep -v ^lo")
        show("ip route")
        if DAEMON:
            show("nmcli device | grep -v ^lo")

    def tool(self, *words):
        print(f"  $ location-assistant {' '.join(words)}")
        status, trace = self.machine.tool(*words)
        indented(trace)
        self.expect(status == 0, f"exit status {status}")

    def expect(self, condition, text):
        if not condition:
            print(f"\nNOT SO: {text}")
            indented("\n".join(self.machine.syslog))
            sys.exit(1)

    def locations(self):
        say("The locations of this machine")
        show(f"{lab.BUILD}/examples/locations list", "examples/locations list")

    def only(self, card, other, address):
        say(f"Now only {card} is on")
        self.show_network()
        addresses = self.machine.ipv4(card) or [""]
        self.expect(addresses[0].startswith(address), f"{card} has {addresses}")
        self.expect(self.machine.ipv4(other) is None or DAEMON and not self.machine.ipv4(other), f"{other} is on")

    def page(self):
        say("The printer answers")
        show("ip route get 192.0.0.192 | head -1")
        show("busybox wget -q -O - http://192.0.0.192/")
        self.expect("Demonstration printer" in self.machine.fetch(), "the printer's page")

    def back(self):
        say("And back")
        self.tool("remove")
        self.show_network()
        now = self.machine.network()
        difference = difflib.ndiff(pprint.pformat(self.before).split("\n"), pprint.pformat(now).split("\n"))
        self.expect(now == self.before, "as before\n" + "\n".join(line for line in difference if line[0] != " "))
        say("Addresses, routes, link states and name servers are exactly as before"
            + (", and so are NetworkManager's profiles and devices" if DAEMON else ""))
        self.machine.close()

    def assisted(self, *answers):
        """The assisted run, with these answers typed at its prompt."""
        print("  $ location-assistant test")
        run = self.machine.start("test", stdin=subprocess.PIPE)
        left, line = list(answers), ""
        while byte := run.stdout.read(1):
            line += byte.decode("ascii", "replace")
            if line == PROMPT and left:
                line += left[0] + "\n"
                run.stdin.write(left.pop(0).encode() + b"\n")
                run.stdin.flush()
            if line.endswith("\n"):
                indented(line)
                line = ""
        self.expect(run.wait() == 0 and not left, "the prompt took every answer")


def main():
    lab.enter()

    one = Demonstration("To the printer's own network, with the fixed address it expects")
    one.locations()
    say("To the printer")
    one.tool("create", "from_intro")
    one.only("wlan0", "eth0", "192.0.0.199/24")
    one.page()
    one.back()

    one = Demonstration("The wired card alone, with an address from a DHCP server", dhcp="eth0")
    say("To the network behind the cable")
    one.tool("create", "auto")
    one.only("eth0", "wlan0", "192.168.77.")
    say("What the DHCP server says")
    indented("\n".join(line.split(": ", 1)[1] for line in one.machine.file("dhcp.log").splitlines() if " DHCP" in line))
    one.back()

    one = Demonstration("The whole cycle in one run, with a question to the user")
    one.machine.start_desktop()
    say("Answered with n, an empty line, x and y")
    one.assisted("n", "", "x", "y")
    say("What the browser of the user at the computer was told")
    one.expect(lab.wait_until(lambda: one.machine.file("/tmp/browser") or not lab.other_users()), "a page opened")
    show("cat /tmp/browser" if lab.other_users() else "echo 'nothing: only root can be another user here'")
    one.back()


if __name__ == "__main__":
    main()
