# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/test [PRESET] [-R REGEX]

Builds the program and all tests with a preset (dev by default; clang, asan, coverage,
arm64-dev), and runs them, or those whose names match REGEX, each on a private device
of its own. Installs what that takes, as root: some 400 MB of Debian packages on a bare
Debian 12; otherwise says what is missing. Nothing else is touched outside of the folder
"build", or the one that MARLIN_BUILD names, an absolute path.

Exit status: 0 when all tests pass, 1 when one fails or something does not build, 2 for
bad use, 77 when tests are skipped, as where there can be no private device.
"""

import os
import re
import subprocess
import sys
from pathlib import Path

from lab.doors import Options, build, locked, need, stop
from lab.places import BUILD, PROJECT

# What the machine of a preset cannot do, and the tests that therefore skip themselves.
MAY_SKIP = {
    **dict.fromkeys(["dev", "clang", "coverage"], (None, "")),
    "asan": (r"(UntrustedData|WholeListOfCalls)\.",
             "a sanitizer stands no limit of memory, and makes its own calls"),
    "arm64-dev": (r"(Calls|DataProtection|UntrustedData|WholeListOfCalls)\.",
                  "qemu-user neither traces system calls nor limits memory"),
}
PURPOSES = {"clang": ["clang"], "arm64-dev": ["arm64", "arm64-test"]}


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


def run_tests(folder: Path, regex: str, may_skip: str | None, reason: str) -> int:
    """Shows what ctest prints, but counts no skipped test as passed."""
    skipped = []
    command = ["ctest", "-R", regex, "--no-tests=error", "--output-on-failure",
               "--parallel", str(2 * (os.cpu_count() or 1))]
    with subprocess.Popen(command, cwd=folder, stdout=subprocess.PIPE, text=True,
                          errors="replace") as ctest:
        for line in ctest.stdout:
            skipped += re.findall(r"^ *\d+/\d+ Test +#\d+: (\S+) \.+\*+Skipped", line)
            if skipped and (end := re.match(r"\d+% (.* (\d+) .* (\d+))$", line)):
                text, failed, tests = end[1], int(end[2]), int(end[3])
                line = (f"{100 * (tests - failed - len(skipped)) // tests}% {text}, "
                        f"{len(skipped)} of {tests} skipped\n")
            print(line, end="", flush=True)
    if ctest.returncode:
        return 1
    if [name for name in skipped if not (may_skip and re.match(may_skip, name))]:
        return 77
    if skipped:
        print(f"Skipped rightly: {reason}.")
    return 0


if __name__ == "__main__":
    main()
