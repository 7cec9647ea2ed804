# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/status [--root DIR] [--json | --check]

Builds marlin-status, and runs it: it tells which time-zone data a device uses and what
its next boot will do. Without --root the device is this machine. Nothing is changed.
docs/marlin-status.8 has the options, and the exit status after the build.

Exit status: marlin-status's; 1 when it cannot be built, 2 for bad use of this door.
"""

import os
import sys

from lab.carriers.building import build_program, need
from lab.words.command import Options
from lab.words.places import BUILD

PROGRAM = BUILD / "release" / "tools" / "marlin-status"


def main(words: list[str]):
    options = Options(__doc__)
    options.add_argument("--root")
    form = options.add_mutually_exclusive_group()
    form.add_argument("--json", action="store_true")
    form.add_argument("--check", action="store_true")
    options.parse_args(words)
    need("build")
    build_program()
    os.execv(PROGRAM, ["marlin-status", *words])


if __name__ == "__main__":
    main(sys.argv[1:])
