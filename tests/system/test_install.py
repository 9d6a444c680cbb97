#!/usr/bin/env python3
"""What is installed, and programs that are built upon it: others' and the examples."""
import fcntl
import os
import re
import shlex
import shutil
import subprocess
import unittest
from pathlib import Path

import lab

PLACE = lab.BUILD / "installed"
PREFIX = PLACE / "a prefix"
HEADERS = PREFIX / "include/location-assistant-1"
CACHE = dict(re.findall(r"^(\w+):\w+=(.*)$", (lab.BUILD / "CMakeCache.txt").read_text(), re.M))
LIBRARIES = PREFIX / CACHE["CMAKE_INSTALL_LIBDIR"]
SANITIZE = [f"-fsanitize={CACHE['LA_SANITIZE']}"] if CACHE["LA_SANITIZE"] else []
STRICT = "-Wall", "-Wextra", "-Wpedantic", "-Wshadow", "-Wconversion", "-Wsign-conversion", "-Wundef", "-Werror"
ENVIRONMENT = lab.ENVIRONMENT | {"PKG_CONFIG_PATH": f"{LIBRARIES}/pkgconfig", "LD_LIBRARY_PATH": str(LIBRARIES)}
DEFAULT_ROUTE = "{PrimaryInterface = eth0; Router = 192.168.77.1}\n"
TAKEN = ["DHCPDISCOVER", "DHCPOFFER", "DHCPREQUEST", "DHCPACK"]
CHANGED = 'the network configuration changed!\nMain Key 0="State:/Network/Global/IPv4"\n'
GONE = CHANGED + "Main Key Dict is nil\nsetting gIsNetworkReady to FALSE\n\n"


def run(*words, **options):
    done = subprocess.run([*map(str, words)], env=ENVIRONMENT, text=True, check=False,
                          **{"capture_output": True} | options)
    if done.returncode:
        raise AssertionError(f"{shlex.join(map(str, words))}\n{done.stdout}{done.stderr}")
    return done.stdout


def files_below(folder):
    return {str(path.relative_to(folder)) for path in folder.rglob("*") if not path.is_dir()}


def pkg_config(*words):
    return shlex.split(run("pkg-config", *words, "morescf"))


def compile_c(source, target, *flags):
    """A C program as its maker would build it, with the flags that pkg-config names."""
    run("cc", "-std=c11", *STRICT, *SANITIZE, "-xc", source, "-xnone", "-o", target, *(flags or pkg_config("--cflags", "--libs")))
    return target


def code_in(page, start, end):
    """The one piece of code in a page of the documentation."""
    (code,) = re.findall(f"^{start}\n(.*?)^{end}\n", (lab.PROJECT / page).read_text(), re.M | re.S)
    return code


def setUpModule():
    shutil.rmtree(PLACE, ignore_errors=True)
    run("cmake", "--install", lab.BUILD, "--prefix", PREFIX)


class Installed(unittest.TestCase):
    def test_everything_is_below_the_prefix(self):
        staged = PLACE / "staged"
        run("env", f"DESTDIR={staged}", "cmake", "--install", lab.BUILD)
        self.assertEqual(files_below(staged / CACHE["CMAKE_INSTALL_PREFIX"][1:]), files_below(PREFIX))
        self.assertEqual(len(files_below(staged)), len(files_below(PREFIX)))
        for file in PREFIX.rglob("*.pc"), PREFIX.rglob("*.cmake"):
            for path in file:
                self.assertNotIn(str(lab.PROJECT), path.read_text(), path)

    def test_headers_are_c_and_cplusplus(self):
        headers = sorted(files_below(HEADERS))
        self.assertIn("morescf/MoreSCF.h", headers)
        for header in headers:
            for words in ("gcc", "-xc", "-std=c11"), ("g++", "-xc++", "-std=c++17"), ("clang-14", "-xc", "-std=c11"), (
                    "clang++-14", "-xc++", "-std=c++17"):
                run(*words, *STRICT, f"-I{HEADERS}", "-fsyntax-only", "-", input=f'#include "{header}"\nint some;\n')

    def test_the_public_operations_are_shown_and_nothing_else(self):
        text = "\n".join(re.sub(r"//.*|^ *#(?:.*\\\n)*.*", "", (HEADERS / each).read_text(), flags=re.M)
                         for each in files_below(HEADERS))
        declared = set(re.findall(r"^(?!static|typedef|LA_)[\w* ]*?\b(\w+)\([^*][^;{]*;", text, re.M))
        declared |= set(re.findall(r"^extern const [\w ]+ (\w+);", text, re.M))
        shown = {line.split("@")[0].split()[-1] for line in
                 run("nm", "-D", "--defined-only", LIBRARIES / "libmorescf.so").splitlines()}
        self.assertEqual(declared, shown - {"MORESCF_1"})
        self.assertIn("[libmorescf.so.1]", run("readelf", "-d", LIBRARIES / "libmorescf.so"))


class Built(lab.LabTest):
    options = {"dhcp": "eth0"}

    def test_c_programs(self):
        state = lab.PROJECT / "examples/network_state.c"
        self.assertEqual(DEFAULT_ROUTE, run(compile_c(state, PLACE / "state")))
        static = [LIBRARIES / "libmorescf.a" if flag == "-lmorescf" else flag
                  for flag in pkg_config("--static", "--cflags", "--libs")]
        self.assertEqual(DEFAULT_ROUTE, run(compile_c(state, PLACE / "state-static", *static)))

        watcher = self.lab.daemon(PLACE / "state-static", "20", stdout=subprocess.PIPE)
        self.assertEqual(DEFAULT_ROUTE, watcher.stdout.readline().decode())
        lab.ip("route del default")
        self.assertEqual("no default route\n", watcher.stdout.readline().decode())
        self.lab.stop(watcher)

    def test_cplusplus_programs(self):
        run("cmake", "-S", lab.PROJECT / "examples", "-B", PLACE / "examples", f"-DCMAKE_PREFIX_PATH={PREFIX}",
            f"-DCMAKE_C_FLAGS={' '.join(SANITIZE)}", f"-DCMAKE_CXX_FLAGS={' '.join([*STRICT, *SANITIZE])}",
            f"-DCMAKE_CXX_COMPILER={CACHE['CMAKE_CXX_COMPILER']}", f"-DCMAKE_C_COMPILER={CACHE['CMAKE_C_COMPILER']}")
        run("cmake", "--build", PLACE / "examples")
        locations = PLACE / "examples/locations"
        self.assertIn("* Automatic\n", run(locations, "list"))

        # The tool and the library each find the DHCP client's program in their own installation.
        def called():
            clients = [path.read_bytes().decode().split("\0") for path in Path("/proc").glob("[0-9]*/cmdline")]
            return [words[words.index("-s") + 1] for words in clients if "udhcpc" in words]
        hook = os.path.realpath(PREFIX / CACHE["CMAKE_INSTALL_LIBEXECDIR"] / "location-assistant/location-assistant-dhcp-hook")
        run(PREFIX / CACHE["CMAKE_INSTALL_SBINDIR"] / "location-assistant", "create", "auto")
        self.assertEqual([hook], [os.path.realpath(each) for each in called()])
        listed = run(locations, "list")
        for line in "  Automatic", "* kv zat temp set", "eth0", "default route: {PrimaryInterface = eth0":
            self.assertIn(line, listed)
        service = next(key for key, value in self.lab.store()["NetworkServices"].items()
                       if value.get("IPv4") == {"ConfigMethod": "DHCP"})
        self.assertEqual(f"renewing the lease of service {service}\n", run(locations, "renew"))
        self.assertEqual([hook], [os.path.realpath(each) for each in called()])
        log = [line.split("(")[0].split()[-1] for line in self.lab.file("dhcp.log").splitlines() if "far-eth0)" in line]
        self.assertEqual([*TAKEN, "DHCPRELEASE", *TAKEN], log)
        self.assertEqual(1, len(self.lab.ipv4("eth0")))

    def test_watcher(self):
        watcher = self.lab.daemon(lab.BUILD / "examples/watch_network", stdout=subprocess.PIPE)
        self.assertEqual(b"watching\n", watcher.stdout.readline())
        fcntl.fcntl(watcher.stdout, fcntl.F_SETFL, os.O_NONBLOCK)

        def expect(text):
            heard = []
            lab.wait_until(lambda: heard.append(watcher.stdout.read() or b"") or sum(map(len, heard)) >= len(text))
            self.assertEqual(text, b"".join(heard).decode())

        def there(card, router):
            return (f'{CHANGED}setting gIsNetworkReady to TRUE\nMain Key Dict:\nkey="PrimaryInterface", value="{card}"\n'
                    f'key="Router", value="{router}"\n\n')

        default = "default via 192.168.77.{} dev eth0 metric 100"
        lab.ip("route del " + default.format(1))
        expect(GONE)
        lab.ip("route add " + default.format(2))
        expect(there("eth0", "192.168.77.2"))
        lab.ip("route add default via 10.20.0.1 dev wlan0 metric 50")
        expect(there("wlan0", "10.20.0.1"))
        burst = "".join(f"addr {verb} 10.20.{i}.9/16 dev wlan0\n" for i in range(100) for verb in ["add", "del"] * 25)
        subprocess.run(["ip", "-batch", "-"], input=burst * 2, text=True, check=True)
        lab.ip("-n far link del far-wlan0")
        expect(there("eth0", "192.168.77.2"))
        self.assertLess(int(Path(f"/proc/{watcher.pid}/status").read_text().split("VmHWM:")[1].split()[0]), 200_000)
        watcher.terminate()
        expect("the network is ready\n")
        self.assertEqual(0, watcher.wait())

    def test_code_in_the_documentation(self):
        for page, start, end in ("docs/morescf.3", r"\.EX", r"\.EE"), ("README.md", "```c", "```"):
            source = PLACE / "page.c"
            source.write_text(code_in(page, start, end).replace("\\e", "\\").replace("\\-", "-"))
            self.assertEqual("Automatic\n", run(compile_c(source, PLACE / "page")))


if __name__ == "__main__":
    lab.main()
