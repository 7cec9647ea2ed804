# SPDX-License-Identifier: BSD-2-Clause
"""What marlin-status costs: the time and the memory of its runs. A device of 400 MB of
updates in 20,000 files, and two hostile ones, all unpacked in the build folder."""

import os
import statistics
import subprocess
import time

from lab.bench.peak import peak
from lab.carriers.namespace import build_below
from lab.words.chosen_devices import activation
from lab.words.device import Device, decoded, sound_device
from lab.words.paths import update_path
from lab.words.places import BUILD

STATUS = BUILD / "bench" / "static" / "tools" / "marlin-status"
TREE = BUILD / "bench" / "device"
HOSTILE = f"{TREE}{update_path('2024a.1.0')}"


def empty():
    subprocess.run(["rm", "-rf", TREE], check=True)


def unpack(device: Device):
    empty()
    build_below(decoded(os.fsencode(TREE)), device.root)


def usual():
    device = sound_device()
    for number in range(40):
        version = f"{2024 + number}a.1.0"
        device.install_update(version)
        device.file(f"{update_path(version)}/icutz/icutz44l.dat", "\0" * 200_000)
        for zone in range(500):
            device.file(f"{update_path(version)}/zoneinfo/zone{zone}", "\0" * 20_000)
    device.announce(version)
    unpack(device)


def terabyte():
    device = activation()
    # Without a line end, so that all of it is one word.
    device.file(f"{update_path('2024a.1.0')}/zoneinfo/+VERSION", "2024a")
    unpack(device)
    os.truncate(f"{HOSTILE}/zoneinfo/+VERSION", 1 << 40)


def crowd():
    unpack(activation())
    folder = os.open(f"{HOSTILE}/icutz", os.O_RDONLY)
    for number in range(1_000_000):
        os.mknod(str(number), dir_fd=folder)
    os.close(folder)


def milliseconds(*command) -> float:
    started = time.monotonic()
    subprocess.run(command, capture_output=True)
    return 1000 * (time.monotonic() - started)


def rows():
    """Device, milliseconds (the median), MB and exit status of marlin-status."""
    for name, make, runs in (("400 MB of updates in 20,000 files", usual, 20),
                             ("a +VERSION of a terabyte", terabyte, 3),
                             ("a million ICU entries", crowd, 3)):
        make()
        command = STATUS, "--root", TREE
        taken = statistics.median(milliseconds(*command) for _ in range(runs))
        memory, status = peak(*command)
        yield name, f"{taken:.1f}", f"{memory / 1024:.1f}", status
    empty()
