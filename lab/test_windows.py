# SPDX-License-Identifier: BSD-2-Clause
"""The windows from which later boots do not fully recover, one by one: a device is
killed at one call and then looked at, boot by boot. Nothing here comes from the model,
so that a change of the window is noticed even if model and program change alike."""

import os

import pytest

from lab import boot, devices, lines
from lab.carriers import namespace
from lab.conditions import Killed
from lab.paths import (DEFAULT_LOCALTIME, DEFAULT_ZONE, ICUTZ, LEGACY_ICUTZ, LOCALTIME,
                       RECORD, SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO, update_path)
from lab.seen import as_device

NO_LINK = None
CHOSEN_LOCALTIME = ZONEINFO + "/Europe/Paris"


class Case:

    def on(self, device):
        namespace.build(device)

    def killed_before(self, name, path):
        """Kills the program before its first call of this kind takes effect."""
        device = as_device(namespace.look())
        boot.traced()
        call = next(call for call in boot.pass_of(list(boot.calls()))
                    if (call.name, call.path) == (name, path))
        namespace.build(device)
        kill = Killed(call.call, call.number, None)
        assert boot.traced(*kill.options(None)).ending == "killed"

    def boot(self, printed):
        booted = boot.boot()
        assert booted.ending == "exit 0"
        assert [line.rpartition(": ")[0] for line in booted.log.splitlines()] == [
            lines.NAME + line for line in printed]

    def expect(self, zoneinfo=SYSTEM_ZONEINFO, icutz=NO_LINK, record=None,
               localtime=CHOSEN_LOCALTIME, legacy=NO_LINK):
        for path, expected in ((ZONEINFO, zoneinfo), (ICUTZ, icutz),
                               (LOCALTIME, localtime), (LEGACY_ICUTZ, legacy)):
            target = os.readlink(path) if os.path.islink(path) else NO_LINK
            assert (path, target) == (path, expected)
        content = None
        if os.path.exists(RECORD):
            with open(RECORD, encoding="latin-1") as file:
                content = file.read()
        assert content == record


@pytest.fixture
def case():
    return Case()


UPDATE = update_path("2024a.1.0")
UPDATE_TWICE = lines.NOT_NEWER % ("2024a.1.0", "2024a.1.0")


def test_an_update_s_zoneinfo_without_its_icu_data(case):
    """Activation links the two components one after the other. In between, the
    next boot finds the update active, and so not newer, and never links the rest:
    readers have the update's zoneinfo and the ICU data of before, until an update
    that is newer still is activated, or the links are reset."""
    case.on(devices.first_activation())
    case.killed_before("unlink", ICUTZ)
    case.expect(UPDATE + "/zoneinfo", NO_LINK)
    for _ in range(3):
        case.boot([UPDATE_TWICE])
        case.expect(UPDATE + "/zoneinfo", NO_LINK)

    newer = as_device(namespace.look())
    newer.install_update("2024b.1.0")
    newer.announce("2024b.1.0")
    case.on(newer)
    case.boot([])
    newer_path = update_path("2024b.1.0")
    case.expect(newer_path + "/zoneinfo", newer_path + "/icutz",
                record="2024a.1.0_2024b.1.0")


def test_an_update_s_zoneinfo_with_an_older_update_s_icu_data(case):
    case.on(devices.activation_after_an_update())
    case.killed_before("unlink", ICUTZ)
    for _ in range(3):
        case.boot([UPDATE_TWICE])
        case.expect(UPDATE + "/zoneinfo",
                    update_path("2023d.1.0") + "/icutz",
                    record="2023c.1.0_2023d.1.0")


def test_the_system_s_zoneinfo_with_an_update_s_icu_data(case):
    """A reset links the zoneinfo tree before it removes the ICU link. In between,
    the next boot finds the links at the system partition, which is accepted
    whatever "icutz" names: ICU data that may even be of a schema that the system
    cannot read stays linked until an update is activated."""
    case.on(devices.system_overtakes_the_update())
    case.killed_before("unlink", ICUTZ)
    for _ in range(3):
        case.boot([])
        case.expect(SYSTEM_ZONEINFO,
                    update_path("2023b.1.0") + "/icutz", legacy="/nowhere")


def test_the_system_s_zoneinfo_with_icu_data_of_another_schema(case):
    device = devices.reset_for_the_schema_then_an_update()
    device.drop(TZ_LATEST)
    case.on(device)
    case.killed_before("unlink", ICUTZ)
    for _ in range(3):
        case.boot([])
        case.expect(SYSTEM_ZONEINFO, UPDATE + "/icutz")


def test_a_legacy_link_that_dangles_is_kept(case):
    """Only an activation, such as that of a reset, removes it."""
    case.on(devices.system_overtakes_the_update())
    case.killed_before("unlink", LEGACY_ICUTZ)
    for _ in range(3):
        case.boot([])
        case.expect(SYSTEM_ZONEINFO, NO_LINK, legacy="/nowhere")


def test_an_activation_without_a_record(case):
    """The record is written last; the next boot has nothing to activate."""
    case.on(devices.activation_after_an_update())
    case.killed_before("create", RECORD)
    for _ in range(3):
        case.boot([UPDATE_TWICE])
        case.expect(UPDATE + "/zoneinfo", UPDATE + "/icutz",
                    record="2023c.1.0_2023d.1.0")


def test_an_empty_record(case):
    """The file is emptied before it is written."""
    case.on(devices.activation_after_an_update())
    case.killed_before("write", None)
    for _ in range(3):
        case.boot([UPDATE_TWICE])
        case.expect(UPDATE + "/zoneinfo", UPDATE + "/icutz", record="")


def test_a_record_that_starts_from_the_system_s_release(case):
    """While "zoneinfo" is removed nothing tells which update was active."""
    case.on(devices.activation_after_an_update())
    case.killed_before("symlink", ZONEINFO)
    case.boot([
        lines.BAD_LINK % "", lines.INVALID_LINKS
    ])
    case.expect(UPDATE + "/zoneinfo", UPDATE + "/icutz", record="2023c.1.0_2024a.1.0")


def test_an_update_older_than_the_system_s_data_is_not_activated(case):
    """It would be, right after the reset, and be reset by the next boot; after a
    kill during the reset it is compared with the system's data and refused."""
    case.on(devices.reset_then_an_update_older_than_the_system())
    case.killed_before("unlink", ICUTZ)
    for _ in range(3):
        case.boot([lines.NOT_NEWER % ("2023b.1.0", "2023c.1.0")])
        case.expect(SYSTEM_ZONEINFO, update_path("2023a.1.0") + "/icutz")


def test_a_corrected_localtime_becomes_the_default(case):
    """The link is removed before it is made again, and nothing else holds the
    user's zone."""
    case.on(devices.localtime_corrected())
    case.killed_before("symlink", LOCALTIME)
    case.expect(localtime=NO_LINK)
    case.boot([lines.LOCALTIME_INVALID % DEFAULT_ZONE])
    case.expect(localtime=DEFAULT_LOCALTIME)
    case.boot([])
