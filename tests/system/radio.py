#!/usr/bin/env python3
"""A whole emulated machine with a real wireless stack and simulated radios that hear each other.

usage: radio.py run SCRIPT [HOST [ARGUMENT ...]]
       radio.py packages PACKAGE ...

The second installs Debian packages on a whole Debian, goes to a printer and back with them, and removes them. The first
boots the machine, plays SCRIPT in it as root and ends with SCRIPT's exit status; what it prints comes out as it is
printed. SCRIPT is an executable file or a Python file; it sees the whole file system of this machine below /host, and
its own root is the same file system with everything that it writes lost at the end. HOST says who runs the network
there, joined to a network "home" when SCRIPT begins:

    bare          nobody, nothing prepared: `modprobe mac80211_hwsim radios=N` is SCRIPT's own affair (the default)
    nobody        wlan0 is down and on no network
    supplicant    a bare wpa_supplicant on wlan0
    networkmanager, networkmanager-iwd

On all but the first a Python SCRIPT finds the host as `host` (radio/hosts.py) and networks to put on the air in `air`
(radio/air.py). The machine's clock counts instructions and idle time is skipped: it keeps time however busy this
computer is.
Environment: LA_BINARY, the tool; RADIO_LIMIT, after how many seconds of this computer's the machine is ended (600).
"""
import glob
import gzip
import os
import re
import shlex
import shutil
import subprocess
import sys
import tempfile
from pathlib import Path

HERE = Path(__file__).resolve().parent
PROJECT = HERE.parents[1]
BINARY = Path(os.environ.get("LA_BINARY", PROJECT / "build/debug/app/location-assistant")).resolve()
LAB = PROJECT / ".lab"
KERNEL = LAB / "machine/boot/vmlinux"
SKIP = 77
HOSTS = ("bare", "nobody", "supplicant", "networkmanager", "networkmanager-iwd")

MODULES = ("virtio_pci", "9pnet_virtio", "9p", "overlay")
# The lower folders of the root come first to last: what is unpacked for the laboratory, then this computer's own.
LOWER = {"host": "/lab/root:/lab/machine:/host", "debian": "/lab/machine:/lab/debian"}

WORDS = "console=ttyS0 panic=-1 loglevel=3 mitigations=off cryptomgr.notests net.ifnames=0 systemd.show_status=0"
END_WITH_PARENT = "setpriv", "--pdeathsig", "KILL"

PROGRAMS = ("NetworkManager", "nmcli", "wpa_supplicant", "wpa_cli", "iwd", "hostapd", "dnsmasq", "dbus-daemon",
            "udevadm",
            "busybox", "dhclient", "iw", "ip", "ss", "nsenter", "sh", "rm", "mkdir", "id", "python3", "wpa_action")

READ = ("/bin", "/sbin", "/lib", "/lib64", "/etc/ld.so.cache", "/etc/nsswitch.conf", "/etc/passwd", "/etc/group",
        "/etc/hosts", "/etc/host.conf", "/etc/gai.conf", "/etc/services", "/etc/protocols", "/etc/localtime",
        "/etc/ssl/openssl.cnf",
        "/etc/iproute2/*", "/usr/lib/x86_64-linux-gnu/libnss_*",
        "/usr/lib/x86_64-linux-gnu/gconv/gconv-modules.cache", "/usr/lib/x86_64-linux-gnu/ossl-modules/*")

# What the emulator says of every hub that ends inside the machine, as ours shall, and the kernel's last words.
NOISE = re.compile(r"hub 0 is not connected to host network$|\] sysrq: Power Off$|\] reboot: Power down$")


def missing(distribution="host"):
    """What the machine needs and is not here, or nothing."""
    if not shutil.which("qemu-system-x86_64"):
        return "no qemu-system-x86_64"
    if not KERNEL.exists():
        return f"no {KERNEL}"
    if distribution == "debian" and not (LAB / "debian/sbin/init").exists():
        return f"no {LAB}/debian: scripts/install-dependencies debian makes it"
    return None


def initial_root(folder, distribution, init):
    """Writes the initial root file system; returns its path."""
    root = folder / "initial"
    (version,) = (path.name for path in (LAB / "machine/usr/lib/modules").iterdir())
    for name in ("bin", "dev", "host", "lab", "modules", "new", "over", "proc", "sys"):
        (root / name).mkdir(parents=True)
    shutil.copy(LAB / "machine/usr/bin/busybox", root / "bin")
    order = []
    for module in MODULES:
        shown = subprocess.run(["modprobe", "-d", LAB / "machine", "-S", version, "--show-depends", module], check=True,
                               capture_output=True, text=True, env={"PATH": "/usr/sbin:/sbin"}).stdout
        for line in shown.splitlines():
            path = Path(line.split()[1])
            if path.name not in order:
                order.append(path.name)
                shutil.copy(path, root / "modules")
    settings = {"modules": " ".join(order), "lower": LOWER[distribution], "init": init, "here": HERE}
    (root / "settings").write_text("".join(f"{key}={shlex.quote(str(value))}\n" for key, value in settings.items()))
    shutil.copy(HERE / "radio/initial-init", root / "init")
    (root / "init").chmod(0o755)
    if distribution == "debian":
        shutil.copy(HERE / "radio/initial-debian", root / "extra")
    names = subprocess.run(["find", "."], cwd=root, check=True, capture_output=True).stdout
    archive = subprocess.run(["cpio", "-o", "-H", "newc", "-R", "0:0", "--quiet"], cwd=root, check=True, input=names,
                             capture_output=True).stdout
    path = folder / "initrd"
    path.write_bytes(gzip.compress(archive, 1))
    shutil.rmtree(root)
    return path


def needed(unpacked):
    """The files that the machine's programs consist of, as it sees them; it copies them before anything is timed. Every
    file that is opened here asks this computer, and meanwhile the idle machine's clock runs on, by as much as this
    computer is slow."""
    environment = {"LD_LIBRARY_PATH": f"{unpacked}/usr/lib/x86_64-linux-gnu", "PATH": "/usr/sbin:/usr/bin:/sbin:/bin"}
    programs = [BINARY, *(unpacked / "usr/lib/x86_64-linux-gnu/NetworkManager").glob("*/*.so")]
    for name in PROGRAMS:
        here = [path for path in (unpacked / "usr").glob(f"*/{name}") if path.is_file()]
        programs += here or [shutil.which(name, path=environment["PATH"])]
    files = {Path(each) for pattern in READ for each in glob.glob(pattern)}
    for program in filter(None, programs):
        listed = subprocess.run(["ldd", program], env=environment, capture_output=True, text=True, check=False).stdout
        files |= {Path(program), *(Path(word) for word in listed.split() if word[0] == "/")}
    files |= {file.resolve() for file in files}
    return sorted(f"/{file.relative_to(unpacked)}" if file.is_relative_to(unpacked) else str(file) for file in files
                  if not file.is_relative_to(BINARY.parent))


def boot(words, report, distribution="host", limit=None, output=sys.stdout):
    """Runs the command `words` in a machine of its own. It finds the folder `report` at /report, and may write there.
    Returns its exit status, or None when the machine ended without one."""
    limit = limit or os.environ.get("RADIO_LIMIT", "600")
    here = shlex.quote(str(HERE))
    (report / "command").write_text(
        "export PATH=/usr/sbin:/usr/bin:/sbin:/bin LC_ALL=C PYTHONUTF8=1 PYTHONCOERCECLOCALE=0\n"
        "export PYTHONDONTWRITEBYTECODE=1 PYTHONUNBUFFERED=1\n"
        f"export LA_BINARY=/build/app/{BINARY.name} PYTHONPATH=/host{here}/radio:/host{here}\n"
        + "".join(f"export {key}={shlex.quote(value)}\n" for key, value in os.environ.items() if "SAN_OPTIONS" in key)
        + f"exec {shlex.join(map(str, words))}\n")
    (report / "needed").write_text("\n".join(needed(LAB / ("debian" if distribution == "debian" else "root"))) + "\n")
    (report / "build").write_text(str(BINARY.parents[1]))
    (report / "status").unlink(missing_ok=True)
    init = f"/bin/sh /host{here}/radio/init" if distribution == "host" else "/sbin/init"
    with tempfile.TemporaryDirectory() as folder:
        machine = subprocess.Popen([
            *END_WITH_PARENT, "timeout", "--foreground", "--signal=KILL", str(limit), *END_WITH_PARENT,
            "qemu-system-x86_64", "-nodefaults", "-no-user-config", "-display", "none", "-no-reboot",
            "-accel", "tcg,thread=single", "-icount", "shift=1,sleep=off", "-rtc", "clock=vm", "-smp", "1",
            "-m", "2000" if distribution == "debian" else "1500", "-kernel", KERNEL, "-initrd", initial_root(Path(folder), distribution, init),
            "-append", WORDS, "-serial", "stdio",
            "-virtfs", "local,path=/,mount_tag=files,security_model=none,readonly=on,multidevs=remap",
            "-virtfs", f"local,path={LAB},mount_tag=lab,security_model=none,readonly=on",
            "-virtfs", f"local,path={report},mount_tag=report,security_model=none",
            # Two cards and a cable between them; their driver, e1000, is not loaded.
            "-netdev", "hubport,id=near,hubid=0", "-device", "e1000,netdev=near",
            "-netdev", "hubport,id=far,hubid=0", "-device", "e1000,netdev=far",
        ], stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
        try:
            for line in machine.stdout:
                line = line.decode("utf-8", "replace").rstrip("\r\n")
                if not NOISE.search(line):
                    print(line, file=output, flush=True)
        finally:
            machine.kill()
            machine.wait()
    status = report / "status"
    return int(status.read_text()) if status.exists() and status.read_text().strip() else None


def skip(reason):
    print("LABORATORY SKIP:", reason)
    sys.exit(1 if os.environ.get("LA_FORBID_SKIPS") == "1" else SKIP)


def main():
    distribution = "host"
    with tempfile.TemporaryDirectory() as report:
        match sys.argv[1:]:
            case ["run", script, *rest] if (rest or ["bare"])[0] in HOSTS:
                host, *arguments = rest or ["bare"]
                words = [f"/host{Path(script).resolve()}", *arguments]
                if script.endswith(".py"):
                    words.insert(0, "python3")
                if host != "bare":
                    words = ["python3", f"/host{HERE}/radio/hosts.py", host, *words]
            case ["packages", *packages] if packages:
                distribution, words = "debian", ["python3", f"/host{HERE}/radio/package.py"]
                for package in packages:
                    shutil.copy(package, report)
            case _:
                sys.exit(__doc__)
        if reason := missing(distribution):
            skip(reason)
        status = boot(words, Path(report), distribution)
    if status is None:
        print("The machine ended without a result.")
    sys.exit(1 if status is None else status)


if __name__ == "__main__":
    main()
