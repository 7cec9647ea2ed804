# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/ci [--full] [STAGE...]

Does what must hold before a change lands, in some ten minutes; with --full everything.
Each STAGE can be done alone. These are the usual seconds of each on two quiet
processors, as SHORT/FULL; "-" marks what only --full does:

{stages}
Installs what that takes, as root. Ends with the first stage that does not hold.

Exit status: 0 when everything holds, 1 when something does not, 2 for bad use, 77 when
this machine lacks something.
"""

import os
import re
import shlex
import subprocess
import time
from collections.abc import Callable
from pathlib import Path
from typing import NamedTuple

from lab.carriers.building import configure, need, pytest
from lab.words.command import Options, stop
from lab.words.places import BUILD, PROJECT

LLVM = 14  # the version whose clang-format and clang-tidy judge this code
LONGEST_DOOR = 40  # lines; more of them are logic, which belongs in lab/


def run(*command, words=""):
    """Runs a command in the project's folder; `words` go to its standard input."""
    status = subprocess.run(command, cwd=PROJECT, input=words, text=True).returncode
    if status:
        stop(77 if status == 77 else 1,
             f"exit status {status}: {shlex.join(map(str, command[:6]))}")


def files(*patterns: str) -> list[str]:
    """What the project has of these, without what is built."""
    found = []
    for folder, folders, names in os.walk(PROJECT):
        here = Path(folder)
        folders[:] = [name for name in folders
                      if name not in (".git", "build") and here / name != BUILD]
        found += [str((here / name).relative_to(PROJECT)) for name in names
                  if any((here / name).match(pattern) for pattern in patterns)]
    return sorted(found) or stop(1, f"no files like {patterns}")


def another_version(tool: str) -> bool:
    """Tells of it: each version formats, and finds, something else."""
    told = subprocess.run([tool, "--version"], stdout=subprocess.PIPE, text=True).stdout
    if other := f" version {LLVM}." not in told:
        print(f"Not checked: that takes {tool} {LLVM}, and here is", told.strip())
    return other


def check_format():
    need("lint")
    if another_version("clang-format"):
        return
    run("clang-format", "--dry-run", "--Werror", *files("*.cpp", "*.c", "*.h"))


def clang_tidy():
    need("build", "clang", "test", "lint")
    if another_version("clang-tidy"):
        return
    folder = configure("clang")
    product = [name for name in files("*.cpp")
               if name.startswith(("driver/", "dataset/", "support/"))]
    run("xargs", "-0", "-n", "4", "-P", str(os.cpu_count()), "clang-tidy", "--quiet",
        "-p", folder, words="\0".join(product))


def check_shell():
    need("lint")
    run("shellcheck", "-x", *(
        name for name in files("*")
        if re.match(rb"#!.*\b(ba)?sh\b", (PROJECT / name).read_bytes())))
    for door in sorted((PROJECT / "scripts").iterdir()):
        if door.is_file() and len(door.read_text().splitlines()) > LONGEST_DOOR:
            stop(1, f"{door.name} has more lines than a door may have, {LONGEST_DOOR}")


def check_python():
    need("lint")
    names = files("*.py", "tools/make-*")
    run("/usr/bin/python3", "-m", "pycodestyle", "--max-line-length=88", *names)
    run("/usr/bin/python3", "-m", "pyflakes", *names)


def first_contact():
    need("build", "private-device", "test", "pytest")
    run(*pytest("lab/proofs/first_contact.py"))


def door(*words: str):
    return lambda: run("scripts/" + words[0], *words[1:])


class Stage(NamedTuple):
    about: str
    seconds: str
    full: Callable[[], None]
    short: Callable[[], None] | None = None  # what CI does of it for every change


def both(about: str, seconds: str, stage: Callable[[], None]) -> Stage:
    """A stage that is as short as it can be."""
    return Stage(about, seconds, stage, stage)


STAGES = {
    "gcc": both("g++: build without a warning, all tests", "100", door("test")),
    "clang": Stage("clang++: build without a warning, all tests", "-/115",
                   door("test", "clang")),
    "format": both("the format of C++", "2", check_format),
    "clang-tidy": both("clang-tidy", "20", clang_tidy),
    "shell": both("shellcheck; doors are short", "3", check_shell),
    "python": both("pycodestyle, pyflakes", "5", check_python),
    "contact": Stage("the first contact of a new user", "-/100", first_contact),
    "demo": both("the demonstration ends as it says", "25", door("demo", "--facts")),
    "readers": Stage("real programs read what the document says; its recipe", "-/35",
                     door("readers")),
    "bench": Stage("the cost of a boot has not grown", "-/15",
                   door("bench", "--check")),
    "package": Stage("the package, and the boot unit in it", "45/90",
                     door("package"), door("package", "release")),
    "arm64": Stage("arm64: build without a warning, all tests under qemu-user",
                   "-/115", door("test", "arm64-dev")),
    "armhf": Stage("armhf: the same with 32 bits, and times of 64",
                   "-/115", door("test", "armhf-dev")),
    "device": Stage("an emulated device: sequences of boots, power cuts", "-/100",
                    door("device", "--tests")),
    "systems": Stage("real systems boot with the package: the unit holds", "-/360",
                     door("device", "--systems", "--quick")),
    "proofs": Stage("the proofs, by samples; scripts/prove does the whole", "280/900",
                    door("prove", "--quick"),
                    door("prove", "--quick", "faults", "kills", "states", "life",
                         "install", "status", "make", "component")),
    "bare": Stage("every door alone, on a bare Debian 12 and 13", "-/9000",
                  lambda: run("/usr/bin/python3", "-B", "-m", "lab.proofs.bare")),
}


def main():
    table = [f"  {name:11} {stage.seconds:>8}  {stage.about}\n"
             for name, stage in STAGES.items()]
    options = Options(__doc__.format(stages="".join(table)))
    options.add_argument("--full", action="store_true")
    options.add_names("stages", STAGES)
    chosen = options.parse_args()
    if chosen.stages == list(STAGES) and not chosen.full:
        chosen.stages = [name for name in STAGES if STAGES[name].short]
    times = []
    for name in chosen.stages:
        stage = STAGES[name]
        print(f"\n=== {name}: {stage.about}", flush=True)
        started = time.monotonic()
        (stage.full if chosen.full else stage.short or stage.full)()
        times.append((time.monotonic() - started, name))
        print(f"=== {name}: holds, after {times[-1][0]:.0f} s", flush=True)
    print()
    for seconds, name in times:
        print(f"{seconds:6.0f} s  {name}")
    print(f"All of that holds, after {sum(seconds for seconds, _ in times):.0f} s.")


if __name__ == "__main__":
    main()
