#!/usr/bin/env python3
"""Installs Debian packages on a whole Debian in an emulated machine, goes to a printer and back with them, and removes
them. usage: package_trial.py PACKAGE ...
"""
import os
import shutil
import sys
import tempfile
from pathlib import Path

import radio


def main():
    packages = [Path(name) for name in sys.argv[1:]]
    if not packages:
        sys.exit(__doc__)
    if reason := radio.missing("debian"):
        print("LABORATORY SKIP:", reason)
        sys.exit(1 if os.environ.get("LA_FORBID_SKIPS") == "1" else radio.SKIP)
    with tempfile.TemporaryDirectory() as report:
        for package in packages:
            shutil.copy(package, report)
        status = radio.boot(["python3", f"/host{radio.HERE}/radio/package.py"], Path(report), "debian", memory=2000)
    if status is None:
        print("The machine ended without a result.")
    sys.exit(1 if status is None else status)


if __name__ == "__main__":
    main()
