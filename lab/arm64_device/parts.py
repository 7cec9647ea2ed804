# SPDX-License-Identifier: BSD-2-Clause
"""What an emulated arm64 device is made of: the program, built for it, and Debian's
kernel and busybox."""

import functools
from pathlib import Path

from lab.carriers import qemu
from lab.carriers.building import build
from lab.words.places import BUILD

WORK = BUILD / "emulator"
PROGRAM = BUILD / "arm64-release" / "marlin"
COMPANIONS = [PROGRAM.parent / "tools" / name
              for name in ("marlin-install", "marlin-mend", "marlin-status")]


def prepare():
    """Builds and fetches what is missing; or raises qemu.Unavailable."""
    with qemu.preparing(qemu.ARM64, WORK, "build", "arm64", "device"):
        build("arm64-release")


@functools.cache
def part(pattern: str) -> Path:
    return qemu.part(WORK, pattern)
