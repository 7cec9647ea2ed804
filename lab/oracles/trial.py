# SPDX-License-Identifier: BSD-2-Clause
"""One device, one condition, one boot: compared with the model, call by call where it
is traced. A trial that fails tells the device in words and where it differs."""

from __future__ import annotations

import functools
import os
from collections.abc import Iterator
from itertools import count, zip_longest

import pytest

from lab.carriers import boot, namespace
from lab.oracles import model, properties
from lab.oracles.conditions import Condition
from lab.words import lines
from lab.words.chosen_devices import ABNORMAL, CHOSEN
from lab.words.device import Device, described
from lab.words.seen import Call, Entries, Seen, as_device


def fail(what: str, found: list[str], before: Entries):
    """Ends the test if anything is wrong, which is `found`; `before` is the device at
    the start."""
    if found:
        pytest.fail("\n  ".join([what, *found]) + "\nThe device at the start:\n" +
                    as_device(before).in_words(), pytrace=False)


def real(name: str) -> tuple[Device, Entries]:
    """A chosen device, made real, and how it looks."""
    device = CHOSEN[name]()
    namespace.build(device)
    return device, namespace.look()


@functools.cache
def undisturbed(name: str) -> Seen:
    """An undisturbed boot of a chosen device, with all its calls."""
    namespace.build(CHOSEN[name]())
    return Seen({}, {}, *boot.traced(), list(boot.calls()))


def trial(device: Device, condition: Condition | None = None,
          tell="the boot", again=False) -> tuple[model.Outcome, Seen]:
    """Boots a described device, really and in the model, which changes `device`; fails
    where they differ. With a condition the calls are compared as well. `again`: the
    device is still there from the boot before."""
    if not again:
        namespace.build(device)
    before = namespace.look()
    outcome = expected(device, condition or Condition())
    if condition is None:
        booted, calls = boot.boot(), []
    else:
        booted = boot.traced("-e", f"trace={boot.TRACED}", *condition.options(outcome))
        calls = boot.pass_of(list(boot.calls()))
    seen = Seen(before, namespace.look(), *booted, calls)
    found = differences(device, outcome, seen)
    if condition is not None:
        found += call_differences(outcome, calls)
        tell = condition.name
    fail(tell, found, before)
    return outcome, seen


def most_boots(lines: str) -> int:
    """How many can change a device; the next one must not.

    What the second can still change, with the reason:
    - An update older than the system's data was activated right after a reset. The
      second boot resets it, and then it is not newer than what is in use.
    - An update was refused that is newer than the system's data, but not than the data
      that was given up for it. The second boot activates it.
    - The legacy link leads somewhere only through "localtime", which the first boot has
      made. The second boot moves it.
    A legacy link that cannot be deleted is moved once more by the boot after the last
    reset, which took icutz away.
    """
    return 3 if "l" in lines else 2


def boots_until_settled(device: Device, tell: str,
                        again=False) -> Iterator[properties.Judged]:
    """Boots a device until it has settled, and once more: as the model says, and with
    every property."""
    contents = None
    for turn in count(1):
        what = f"{tell}, boot {turn}"
        _, seen = trial(device, tell=what, again=again or turn > 1)
        judged = properties.Judged(seen)
        found = properties.shortcomings(judged)
        last, contents = contents, device.contents()
        if contents == last:
            found += properties.changed_by_a_settled_boot(judged)
        elif turn > most_boots(judged.lines):
            found.append(f"has not settled after {turn - 1} boots")
        fail(what, found, seen.before)
        yield judged
        if contents == last:
            return


def recovers(name: str, device: Device, start: Entries):
    """The boots after one of a chosen device that was disturbed."""
    for judged in boots_until_settled(device, "afterwards", again=True):
        found = properties.data_changes(start, judged.seen.after)
        if name not in ABNORMAL:
            found += properties.not_ready(judged.seen)
        fail("afterwards", found, start)


def expected(device: Device, condition: Condition) -> model.Outcome:
    """The model's boot; its `failed` are the numbers of the calls that failed."""
    outcome = model.boot(device, condition.fault, condition.killed_before)
    outcome.failed = [number for number, call in enumerate(outcome.calls, start=1)
                      if condition.fault(number, *call) is not None]
    condition.amend(device, outcome)
    return outcome


def differences(device: Device, outcome: model.Outcome, seen: Seen) -> list[str]:
    """Where a boot was not as the model says."""
    return log_differences(outcome, seen) + entry_differences(device, seen.after)


def left(device: Device, ending: str, outcome: model.Outcome) -> list[str]:
    """Where a boot did not end, or leave the real device, as the model's."""
    found = entry_differences(device, namespace.look())
    if ending != outcome.ending:
        found.append(f"ended with {ending}, expected {outcome.ending}")
    return found


def entry_differences(device: Device, entries: Entries) -> list[str]:
    """Where the real device is not as described. The description learns again in
    which order directories are listed."""
    found = []
    nodes = dict(device.everything())
    for path in sorted(nodes.keys() | entries.keys()):
        if path not in entries:
            found.append(f"{path} is missing: expected {described(nodes[path])}")
        elif path not in nodes:
            found.append(f"{path} is there: {described(entries[path])}")
        else:
            node, here = nodes[path], entries[path]
            if described(node) != described(here):
                found.append(f"{path} is {described(here)}, expected {described(node)}")
            elif node.kind == "dir" and set(here.names) == set(node.entries):
                node.entries = {name: node.entries[name] for name in here.names}
    return found


def log_differences(outcome: model.Outcome, seen: Seen | boot.Booted) -> list[str]:
    """Where the printed lines or the ending are not what the model says."""
    found = []
    if seen.ending != outcome.ending:
        found.append(f"ended with {seen.ending}, expected {outcome.ending}")
    rest = seen.log
    for text, error in outcome.lines:
        start = f"{lines.NAME}{text}: "
        if not rest.startswith(start):
            return found + [f"expected the line {start!r}, got {first_line(rest)!r}"]
        ending, _, rest = rest[len(start):].partition("\n")
        if error is not None and ending != os.strerror(error):
            found.append(f"{start!r} ends in {ending!r}, "
                         f"expected {os.strerror(error)!r}")
        if ending not in lines.ERROR_TEXTS:
            found.append(f"{start!r} ends in {ending!r}, which is not an error's text")
    # The runtime's own words on an exception that nobody caught may follow.
    if rest and (outcome.ending != "abort" or rest.startswith(lines.NAME)):
        found.append(f"expected no further line, got {first_line(rest)!r}")
    return found


def first_line(text: str) -> str:
    return text.partition("\n")[0]


def call_differences(outcome: model.Outcome, calls: list[Call]) -> list[str]:
    """Where the calls are not the model's, or other calls failed than were to."""
    made = [(call.name, call.path) for call in calls]
    for number, (wanted, got) in enumerate(zip_longest(outcome.calls, made), start=1):
        if wanted != got:
            return [f"call {number} is {got or 'missing'}, expected {wanted or 'none'}"]
    injected = [number for number, call in enumerate(calls, start=1) if call.injected]
    if injected != outcome.failed:
        return [f"failed were the calls {injected}, not {outcome.failed}"]
    return []
