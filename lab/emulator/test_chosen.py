# SPDX-License-Identifier: BSD-2-Clause
"""Every chosen device boots on arm64, with its kernel and file system, and is compared
with the model and the properties as on a private device.

One boot of the emulator does for all: its disk holds them side by side, and each in
turn is mounted where a device is. The pass runs there as the owner of the device, who
has no capability, as the model has it; as root it runs in the scenes. What an image
cannot hold, or such a boot does otherwise, is listed in lab/carriers/image.py.
"""

import os

import pytest

from lab import properties
from lab.carriers import image
from lab.conditions import Condition
from lab.device import Node, sound_device
from lab.devices import CHOSEN
from lab.emulator.machine import ending
from lab.paths import PLACES
from lab.seen import Entries, Seen
from lab.trial import differences, entry_differences, expected, fail

BOOT_EACH = """
for device in /var/chosen/*; do
  mount --bind $device/var/db /var/db && mount --bind $device/usr/share /usr/share
  find /usr/share /var/db -print0 >$device/listed
  su owner -c "exec marlin" </dev/null >/dev/null 2>$device/log
  echo $? >$device/status
  umount /usr/share /var/db
done
"""


@pytest.fixture(scope="module")
def booted(machine):
    """Two looks at the disk, with a boot of every chosen device in between."""
    here = machine("chosen")
    here.build(sound_device(), owner=1, chosen=Node("dir", 0o755, entries={
        name.replace(" ", "_"): make().root for name, make in CHOSEN.items()}))
    before = image.look(here.var, "/chosen", "")
    print(here.boot(script=BOOT_EACH).text)
    return before, image.look(here.var, "/chosen", "")


def below(entries: Entries, directory: str) -> Entries:
    """Those of the device that is there."""
    return {path.removeprefix(directory): here for path, here in entries.items()
            if path.startswith(tuple(directory + place for place in PLACES))}


def in_order(entries: Entries, listed: list[str]) -> Entries:
    for path in listed:
        entries[path].names = [os.path.basename(other) for other in listed
                               if os.path.dirname(other) == path]
    return {path: entries[path] for path in listed}


@pytest.mark.parametrize("name", CHOSEN)
def test_a_chosen_device(booted, name):
    before, after = booted
    directory = "/" + name.replace(" ", "_")
    listed, log, status = (after[f"{directory}/{file}"].text
                           for file in ("listed", "log", "status"))
    before = in_order(below(before, directory), listed.split("\0")[:-1])
    device = CHOSEN[name]()
    assert entry_differences(device, before) == []  # learns the order as well
    nodes = dict(device.everything())
    seen = Seen(before, below(after, directory), ending(int(status)), log)
    outcome = expected(device, Condition())
    found = (differences(device, nodes, outcome, seen) +
             properties.shortcomings(properties.Judged(seen)))
    fail("the boot on arm64", found, before)
