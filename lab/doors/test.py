# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/test [PRESET] [-R REGEX]

Builds the program and all tests with a preset (dev by default; clang, asan,
arm64-dev, armhf-dev), and runs them, or those whose names match REGEX, each on a
private device of its own. Installs what that takes, as root: some 100 MB of Debian
packages, 400 MB on the disk; otherwise says what is missing. Nothing else is touched
outside of the folder "build", or the one that MARLIN_BUILD names, an absolute path.

Exit status: 0 when all tests pass, 1 when one fails or something does not build, 2 for
bad use, 77 when tests are skipped, as where there can be no private device.
"""

import os
import re
import subprocess
import sys

from lab.carriers.building import MAY_SKIP, build, locked, need, run_tests
from lab.words.command import Options, stop
from lab.words.places import BUILD, PROJECT

PURPOSES = {"clang": ["clang"], "arm64-dev": ["arm64", "cross-test"],
            "armhf-dev": ["armhf", "cross-test"]}


def main():
    options = Options(__doc__)
    options.add_argument("preset", nargs="?", default="dev", choices=MAY_SKIP)
    options.add_argument("-R", dest="regex", default=".")
    chosen = options.parse_args()
    purposes = ["build", "private-device", "test", *PURPOSES.get(chosen.preset, [])]
    # Root learns what cannot be before much is installed for it.
    need(*purposes[1:2] if os.geteuid() == 0 else purposes)
    probe = subprocess.run([PROJECT / "scripts/private-device", "--probe"])
    if probe.returncode:
        tests = sum(len(re.findall("^TEST", source.read_text(), re.MULTILINE))
                    for source in (PROJECT / "tests").rglob("*_test.cpp"))
        stop(77, f"{tests} of {tests} tests skipped: each needs a private device")
    need(*purposes)
    folder = BUILD / chosen.preset
    with locked(folder):
        build(chosen.preset)
        sys.exit(run_tests(folder, chosen.regex, *MAY_SKIP[chosen.preset]))


if __name__ == "__main__":
    main()
