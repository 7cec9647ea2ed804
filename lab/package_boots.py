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
    """What the unit forbids, tried in the program's place. Secrets are for a system
    that has some: lab/systems."""
    namespace.build(sound_device())
    ending, log = boot.boot()
    tried = dict(line.split(":", 1) for line in log.splitlines())
    assert ending == "signal 31"  # SIGSYS, at the first of the calls
    assert list(tried)[-1] == "calls"
    assert {what for what, result in tried.items()
            if what.startswith("write") and result == " done"} == {
                "write /var/db/entry", "write /var/db/timezone/entry"}
    for path in ("/var/db/timezone/tz/entry", "/var/entry", "/usr/share/entry",
                 "/tmp/entry", "/entry"):
        assert tried["write " + path] == " Read-only file system"
    assert {what: int(result, 16) for what, result in tried.items()
            if what.startswith("Cap")} == dict.fromkeys(
                ("CapInh", "CapPrm", "CapEff", "CapBnd", "CapAmb"), 0)


@pytest.mark.parametrize("name", CHOSEN)
def test_a_chosen_device_boots(name):
    trial(CHOSEN[name]())
