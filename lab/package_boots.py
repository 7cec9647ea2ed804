# SPDX-License-Identifier: BSD-2-Clause
"""The part of test_package.py that takes a private device: it is started there with
what is to boot, which is not always the program alone, in MARLIN."""

import pytest

from lab import boot
from lab.carriers import namespace
from lab.conditions import Condition
from lab.device import Device, sound_device
from lab.devices import CHOSEN, activation
from lab.paths import DOWNLOADS, ICUTZ, SYSTEM_ZONEINFO, ZONEINFO, update_path
from lab.seen import Entries, Seen
from lab.trial import entry_differences, expected, fail, log_differences, trial


def compare(what: str, device: Device, before: Entries, ending: str, log: str):
    """Fails unless a boot did what the model does on this device."""
    outcome = expected(device, Condition())
    seen = Seen(before, namespace.look(), ending, log)
    if found := log_differences(outcome, seen) + entry_differences(device, seen.after):
        fail(what, found, before)


def test_a_new_device_boots():
    """It does not have the two directories yet."""
    device = Device()
    device.install_system()
    namespace.build(device)
    before = namespace.look()
    device.directory(DOWNLOADS)
    compare("the first boot", device, before, *boot.boot())


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


@pytest.mark.parametrize("zoneinfo, icutz", [
    (f"{update_path('2024a.1.0')}/zoneinfo", f"{update_path('2023d.1.0')}/icutz"),
    (f"{update_path('2024a.1.0')}/zoneinfo", None),
    (SYSTEM_ZONEINFO, f"{update_path('2023d.1.0')}/icutz"),
    (SYSTEM_ZONEINFO, f"{update_path('gone')}/icutz")])
def test_mixed_links_are_mended(zoneinfo, icutz):
    """The mend runs first; then marlin finds a device without the link."""
    device = activation("2023d.1.0")
    device.link(ZONEINFO, zoneinfo)
    device.drop(ICUTZ)
    if icutz:
        device.link(ICUTZ, icutz)
    namespace.build(device)
    before = namespace.look()
    ending, log = boot.boot()
    line, _, log = log.partition("\n")
    assert line == (
        f"marlin-mend: {ZONEINFO} did not fit {ICUTZ}; marlin makes both anew")
    device.drop(ZONEINFO)
    compare("the boot after the mend", device, before, ending, log)


def test_a_failing_mend_stops_no_boot():
    """It is another program here, which only fails."""
    device = activation("2023d.1.0")
    device.drop(ICUTZ)
    namespace.build(device)
    before = namespace.look()
    assert boot.boot().ending == "exit 0"
    expected(device, Condition())
    fail("the boot", entry_differences(device, namespace.look()), before)
