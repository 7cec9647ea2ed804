# SPDX-License-Identifier: BSD-2-Clause
"""The windows from which later boots do not fully recover, one by one, each with
examples: a device is killed at one call and then looked at, boot by boot. Nothing in an
example comes from the model, so that a change of the window is noticed even if model
and program change alike."""

import itertools
from collections.abc import Callable
from typing import NamedTuple

import pytest

from lab.carriers import boot, namespace
from lab.words import lines
from lab.words.chosen_devices import NORMAL, made
from lab.words.paths import (DEFAULT_LOCALTIME, DEFAULT_ZONE, ICUTZ, LEGACY_ICUTZ,
                             LOCALTIME, RECORD, SYSTEM_ZONEINFO, ZONEINFO, update_path)
from lab.words.seen import as_device


class Example(NamedTuple):
    """A device, by how a sound one is changed, whose boot is killed before the first
    call `killed`. After every later boot the links and the record are these, beside
    those of a device as it is sold; the first of the boots prints `first`, all others
    `later`."""
    changes: str
    killed: tuple
    left: dict
    first: list = []
    later: list = []


class Window(NamedTuple):
    """Open after a kill between two changes: after the last call `opened` that was
    carried out, and before `closed`. At `path` is then something else for good:
    `different` compares that with the usual, and knows the calls carried out."""
    path: str
    opened: tuple
    closed: tuple
    different: Callable
    examples: list


AS_SOLD = {ZONEINFO: SYSTEM_ZONEINFO, LOCALTIME: ZONEINFO + "/Europe/Paris",
           ICUTZ: None, LEGACY_ICUTZ: None, RECORD: None}
TREE, ICU = (update_path(f"2024a.1.0/{part}") for part in ("zoneinfo", "icutz"))
OLD_ICU, OLD_RECORD = update_path("2023d.1.0/icutz"), "2023c.1.0_2023d.1.0"
STAYS = [[lines.NOT_NEWER % ("2024a.1.0", "2024a.1.0")]] * 2
OLDER = [[lines.NOT_NEWER % ("2023b.1.0", "2023c.1.0")]] * 2

# Why each is open, and what stays: docs/decisions.md.
WINDOWS = {
    "an update's zoneinfo without its ICU data": Window(
        ICUTZ, ("symlink", ZONEINFO), ("symlink", ICUTZ),
        lambda left, usual, _: usual is not None, [
            Example(NORMAL["first activation"], ("unlink", ICUTZ),
                    {ZONEINFO: TREE}, *STAYS),
            Example(NORMAL["activation after an update"], ("unlink", ICUTZ),
                    {ZONEINFO: TREE, ICUTZ: OLD_ICU, RECORD: OLD_RECORD}, *STAYS)]),
    "the system's zoneinfo with an update's ICU data": Window(
        ICUTZ, ("symlink", ZONEINFO), ("unlink", ICUTZ),
        lambda left, usual, _: left is not None and usual is None, [
            Example(NORMAL["system overtakes the update"], ("unlink", ICUTZ),
                    {ICUTZ: update_path("2023b.1.0/icutz"), LEGACY_ICUTZ: "/nowhere"}),
            Example(f"{NORMAL['reset for the schema then an update']}; drop TZ_LATEST",
                    ("unlink", ICUTZ), {ICUTZ: ICU})]),
    "a legacy link that dangles is kept": Window(
        LEGACY_ICUTZ, ("symlink", ZONEINFO), ("unlink", LEGACY_ICUTZ),
        lambda left, usual, _: usual is None, [
            Example(NORMAL["system overtakes the update"], ("unlink", LEGACY_ICUTZ),
                    {LEGACY_ICUTZ: "/nowhere"})]),
    "an update older than the system's data is not activated": Window(
        RECORD, ("unlink", ZONEINFO), ("create", RECORD),
        lambda left, usual, calls: left is None and usual == "2023c.1.0_2023b.1.0"
        and calls.count(("symlink", ZONEINFO)) < 2, [
            Example(NORMAL["reset then an update older than the system"],
                    ("unlink", ICUTZ), {ICUTZ: update_path("2023a.1.0/icutz")},
                    *OLDER)]),
    "an activation without a record": Window(
        RECORD, ("symlink", ZONEINFO), ("create", RECORD),
        lambda left, usual, _: left is None or left.endswith("_2023d.1.0"), [
            Example(NORMAL["activation after an update"], ("create", RECORD),
                    {ZONEINFO: TREE, ICUTZ: ICU, RECORD: OLD_RECORD}, *STAYS)]),
    "an empty record": Window(
        RECORD, ("create", RECORD), ("write", None), lambda left, usual, _: left == "",
        [Example(NORMAL["activation after an update"], ("write", None),
                 {ZONEINFO: TREE, ICUTZ: ICU, RECORD: ""}, *STAYS)]),
    "a record that starts from the system's release": Window(
        RECORD, ("unlink", ZONEINFO), ("symlink", ZONEINFO),
        lambda left, usual, _: left is not None and left.startswith("2023c.1.0_") and
        not usual.startswith("2023c"), [
            Example(NORMAL["activation after an update"], ("symlink", ZONEINFO),
                    {ZONEINFO: TREE, ICUTZ: ICU, RECORD: "2023c.1.0_2024a.1.0"},
                    [lines.BAD_LINK % "", lines.INVALID_LINKS], STAYS[0])]),
    "a corrected localtime becomes the default": Window(
        LOCALTIME, ("unlink", LOCALTIME), ("symlink", LOCALTIME),
        lambda left, usual, _: left == DEFAULT_LOCALTIME, [
            Example(NORMAL["localtime corrected"], ("symlink", LOCALTIME),
                    {LOCALTIME: DEFAULT_LOCALTIME},
                    [lines.LOCALTIME_INVALID % DEFAULT_ZONE])]),
}


def window_of(path, left, usual, carried_out) -> str | None:
    """The window that explains a difference after a kill."""
    for name, window in WINDOWS.items():
        since = list(itertools.takewhile(lambda call: call != window.opened,
                                         reversed(carried_out)))
        if (window.path == path and window.opened in carried_out
                and window.closed not in since
                and window.different(left, usual, carried_out)):
            return name
    return None


@pytest.mark.parametrize("example", [
    pytest.param(example, id=f"{name}: {number}") for name, window in WINDOWS.items()
    for number, example in enumerate(window.examples, start=1)])
def test_an_example_of_a_window(example):
    """It ends with the next activation; but what the zone was nobody knows."""
    namespace.build(made(example.changes))
    boot.traced()
    call = next(call for call in boot.pass_of(list(boot.calls()))
                if (call.name, call.path) == example.killed)
    namespace.build(made(example.changes))
    assert boot.traced(*boot.killing(call.call, call.number)).ending == "killed"
    for printed in (example.first, example.later, example.later):
        booted = boot.boot()
        assert booted.ending == "exit 0"
        assert [line.rpartition(": ")[0] for line in booted.log.splitlines()] == [
            lines.NAME + line for line in printed]
        there = as_device(namespace.look()).contents()
        assert {path: there.get(path) for path in AS_SOLD} == AS_SOLD | example.left

    device = as_device(namespace.look())
    device.install_update("2024c.1.0")
    device.announce("2024c.1.0")
    namespace.build(device)
    assert boot.boot() == ("exit 0", "")
    there = as_device(namespace.look()).contents()
    assert there[ZONEINFO] == update_path("2024c.1.0/zoneinfo")
    assert there[ICUTZ] == update_path("2024c.1.0/icutz")
    assert there[RECORD].endswith("_2024c.1.0") and LEGACY_ICUTZ not in there
