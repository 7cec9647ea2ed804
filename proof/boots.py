# SPDX-License-Identifier: BSD-2-Clause
"""The chosen boots: devices on which every call is made to fail, and on which
the program is killed at every call. Together they take every way through a
boot."""

from model import (Device, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, RECORD,
                   SYSTEM_ICU, SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO)

CHOSEN_LOCALTIME = ZONEINFO + "/Europe/Paris"


def update_path(version):
  return f"/var/db/timezone/tz/{version}"


def install_system(device, release="2023c", schema="44l"):
  device.file(f"{SYSTEM_ZONEINFO}/+VERSION", f"{release}\n")
  device.file(f"{SYSTEM_ZONEINFO}/America/Los_Angeles", "TZif system LA")
  device.file(f"{SYSTEM_ZONEINFO}/Europe/Paris", "TZif system Paris")
  device.file(f"{SYSTEM_ICU}/icutzformat.txt", f"{schema}\n")


def install_update(device, version, schema="44l"):
  path = update_path(version)
  device.file(f"{path}/zoneinfo/+VERSION", f"{version.partition('.')[0]}\n")
  device.file(f"{path}/zoneinfo/America/Los_Angeles", f"TZif {version} LA")
  device.file(f"{path}/zoneinfo/Europe/Paris", f"TZif {version} Paris")
  device.file(f"{path}/icutz/icutz{schema}.dat", f"ICU {version}")


def sound_device():
  """A system partition, links to it, and a zone that somebody chose."""
  device = Device()
  device.directory("/var/db/timezone/tz")
  install_system(device)
  device.link(ZONEINFO, SYSTEM_ZONEINFO)
  device.link(LOCALTIME, CHOSEN_LOCALTIME)
  return device


def announce(device, version):
  device.link(TZ_LATEST, update_path(version))


def link_to_update(device, version):
  device.link(ZONEINFO, f"{update_path(version)}/zoneinfo")
  device.link(ICUTZ, f"{update_path(version)}/icutz")


def activation(current=None, update="2024a.1.0"):
  device = sound_device()
  if current:
    install_update(device, current)
    link_to_update(device, current)
    device.file(RECORD, f"2023c.1.0_{current}")
  install_update(device, update)
  announce(device, update)
  return device


# --- Boots that end well -----------------------------------------------------


def nothing_to_do():
  return sound_device()


def update_stays():
  device = activation("2024a.1.0")
  return device


def first_activation():
  return activation()


def activation_after_an_update():
  return activation("2023d.1.0")


def links_wiped():
  device = sound_device()
  device.drop(ZONEINFO)
  device.drop(LOCALTIME)
  return device


def links_wiped_and_update_announced():
  device = activation()
  device.drop(ZONEINFO)
  return device


def system_overtakes_the_update():
  device = sound_device()
  install_update(device, "2023b.1.0")
  link_to_update(device, "2023b.1.0")
  device.link(LEGACY_ICUTZ, "/nowhere")
  return device


def reset_then_an_update_older_than_the_system():
  device = sound_device()
  install_update(device, "2023a.1.0")
  install_update(device, "2023b.1.0")
  link_to_update(device, "2023a.1.0")
  announce(device, "2023b.1.0")
  return device


def reset_for_the_schema_then_an_update():
  device = sound_device()
  install_update(device, "2024a.1.0", "45l")
  install_update(device, "2024b.1.0")
  link_to_update(device, "2024a.1.0")
  announce(device, "2024b.1.0")
  return device


def update_of_another_schema():
  device = activation()
  device.drop(f"{update_path('2024a.1.0')}/icutz/icutz44l.dat")
  device.file(f"{update_path('2024a.1.0')}/icutz/icutz45b.dat", "ICU")
  return device


def announcement_is_no_data_set():
  device = activation("2024a.1.0")
  device.link(TZ_LATEST, "tz/2024a.1.0")
  return device


def announcement_is_a_file():
  device = activation("2024a.1.0")
  device.file(TZ_LATEST, "2024a.1.0")
  return device


def announcement_of_a_number_too_great():
  device = activation("2024a.1.0")
  announce(device, "2024b.2147483648")
  return device


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


def no_icu_data():
  device = activation("2023d.1.0")
  device.drop(f"{update_path('2023d.1.0')}/icutz")
  device.link(f"{update_path('2023d.1.0')}/icutz", "gone")
  device.drop(f"{update_path('2024a.1.0')}/icutz/icutz44l.dat")
  return device


def legacy_migration():
  device = activation("2024a.1.0")
  device.drop(ICUTZ)
  device.link(LEGACY_ICUTZ, f"{update_path('2024a.1.0')}/icutz")
  device.directory(OLD_ICU)
  return device


def legacy_directory():
  device = sound_device()
  device.directory(LEGACY_ICUTZ)
  device.file(f"{OLD_ICU}/data", "x")
  return device


def localtime_corrected():
  device = sound_device()
  device.link(LOCALTIME, "/usr/share/zoneinfo/Europe/Paris")
  device.file(OLD_ICU, "x")
  return device


def localtime_corrected_in_vain():
  device = sound_device()
  device.link(LOCALTIME, "/usr/share/zoneinfo/Europe/Nowhere")
  return device


def localtime_relative():
  device = sound_device()
  device.link(LOCALTIME, "zoneinfo/Europe/Paris")
  return device


def localtime_file():
  device = sound_device()
  device.file(LOCALTIME, "TZif")
  return device


def localtime_directory():
  device = sound_device()
  device.directory(LOCALTIME)
  return device


def long_version_file():
  """A word that ends where a read does, and a format without a line end."""
  device = activation()
  device.file(f"{SYSTEM_ZONEINFO}/+VERSION",
              "2023c".rjust(4096) + "\n" + "x" * 5000)
  device.file(f"{SYSTEM_ICU}/icutzformat.txt", "44l")
  return device


BOOTS = [
    nothing_to_do, update_stays, first_activation, activation_after_an_update,
    links_wiped, links_wiped_and_update_announced, system_overtakes_the_update,
    reset_then_an_update_older_than_the_system,
    reset_for_the_schema_then_an_update, update_of_another_schema,
    announcement_is_no_data_set, announcement_is_a_file,
    announcement_of_a_number_too_great, crowded_icu_directory, no_icu_data,
    legacy_migration, legacy_directory, localtime_corrected,
    localtime_corrected_in_vain, localtime_relative, localtime_file,
    localtime_directory, long_version_file]

# --- Boots that end abnormally, as they have to ------------------------------


def no_timezone_directory():
  device = sound_device()
  device.drop("/var/db/timezone")
  return device


def localtime_blocked():
  device = sound_device()
  device.drop(LOCALTIME)
  device.file(f"{LOCALTIME}/inside", "x")
  return device


def zoneinfo_blocked():
  device = activation()
  device.drop(ZONEINFO)
  device.file(f"{ZONEINFO}/inside", "x")
  return device


def system_release_too_great():
  device = sound_device()
  device.file(f"{SYSTEM_ZONEINFO}/+VERSION", "99999999999a\n")
  return device


ABNORMAL_BOOTS = [no_timezone_directory, localtime_blocked, zoneinfo_blocked,
                  system_release_too_great]


def all_boots():
  return {boot.__name__.replace("_", " "): boot
          for boot in BOOTS + ABNORMAL_BOOTS}
