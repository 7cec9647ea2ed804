# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/demo [--facts]

Shows what marlin does, on a private device with real time-zone data: eight
boots, from a first one to damaged links. Installs what it needs, as root, and
builds the release program; changes nothing else outside the folder "build".
With --facts only what was found is printed, as lab/demo/facts has it.

Prints colours on a terminal, unless NO_COLOR is set; with FORCE_COLOR anywhere.

Exit status: 0 when every scene ended as it claims, otherwise 1; 2 for bad use;
77 when there can be no private device.
"""

import os
import subprocess
import sys

from lab.carriers import boot, real_data
from lab.carriers.building import build_program, locked, need, unprivileged
from lab.words.command import Options, say
from lab.words.places import PROJECT


def main() -> int:
    options = Options(__doc__)
    options.add_argument("--facts", action="store_true")
    options.parse_args()
    os.chdir(PROJECT)
    need("private-device")
    # The first of these tells more, and the second is what the story takes.
    for user in [], unprivileged():
        if subprocess.call([*user, "scripts/private-device", "--probe"]):
            return 77
    need("build", "demo")
    build_program()
    # Two demonstrations at once would prepare the same.
    with locked(real_data.TARGET.parent):
        say("Preparing the real time-zone data (about 5 s)")
        real_data.prepare()
    os.environ["MARLIN"] = boot.PROGRAM
    command = [
        *unprivileged(), "scripts/private-device", "--readable", str(real_data.TARGET),
        "--readable", os.path.dirname(boot.PROGRAM),
        "/usr/bin/python3", "-B", "-m", "lab.demo.story", *sys.argv[1:]]
    os.execvp(command[0], command)


sys.exit(main())
