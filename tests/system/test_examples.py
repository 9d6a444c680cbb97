#!/usr/bin/env python3
"""The example programs on live kernel state."""
import fcntl
import os
import subprocess

import lab

CHANGED = 'the network configuration changed!\nMain Key 0="State:/Network/Global/IPv4"\n'
GONE = CHANGED + "Main Key Dict is nil\nsetting gIsNetworkReady to FALSE\n\n"


def there(card, router):
    return (f'{CHANGED}setting gIsNetworkReady to TRUE\nMain Key Dict:\nkey="PrimaryInterface", value="{card}"\n'
            f'key="Router", value="{router}"\n\n')


class Examples(lab.LabTest):
    def test_watch_network(self):
        watcher = self.lab.daemon(lab.BUILD / "examples/watch_network", stdout=subprocess.PIPE)
        self.assertEqual(b"watching\n", watcher.stdout.readline())
        fcntl.fcntl(watcher.stdout, fcntl.F_SETFL, os.O_NONBLOCK)
        heard = ""

        def expect(text):
            nonlocal heard

            def complete():
                nonlocal heard
                heard += (watcher.stdout.read() or b"").decode()
                return len(heard) >= len(text)
            lab.wait_until(complete)
            self.assertEqual(text, heard)
            heard = ""

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
        status = (lab.Path("/proc") / str(watcher.pid) / "status").read_text()
        self.assertLess(int(status.split("VmHWM:")[1].split()[0]), 200_000)
        watcher.terminate()
        expect("the network is ready\n")
        self.assertEqual(0, watcher.wait())

    def test_list_locations(self):
        self.lab.tool("create")
        listed = lab.sh(f"{lab.BUILD}/examples/locations list")
        for line in "  Automatic", "* kv zat temp set", "wlan0", "default route: {PrimaryInterface = wlan0":
            self.assertIn(line, listed)


class Lease(lab.LabTest):
    options = {"dhcp": "eth0"}

    def test_renew(self):
        self.lab.tool("create", "auto")
        lab.sh(f"cp {lab.BUILD}/examples/locations {lab.TOOL.parent}/location-assistant-dhcp-hook /tmp/")
        service = next(key for key, value in self.lab.store()["NetworkServices"].items()
                       if value.get("IPv4") == {"ConfigMethod": "DHCP"})
        self.assertEqual(f"renewing the lease of service {service}\n", lab.sh("/tmp/locations renew"))
        taken = ["DHCPDISCOVER", "DHCPOFFER", "DHCPREQUEST", "DHCPACK"]
        log = [line.split("(")[0].split()[-1] for line in self.lab.file("dhcp.log").splitlines() if "far-eth0)" in line]
        self.assertEqual([*taken, "DHCPRELEASE", *taken], log)
        self.assertEqual(1, len(self.lab.ipv4("eth0")))


if __name__ == "__main__":
    lab.main()
