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
import re
import subprocess
import sys
from pathlib import Path

from lab.carriers import boot, real_data, releases
from lab.carriers.building import build_program, locked, need, pytest
from lab.carriers.private_device import device
from lab.readers import GLIBC, HOME, MUSL, UNPACKED
from lab.words.command import Options, say, stop
from lab.words.places import BUILD, PROJECT

# Large programs, and of what they depend on what they need to tell the time.
PROGRAMS = "libnode", "postgresql-", "postgresql-client-"  # with a number
NEEDED = r"lib(?!llvm|perl)|node|postgresql-(client-)?\d|miller"
RECIPE, IMAGE = "lab/proofs/recipe.py", "lab/proofs/image.py"
# Of the machine's "/etc": what programs need to start.
ETC = ("alternatives", "group", "ld.so.cache")


def apt(*words: str) -> str:
    """What apt-get or apt-cache says."""
    done = subprocess.run([f"apt-{words[0]}", "-q", *words[1:]], cwd=HOME, text=True,
                          capture_output=True)
    if done.returncode:
        stop(1, f"cannot fetch the programs: {done.stderr.splitlines()[0]}")
    return done.stdout


def unpack():
    """What would be large, or start a server, is not installed."""
    UNPACKED.mkdir()
    names = [max(re.findall(rf"(?m)^{name}\d+$", apt("cache", "pkgnames", name)),
                 default="") for name in PROGRAMS]
    if not all(names):
        stop(1, "apt knows no Node and no PostgreSQL; as root, run apt-get update")
    # Another Node than Debian's may be installed, and then counts as the candidate.
    release = releases.find("Node", "^Version: (.*)", apt("cache", "show", names[0]))[1]
    planned = apt("get", "-s", "--no-install-recommends", "--reinstall",
                  "--allow-downgrades", "install", "miller", f"nodejs={release}",
                  *names)
    say("Fetching Debian packages (50 MB)")
    apt("get", "download", *(
        f"{name}={version}" for name, version in re.findall(
            r"(?m)^Inst (\S+) [^(]*\((\S+)", planned) if re.match(NEEDED, name)))
    for package in HOME.glob("*.deb"):
        releases.output("dpkg-deb", "-x", package, UNPACKED)
        package.unlink()


def make():
    unpack()
    sources, output = PROJECT / "lab/readers", releases.output
    output("gcc", "-O1", sources / "clock.c", "-o", GLIBC)
    output("musl-gcc", "-O1", "-static", sources / "clock.c", "-o", MUSL)
    (HOME / "passwd").write_text("reader:x:1000:1000::/tmp:/bin/sh\n")


def inside(*command: str) -> list[str]:
    """A private device with an "/etc" of its own, in which the zone can be set. Nobody
    is root there, as PostgreSQL's server insists."""
    places = [str(place) for place in (BUILD, Path(boot.PROGRAM).parent)]
    places += [f"/etc/{name}" for name in ETC if os.path.exists(f"/etc/{name}")]
    return [*device(*"--unshare-user --uid 1000 --gid 1000 --tmpfs /etc".split(),
                    *(word for place in places for word in ("--ro-bind", place, place)),
                    "--ro-bind", str(HOME / "passwd"), "/etc/passwd",
                    "--setenv", "MARLIN", boot.PROGRAM), *command]


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
            releases.once(HOME, [real_data.TARGET / "inputs", __file__,
                                 *sorted((PROJECT / "lab/readers").glob("*.c"))], make)
    run = pytest("-p", "no:cacheprovider", "-q")
    commands = [[*run, *outside]] if outside else []
    if others:
        commands.append(inside(*run, *others))
    return int(any([subprocess.call(command, cwd=PROJECT) for command in commands]))


sys.exit(main())
