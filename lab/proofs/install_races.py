# SPDX-License-Identifier: BSD-2-Clause
"""Several installers at once, and updates that change while they are installed."""

import contextlib
import itertools
import os
import random
import subprocess
import threading
from pathlib import Path

import pytest

from lab.carriers import namespace
from lab.oracles.installer import (DONE, FAILED, PROGRAM, SOURCE, announced, first,
                                   hidden, names, next_boot, put_update, run, zone)
from lab.oracles.trial import fail
from lab.words.device import Device, encoded
from lab.words.paths import DOWNLOADS, update_path

INCOMING = "/var/db/incoming/"


def several(count: int) -> Device:
    device = first()
    for number in range(count):
        put_update(device, f"{INCOMING}2024b.1.{number}", "2024b", 3600)
    return device


@pytest.mark.parametrize("turn", range(30))
def test_several_at_once(turn, count):
    """One works, the others say so in a line; each of them prunes now and then."""
    chance = random.Random(turn)
    namespace.build(several(6))
    before = namespace.look()
    running = [subprocess.Popen(
        [PROGRAM, "--prune" if chance.random() < 0.2 else
         f"{INCOMING}2024b.1.{number}"],
        stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True)
        for number in chance.sample(range(6), 6)]
    ended = [(each.communicate()[1], each.returncode, each.args[1]) for each in running]
    after = namespace.look()
    found = [f"{log!r}, status {status}" for log, status, _ in ended
             if status not in (0, 3, 4) or log.count("\n") != (status != 0)]
    done = [word.removeprefix(INCOMING) for _, status, word in ended
            if status == 0 and word != "--prune"]
    if announced(after) != (update_path(max(done)) if done else None):
        found.append(f"done are {done}, announced is {announced(after)}")
    if set(names(after)) - set(done) or hidden(after):
        found.append(f"done are {done}, but there are {names(after)}")
    fail("several at once", found, before)
    count("of them busy", sum(status == 3 for _, status, _ in ended))
    next_boot(after)


def file(content: bytes):
    return lambda path: Path(path).write_bytes(content)


@contextlib.contextmanager
def changing(seed: int):
    """Meanwhile a zone of the update is replaced by one thing after the other, without
    a pause."""
    place = f"{SOURCE}/zoneinfo/Europe/Paris"
    stopped, chance = threading.Event(), random.Random(seed)
    another_zone = file(encoded(zone(0)))
    things = itertools.cycle([
        another_zone, file(encoded(zone(5))), file(b"TZif of a sort"),
        lambda path: os.symlink("/etc/passwd", path), os.mkfifo, another_zone])

    def change():
        while not stopped.is_set():
            next(things)(place + ".next")
            os.rename(place + ".next", place)
            if chance.random() < 0.1:
                os.truncate(f"{SOURCE}/icutz/icutz44l.dat", chance.choice((10, 60)))

    thread = threading.Thread(target=change)
    thread.start()
    try:
        yield
    finally:
        stopped.set()
        thread.join()


@pytest.mark.parametrize("seed", range(20))
def test_an_update_that_changes_meanwhile(seed, count):
    """What is installed has passed every check, or nothing is."""
    namespace.build(first())
    before = namespace.look()
    with changing(seed):
        for _ in range(20):
            told = run(["--force", SOURCE])
            if told.ending == DONE:
                break
            if told.ending != FAILED or told.log.count("\n") != 1:
                fail("an update that changes", [f"{told}"], before)
            count("refused")
    after = namespace.look()
    set_there = DOWNLOADS + SOURCE.rpartition("/")[2]
    found = hidden(after)
    if announced(after):
        count("installed")
        if after[f"{set_there}/zoneinfo/Europe/Paris"].text not in map(
                zone, (3600, 0, 5)):
            found.append("what is installed is not a zone")
        if not after[f"{set_there}/icutz/icutz44l.dat"].text.startswith(
                "\x20\0\xda\x27"):
            found.append("what is installed is not ICU data")
    elif set_there in after:
        found.append("a set is there that is not announced")
    fail("an update that changes", found, before)
