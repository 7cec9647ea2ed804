# SPDX-License-Identifier: BSD-2-Clause
"""What a companion costs: the time and the memory of its runs. A device of 400 MB of
updates in 20,000 files, and two hostile ones, all unpacked in the build folder."""

import os
import shutil
import statistics
import subprocess
import time
from pathlib import Path

from lab.places import BUILD

STATUS = BUILD / "bench" / "static" / "tools" / "marlin-status"
PEAK = BUILD / "bench" / "static" / "lab" / "bench" / "peak"
TREE = BUILD / "bench" / "device"
DOWNLOADS = "var/db/timezone/tz"
RUNS = 20


def sound() -> Path:
    shutil.rmtree(TREE, ignore_errors=True)
    for folder in ("usr/share/zoneinfo.default/Europe", "usr/share/icu", DOWNLOADS):
        (TREE / folder).mkdir(parents=True)
    (TREE / "usr/share/zoneinfo.default/+VERSION").write_text("2023c\n")
    (TREE / "usr/share/zoneinfo.default/Europe/Paris").write_text("TZif")
    (TREE / "usr/share/icu/icutzformat.txt").write_text("44l\n")
    links = TREE / "var/db/timezone"
    (links / "zoneinfo").symlink_to("/usr/share/zoneinfo.default")
    (links / "localtime").symlink_to("/var/db/timezone/zoneinfo/Europe/Paris")
    return TREE


def update(name: str, files: int, size: int):
    zones = TREE / DOWNLOADS / name / "zoneinfo"
    icu = TREE / DOWNLOADS / name / "icutz"
    (zones / "Europe").mkdir(parents=True)
    (zones / "Europe" / "Paris").write_text("TZif")
    icu.mkdir()
    (zones / "+VERSION").write_text(name.partition(".")[0])
    (icu / "icutz44l.dat").write_bytes(bytes(size))
    for number in range(files):
        (zones / f"zone{number}").write_bytes(bytes(size // 10))
    (TREE / "var/db/timezone/tz_latest").unlink(missing_ok=True)
    (TREE / "var/db/timezone/tz_latest").symlink_to(f"/{DOWNLOADS}/{name}")


def usual():
    sound()
    for number in range(40):
        update(f"{2024 + number}a.1.0", 500, 200_000)


def terabyte():
    sound()
    update("2024a.1.0", 1, 1)
    os.truncate(TREE / DOWNLOADS / "2024a.1.0/zoneinfo/+VERSION", 1 << 40)


def crowd():
    sound()
    update("2024a.1.0", 1, 1)
    folder = os.open(TREE / DOWNLOADS / "2024a.1.0/icutz", os.O_RDONLY)
    for number in range(1_000_000):
        os.mknod(str(number), dir_fd=folder)
    os.close(folder)


def costs(*command) -> tuple[float, float, int]:
    """Of one run: milliseconds, MB and the exit status."""
    started = time.monotonic()
    subprocess.run(command, capture_output=True)
    milliseconds = 1000 * (time.monotonic() - started)
    # Not of a child of this process, which begins as large as Python.
    done = subprocess.run([PEAK, *command], capture_output=True, text=True)
    return milliseconds, int(done.stdout) / 1024, done.returncode


def rows():
    """Device, milliseconds (the median), MB and exit status of marlin-status."""
    for name, make, runs in (("400 MB of updates in 20,000 files", usual, RUNS),
                             ("a +VERSION of a terabyte", terabyte, 3),
                             ("a million ICU entries", crowd, 3)):
        make()
        all_costs = [costs(STATUS, "--root", TREE) for _ in range(runs)]
        milliseconds, memory, statuses = zip(*all_costs)
        yield (name, f"{statistics.median(milliseconds):.1f}", f"{max(memory):.1f}",
               statuses[0])
    subprocess.run(["rm", "-rf", TREE], check=True)
