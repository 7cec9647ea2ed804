# SPDX-License-Identifier: BSD-2-Clause
"""Where the project is, and the folder for all that is made of it: "build", or what
MARLIN_BUILD names, an absolute path, for a checkout that cannot be written."""

import os
from pathlib import Path

PROJECT = Path(__file__).resolve().parents[2]
BUILD = Path(os.environ.get("MARLIN_BUILD") or PROJECT / "build")
if not BUILD.is_absolute():
    raise SystemExit(f"MARLIN_BUILD is not an absolute path: {BUILD}")
BUILD = BUILD.resolve()


def shown(place: Path) -> str:
    """As short as it can be told to somebody in the project's folder."""
    inside = place.is_relative_to(PROJECT)
    return str(place.relative_to(PROJECT) if inside else place)
