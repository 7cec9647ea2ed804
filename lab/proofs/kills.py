# SPDX-License-Identifier: BSD-2-Clause
"""The program is killed at every system call of every chosen boot, before the call
takes effect (and therefore also after the one before it), and boots again.

After one undisturbed boot "zoneinfo" and "localtime" can be used, and nothing that is
not the program's has changed (`properties`). After three boots it is what it would
have been without the kill, except for the windows that are named and pinned below.
Then the next boot is killed as well, for every pair of changes to a link: the device
has to settle in the same way.
"""

import collections
from typing import NamedTuple

import pytest

from lab.carriers import boot, namespace
from lab.oracles import model, properties
from lab.oracles.conditions import Killed
from lab.oracles.trial import entry_differences, fail, real, trial, undisturbed
from lab.words.chosen_devices import ABNORMAL, CHOSEN
from lab.words.device import Device
from lab.words.paths import (DEFAULT_LOCALTIME, ICUTZ, LEGACY_ICUTZ, LOCALTIME, RECORD,
                             ZONEINFO)
from lab.words.seen import Entries

# As many as it takes until a device is settled: an update that was activated after a
# reset, though older than the system's data, is reset once more.
BOOTS_TO_SETTLE = 3


class Window(NamedTuple):
    """From which the next boots do not fully recover. It is open after a kill between
    two changes: after the last call `opened` that was carried out, and before `closed`.
    `left` is what is then different for good."""
    name: str
    path: str
    opened: tuple
    closed: tuple
    left: callable


WINDOWS = [
    Window("an update's zoneinfo without its ICU data",
           ICUTZ, ("symlink", ZONEINFO), ("symlink", ICUTZ),
           lambda left, usual, _: usual is not None),
    Window("the system's zoneinfo with an update's ICU data",
           ICUTZ, ("symlink", ZONEINFO), ("unlink", ICUTZ),
           lambda left, usual, _: left is not None and usual is None),
    Window("a legacy link that dangles is kept",
           LEGACY_ICUTZ, ("symlink", ZONEINFO), ("unlink", LEGACY_ICUTZ),
           lambda left, usual, _: usual is None),
    Window("an update older than the system's data is not activated",
           RECORD, ("unlink", ZONEINFO), ("create", RECORD),
           lambda left, usual, calls: left is None and usual == "2023c.1.0_2023b.1.0"
           and calls.count(("symlink", ZONEINFO)) < 2),
    Window("an activation without a record",
           RECORD, ("symlink", ZONEINFO), ("create", RECORD),
           lambda left, usual, _: left is None or left.endswith("_2023d.1.0")),
    Window("an empty record",
           RECORD, ("create", RECORD), ("write", None),
           lambda left, usual, _: left == ""),
    Window("a record that starts from the system's release",
           RECORD, ("unlink", ZONEINFO), ("symlink", ZONEINFO),
           lambda left, usual, _: left is not None and
           left.startswith("2023c.1.0_") and not usual.startswith("2023c")),
    Window("a corrected localtime becomes the default",
           LOCALTIME, ("unlink", LOCALTIME), ("symlink", LOCALTIME),
           lambda left, usual, _: left == DEFAULT_LOCALTIME),
]


def window_of(path, left, usual, carried_out):
    """The window that explains a difference after a kill, or None."""
    for window in WINDOWS:
        if (window.path == path and window.left(left, usual, carried_out)
                and window.opened in carried_out):
            since = carried_out[len(carried_out) -
                                carried_out[::-1].index(window.opened):]
            if window.closed not in since:
                return window.name
    return None


CHANGES = ("symlink", "unlink", "rmdir", "create", "write")


def kills(option):
    """One before every call of every chosen boot; a quick run takes those next to a
    change. strace makes the first call itself."""
    for name in CHOSEN:
        traced = undisturbed(name).calls
        in_the_pass = boot.pass_of(traced)
        carried_out = 0
        for call in traced[1:]:
            within = call in in_the_pass
            carried_out += within
            near = in_the_pass[max(0, carried_out - 2):carried_out]
            if not option("quick") or any(other.name in CHANGES for other in near):
                kill = Killed(call.call, call.number, carried_out + (not within))
                yield pytest.param(name, kill, id=f"{name}: {kill.name}")


def kills_at_links(device: Device):
    """One before every change to a link in the next boot of a described device."""
    families = {"symlink": "?symlink,?symlinkat", "unlink": "?unlink,?unlinkat"}
    counts = collections.Counter()
    for number, (name, _) in enumerate(model.boot(device).calls, start=1):
        if name == "rmdir":  # some machines have no such call and use unlink's
            return
        if name in families:
            counts[name] += 1
            yield Killed(families[name], counts[name], number)


def pairs(option):
    """Every tenth, in a quick run."""
    found = []
    for name, make in CHOSEN.items():
        for first in kills_at_links(make()):
            device = make()
            model.boot(device, killed_before=first.killed_before)
            found += [pytest.param(name, first, second,
                                   id=f"{name}: {first.name}, then {second.name}")
                      for second in kills_at_links(device)]
    return found[::10] if option("quick") else found


def killed(device: Device, kill: Killed, start: Entries, whole_log="") -> model.Outcome:
    """A boot that is killed, really and in the model."""
    outcome = model.boot(device, killed_before=kill.killed_before)
    booted = boot.traced(*kill.options(outcome))
    found = entry_differences(device, namespace.look())
    if booted.ending != "killed":
        found.append(f"ended with {booted.ending}")
    if whole_log and not whole_log.startswith(booted.log):
        found.append(f"printed {booted.log!r}")
    fail(kill.name, found, start)
    return outcome


def settles(name: str, device: Device, start: Entries):
    """Boots until the device has settled, and once more."""
    for number in range(1, BOOTS_TO_SETTLE + 2):
        again, seen = trial(device, tell=f"boot {number} after the kill", again=True)
        found = properties.data_changes(start, seen.after)
        if name not in ABNORMAL:
            found += properties.not_ready(seen)
        if number > BOOTS_TO_SETTLE:
            found += properties.changed_by_a_settled_boot(properties.Judged(seen))
        fail(f"boot {number} after the kill", found, start)


@pytest.mark.cases("name, kill", kills)
def test_a_kill(name, kill, count):
    usual = CHOSEN[name]()
    for _ in range(BOOTS_TO_SETTLE + 1):
        model.boot(usual)
    usual = usual.contents()
    device, start = real(name)
    outcome = killed(device, kill, start, undisturbed(name).log)
    settles(name, device, start)
    left = device.contents()
    for path in sorted(left.keys() | usual.keys()):
        if left.get(path) != usual.get(path):
            window = window_of(path, left.get(path), usual.get(path), outcome.calls)
            if not window:
                fail(kill.name, [f"leaves {path} as {left.get(path)!r} for good, "
                                 f"not as {usual.get(path)!r}"], start)
            count(f"kills leave {window}")


@pytest.mark.cases("name, first, second", pairs)
def test_two_kills(name, first, second):
    device, start = real(name)
    killed(device, first, start)
    killed(device, second, start)
    settles(name, device, start)
