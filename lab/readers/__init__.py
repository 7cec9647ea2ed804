# SPDX-License-Identifier: BSD-2-Clause
"""Real programs that read time-zone data, on a device that follows the links."""

from lab.words.places import BUILD

HOME = BUILD / "readers"
UNPACKED = HOME / "debian"  # Debian packages that are not installed for this
GLIBC, MUSL = str(HOME / "clock-glibc"), str(HOME / "clock-musl")
