# SPDX-License-Identifier: BSD-2-Clause
"""usage: lab.proofs.coverage

Measures which lines and branches of driver/, dataset/ and support/ the tests run
through, those of the program that they boot included. Fails unless all of them are.
Not counted as branches are the edges on which exceptions leave a call, and whether the
address of a reference is null, which the compiler asks before a dynamic_cast; nor as
lines those that only close a block, which some compilers take for an exception's way.

The report is build/coverage/report/index.html. Exit status: 0 when everything is
covered, 1 when a test fails or something is not, 2 for bad use.
"""

import os
import subprocess
from concurrent.futures import ThreadPoolExecutor
from pathlib import Path

from lab.carriers.building import build, locked, need, quietly, room
from lab.words.command import Options, stop
from lab.words.places import BUILD, PROJECT, shown

FOLDER = BUILD / "coverage"
REPORT = FOLDER / "report"
LOG = FOLDER / "log"


def run_tests(program: Path):
    """Two kinds are left out. A boot that may write only five bytes into any file
    cannot write its counters. A whole list of calls would end with those that write
    the counters."""
    quietly(LOG.with_name(f"log of {program.name}"), program, "--gtest_brief=1",
            "--gtest_filter=-*CannotBeWrittenWhole*:WholeListOfCalls.*")


def measure() -> int:
    """What gcovr says of it, and how it ended."""
    build("coverage")
    for counters in FOLDER.rglob("*.gcda"):
        counters.unlink()
    with ThreadPoolExecutor(os.cpu_count()) as together:
        list(together.map(run_tests, FOLDER.glob("tests/*_test")))
    room(REPORT)
    # An object that was built but never ran counts as well: all of it is missing.
    return subprocess.call([
        "gcovr", "--root", PROJECT, "--filter", "driver/", "--filter", "dataset/",
        "--filter", "support/",
        "--object-directory", FOLDER, "--exclude-directories", ".*/CompilerIdCXX",
        "--exclude-throw-branches", "--exclude-unreachable-branches",
        "--exclude-lines-by-pattern", r"\s*}$",
        "--exclude-branches-by-pattern", r".*dynamic_cast<[^>]*\*>\(&",
        "--html-details", REPORT / "index.html", "--txt", "--branches",
        "--print-summary", "--fail-under-line=100", "--fail-under-branch=100", FOLDER],
        cwd=PROJECT)


def main():
    Options(__doc__).parse_args()
    need("build", "private-device", "test", "coverage")
    with locked(FOLDER):
        if measure():
            stop(1, f"not complete; see {shown(REPORT / 'index.html')}")


if __name__ == "__main__":
    main()
