# SPDX-License-Identifier: BSD-2-Clause
"""Several installers at once, and updates that change while they are installed."""

import itertools
import os
import random
import subprocess
import threading

import pytest

from lab.carriers import namespace
from lab.device import Device, encoded
from lab.install import (DONE, FAILED, PROGRAM, SOURCE, announced, first, hidden, names,
                         next_boot, put_update, run, zone)
from lab.paths import DOWNLOADS, update_path
from lab.trial import fail

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
    if found:
        fail("several at once", found, before)
    count("of them busy", sum(status == 3 for _, status, _ in ended))
    next_boot(after)


class Changing(threading.Thread):
    """Replaces an update's zone by one thing after the other, without a pause."""

    place = f"{SOURCE}/zoneinfo/Europe/Paris"

    def __init__(self, seed: int):
        super().__init__()
        self.seed, self.stopped = seed, threading.Event()

    def run(self):
        chance, spare = random.Random(self.seed), self.place + ".next"
        for make in itertools.cycle((self.zone_a, self.zone_b, self.text, self.link,
                                     self.fifo, self.zone_a)):
            if self.stopped.is_set():
                return
            make(spare)
            os.rename(spare, self.place)
            if chance.random() < 0.1:
                os.truncate(f"{SOURCE}/icutz/icutz44l.dat", chance.choice((10, 60)))

    def zone_a(self, path):
        self.write(path, encoded(zone(0)))

    def zone_b(self, path):
        self.write(path, encoded(zone(5)))

    def text(self, path):
        self.write(path, b"TZif of a sort")

    def link(self, path):
        os.symlink("/etc/passwd", path)

    def fifo(self, path):
        os.mkfifo(path)

    @staticmethod
    def write(path, content):
        with open(path, "wb") as file:
            file.write(content)


@pytest.mark.parametrize("seed", range(20))
def test_an_update_that_changes_meanwhile(seed, count):
    """What is installed has passed every check, or nothing is."""
    namespace.build(first())
    before = namespace.look()
    changing = Changing(seed)
    changing.start()
    try:
        for _ in range(20):
            told = run(["--force", SOURCE])
            if told.ending == DONE:
                break
            if told.ending != FAILED or told.log.count("\n") != 1:
                fail("an update that changes", [f"{told}"], before)
            count("refused")
    finally:
        changing.stopped.set()
        changing.join()
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
    if found:
        fail("an update that changes", found, before)
