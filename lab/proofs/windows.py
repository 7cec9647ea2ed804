# SPDX-License-Identifier: BSD-2-Clause
"""The windows from which later boots do not fully recover, one by one: a device is
killed at one call and then looked at, boot by boot. Nothing here comes from the model,
so that a change of the window is noticed even if model and program change alike."""

from lab.carriers import boot, namespace
from lab.words import chosen_devices, lines
from lab.words.paths import (DEFAULT_LOCALTIME, DEFAULT_ZONE, ICUTZ, LEGACY_ICUTZ,
                             LOCALTIME, RECORD, SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO,
                             update_path)
from lab.words.seen import as_device


def killed_before(name, path, device):
    """Kills the program before its first call of this kind takes effect."""
    namespace.build(device)
    boot.traced()
    call = next(call for call in boot.pass_of(list(boot.calls()))
                if (call.name, call.path) == (name, path))
    namespace.build(device)
    assert boot.traced(*boot.killing(call.call, call.number)).ending == "killed"


def boots(*printed):
    booted = boot.boot()
    assert booted.ending == "exit 0"
    assert [line.rpartition(": ")[0] for line in booted.log.splitlines()] == [
        lines.NAME + line for line in printed]


def there_is(zoneinfo=SYSTEM_ZONEINFO, icutz=None, record=None,
             localtime=ZONEINFO + "/Europe/Paris", legacy=None):
    """Targets of links, and what is recorded."""
    device = as_device(namespace.look())
    for path, text in ((ZONEINFO, zoneinfo), (ICUTZ, icutz), (LOCALTIME, localtime),
                       (LEGACY_ICUTZ, legacy), (RECORD, record)):
        node = device.find(path)
        assert (path, node and node.text) == (path, text)


def stays(*printed, **there):
    for _ in range(3):
        boots(*printed)
        there_is(**there)


UPDATE = update_path("2024a.1.0")
UPDATE_TWICE = lines.NOT_NEWER % ("2024a.1.0", "2024a.1.0")


def test_an_update_s_zoneinfo_without_its_icu_data():
    """Activation links the two components one after the other. In between, the
    next boot finds the update active, and so not newer, and never links the rest:
    readers have the update's zoneinfo and the ICU data of before, until an update
    that is newer still is activated, or the links are reset."""
    killed_before("unlink", ICUTZ, chosen_devices.first_activation())
    there_is(zoneinfo=UPDATE + "/zoneinfo")
    stays(UPDATE_TWICE, zoneinfo=UPDATE + "/zoneinfo")

    newer = as_device(namespace.look())
    newer.install_update("2024b.1.0")
    newer.announce("2024b.1.0")
    namespace.build(newer)
    boots()
    there_is(zoneinfo=update_path("2024b.1.0/zoneinfo"),
             icutz=update_path("2024b.1.0/icutz"), record="2024a.1.0_2024b.1.0")


def test_an_update_s_zoneinfo_with_an_older_update_s_icu_data():
    killed_before("unlink", ICUTZ, chosen_devices.activation_after_an_update())
    stays(UPDATE_TWICE, zoneinfo=UPDATE + "/zoneinfo",
          icutz=update_path("2023d.1.0/icutz"), record="2023c.1.0_2023d.1.0")


def test_the_system_s_zoneinfo_with_an_update_s_icu_data():
    """A reset links the zoneinfo tree before it removes the ICU link. In between,
    the next boot finds the links at the system partition, which is accepted
    whatever "icutz" names: ICU data that may even be of a schema that the system
    cannot read stays linked until an update is activated."""
    killed_before("unlink", ICUTZ, chosen_devices.system_overtakes_the_update())
    stays(icutz=update_path("2023b.1.0/icutz"), legacy="/nowhere")


def test_the_system_s_zoneinfo_with_icu_data_of_another_schema():
    device = chosen_devices.reset_for_the_schema_then_an_update()
    device.drop(TZ_LATEST)
    killed_before("unlink", ICUTZ, device)
    stays(icutz=UPDATE + "/icutz")


def test_a_legacy_link_that_dangles_is_kept():
    """Only an activation, such as that of a reset, removes it."""
    killed_before("unlink", LEGACY_ICUTZ, chosen_devices.system_overtakes_the_update())
    stays(legacy="/nowhere")


def test_an_activation_without_a_record():
    """The record is written last; the next boot has nothing to activate."""
    killed_before("create", RECORD, chosen_devices.activation_after_an_update())
    stays(UPDATE_TWICE, zoneinfo=UPDATE + "/zoneinfo", icutz=UPDATE + "/icutz",
          record="2023c.1.0_2023d.1.0")


def test_an_empty_record():
    """The file is emptied before it is written."""
    killed_before("write", None, chosen_devices.activation_after_an_update())
    stays(UPDATE_TWICE, zoneinfo=UPDATE + "/zoneinfo", icutz=UPDATE + "/icutz",
          record="")


def test_a_record_that_starts_from_the_system_s_release():
    """While "zoneinfo" is removed nothing tells which update was active."""
    killed_before("symlink", ZONEINFO, chosen_devices.activation_after_an_update())
    boots(lines.BAD_LINK % "", lines.INVALID_LINKS)
    there_is(zoneinfo=UPDATE + "/zoneinfo", icutz=UPDATE + "/icutz",
             record="2023c.1.0_2024a.1.0")


def test_an_update_older_than_the_system_s_data_is_not_activated():
    """It would be, right after the reset, and be reset by the next boot; after a
    kill during the reset it is compared with the system's data and refused."""
    killed_before("unlink", ICUTZ,
                  chosen_devices.reset_then_an_update_older_than_the_system())
    stays(lines.NOT_NEWER % ("2023b.1.0", "2023c.1.0"),
          icutz=update_path("2023a.1.0/icutz"))


def test_a_corrected_localtime_becomes_the_default():
    """The link is removed before it is made again, and nothing else holds the
    user's zone."""
    killed_before("symlink", LOCALTIME, chosen_devices.localtime_corrected())
    there_is(localtime=None)
    boots(lines.LOCALTIME_INVALID % DEFAULT_ZONE)
    there_is(localtime=DEFAULT_LOCALTIME)
    boots()
