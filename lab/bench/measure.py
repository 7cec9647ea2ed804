# SPDX-License-Identifier: BSD-2-Clause
"""The part of scripts/bench that runs inside the private device; prints JSON:
measure counts PROGRAM..., measure wall ROUNDS PROGRAM..., measure growth PROGRAM,
measure companions MARLIN INSTALL MEND.

A PROGRAM is a file, in whose path "SCENE" stands for the scene's name; the first one
is the floor.
"""

import difflib
import functools
import json
import os
import re
import shlex
import shutil
import statistics
import subprocess
import sys
import tempfile
import time
from collections.abc import Callable, Iterator
from pathlib import Path

from lab.bench.peak import peak
from lab.carriers import namespace
from lab.oracles.installer import SOURCE, icu_data, put_update, zone
from lab.words.chosen_devices import activation
from lab.words.device import Device, sound_device
from lab.words.paths import (DOWNLOADS, ICUTZ, LOCALTIME, RECORD, SYSTEM_ZONEINFO,
                             TZ_LATEST, ZONEINFO, update_path)
from lab.words.seen import as_device

ICU = f"{update_path('2024a.1.0')}/icutz"
# All that the programs get, and this only because the script needs its tools. Each
# variable more is some 550 instructions more in the C library's start-up.
ENVIRONMENT = {"PATH": "/usr/bin"}


def in_use(version: str) -> Device:
    device = sound_device()
    device.install_update(version)
    device.point_links_at(version)
    return device


def bad_localtime() -> Device:
    device = sound_device()
    device.link(LOCALTIME, "/nowhere")
    return device


SCENES = {"quiet": sound_device, "update": lambda: in_use("2024a.1.0"),
          "activation": activation, "reset": lambda: in_use("2022a.1.0"),
          "localtime": bad_localtime}
UNCHANGED = ("quiet", "update")  # scenes in which a boot has nothing to do


def placed(scene: str, programs) -> list[str]:
    """A program is the same number of instructions only by a path of the same length:
    each is copied to a path of its own."""
    for index, program in enumerate(programs):
        os.makedirs(f"/tmp/{index}", exist_ok=True)
        shutil.copy(program.replace("SCENE", scene), f"/tmp/{index}/program")
    return [f"/tmp/{index}/program" for index in range(len(programs))]


def run(*command: str):
    """Runs a command, which must not fail."""
    subprocess.run(command, env=ENVIRONMENT, stdout=subprocess.DEVNULL,
                   stderr=subprocess.DEVNULL, check=True)


def instructions(program: str, restore: Callable) -> int:
    restore()
    with tempfile.TemporaryDirectory() as profiles:
        run("valgrind", "-q", "--tool=callgrind", "--trace-children=yes",
            f"--callgrind-out-file={profiles}/%p", "--log-file=/tmp/valgrind", program)
        return sum(int(re.search(r"^(?:totals|summary): (\d+)", profile.read_text(),
                                 re.M)[1]) for profile in Path(profiles).iterdir())


def measured(program: str, restore: Callable) -> tuple[int, int, int]:
    """Instructions, system calls and peak memory in kB."""
    counted = instructions(program, restore)
    restore()
    run("strace", "-f", "-qq", "-o", "/tmp/calls", program)
    calls = re.findall(r"^\d+ +[a-z_0-9]+\(", Path("/tmp/calls").read_text(), re.M)
    restore()
    return counted, len(calls), peak(program, env=ENVIRONMENT)[0]


def counts(*programs: str) -> dict[str, list]:
    """By scene, in the order of the programs."""
    found = {}
    for scene, describe in SCENES.items():
        restore = functools.partial(namespace.build, describe())
        commands = placed(scene, programs)
        check_outcomes(commands, restore)
        found[scene] = [measured(command, restore) for command in commands]
        for command, (before, *_) in zip(commands, found[scene]):
            again = instructions(command, restore)
            # A count that differs from run to run is useless; a shell's does.
            if again != before and Path(command).read_bytes()[:2] != b"#!":
                sys.exit(f"measure: {scene}: {command} took {before} instructions, "
                         f"then {again}")
    return found


def check_outcomes(commands: list[str], restore: Callable):
    """All programs must leave the same device, or their costs say nothing."""
    outcomes = []
    for command in commands:
        restore()
        run(command)
        outcomes.append(sorted(as_device(namespace.look()).in_words().splitlines()))
        if outcomes[-1] != outcomes[0]:
            sys.exit("\n".join(difflib.ndiff(outcomes[0], outcomes[-1])) +
                     f"\nmeasure: {command} leaves another device than the floor")


def wall(rounds: str, *programs: str) -> dict[str, list]:
    """By scene, in the order of the programs: the median time in microseconds and its
    ratio to the floor's: median, lowest and highest of the rounds."""
    found = {}
    for scene, describe in SCENES.items():
        device = describe()
        namespace.build(device)
        prepare = () if scene in UNCHANGED else ("--prepare", restoring_links(device))
        floor, *_ = commands = placed(scene, programs)
        found[scene] = []
        for command in commands:
            pairs = [time_pair([floor, command], 1 - turn % 2 * 2, prepare)
                     for turn in range(int(rounds))]
            ratios = [median / least for least, median in pairs]
            found[scene].append((
                statistics.median_high(median for _, median in pairs) * 1e6,
                statistics.median_high(ratios), min(ratios), max(ratios)))
    return found


def restoring_links(device: Device) -> str:
    """A command that does. It runs before every run that is timed, so it is small."""
    made = [f"ln -s {node.text} {path}" for path, node in device.everything()
            if node.kind == "link"]
    taken = f"rm -f {ZONEINFO} {ICUTZ} {LOCALTIME} {TZ_LATEST} {RECORD}"
    return f"sh -c '{'; '.join([taken, *made])}'"


def time_pair(pair: list[str], order: int, prepare) -> list[float]:
    """One right after the other, in turns this (1) and that (-1) first: a ratio to the
    floor is of one round."""
    run("hyperfine", "-N", "--style", "none", "--warmup", "2", "--runs", "20", *prepare,
        "--export-json", "/tmp/pair", *pair[::order])
    timed = json.loads(Path("/tmp/pair").read_text())["results"]
    return [each["median"] for each in timed[::order]]


def growth(program: str) -> list[tuple]:
    """(series, size, instructions, calls, kB) of ever larger devices."""
    [command] = placed("growth", [program])
    return [(series, size, *measured(
        command, functools.partial(run, *shlex.split(restoring_links(device)))))
        for series, size, device in larger_devices()]


def larger_devices() -> Iterator[tuple[str, int, Device]]:
    """Makes each in turn."""
    for size in (10, 250_000, 500_000, 750_000, 1_000_000):
        for match in ("first", "last", "absent"):
            namespace.build(device := in_use("2024a.1.0"))
            fill_icu_directory(size - 1, match)
            yield f"icu-{match}", size, device
    for size in (100, 25_000, 50_000, 75_000, 100_000):
        device = in_use("2024a.1.0")
        for chain in range(size // 100):
            device.directory(f"{ICU}/chain.{chain}" + "/d" * 100)
        namespace.build(device)
        yield "icu-tree", size, device
    for size in (10, 1 << 24, 2 << 24, 3 << 24, 4 << 24):
        device = sound_device()
        device.file(f"{SYSTEM_ZONEINFO}/+VERSION", "2024".ljust(size, "a"))
        namespace.build(device)
        yield "version", size, device


def companions(marlin: str, install: str, mend: str) -> dict:
    """What the installer takes for an update of 1 MB on a disk where fsync(2) costs
    nothing, in ms and kB, the fastest of some runs; and what marlin and the mend take
    on the same quiet boot: instructions, calls, kB."""
    device = sound_device()
    device.directory(DOWNLOADS)
    put_update(device, SOURCE, "2024b", 3600)
    for number in range(600):
        device.file(f"{SOURCE}/zoneinfo/Area{number % 20}/Zone{number}", zone(0, 125))
    device.file(f"{SOURCE}/icutz/icutz44l.dat", icu_data("x" * 200_000))
    restore = functools.partial(namespace.build, device)
    times = []
    for _ in range(11):
        restore()
        started = time.monotonic()
        run(install, SOURCE)
        times.append((time.monotonic() - started) * 1000)
    restore()
    return {"bytes": sum(len(text) for path, text in device.contents().items()
                         if path.startswith(SOURCE)),
            "install": [min(times), peak(install, SOURCE, env=ENVIRONMENT)[0]],
            "quiet": [measured(command, functools.partial(
                namespace.build, in_use("2024a.1.0")))
                for command in placed("quiet", [marlin, mend])]}


def fill_icu_directory(others: int, match: str):
    """Not by way of a description: a million nodes are too many."""
    for number in range(others):
        os.mknod(f"{ICU}/other.{number}", 0o644)
    data = "icutz44l.dat"
    # It is the oldest; made anew it is the newest, at the other end of the listing.
    if match == "absent" or (os.listdir(ICU)[0] == data) != (match == "first"):
        os.unlink(f"{ICU}/{data}")
        if match != "absent":
            os.mknod(f"{ICU}/{data}", 0o644)


if __name__ == "__main__":
    namespace.insist_on_private_device()
    os.umask(0o022)
    job = {"counts": counts, "wall": wall, "growth": growth,
           "companions": companions}[sys.argv[1]]
    print(json.dumps(job(*sys.argv[2:])))
