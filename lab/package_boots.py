# SPDX-License-Identifier: BSD-2-Clause
"""The part of test_package.py that takes a private device: it is started there with
what is to boot, which is not always the program alone, in MARLIN."""

import pytest

from lab import boot
from lab.carriers import namespace
from lab.conditions import Condition
from lab.device import Device, sound_device
from lab.devices import CHOSEN
from lab.paths import DOWNLOADS
from lab.seen import Seen
from lab.trial import entry_differences, expected, fail, log_differences, trial

REFUSED = """\
write /var/db/entry: done
write /var/db/timezone/entry: done
write /var/db/timezone/tz/entry: Read-only file system
write /var/entry: Read-only file system
write /usr/share/entry: Read-only file system
write /tmp/entry: Read-only file system
write /entry: Read-only file system
CapInh:	0000000000000000
CapPrm:	0000000000000000
CapEff:	0000000000000000
CapBnd:	0000000000000000
CapAmb:	0000000000000000
socket: next
"""


def test_a_new_device_boots():
    """It does not have the two directories yet."""
    device = Device()
    device.install_system()
    namespace.build(device)
    before = namespace.look()
    device.directory(DOWNLOADS)
    outcome = expected(device, Condition())
    booted = boot.boot()
    seen = Seen(before, namespace.look(), *booted)
    found = log_differences(outcome, seen) + entry_differences(device, seen.after)
    if found:
        fail("the first boot", found, before)


def test_the_probe_is_refused():
    """What the unit forbids, tried in the program's place."""
    namespace.build(sound_device())
    assert boot.boot() == boot.Booted("signal 31", REFUSED)  # SIGSYS


@pytest.mark.parametrize("name", CHOSEN)
def test_a_chosen_device_boots(name):
    trial(CHOSEN[name]())
