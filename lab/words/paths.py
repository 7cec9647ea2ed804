# SPDX-License-Identifier: BSD-2-Clause
"""Every place on a device that the program knows, and how much of it is whose.

Written down a second time, apart from the program, so that a wrong constant there
does not make its own trial right.
"""

PLACES = ("/usr/share", "/var/db")  # all that a device is made of

TIMEZONE = "/var/db/timezone"
DOWNLOADS = "/var/db/timezone/tz/"
ZONEINFO = "/var/db/timezone/zoneinfo"
ICUTZ = "/var/db/timezone/icutz"
LOCALTIME = "/var/db/timezone/localtime"
TZ_LATEST = "/var/db/timezone/tz_latest"
RECORD = "/var/db/timezone/TZVersionDiffRecord"
LEGACY_ICUTZ = "/var/db/icutz"
OLD_ICU = "/var/db/icu"
SYSTEM_ZONEINFO = "/usr/share/zoneinfo.default"
SYSTEM_ICU = "/usr/share/icu"
FORMER_ZONEINFO = "/usr/share/zoneinfo"

DEFAULT_ZONE = "America/Los_Angeles"
DEFAULT_LOCALTIME = "/var/db/timezone/zoneinfo/America/Los_Angeles"


def update_path(version: str) -> str:
    """The directory of a downloaded data set."""
    return DOWNLOADS + version
