#!/usr/bin/env python3
"""Whole commands measured in the private laboratory, as ratios of what ran side by side in this one run.

Figures are CPU seconds (user and system) that the kernel accounts to a process and to the children that it waited for,
the median of several runs; waiting costs nothing here. Run it through scripts/benchmark.
"""
import os
import statistics
import subprocess
import sys
import time
from pathlib import Path

sys.path.insert(0, str(Path(__file__).resolve().parents[1] / "tests/system"))
import lab  # noqa: E402

RUNS = 15
PROFILE = "comparable"


def cpu(command, **options):
    """CPU seconds and wall seconds of one process."""
    began = time.monotonic()
    process = subprocess.Popen(command, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL,
                               env=lab.ENVIRONMENT, **options)
    _, status, usage = os.wait4(process.pid, 0)
    process.returncode = os.waitstatus_to_exitcode(status)
    if process.returncode != 0:
        raise RuntimeError(f"{command} ended with {process.returncode}")
    return usage.ru_utime + usage.ru_stime, time.monotonic() - began


def tool(*words):
    return cpu(["location-assistant", *words], executable=lab.TOOL)


def total(*measured):
    return sum(one for one, _ in measured), sum(one for _, one in measured)


def medians(samples):
    return [statistics.median(column) for column in zip(*samples, strict=True)]


def report(what, ours, theirs, name):
    print(f"{what}: {ours * 1000:.1f} ms; {name}: {theirs * 1000:.1f} ms; ratio {ours / theirs:.2f}", flush=True)


def create_and_remove():
    return total(tool("create", "auto"), tool("remove"))


def three_nmcli_calls():
    """Adds, activates and deletes a profile with an address by DHCP, as "create auto" and "remove" do."""
    return total(cpu(["nmcli", "connection", "add", "type", "ethernet", "ifname", "eth0", "con-name", PROFILE,
                      "autoconnect", "no", "ipv6.method", "disabled"]),
                 cpu(["nmcli", "connection", "up", PROFILE]),
                 cpu(["nmcli", "connection", "delete", PROFILE]))


def against_nmcli():
    """The same machine, its network in the hands of a running NetworkManager."""
    machine = lab.Lab(daemon=True, dhcp="eth0")
    before = subprocess.run(["nmcli", "-t", "-g", "GENERAL.CONNECTION", "device", "show", "eth0"],
                                capture_output=True, text=True, check=True).stdout.strip()
    ours, theirs = [], []
    for _ in range(RUNS):
        ours.append(create_and_remove())
        theirs.append(three_nmcli_calls())
        subprocess.run(["nmcli", "connection", "up", before], check=True, capture_output=True)
    machine.close()
    (our_cpu, our_wall), (their_cpu, their_wall) = medians(ours), medians(theirs)
    report("create and remove through NetworkManager, CPU", our_cpu, their_cpu, "three nmcli calls")
    report("create and remove through NetworkManager, elapsed", our_wall, their_wall, "three nmcli calls")
    return their_cpu


def without_daemon(nmcli_cpu):
    machine = lab.Lab()
    ours = []
    for _ in range(RUNS):
        ours.append(total(tool("create"), tool("remove")))
    machine.close()
    report("create and remove without NetworkManager, CPU", medians(ours)[0], nmcli_cpu, "three nmcli calls")


def leftovers():
    """One "remove" that deletes left-over temporary locations of 8 services each."""
    figures = {}
    for count in (10, 100, 300):
        samples = []
        for _ in range(3):
            machine = lab.Lab(printer=None)
            write_leftovers(count)
            samples.append(tool("remove")[0])
            machine.close()
        figures[count] = statistics.median(samples)
        print(f"remove of {count} left-over locations: {figures[count] * 1000:.0f} ms of CPU, "
              f"{figures[count] / count * 1000:.2f} ms each", flush=True)
    print(f"growth: 10 to 100 by {figures[100] / figures[10]:.1f}, 100 to 300 by {figures[300] / figures[100]:.1f}")


def write_leftovers(count):
    """A store as `count` interrupted runs on a machine with 8 cards would leave it."""
    tool("create")
    tool("remove")
    tree = lab.Lab.store()
    tool("create")
    made = lab.Lab.store()
    tool("remove")
    service = made["NetworkServices"][next(iter(set(made["NetworkServices"]) - set(tree["NetworkServices"])))]
    next_service = 1000
    for number in range(count):
        identifiers = [str(next_service + i) for i in range(8)]
        next_service += 8
        tree["Sets"][str(1000 + number)] = {
            "UserDefinedName": "kv zat temp set",
            "Network": {"Service": {i: {"__LINK__": f"/NetworkServices/{i}"} for i in identifiers},
                        "Global": {"IPv4": {"PPPOverridePrimary": 0, "ServiceOrder": identifiers}, "NetInfo": {}}}}
        tree["NetworkServices"] |= dict.fromkeys(identifiers, service)
    with lab.STORE.open("wb") as file:
        lab.plistlib.dump(tree, file, sort_keys=False)


def whole_test():
    """ "test" against the printer, with "y" typed at once, beside curl for its probe alone."""
    machine = lab.Lab()
    answer = Path("/tmp/answer")
    answer.write_text("y\n")
    ours, theirs = [], []
    for _ in range(RUNS):
        with answer.open() as typed:
            process = subprocess.Popen(["location-assistant", "test"], executable=lab.TOOL, stdin=typed,
                                       stdout=subprocess.DEVNULL, env=lab.ENVIRONMENT)
            _, _, usage = os.wait4(process.pid, 0)
            process.returncode = 0
        ours.append(usage.ru_utime + usage.ru_stime)
        theirs.append(cpu(["curl", "-s", "-o", "/dev/null", "http://192.0.0.192/mactestfoo.html"])[0])
        tool("remove")
    machine.close()
    report("the whole test command, CPU", statistics.median(ours), statistics.median(theirs), "curl for the probe alone")


def main():
    lab.enter()
    nmcli_cpu = against_nmcli()
    without_daemon(nmcli_cpu)
    leftovers()
    whole_test()


if __name__ == "__main__":
    main()
