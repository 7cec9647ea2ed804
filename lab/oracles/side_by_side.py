# SPDX-License-Identifier: BSD-2-Clause
"""Devices side by side on one disk: one boot of an emulator does for all of them. Each
in turn is mounted where a device is, and the program runs there once.

What an image cannot hold, or such a boot does otherwise, is listed in
lab/carriers/image.py.
"""

import os

from lab.oracles import properties
from lab.oracles.conditions import Condition
from lab.oracles.trial import differences, entry_differences, expected, fail
from lab.words.device import Device, Node
from lab.words.paths import PLACES
from lab.words.seen import Entries, Seen

EACH = """
for device in {place}; do
  mount --bind $device/var/db /var/db && mount --bind $device/usr/share /usr/share
  find /usr/share /var/db -print0 >$device/listed
  {run}
  umount /usr/share /var/db
done
"""


def directory(name: str) -> str:
    return name.replace(" ", "_")


def disk(devices: dict[str, Device]) -> Node:
    return Node("dir", 0o755, entries={
        directory(name): device.root for name, device in devices.items()})


def each(place: str, run: str) -> str:
    """What a shell does to run this on each of these directories' devices. It leaves
    what was printed in $device/log, and how it ended in $device/status."""
    return EACH.format(place=place, run=run)


def below(entries: Entries, place: str) -> Entries:
    """The entries of the device at this place, by the paths that it knows."""
    return {path.removeprefix(place): here for path, here in entries.items()
            if path.startswith(tuple(place + part for part in PLACES))}


def in_order(entries: Entries, listed: list[str]) -> Entries:
    for path in listed:
        entries[path].names = [os.path.basename(other) for other in listed
                               if os.path.dirname(other) == path]
    return {path: entries[path] for path in listed}


def judge(name: str, device: Device, looks: tuple[Entries, Entries], ending_of):
    """Fails unless the boot of this device, between two looks at the disk, was what the
    model and the properties say. `ending_of` reads what is in $device/status."""
    before, after = looks
    place = "/" + directory(name)
    listed, log, status = (after[f"{place}/{file}"].text
                           for file in ("listed", "log", "status"))
    before = in_order(below(before, place), listed.split("\0")[:-1])
    assert entry_differences(device, before) == []  # learns the order as well
    seen = Seen(before, below(after, place), ending_of(status), log)
    outcome = expected(device, Condition())
    found = (differences(device, outcome, seen) +
             properties.shortcomings(properties.Judged(seen)))
    fail(f"the boot of: {name}", found, before)
