# SPDX-License-Identifier: BSD-2-Clause
"""The program is killed at every system call of every chosen boot, before the call
takes effect (and therefore also after the one before it), and boots again until it has
settled.

After one undisturbed boot "zoneinfo" and "localtime" can be used, and nothing that is
not the program's has changed (`properties`). In the end the device is what it would
have been without the kill, except for the windows that are named and pinned. Then the
next boot is killed as well, for every pair of changes to a link: the device has to
settle in the same way.
"""

import collections
from collections.abc import Iterator

import pytest

from lab.carriers import boot
from lab.oracles import model
from lab.oracles.conditions import Killed
from lab.oracles.trial import fail, left, real, recovers, undisturbed
from lab.proofs.windows import window_of
from lab.words.chosen_devices import CHOSEN
from lab.words.device import Device
from lab.words.seen import Call, Entries


def kills(traced: list[Call]) -> Iterator[Killed]:
    """One before every call but the first, which strace makes itself."""
    in_the_pass = boot.pass_of(traced)
    carried_out = 0
    for call in traced[1:]:
        within = call in in_the_pass
        carried_out += within
        yield Killed(call.call, call.number, carried_out + (not within))


def single_kills(_):
    for name in CHOSEN:
        for kill in kills(undisturbed(name).calls):
            yield pytest.param(name, kill, id=f"{name}: {kill.name}")


def kills_at_links(device: Device):
    """One before every change to a link in the next boot of a described device."""
    counts = collections.Counter()
    for number, (name, _) in enumerate(model.boot(device).calls, start=1):
        if name == "rmdir":  # some machines have no such call and use unlink's
            return
        if name in ("symlink", "unlink"):
            counts[name] += 1
            yield Killed(boot.family(name), counts[name], number)


def pairs(_):
    for name, make in CHOSEN.items():
        for first in kills_at_links(make()):
            device = make()
            model.boot(device, killed_before=first.killed_before)
            for second in kills_at_links(device):
                yield pytest.param(name, first, second,
                                   id=f"{name}: {first.name}, then {second.name}")


def killed(device: Device, kill: Killed, start: Entries, whole_log="") -> model.Outcome:
    """A boot that is killed, really and in the model."""
    outcome = model.boot(device, killed_before=kill.killed_before)
    outcome.ending = "killed"  # perhaps behind the pass
    booted = boot.traced(*kill.options(outcome))
    found = left(device, booted.ending, outcome)
    if whole_log and not whole_log.startswith(booted.log):
        found.append(f"printed {booted.log!r}")
    fail(kill.name, found, start)
    return outcome


@pytest.mark.cases("name, kill", single_kills, quick=3)
def test_a_kill(name, kill, count):
    usual = CHOSEN[name]()
    for _ in range(4):
        model.boot(usual)
    usual = usual.contents()
    device, start = real(name)
    outcome = killed(device, kill, start, undisturbed(name).log)
    recovers(name, device, start)
    there = device.contents()
    for path in sorted(there.keys() | usual.keys()):
        was, now = usual.get(path), there.get(path)
        if now != was:
            window = window_of(path, now, was, outcome.calls)
            if not window:
                fail(kill.name, [f"leaves {path} as {now!r} for good, not as {was!r}"],
                     start)
            count(f"kills leave {window}")


@pytest.mark.cases("name, first, second", pairs, quick=10)
def test_two_kills(name, first, second):
    device, start = real(name)
    killed(device, first, start)
    killed(device, second, start)
    recovers(name, device, start)
