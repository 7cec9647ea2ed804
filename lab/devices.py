# SPDX-License-Identifier: BSD-2-Clause
"""The chosen devices: on each of them every call is made to fail, and the program
is killed at every call. Together they take every way through a boot."""

from collections.abc import Callable

from lab.device import Device, sound_device
from lab.paths import (ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, RECORD, SYSTEM_ICU,
                       SYSTEM_ZONEINFO, TIMEZONE, TZ_LATEST, ZONEINFO, update_path)


CHOSEN: dict[str, Callable[[], Device]] = {}  # by name; each call makes a new one
ABNORMAL: set[str] = set()  # those on which a boot ends abnormally, as it has to


def chosen(make):
    CHOSEN[make.__name__.replace("_", " ")] = make
    return make


def chosen_abnormal(make):
    ABNORMAL.add(make.__name__.replace("_", " "))
    return chosen(make)


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


# --- Boots that end well ------------------------------------------------------


@chosen
def nothing_to_do():
    return sound_device()


@chosen
def update_stays():
    return activation("2024a.1.0")


@chosen
def first_activation():
    return activation()


@chosen
def activation_after_an_update():
    return activation("2023d.1.0")


@chosen
def links_wiped():
    device = sound_device()
    device.drop(ZONEINFO)
    device.drop(LOCALTIME)
    return device


@chosen
def links_wiped_and_update_announced():
    device = activation()
    device.drop(ZONEINFO)
    return device


@chosen
def system_overtakes_the_update():
    device = sound_device()
    device.install_update("2023b.1.0")
    device.point_links_at("2023b.1.0")
    device.link(LEGACY_ICUTZ, "/nowhere")
    return device


@chosen
def reset_then_an_update_older_than_the_system():
    device = sound_device()
    device.install_update("2023a.1.0")
    device.install_update("2023b.1.0")
    device.point_links_at("2023a.1.0")
    device.announce("2023b.1.0")
    return device


@chosen
def reset_for_the_schema_then_an_update():
    device = sound_device()
    device.install_update("2024a.1.0", "45l")
    device.install_update("2024b.1.0")
    device.point_links_at("2024a.1.0")
    device.announce("2024b.1.0")
    return device


@chosen
def update_of_another_schema():
    device = activation()
    device.drop(f"{update_path('2024a.1.0')}/icutz/icutz44l.dat")
    device.file(f"{update_path('2024a.1.0')}/icutz/icutz45b.dat", "ICU")
    return device


@chosen
def announcement_is_no_data_set():
    device = activation("2024a.1.0")
    device.link(TZ_LATEST, "tz/2024a.1.0")
    return device


@chosen
def announcement_is_a_file():
    device = activation("2024a.1.0")
    device.file(TZ_LATEST, "2024a.1.0")
    return device


@chosen
def announcement_of_a_number_too_great():
    device = activation("2024a.1.0")
    device.announce("2024b.2147483648")
    return device


@chosen
def crowded_icu_directory():
    """Data that counts among much that does not, behind a link."""
    device = activation()
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
    return device


@chosen
def no_icu_data():
    device = activation("2023d.1.0")
    device.drop(f"{update_path('2023d.1.0')}/icutz")
    device.link(f"{update_path('2023d.1.0')}/icutz", "gone")
    device.drop(f"{update_path('2024a.1.0')}/icutz/icutz44l.dat")
    return device


@chosen
def legacy_migration():
    device = activation("2024a.1.0")
    device.drop(ICUTZ)
    device.link(LEGACY_ICUTZ, f"{update_path('2024a.1.0')}/icutz")
    device.directory(OLD_ICU)
    return device


@chosen
def legacy_directory():
    device = sound_device()
    device.directory(LEGACY_ICUTZ)
    device.file(f"{OLD_ICU}/data", "x")
    return device


@chosen
def localtime_corrected():
    device = sound_device()
    device.link(LOCALTIME, "/usr/share/zoneinfo/Europe/Paris")
    device.file(OLD_ICU, "x")
    return device


@chosen
def localtime_corrected_in_vain():
    device = sound_device()
    device.link(LOCALTIME, "/usr/share/zoneinfo/Europe/Nowhere")
    return device


@chosen
def localtime_relative():
    device = sound_device()
    device.link(LOCALTIME, "zoneinfo/Europe/Paris")
    return device


@chosen
def localtime_file():
    device = sound_device()
    device.file(LOCALTIME, "TZif")
    return device


@chosen
def localtime_directory():
    device = sound_device()
    device.directory(LOCALTIME)
    return device


@chosen
def long_version_file():
    """A word that ends where a read does, and a format without a line end."""
    device = activation()
    device.file(f"{SYSTEM_ZONEINFO}/+VERSION", "2023c".rjust(4096) + "\n" + "x" * 5000)
    device.file(f"{SYSTEM_ICU}/icutzformat.txt", "44l")
    return device


# --- Boots that end abnormally, as they have to -------------------------------


@chosen_abnormal
def no_timezone_directory():
    device = sound_device()
    device.drop(TIMEZONE)
    return device


@chosen_abnormal
def localtime_blocked():
    device = sound_device()
    device.drop(LOCALTIME)
    device.file(f"{LOCALTIME}/inside", "x")
    return device


@chosen_abnormal
def zoneinfo_blocked():
    device = activation()
    device.drop(ZONEINFO)
    device.file(f"{ZONEINFO}/inside", "x")
    return device


@chosen_abnormal
def system_release_too_great():
    device = sound_device()
    device.file(f"{SYSTEM_ZONEINFO}/+VERSION", "99999999999a\n")
    return device
