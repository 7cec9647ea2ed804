# SPDX-License-Identifier: BSD-2-Clause
"""Every line that the program prints, as the format that it gives to warn(3).

The one table for the lab and for the manual page's check. The texts stand in the
program, the C++ tests and docs/marlin.8 as well, on purpose: a reworded line has to be
reworded there.
"""

import errno
import os
import re

READ_SYMLINK = "read_symlink: %s"
CREATE_SYMLINK = "create_symlink: from %s to %s"
REMOVE = "remove: could not remove %s"
NOT_MIGRATED = "Could not migrate /var/db/icutz to /var/db/timezone/icutz"
LEGACY_NOT_REMOVED = "Could not remove /var/db/icutz"
ZONEINFO_NOT_UNLINKED = "Unlink of zoneinfo softlink failed"
ICU_NOT_UNLINKED = "unlink of ICU softlink failed"
VERSION_GROUPS = "Cannot parse version string %s, results.size() = %d"
VERSION = "Cannot parse version string %s"
WALK_NOT_STARTED = "tz_icu::initialize: fts_open of %s failed, %s"
NO_SCHEMA = "No ICU schema found for %s"
NOT_AN_ICU = "mln_icu::compatible_schema: could not dynamic_cast other component"
BAD_LINK = "Bad zoneinfo link %s"
BAD_PATH = "mln_dataset::create_components: bad path %s"
INVALID_LINKS = "Invalid current symlinks; resetting to system partition"
INCOMPATIBLE = "Symlink points at data incompatible with installed system"
NO_DATA = "Unable to locate data; resetting to system partition"
NOT_NEWER = "New update not compatible or older version: %s vs. %s"
CORRECTING = "Correcting localtime link to %s"
LOCALTIME_INVALID = "localtime link invalid; resetting to %s"

FORMATS = [
    text for name, text in list(globals().items())
    if name.isupper() and isinstance(text, str)
]

NAME = "marlin: "  # what warn(3) puts before every line
ERROR_TEXTS = {os.strerror(number) for number in [0, *errno.errorcode]}


def pattern(text: str) -> str:
    """A regular expression for all lines of a format."""
    return re.escape(text).replace("%s", ".*").replace("%d", "0")
