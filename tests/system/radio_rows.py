#!/usr/bin/env python3
"""The rows of the radio laboratory, for the test runner.

usage: radio_rows.py list               the hosts and their rows
       radio_rows.py play HOST [ROW ...]    plays the rows in one machine and keeps each one's result and log
       radio_rows.py judge HOST ROW     tells of the row as it was played: exit status, and the log when it failed
"""
import os
import shutil
import sys
from pathlib import Path

import radio

sys.path.insert(0, str(radio.HERE / "radio"))
import distribution  # noqa: E402
import rows  # noqa: E402

BUILD = Path(os.environ.get("LA_BUILD", radio.BINARY.parents[1])).resolve()


def results(host):
    return BUILD / "radio" / host


def play(host, *chosen):
    folder = results(host)
    shutil.rmtree(folder, ignore_errors=True)
    folder.mkdir(parents=True)
    if reason := radio.missing("debian" if host == "debian" else "host"):
        (folder / "skipped").write_text(reason)
        radio.skip(reason)
    if host == "debian":
        status = radio.boot(["python3", f"/host{radio.HERE}/radio/distribution.py", *chosen], folder, "debian",
                            limit=1100)
        sys.exit(0 if status == 0 else 1)
    todo, tries = chosen, 2
    while tries:
        status = radio.boot(["python3", f"/host{radio.HERE}/radio/rows.py", host, *todo], folder, limit=1100)
        # The air is shared and times are real there: a row that fails gets a machine of its own once more, and says so.
        todo = [name for name in todo or rows.rows_of(host)
                if not (result := folder / f"{name}.result").exists() or result.read_text() != "held"]
        tries = tries - 1 if todo else 0
        if tries:
            for log in filter(Path.exists, (folder / f"{name}.log" for name in todo)):
                shutil.copy(log, log.with_suffix(".first.log"))
            print(f"{host}: once more: {' '.join(todo)}", flush=True)
    sys.exit(0 if status == 0 else 1)


def judge(host, name):
    folder = results(host)
    if (folder / "skipped").exists():
        radio.skip((folder / "skipped").read_text())
    result = folder / f"{name}.result"
    if not result.exists():
        sys.exit(f"{name} did not run: see the test that boots the machine")
    held = result.read_text() == "held"
    print((folder / f"{name}.log").read_text())
    if (first := folder / f"{name}.first.log").exists():
        print(f"{'held' if held else 'failed'} at the second try; the log of the first:\n{first.read_text()}")
    sys.exit(0 if held else 1)


def main():
    match sys.argv[1:]:
        case ["list"]:
            for host in rows.hosts.HOSTS:
                print(host, *rows.rows_of(host))
            print("debian", *distribution.HOSTS)
        case ["play", host, *chosen]:
            play(host, *chosen)
        case ["judge", host, name]:
            judge(host, name)
        case _:
            sys.exit(__doc__)


if __name__ == "__main__":
    main()
