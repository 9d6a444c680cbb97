"""The Debian packages, which lie in /report, on a whole Debian with NetworkManager: installed, used, removed."""
import os
import subprocess
import sys
from pathlib import Path

import distribution
import rows
from machine import STORE, sh

TOOL = "/usr/sbin/location-assistant"
# What running daemons and the package manager write by themselves; but systemd-networkd is told by files in NETWORKD.
NETWORKD = "/run/systemd/network"
OTHERS = ("/run/systemd/*", "/run/udev", "/run/user", "/run/dbus", "/run/NetworkManager", "/run/wpa_supplicant", "/run/air",
          "/run/netns", "/var/lib/NetworkManager", "/var/lib/dpkg", "/var/lib/systemd", "/var/log", "/var/cache", "/var/backups",
          "/tmp/systemd*", "/var/tmp/systemd*")


def files():
    skipped = " -o ".join(f"-path '{path}'" for path in OTHERS)
    return set(sh(rf"find / /run /tmp -xdev \( {skipped} \) ! -path '{NETWORKD}*' -prune -o -print").splitlines())


def installed_used_and_removed(visit):
    before = files()
    sh("dpkg -i /report/*.deb >/report/dpkg.txt 2>&1")
    assert sh("dpkg --audit") == "", "half installed"
    visit.say("installed: " + " ".join(sorted(path for path in files() - before if "location-assistant" in path)))
    assert Path(TOOL).exists()
    os.environ["LA_BINARY"] = TOOL
    visit.offer()
    visit.there_and_back()
    # From a location that is kept only "restoreZAT" leads back, so the tool has to stay.
    visit.tool("saveZAT")
    visit.create()
    visit.tool("save")
    removal = subprocess.run(["dpkg", "-r", "location-assistant"], capture_output=True, text=True, check=False)
    assert removal.returncode != 0 and "restoreZAT" in removal.stderr, removal
    visit.page()
    visit.tool("restoreZAT", limit=rows.BACK)
    visit.as_before()
    assert visit.host.tool("create", "from_intro", visit.name)
    visit.page()
    # Removed at the printer, it leads back first.
    sh("dpkg -r location-assistant libmorescf-dev libmorescf1 >>/report/dpkg.txt 2>&1")
    visit.as_before(within=20)
    left = {path for path in files() - before if not path.startswith(str(STORE.parent))}
    assert not left, f"left behind: {sorted(left)}"
    assert not before - files(), f"gone: {sorted(before - files())}"
    assert STORE.exists()
    sh("dpkg -P location-assistant")
    assert not STORE.parent.exists()
    visit.say("removed and purged")


rows.ROWS["installed_used_and_removed"] = installed_used_and_removed, ()


def main():
    log, held = rows.play(distribution.HOSTS["networkmanager"](), "installed_used_and_removed")
    print(log, flush=True)
    print(Path("/report/dpkg.txt").read_text(), flush=True)
    sys.exit(0 if held else 1)


if __name__ == "__main__":
    main()
