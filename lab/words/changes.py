# SPDX-License-Identifier: BSD-2-Clause
"""Changes of a device as text: verbs of its description with their arguments, and ";"
between changes. A path can begin with one of the names below; "%20" is a blank, and
other characters likewise."""

import re
from urllib.parse import unquote

from lab.words.device import Device
from lab.words.paths import (DOWNLOADS, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, RECORD,
                             SYSTEM_ICU, SYSTEM_ZONEINFO, TIMEZONE, TZ_LATEST, ZONEINFO,
                             update_path)

PATHS = {"ZONEINFO": ZONEINFO, "ICUTZ": ICUTZ, "LOCALTIME": LOCALTIME,
         "TZ_LATEST": TZ_LATEST, "RECORD": RECORD, "LEGACY_ICUTZ": LEGACY_ICUTZ,
         "OLD_ICU": OLD_ICU, "TIMEZONE": TIMEZONE, "TZ": DOWNLOADS.rstrip("/"),
         "SYSTEM": SYSTEM_ZONEINFO, "SYSTEM_ICU": SYSTEM_ICU,
         "U": update_path("2024a.1.0"), "OLD": update_path("2023d.1.0")}


def word(text: str) -> str | int:
    """A text, or a mode of four digits."""
    if re.fullmatch("0[0-7]{3}", text):
        return int(text, 8)
    text = re.sub("^[A-Z_]+(?=/|$)", lambda match: PATHS.get(match[0], match[0]), text)
    return unquote(text, "latin-1")


def change(device: Device, changes: str) -> Device:
    for verb, *words in (text.split() for text in changes.split(";") if text.strip()):
        getattr(device, verb)(*map(word, words))
    return device
