# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/simulate [--boots N] SOURCE

Rehearses what marlin would do to a device, on a copy: its links and record as they
are, the lines of each boot, and what that changed. SOURCE is never changed. It is a
directory or a tar archive that holds a device's "/var/db" and "/usr/share" as var/db
and usr/share; "/" is this machine. Links inside it are taken as the device would take
them, as far as they lead to one of these places.

  --boots N   how many boots, one after the other (1; 0 shows the device as it is)

MARLIN names another program than build/release/marlin. Control bytes are shown
escaped. Exit status: 0 when the last boot ended well, 1 when it did not or SOURCE is
no device, 2 for bad use, 77 when there can be no private device.
"""

import os
import pickle
import re
import subprocess
import sys

from lab import boot
from lab.carriers import archive, namespace
from lab.device import described
from lab.paths import (ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, RECORD, TZ_LATEST,
                       ZONEINFO)
from lab.places import PROJECT

SHOWN = (ZONEINFO, ICUTZ, LOCALTIME, TZ_LATEST, RECORD, LEGACY_ICUTZ, OLD_ICU)


def escaped(text: str) -> str:
    return re.sub(r"[^ -~]", lambda byte: f"\\x{ord(byte[0]):02x}", text)


def print_device(entries, before):
    for path in SHOWN:
        here = entries.get(path)
        was = here if before is None else before.get(path)
        mark = "*" if (was and was.identity) != (here and here.identity) else " "
        print(f"  {mark} {path:38} {escaped(described(here)) if here else 'nothing'}")


def rehearse(boots: int) -> int:
    """Inside the private device; the description comes from standard input."""
    namespace.build(pickle.load(sys.stdin.buffer))
    entries = namespace.look()
    print("The device:")
    print_device(entries, None)
    ending = "exit 0"
    for number in range(1, boots + 1):
        booted = boot.boot()
        before, entries, ending = entries, namespace.look(), booted.ending
        print(f"Boot {number}: {ending}")
        for line in booted.log.splitlines():
            print(f"    {escaped(line)}")
        print_device(entries, before)
    return 0 if ending == "exit 0" else 1


def main(arguments: list[str]) -> int:
    boots = "1"
    from lab import doors  # not on the private device
    if arguments[:1] == ["--boots"] and len(arguments) > 1:
        boots, arguments = arguments[1], arguments[2:]
    if arguments == ["--help"]:
        print(__doc__, end="")
        return 0
    if len(arguments) != 1 or arguments[0].startswith("-") or not re.fullmatch(
            "[0-9]{1,4}", boots):
        print("simulate: one directory or archive is expected; see --help",
              file=sys.stderr)
        return 2
    try:
        device = archive.read(os.path.abspath(arguments[0]))
    except archive.NoDevice as reason:
        print(f"simulate: {reason}", file=sys.stderr)
        return 1
    doors.need("build", "private-device")
    doors.build_program()
    return subprocess.run(
        ["scripts/private-device", "--readable", os.path.dirname(boot.PROGRAM),
         "/usr/bin/python3", "-B", "-m", "lab.simulate", "--inside", boots],
        input=pickle.dumps(device), cwd=PROJECT,
        env=dict(os.environ, MARLIN=boot.PROGRAM)).returncode


if __name__ == "__main__":
    if sys.argv[1:2] == ["--inside"]:
        sys.exit(rehearse(int(sys.argv[2])))
    sys.exit(main(sys.argv[1:]))
