# SPDX-License-Identifier: BSD-2-Clause
"""The chosen devices: on each of them every call is made to fail, and the program
is killed at every call. Together they take every way through a boot."""

from functools import partial
from urllib.parse import quote

from lab.words.changes import change
from lab.words.device import Device, sound_device


def in_use(version: str) -> str:
    return (f"install_update {version}; point_links_at {version};"
            f"file RECORD 2023c.1.0_{version};")


def announced(version: str) -> str:
    return f"install_update {version}; announce {version};"


FIRST = announced("2024a.1.0")  # the system's data is in use
NEXT = in_use("2023d.1.0") + FIRST
STAYS = in_use("2024a.1.0") + FIRST

NORMAL = {  # by name: how a sound device is changed
    "nothing to do": "",
    "update stays": STAYS,
    "first activation": FIRST,
    "activation after an update": NEXT,
    "links wiped": "drop ZONEINFO; drop LOCALTIME",
    "links wiped and update announced": FIRST + "drop ZONEINFO",
    "system overtakes the update":
        "install_update 2023b.1.0; point_links_at 2023b.1.0;"
        "link LEGACY_ICUTZ /nowhere",
    "reset then an update older than the system":
        "install_update 2023a.1.0; point_links_at 2023a.1.0;" + announced("2023b.1.0"),
    "reset for the schema then an update":
        "install_update 2024a.1.0 45l; point_links_at 2024a.1.0;"
        + announced("2024b.1.0"),
    "update of another schema":
        FIRST + "drop U/icutz/icutz44l.dat; file U/icutz/icutz45b.dat ICU",
    "announcement is no data set": STAYS + "link TZ_LATEST tz/2024a.1.0",
    "announcement is a file": STAYS + "file TZ_LATEST 2024a.1.0",
    "announcement of a number too great": STAYS + "announce 2024b.2147483648",
    # Data that counts among much that does not, behind a link.
    "crowded icu directory":
        FIRST + "drop U/icutz; link U/icutz icu-data;"
        "file U/icu-data/icutz44l.dat ICU; file U/icu-data/icutz45l.dat ICU 0640;"
        "file U/icu-data/readme x; file U/icu-data/icutzl.dat x;"
        "file U/icu-data/icutz44.dat x; file U/icu-data/icutz44L.dat x;"
        "file U/icu-data/icutz43l.dat.bak x; file U/icu-data/xicutz43l.dat x;"
        "link U/icu-data/icutz46l.dat icutz44l.dat;"
        "file U/icu-data/icutz47l.dat/icutz48l.dat ICU",
    "no icu data":
        NEXT + "drop OLD/icutz; link OLD/icutz gone; drop U/icutz/icutz44l.dat",
    "legacy migration":
        STAYS + "drop ICUTZ; link LEGACY_ICUTZ U/icutz; directory OLD_ICU",
    "legacy directory": "directory LEGACY_ICUTZ; file OLD_ICU/data x",
    "localtime corrected":
        "link LOCALTIME /usr/share/zoneinfo/Europe/Paris; file OLD_ICU x",
    "localtime corrected in vain": "link LOCALTIME /usr/share/zoneinfo/Europe/Nowhere",
    "localtime relative": "link LOCALTIME zoneinfo/Europe/Paris",
    "localtime file": "file LOCALTIME TZif",
    "localtime directory": "directory LOCALTIME",
    # A word that ends where a read does, and a format without a line end.
    "long version file":
        f"{FIRST} file SYSTEM/+VERSION {quote('2023c'.rjust(4096))}%0A{'x' * 5000};"
        "file SYSTEM_ICU/icutzformat.txt 44l",
}
ABNORMAL = {  # a boot ends abnormally, as it has to
    "no timezone directory": "drop TIMEZONE",
    "localtime blocked": "drop LOCALTIME; file LOCALTIME/inside x",
    "zoneinfo blocked": FIRST + "drop ZONEINFO; file ZONEINFO/inside x",
    "system release too great": "file SYSTEM/+VERSION 99999999999a%0A",
}


def made(changes: str) -> Device:
    return change(sound_device(), changes)


# Each call makes a new one.
CHOSEN = {name: partial(made, changes) for name, changes in (NORMAL | ABNORMAL).items()}
