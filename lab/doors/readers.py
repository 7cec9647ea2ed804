# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/readers [--image | TEST...]

Runs the commands of docs/integration.md that make an update. Then shows what real
programs from Debian read, on a private device on which an update is activated, another
refused, and the system upgraded; compares it with docs/readers.md.
Installs small packages, as root; the large programs are only unpacked, into the folder
"build/readers", some 150 MB. With --image it makes and boots the image of
docs/integration.md instead, as root, in five minutes.

Exit status: 0 when everything is as the document says, 1 when it is not, 2 for bad
use, 77 when there can be no private device.
"""

import os
import subprocess
import sys
from pathlib import Path

from lab.carriers import boot, real_data, releases
from lab.carriers.building import build_program, locked, need, pytest
from lab.carriers.private_device import ISOLATION, machine
from lab.readers.programs import GLIBC, HOME, ICU, MUSL, UNPACKED
from lab.words.command import Options, say, stop
from lab.words.places import BUILD, PROJECT

PACKAGES = ("libnode108 node-undici node-acorn node-cjs-module-lexer miller "
            "postgresql-15 postgresql-client-15").split()
RECIPE, IMAGE = "lab/proofs/recipe.py", "lab/proofs/image.py"
# Of the machine's "/etc": what programs need to start.
ETC = ("alternatives", "group", "ld.so.cache", "passwd")


def unpack():
    """What would be large, or start a server, is not installed."""
    UNPACKED.mkdir()
    # Another Node than Debian's may be installed, and then counts as the candidate.
    known = subprocess.run(["apt-cache", "show", "--no-all-versions", "libnode108"],
                           capture_output=True, text=True).stdout
    if not known:
        stop(1, "apt knows no package libnode108; as root, run apt-get update")
    release = releases.find("Node", "^Version: (.*)", known)[1]
    say("Fetching Debian packages (35 MB)")
    fetched = subprocess.run(
        ["apt-get", "-q", "download", f"nodejs={release}", *PACKAGES], cwd=HOME,
        capture_output=True, text=True)
    if fetched.returncode:
        why, *_ = fetched.stderr.splitlines()
        stop(1, f"cannot fetch the programs: {why}")
    for package in HOME.glob("*.deb"):
        releases.output("dpkg-deb", "-x", package, UNPACKED)
        package.unlink()


def make():
    unpack()
    sources, output = PROJECT / "lab/readers", releases.output
    output("gcc", "-O1", sources / "clock.c", "-o", GLIBC)
    output("musl-gcc", "-O1", "-static", sources / "clock.c", "-o", MUSL)
    output("g++", "-O1", sources / "icu.cpp", "-o", ICU, "-licui18n", "-licuuc")


def inside(*command: str) -> list[str]:
    """A private device with an "/etc" of its own, in which the zone can be set. Nobody
    is root there, as PostgreSQL's server insists."""
    places = [str(place) for place in (PROJECT, BUILD, Path(boot.PROGRAM).parent)]
    places += [f"/etc/{name}" for name in ETC if os.path.exists(f"/etc/{name}")]
    return ["bwrap", "--unshare-user", "--uid", "1000", "--gid", "1000", *ISOLATION,
            *machine(), "--tmpfs", "/etc", "--tmpfs", "/tmp", "--dir",
            "/run", "--tmpfs", "/var/db", "--tmpfs", "/usr/share",
            *(word for place in places for word in ("--ro-bind", place, place)),
            "--setenv", "HOME", "/tmp", "--setenv", "MARLIN_PRIVATE_DEVICE", "1",
            "--setenv", "MARLIN", boot.PROGRAM, "--chdir", str(PROJECT), "--", *command]


def main() -> int:
    options = Options(__doc__)
    options.add_argument("--image", action="store_true")
    options.add_argument("tests", nargs="*", default=[RECIPE, "lab/proofs/readers.py"])
    chosen = options.parse_args()
    tests = [IMAGE] if chosen.image else chosen.tests
    # These have private devices, or a whole system, of their own.
    outside = [test for test in tests if test.startswith((RECIPE, IMAGE))]
    others = [test for test in tests if test not in outside]
    need("private-device")
    if status := subprocess.call([PROJECT / "scripts/private-device", "--probe"]):
        return status
    need("build", "demo", "prove", "pytest", "readers", *["image"] * chosen.image)
    build_program()
    with locked(real_data.TARGET.parent):
        real_data.prepare()
        if others:
            try:
                releases.once(HOME, [real_data.TARGET / "inputs", __file__,
                                     *sorted((PROJECT / "lab/readers").glob("*.c*"))],
                              make)
            except (releases.NotOfTheForm, subprocess.CalledProcessError) as failed:
                stop(1, str(failed))
    run = pytest("-p", "no:cacheprovider", "-q")
    commands = [[*run, *outside]] if outside else []
    if others:
        commands.append(inside(*run, *others))
    return int(any([subprocess.call(command, cwd=PROJECT) for command in commands]))


sys.exit(main())
