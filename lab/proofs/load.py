# SPDX-License-Identifier: BSD-2-Clause
"""Devices with far too much on them: huge directories, deep trees, the longest names
and link targets, files of one huge word, and files without an end. The outcome has to
be the model's, the memory must not exceed what is stated for each, and where there is
more of something the cost has to grow in step with it: of eight times as many, each
may cost at most one and a half times as much."""

import contextlib
import ctypes
import math
import os
import signal
import stat
import subprocess
import sys
from typing import NamedTuple

import pytest

from lab.carriers import boot, namespace
from lab.oracles import model
from lab.oracles.trial import entry_differences, fail, log_differences
from lab.words.chosen_devices import activation
from lab.words.device import Device, Node, decoded
from lab.words.paths import (ICUTZ, LEGACY_ICUTZ, LOCALTIME, RECORD, SYSTEM_ICU,
                             SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO, update_path)

UPDATE = update_path("2024a.1.0")
VERSION = f"{SYSTEM_ZONEINFO}/+VERSION"
MIB = 1 << 20
# What a boot may take where nothing is large; a program that is not static brings its
# libraries.
USUAL_KIB = 8 * 1024
# How much more each may cost where there are eight times as many. Were the cost to grow
# with the square, it would be eight times as much.
DEARER = 1.5
RUNS = 40  # at most, of which the best counts


class Measured(NamedTuple):
    """A boot, and what the kernel has counted of it."""
    ending: str
    log: str
    milliseconds: float  # on a processor, in the program and in the kernel
    kib: int  # of memory, at the peak


def measured_boot() -> Measured:
    """A peak is passed on when a process becomes another program, and ours is high: the
    boot is not a child of ours, but of the small setsid(1), which leaves it."""
    with (open(os.memfd_create("log"), "r+b", buffering=0) as log,
          open(os.devnull, "r+b", buffering=0) as null):
        boot.spawn(["/usr/bin/setsid", "--fork", boot.PROGRAM],
                   {0: null.fileno(), 1: null.fileno(), 2: log.fileno()})
        signal.signal(signal.SIGALRM, kill_children)
        signal.alarm(boot.SECONDS)
        _, status, used = os.wait4(-1, 0)
        signal.alarm(0)
        log.seek(0)
        return Measured(boot.ending_of(status), decoded(log.read()),
                        (used.ru_utime + used.ru_stime) * 1000, used.ru_maxrss)


def kill_children(*_):
    with open("/proc/thread-self/children", encoding="ascii") as children:
        for child in children.read().split():
            os.kill(int(child), signal.SIGKILL)


@pytest.fixture
def load(count, monkeypatch):
    sys.setrecursionlimit(100_000)
    monkeypatch.setattr(model, "READ_SIZE", MIB)  # for a model that is done sooner
    # Orphans of our children fall to us, not to the device's first process.
    pr_set_child_subreaper = 36
    assert ctypes.CDLL(None).prctl(pr_set_child_subreaper, 1, 0, 0, 0) == 0
    return Load(count)


class Load:
    """What every test here does, and counts."""

    def __init__(self, count):
        self.count = count

    def boot(self, what: str, device: Device, most_kib=USUAL_KIB):
        """One boot, compared with the model's."""
        namespace.build(device)
        outcome = model.boot(device)
        booted = measured_boot()
        self.finish(what, booted, log_differences(outcome, booted) +
                    entry_differences(device, namespace.look()), most_kib)

    def finish(self, what, booted, found, most_kib=USUAL_KIB):
        self.count("boots under load")
        self.count("most milliseconds of a boot under load", round(booted.milliseconds))
        self.count("most KiB of a boot under load", booted.kib)
        print(f"{booted.milliseconds:9.1f} ms {booted.kib:8} KiB  {what}")
        if not 0 < booted.kib <= most_kib:
            found.append(f"takes {booted.kib} KiB, of at most {most_kib}")
        fail(what, found, {})

    def grow(self, what, make, size, bytes_each):
        """Boots with an eighth of a size and with all of it, each unit of which may
        take so much memory; `what` and `make` are told the size. The boots that follow
        are all alike, because the device has settled."""

        def least_cost_each(number, enough):
            self.boot(what(number), make(number),
                      USUAL_KIB + number * bytes_each // 1024)
            least = math.inf
            for _ in range(RUNS):
                least = min(least, measured_boot().milliseconds / number)
                if least <= enough:
                    break
            return least

        of_an_eighth = least_cost_each(size // 8, enough=0)
        factor = least_cost_each(size, enough=DEARER * of_an_eighth) / of_an_eighth
        self.count("growths under load")
        self.count("most growth under load, in percent", round(factor * 100))
        if factor > DEARER:
            fail(what(size), [f"each costs {factor:.2f} times as much as with an "
                              f"eighth of them, at most {DEARER}"], {})


def with_file(path, text):
    device = activation("2023d.1.0")
    device.file(path, text)
    return device


@pytest.mark.parametrize("path, what, text, bytes_each", [
    (VERSION, "one word", lambda size: "x" * size, 4),
    (VERSION, "one version", lambda size: "2023" + "c" * (size - 4), 6),
    (VERSION, "blanks before the word", lambda size: " " * size + "2023c\n", 0),
    (VERSION, "bytes behind the word", lambda size: "2023c\n" + "\0" * size, 0),
    (f"{UPDATE}/zoneinfo/+VERSION", "one word", lambda size: "x" * size, 2),
    (f"{SYSTEM_ICU}/icutzformat.txt", "one word", lambda size: "4" * size + "l", 4),
])
def test_a_huge_file(load, path, what, text, bytes_each):
    load.grow(lambda size: f"{path}: {size // MIB} MiB of {what}",
              lambda size: with_file(path, text(size)), 64 * MIB, bytes_each)


def test_an_icu_directory_with_nothing_that_counts(load):
    def crowded(number):
        device = activation("2023d.1.0")
        device.drop(f"{UPDATE}/icutz/icutz44l.dat")
        entries = device.directory(f"{UPDATE}/icutz").entries
        for at in range(number):
            entries[f"icutz{at}l.dat.x"] = Node("file", 0o644)
        return device

    load.grow(lambda number: f"an ICU directory with {number} entries, none of which "
              "counts", crowded, size=200_000, bytes_each=400)


@pytest.mark.parametrize("data_first", [False, True])
def test_a_deep_tree(load, data_first):
    """Beside the ICU data, before it and after it in the listing."""
    device = activation("2023d.1.0")
    icu = f"{UPDATE}/icutz"
    if not data_first:
        device.drop(f"{icu}/icutz44l.dat")
    device.file(icu + "/d" * 1000 + "/icutz45l.dat", "ICU")
    device.file(f"{icu}/icutz44l.dat", "ICU")
    load.boot("a tree 1000 levels deep in an ICU directory", device)


def test_a_tree_deeper_than_any_path(load):
    """Its path would be longer than fts(3) can hold. Nothing below counts: it must
    not keep the data beside it from being found."""
    namespace.build(activation("2023d.1.0"))
    with contextlib.chdir(f"{UPDATE}/icutz"):
        for _ in range(1000):
            os.mkdir("d" * 100)
            os.chdir("d" * 100)
    booted = measured_boot()
    link = os.readlink(ZONEINFO)
    subprocess.run(["/usr/bin/rm", "-rf", f"{UPDATE}/icutz"], check=True,
                   timeout=boot.SECONDS)
    found = [] if (booted.ending, booted.log) == ("exit 0", "") else [
        f"{booted.ending}, printed {booted.log!r}"]
    if link != f"{UPDATE}/zoneinfo":
        found.append(f"zoneinfo is {link}")
    load.finish("a tree 1000 levels deep with names of 100 bytes", booted, found)


def test_the_longest_name_of_an_update(load):
    version = "2024" + "a" * 247 + ".1.0"
    assert len(version) == 255
    load.boot("an update with a name of 255 bytes", activation("2023d.1.0", version))


def padded(start, end, length):
    """A path of this length that means start/end."""
    room = length - len(start) - len(end) - 1
    target = start + "/" + "./" * (room // 2) + "/" * (room % 2) + end
    assert len(target) == length
    return target


@pytest.mark.parametrize("length", [1023, 1024, 1025, 4095])
@pytest.mark.parametrize("path, start, end, without", [
    (ZONEINFO, update_path("2023d.1.0"), "zoneinfo", []),
    (ICUTZ, SYSTEM_ICU, ".", []),
    (LEGACY_ICUTZ, SYSTEM_ICU, ".", []),
    (LOCALTIME, "/usr/share/zoneinfo", "Europe/Paris", []),
    (TZ_LATEST, UPDATE, "x", []),
    (LEGACY_ICUTZ, SYSTEM_ICU, ".", [ICUTZ, TZ_LATEST]),  # to be migrated
])
def test_a_long_link_target(load, path, start, end, without, length):
    device = activation("2023d.1.0")
    for other in without:
        device.drop(other)
    device.link(path, padded(start, end, length))
    load.boot(f"{path} with a target of {length} bytes", device)


@pytest.mark.parametrize("target", ["/dev/zero", "/dev/urandom", "/dev/null",
                                    "/dev/full", "/dev/tty", "/dev/ptmx"])
@pytest.mark.parametrize("path", [
    VERSION, f"{SYSTEM_ICU}/icutzformat.txt", f"{UPDATE}/zoneinfo/+VERSION", RECORD])
def test_a_link_to_a_device(load, path, target):
    """As good as nothing to read, or to write to."""
    if not stat.S_ISCHR(os.stat(target).st_mode):
        pytest.skip(f"on this machine {target} is not a device")
    device = activation("2023d.1.0")
    device.link(path, target)
    namespace.build(device)
    device.put(path, Node("device"))
    outcome = model.boot(device)
    booted = measured_boot()
    found = log_differences(outcome, booted)
    if os.readlink(path) != target:
        found.append(f"{path} is {os.readlink(path)}")
    load.finish(f"{path}: a link to {target}", booted, found)
