# SPDX-License-Identifier: BSD-2-Clause
"""Devices with far too much on them: huge directories, deep trees, the longest names
and link targets, files of one huge word, and files without an end. The outcome has to
be the model's, the memory must not exceed what is stated for each, and where there is
more of something the instructions have to grow in step with it."""

import contextlib
import os
import stat
import subprocess
import sys

import pytest

from lab.bench.costs import instructions, peak
from lab.carriers import boot, namespace
from lab.oracles import model
from lab.oracles.trial import entry_differences, fail, log_differences
from lab.words.chosen_devices import NEXT, announced, in_use, made
from lab.words.device import Device, Node, decoded
from lab.words.paths import (ICUTZ, LEGACY_ICUTZ, LOCALTIME, RECORD, SYSTEM_ICU,
                             SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO, update_path)

UPDATE = update_path("2024a.1.0")
VERSION = f"{SYSTEM_ZONEINFO}/+VERSION"
MIB = 1 << 20
# What a boot may take where nothing is large; a program that is not static brings its
# libraries.
USUAL_KIB = 8 * 1024
# How many more instructions each may take where there are eight times as many.
DEARER = 1.02


def measured_boot() -> tuple[boot.Booted, int]:
    """A boot, and the most KiB that it had."""
    with open(os.memfd_create("log"), "r+b", buffering=0) as log:
        kib, status = peak(boot.PROGRAM, log=log)
        log.seek(0)
        return boot.Booted(boot.ending_of(status), decoded(log.read())), kib


@pytest.fixture
def load(count, monkeypatch):
    sys.setrecursionlimit(100_000)
    monkeypatch.setattr(model, "READ_SIZE", MIB)  # for a model that is done sooner
    return Load(count)


class Load:
    """What every test here does, and counts."""

    def __init__(self, count):
        self.count = count

    def boot(self, what: str, device: Device, most_kib=USUAL_KIB):
        """One boot, compared with the model's."""
        namespace.build(device)
        outcome = model.boot(device)
        booted, kib = measured_boot()
        self.finish(what, kib, log_differences(outcome, booted) +
                    entry_differences(device, namespace.look()), most_kib)

    def finish(self, what, kib, found, most_kib=USUAL_KIB):
        self.count("boots under load")
        self.count("most KiB of a boot under load", kib)
        if not 0 < kib <= most_kib:
            found.append(f"takes {kib} KiB, of at most {most_kib}")
        fail(what, found, {})

    def grow(self, what, make, size, bytes_each):
        """Boots with an eighth of a size and with all of it, each unit of which may
        take so much memory; `what` and `make` are told the size."""
        def instructions_each(number):
            self.boot(what(number), make(number),
                      USUAL_KIB + number * bytes_each // 1024)
            return instructions(boot.PROGRAM) / number

        of_an_eighth, of_all = map(instructions_each, (size // 8, size))
        factor = of_all / of_an_eighth
        self.count("growths under load")
        self.count("most growth under load, in percent", round(factor * 100))
        if factor > DEARER:
            fail(what(size), [f"each costs {factor:.2f} times as much as with an "
                              f"eighth of them, at most {DEARER}"], {})


def with_file(path, text):
    device = made(NEXT)
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
        device = made(NEXT)
        device.drop(f"{UPDATE}/icutz/icutz44l.dat")
        entries = device.directory(f"{UPDATE}/icutz").entries
        for at in range(number):
            entries[f"icutz{at}l.dat.x"] = Node("file", 0o644)
        return device

    load.grow(lambda number: f"an ICU directory with {number} entries, none of which "
              "counts", crowded, size=200_000, bytes_each=400)


@pytest.mark.parametrize("data_first", [False, True])
def test_a_deep_tree(load, data_first):
    """It stands beside the ICU data, before it and after it in the listing."""
    load.boot("a tree 1000 levels deep in an ICU directory", made(
        NEXT + "drop U/icutz/icutz44l.dat;" * (not data_first)
        + f"file U/icutz/{'d/' * 1000}icutz45l.dat ICU; file U/icutz/icutz44l.dat ICU"))


def test_a_tree_deeper_than_any_path(load):
    """Its path would be longer than fts(3) can hold. Nothing below counts: it must
    not keep the data beside it from being found."""
    namespace.build(made(NEXT))
    with contextlib.chdir(f"{UPDATE}/icutz"):
        for _ in range(1000):
            os.mkdir("d" * 100)
            os.chdir("d" * 100)
    booted, kib = measured_boot()
    link = os.readlink(ZONEINFO)
    subprocess.run(["/usr/bin/rm", "-rf", f"{UPDATE}/icutz"], check=True,
                   timeout=boot.SECONDS)
    found = [] if booted == ("exit 0", "") else [f"{booted}"]
    if link != f"{UPDATE}/zoneinfo":
        found.append(f"zoneinfo is {link}")
    load.finish("a tree 1000 levels deep with names of 100 bytes", kib, found)


def test_the_longest_name_of_an_update(load):
    version = "2024" + "a" * 247 + ".1.0"
    assert len(version) == 255
    load.boot("an update with a name of 255 bytes",
              made(in_use("2023d.1.0") + announced(version)))


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
    device = made(NEXT)
    for other in without:
        device.drop(other)
    device.link(path, padded(start, end, length))
    load.boot(f"{path} with a target of {length} bytes", device)


@pytest.mark.parametrize("target", ["/dev/zero", "/dev/urandom", "/dev/null",
                                    "/dev/full", "/dev/tty", "/dev/ptmx"])
@pytest.mark.parametrize("path", [
    VERSION, f"{SYSTEM_ICU}/icutzformat.txt", f"{UPDATE}/zoneinfo/+VERSION", RECORD])
def test_a_link_to_a_device(load, path, target):
    """It counts as nothing to read, and as nothing to write to."""
    if not stat.S_ISCHR(os.stat(target).st_mode):
        pytest.skip(f"on this machine {target} is not a device")
    device = made(NEXT)
    device.link(path, target)
    namespace.build(device)
    device.put(path, Node("device"))
    outcome = model.boot(device)
    booted, kib = measured_boot()
    found = log_differences(outcome, booted)
    if os.readlink(path) != target:
        found.append(f"{path} is {os.readlink(path)}")
    load.finish(f"{path}: a link to {target}", kib, found)
