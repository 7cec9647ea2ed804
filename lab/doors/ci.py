# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/ci [STAGE...]

Does all that must hold before a change lands, or only some stages of it:

{stages}
Installs what that takes, as root. Ends with the first stage that does not hold.

Exit status: 0 when everything holds, 1 when something does not, 2 for bad use.
"""

import os
import re
import shlex
import subprocess
import time
from pathlib import Path

from lab.carriers.building import configure, need, pytest
from lab.words.command import Options, stop
from lab.words.places import BUILD, PROJECT

LONGEST_DOOR = 40  # lines; more of them are logic, which belongs into lab/


def run(*command, words=""):
    """Runs a command in the project's folder; `words` go to its standard input."""
    status = subprocess.run(command, cwd=PROJECT, input=words, text=True).returncode
    if status:
        stop(1, f"exit status {status}: {shlex.join(map(str, command))}")


def files(*patterns: str) -> list[str]:
    """What the project has of these, without what is built."""
    found = []
    for folder, folders, names in os.walk(PROJECT):
        here = Path(folder)
        folders[:] = [name for name in folders
                      if name not in (".git", "build") and here / name != BUILD]
        found += [str((here / name).relative_to(PROJECT)) for name in names
                  if any((here / name).match(pattern) for pattern in patterns)]
    return sorted(found)


def many(command: str, names: list[str], at_once=1):
    """Runs a command on files, four of them in each of so many processes."""
    if not names:
        stop(1, f"no files for {command}")
    run("xargs", "-0", "-n", "4", "-P", str(at_once), *shlex.split(command),
        words="\0".join(names))


def check_format():
    need("lint")
    many("clang-format --dry-run --Werror", files("*.cpp", "*.c", "*.h"))


def clang_tidy():
    need("build", "clang", "test", "lint")
    folder = configure("clang")
    product = [name for name in files("*.cpp")
               if name.startswith(("driver/", "dataset/", "support/"))]
    many(f"clang-tidy --quiet -p {shlex.quote(str(folder))}", product, os.cpu_count())


def check_shell():
    need("lint")
    many("shellcheck -x", [
        name for name in files("*")
        if re.match(rb"#!.*\b(ba)?sh\b", (PROJECT / name).read_bytes())])
    for door in sorted((PROJECT / "scripts").iterdir()):
        if door.is_file() and len(door.read_text().splitlines()) > LONGEST_DOOR:
            stop(1, f"{door.name} has more lines than a door may have, {LONGEST_DOOR}")


def check_python():
    need("lint")
    names = files("*.py", "tools/make-*")
    many("/usr/bin/python3 -m pycodestyle --max-line-length=88", names)
    many("/usr/bin/python3 -m pyflakes", names)


def first_contact():
    need("build", "private-device", "test", "pytest")
    run(*pytest("lab/proofs/first_contact.py"))


def demonstration():
    facts = subprocess.run(["scripts/demo", "--facts"], cwd=PROJECT, text=True,
                           stdout=subprocess.PIPE)
    if facts.returncode:
        stop(1, "scripts/demo --facts fails")
    run("diff", "lab/demo/facts", "-", words=facts.stdout)


def door(*words: str):
    return lambda: run("scripts/" + words[0], *words[1:])


STAGES = {
    "gcc": ("g++: build without a warning, all tests", door("test")),
    "clang": ("clang++: build without a warning, all tests", door("test", "clang")),
    "format": ("the format of C++", check_format),
    "clang-tidy": ("clang-tidy", clang_tidy),
    "shell": ("shellcheck; doors are short", check_shell),
    "python": ("pycodestyle, pyflakes", check_python),
    "contact": ("the first contact of a new user", first_contact),
    "demo": ("the demonstration ends as it says", demonstration),
    "readers": ("real programs read what the document says; its recipe",
                door("readers")),
    "bench": ("the cost of a boot has not grown", door("bench", "--check")),
    "package": ("the package, and the boot unit in it", door("package")),
    "arm64": ("arm64: build without a warning, all tests under qemu-user",
              door("test", "arm64-dev")),
    "device": ("an emulated device: sequences of boots, power cuts",
               door("device", "--tests")),
    "systems": ("real systems boot with the package: the unit holds",
                door("device", "--systems", "--quick")),
    "proofs": ("the proofs, in short", door("prove", "--quick")),
}


def main():
    table = [f"  {name:12} {about}\n" for name, (about, _) in STAGES.items()]
    options = Options(__doc__.format(stages="".join(table)))
    options.add_names("stages", STAGES)
    chosen = options.parse_args().stages
    times = []
    for name in chosen:
        about, stage = STAGES[name]
        print(f"\n=== {name}: {about}", flush=True)
        started = time.monotonic()
        stage()
        times.append((time.monotonic() - started, name))
        print(f"=== {name}: holds, after {times[-1][0]:.0f} s", flush=True)
    print()
    for seconds, name in times:
        print(f"{seconds:6.0f} s  {name}")
    everything = "Everything holds" if chosen == list(STAGES) else "That holds"
    print(f"{everything}, after {sum(seconds for seconds, _ in times):.0f} s.")


if __name__ == "__main__":
    main()
