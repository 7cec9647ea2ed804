# SPDX-License-Identifier: BSD-2-Clause
"""usage: python3 -m lab.proofs.bare [--on RELEASE] [ROW...]

Opens every door of scripts/ alone, as root, on a machine that nobody prepared: a bare
Debian 12 or 13, with a clone of what is committed here. A ROW is a command, as "test
clang"; all of them, on both, take hours. Prints each one's status and seconds.

Only the status 0 is right, or 77 with a line that says what the machine lacks; and 2 of
marlin-status, which finds no data there. The roots and the packages that doors download
stay in build/bare, and with them the log of each row, and the machine where it failed.

Exit status: 0 when all is right, 1 when something is not, 2 for bad use, 77 when there
can be no bare Debian here.
"""

import os
import re
import shutil
import subprocess
import sys
import time
from pathlib import Path

from lab.carriers.building import MAY_SKIP, need
from lab.words.command import Options, say, stop
from lab.words.places import BUILD, PROJECT

PLACE = BUILD / "bare"
RELEASES = "bookworm", "trixie"


def told(door: str) -> list[str]:
    """The names that a door lists in its --help."""
    text = subprocess.run([PROJECT / "scripts" / door, "--help"], text=True,
                          stdout=subprocess.PIPE, check=True).stdout
    return re.findall(r"(?m)^  ([a-z-]+) {2,}\S", text)


# The emulators in their smallest forms: their tests take an hour on one processor.
WHOLE_DOORS = {"gcc", "clang", "readers", "bench", "package", "arm64", "device",
               "systems", "proofs", "bare"}
ROWS = [
    "packages python3", "private-device true", "status --json", "demo", "readers",
    "bench --check", "bench --companions", "package", "picture /tmp/picture.svg",
    "device --boot-cost", "device --systems --help",
    *(f"test {preset}" for preset in MAY_SKIP),
    *(f"ci --full {stage}" for stage in told("ci") if stage not in WHOLE_DOORS),
    *(f"prove --quick {proof}" for proof in told("prove"))]

# "/proc" is a new one, whole, so that there can be private devices.
MACHINE = """
cd "$1" && mount -t overlay -o "lowerdir=$2,upperdir=$1/new,workdir=$1/work" none root
shift 2 && exec bwrap --cap-add ALL --dev-bind root / --dev /dev --bind /proc /proc \
  --dev-bind /sys /sys --tmpfs /run --ro-bind /etc/resolv.conf /etc/resolv.conf \
  --bind "$PWD/../packages" /var/cache/apt/archives --chdir /marlin -- "$@"
"""
# Without a buffer, so that the last line of a log is the last that was said.
ENVIRONMENT = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "HOME": "/root",
               "PYTHONUNBUFFERED": "1"}


def root(release: str) -> Path:
    made = PLACE / release / "root"
    if not made.exists():
        say(f"Making a bare {release}, in two minutes")
        new = made.with_name("new")
        shutil.rmtree(new, ignore_errors=True)
        making = subprocess.run(["mmdebstrap", "--quiet", "--variant=minbase", release,
                                 new], stderr=subprocess.PIPE, text=True)
        if making.returncode:
            stop(77, f"no bare {release} here: {making.stderr.splitlines()[-1:]}")
        new.rename(made)
    return made


def run(release: str, row: str) -> bool:
    """Opens a door on a machine of its own; whether that is right."""
    name = re.sub("[^a-z0-9]+", "-", row)
    machine, log = PLACE / release / name, PLACE / release / f"{name}.log"
    shutil.rmtree(machine, ignore_errors=True)
    for folder in ("../packages/partial", "new", "work", "root"):
        (machine / folder).mkdir(parents=True, exist_ok=True)
    subprocess.run(["git", "clone", "-q", PROJECT, machine / "new/marlin"], check=True)
    command = ["unshare", "--mount", "--pid", "--fork", "--kill-child", "--mount-proc",
               "sh", "-euc", MACHINE, "sh", machine, root(release),
               *f"scripts/{row}".split()]
    started = time.monotonic()
    with open(log, "wb") as output:
        status = subprocess.run(command, stdin=subprocess.DEVNULL, stdout=output,
                                stderr=output, env=ENVIRONMENT).returncode
    lacks = log.read_text(errors="replace").splitlines()[-1:] if status == 77 else []
    print(f"{time.monotonic() - started:6.0f} s  {status:4}  {release:9} {row}", *lacks,
          flush=True)
    right = status == (2 if row.startswith("status") else 0) or bool(lacks)
    if right:
        shutil.rmtree(machine)
    return right


def main() -> int:
    options = Options(__doc__)
    options.add_argument("--on", choices=RELEASES)
    options.add_names("rows", ROWS)
    chosen = options.parse_args()
    doors = {path.name for path in (PROJECT / "scripts").iterdir()
             if os.access(path, os.X_OK)}
    if forgotten := doors - {row.split()[0] for row in ROWS}:
        stop(1, f"no row opens {forgotten}")
    need("bare")
    if os.geteuid():
        stop(77, "only root can have a bare Debian")
    results = [run(release, row) for release in RELEASES if chosen.on in (None, release)
               for row in chosen.rows]
    print(f"{sum(results)} passed, {len(results) - sum(results)} failed")
    return 0 if all(results) else 1


if __name__ == "__main__":
    sys.exit(main())
