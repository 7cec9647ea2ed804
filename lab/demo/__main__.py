# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/demo [--facts]

Shows what marlin does, on a private device with real time-zone data: eight
boots, from a first one to damaged links. Installs what it needs, as root, and
builds the release program; changes nothing else outside the folder "build".
With --facts only what was found is printed, a "scene: fact" line each.

Prints colours on a terminal, unless NO_COLOR is set; with FORCE_COLOR anywhere.

Exit status: 0 when every scene ended as it claims, otherwise 1; 2 for bad use;
77 when there can be no private device.
"""

import fcntl
import os
import subprocess
import sys

from lab import boot
from lab.demo import data

PACKAGES = "binutils cmake g++ icu-devtools libc-bin libicu-dev ninja-build tzdata"


def main() -> int:
    match sys.argv[1:]:
        case ["--help"]:
            print(__doc__.strip())
            return 0
        case [] | ["--facts"]:
            pass
        case _:
            print("demo: only --facts is understood; see --help", file=sys.stderr)
            return 2
    os.chdir(boot.PROJECT)
    for command in (["scripts/packages", "bubblewrap"],
                    ["scripts/private-device", "true"],
                    ["scripts/packages", *PACKAGES.split()]):
        if status := subprocess.call(command):
            return status
    os.makedirs("build/demo", exist_ok=True)
    # Two demonstrations at once would build and prepare the same.
    with open("build/demo/lock", "w", encoding="ascii") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        print("Building build/release/marlin", file=sys.stderr)
        boot.build()
        print(f"Preparing the data in {data.TARGET}", file=sys.stderr)
        data.prepare()
    os.environ["MARLIN"] = boot.PROGRAM
    os.execv("scripts/private-device", [
        "private-device", "--readable", os.path.dirname(boot.PROGRAM),
        "/usr/bin/python3", "-B", "-m", "lab.demo.story", *sys.argv[1:]])


sys.exit(main())
