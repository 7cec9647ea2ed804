# SPDX-License-Identifier: BSD-2-Clause
"""The chosen devices: on each of them every call is made to fail, and the program
is killed at every call. Together they take every way through a boot."""

from collections.abc import Callable

from lab.words.device import Device, sound_device
from lab.words.paths import (ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, RECORD,
                             SYSTEM_ICU, SYSTEM_ZONEINFO, TIMEZONE, TZ_LATEST, ZONEINFO,
                             update_path)


CHOSEN: dict[str, Callable[[], Device]] = {}  # by name; each call makes a new one
ABNORMAL: set[str] = set()  # those on which a boot ends abnormally, as it has to


def chosen(start=sound_device, *arguments: str, abnormal=False):
    """The function that follows changes a device that `start` makes."""
    def add(change):
        def make():
            device = start(*arguments)
            change(device)
            return device

        name = change.__name__.replace("_", " ")
        CHOSEN[name] = make
        if abnormal:
            ABNORMAL.add(name)
        return make

    return add


def activation(current: str | None = None, update="2024a.1.0") -> Device:
    """An update is announced; `current`, if any, is the one in use."""
    device = sound_device()
    if current:
        device.install_update(current)
        device.point_links_at(current)
        device.file(RECORD, f"2023c.1.0_{current}")
    device.install_update(update)
    device.announce(update)
    return device


@chosen()
def nothing_to_do(device):
    """The links are right, and nothing is announced."""


@chosen(activation, "2024a.1.0")
def update_stays(device):
    """It is still announced."""


@chosen(activation)
def first_activation(device):
    """The system's data is in use."""


@chosen(activation, "2023d.1.0")
def activation_after_an_update(device):
    """The update in use has left its record."""


@chosen()
def links_wiped(device):
    device.drop(ZONEINFO)
    device.drop(LOCALTIME)


@chosen(activation)
def links_wiped_and_update_announced(device):
    device.drop(ZONEINFO)


@chosen()
def system_overtakes_the_update(device):
    device.install_update("2023b.1.0")
    device.point_links_at("2023b.1.0")
    device.link(LEGACY_ICUTZ, "/nowhere")


@chosen()
def reset_then_an_update_older_than_the_system(device):
    device.install_update("2023a.1.0")
    device.install_update("2023b.1.0")
    device.point_links_at("2023a.1.0")
    device.announce("2023b.1.0")


@chosen()
def reset_for_the_schema_then_an_update(device):
    device.install_update("2024a.1.0", "45l")
    device.install_update("2024b.1.0")
    device.point_links_at("2024a.1.0")
    device.announce("2024b.1.0")


@chosen(activation)
def update_of_another_schema(device):
    device.drop(f"{update_path('2024a.1.0')}/icutz/icutz44l.dat")
    device.file(f"{update_path('2024a.1.0')}/icutz/icutz45b.dat", "ICU")


@chosen(activation, "2024a.1.0")
def announcement_is_no_data_set(device):
    device.link(TZ_LATEST, "tz/2024a.1.0")


@chosen(activation, "2024a.1.0")
def announcement_is_a_file(device):
    device.file(TZ_LATEST, "2024a.1.0")


@chosen(activation, "2024a.1.0")
def announcement_of_a_number_too_great(device):
    device.announce("2024b.2147483648")


@chosen(activation)
def crowded_icu_directory(device):
    """Data that counts among much that does not, behind a link."""
    icu = f"{update_path('2024a.1.0')}/icutz"
    device.drop(icu)
    device.link(icu, "icu-data")
    real = f"{update_path('2024a.1.0')}/icu-data"
    device.file(f"{real}/icutz44l.dat", "ICU")
    device.file(f"{real}/icutz45l.dat", "ICU", 0o640)
    for name in ("readme", "icutzl.dat", "icutz44.dat", "icutz44L.dat",
                 "icutz43l.dat.bak", "xicutz43l.dat"):
        device.file(f"{real}/{name}", "x")
    device.link(f"{real}/icutz46l.dat", "icutz44l.dat")
    device.file(f"{real}/icutz47l.dat/icutz48l.dat", "ICU")


@chosen(activation, "2023d.1.0")
def no_icu_data(device):
    device.drop(f"{update_path('2023d.1.0')}/icutz")
    device.link(f"{update_path('2023d.1.0')}/icutz", "gone")
    device.drop(f"{update_path('2024a.1.0')}/icutz/icutz44l.dat")


@chosen(activation, "2024a.1.0")
def legacy_migration(device):
    device.drop(ICUTZ)
    device.link(LEGACY_ICUTZ, f"{update_path('2024a.1.0')}/icutz")
    device.directory(OLD_ICU)


@chosen()
def legacy_directory(device):
    device.directory(LEGACY_ICUTZ)
    device.file(f"{OLD_ICU}/data", "x")


@chosen()
def localtime_corrected(device):
    device.link(LOCALTIME, "/usr/share/zoneinfo/Europe/Paris")
    device.file(OLD_ICU, "x")


@chosen()
def localtime_corrected_in_vain(device):
    device.link(LOCALTIME, "/usr/share/zoneinfo/Europe/Nowhere")


@chosen()
def localtime_relative(device):
    device.link(LOCALTIME, "zoneinfo/Europe/Paris")


@chosen()
def localtime_file(device):
    device.file(LOCALTIME, "TZif")


@chosen()
def localtime_directory(device):
    device.directory(LOCALTIME)


@chosen(activation)
def long_version_file(device):
    """A word that ends where a read does, and a format without a line end."""
    device.file(f"{SYSTEM_ZONEINFO}/+VERSION", "2023c".rjust(4096) + "\n" + "x" * 5000)
    device.file(f"{SYSTEM_ICU}/icutzformat.txt", "44l")


@chosen(abnormal=True)
def no_timezone_directory(device):
    device.drop(TIMEZONE)


@chosen(abnormal=True)
def localtime_blocked(device):
    device.drop(LOCALTIME)
    device.file(f"{LOCALTIME}/inside", "x")


@chosen(activation, abnormal=True)
def zoneinfo_blocked(device):
    device.drop(ZONEINFO)
    device.file(f"{ZONEINFO}/inside", "x")


@chosen(abnormal=True)
def system_release_too_great(device):
    device.file(f"{SYSTEM_ZONEINFO}/+VERSION", "99999999999a\n")
