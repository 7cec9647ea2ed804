# SPDX-License-Identifier: BSD-2-Clause
"""usage: lab.proofs.sanitize [--sanitizers]

Runs every test twice, the program that the tests boot included: built with
AddressSanitizer, LeakSanitizer and UndefinedBehaviorSanitizer, and under valgrind's
memcheck, unless the sanitizers alone are wanted. Before that, each has to find a leak
that was made on purpose. With the sanitizers marlin-status also tells of trees, and
of random devices that are then booted. Left out is what the tool itself makes
impossible: whole lists of calls, and under valgrind a limit of file sizes and a program
that cannot be run.

Exit status: 0 without a finding, 1 with one or when a test fails, 2 for bad use.
Reports are left in build/asan/findings and build/memcheck/findings.
"""

import os
import re
from dataclasses import dataclass, field
from pathlib import Path

from lab.carriers.building import build, locked, need, quietly, room, show_end, trials
from lab.words.command import Options, say, stop
from lab.words.places import BUILD, PROJECT, shown

LEAK = """int main() {
  char* volatile lost = new char[9];
  lost = nullptr;
}
"""


@dataclass
class Tool:
    """One build of the tests, run under one tool, whose reports are files."""
    folder: Path
    preset: str
    option: str  # of the compiler, for a program that leaks
    tests: str
    prefix: list[str] = field(default_factory=list)
    environment: dict[str, str] = field(default_factory=dict)

    def __post_init__(self):
        self.findings, self.log = self.folder / "findings", self.folder / "sanitize.log"

    def watch(self, program: Path, *arguments: str) -> tuple[int, str]:
        """The status of a program on a private device, and the reports of it."""
        room(self.findings)
        status = quietly(
            self.log, PROJECT / "scripts/private-device", "--writable", self.folder,
            "--", *self.prefix, program, *arguments, check=False,
            env={**os.environ, **self.environment})
        return status, "".join(map(read, sorted(self.findings.iterdir())))

    def run(self) -> int:
        """How many tests have passed, without a finding."""
        with locked(self.folder):
            build(self.preset, folder=self.folder)
            self.find_a_leak()
            return sum(map(self.passed, sorted(self.folder.glob("tests/*_test"))))

    def find_a_leak(self):
        """A tool that says nothing is of use only if it would have said something."""
        source, leak = self.folder / "leak.cpp", self.folder / "leak"
        source.write_text(LEAK)
        quietly(self.log, "g++", self.option, source, "-o", leak)
        if not re.search("leak of 9 byte|9 bytes in 1 blocks are definitely lost",
                         self.watch(leak)[1]):
            stop(1, f"a leak made on purpose was not found in {shown(self.folder)}")

    def passed(self, program: Path) -> int:
        """Runs the tests of a program and tells how many there were."""
        status, reports = self.watch(program, "--gtest_brief=1",
                                     f"--gtest_filter={self.tests}")
        # Lines of the program itself do not count: valgrind's log can get them when a
        # test closes every descriptor.
        if found := re.findall(r"(?m)^==\d+==.*|^.*runtime error.*", reports):
            say("\n".join(found[:200]))
            stop(1, f"findings in {shown(self.findings)}")
        text = read(self.log)
        passed = re.search(r"PASSED  \] (\d+) tests?\.$", text, re.MULTILINE)
        if status or not passed:
            show_end(self.log)
            stop(1, f"{program.name} fails")
        print(f"{shown(program)}: {passed[1]} tests", flush=True)
        if re.search(r"\.cpp:\d+: Skipped$", text, re.MULTILINE):
            stop(1, f"{program.name} skips tests")
        return int(passed[1])


TOOLS = {
    # A sanitizer makes calls of its own.
    "sanitizers": Tool(
        BUILD / "asan", "asan", "-fsanitize=address", "-WholeListOfCalls.*",
        environment=dict.fromkeys(["ASAN_OPTIONS", "UBSAN_OPTIONS"], (
            "detect_leaks=1:detect_stack_use_after_return=1:strict_string_checks=1:"
            "check_initialization_order=1:strict_init_order=1:print_stacktrace=1:"
            f"log_path='{BUILD}/asan/findings/of'"))),
    # valgrind itself exceeds limits of file sizes, and spawns what cannot be run.
    # Traced are test programs and what they boot, not the machine's tools. "Possibly
    # lost" does not count: so is every exception in flight when a boot ends abnormally,
    # because the library holds it by its middle. A test's own operator new stays.
    "memcheck": Tool(
        BUILD / "memcheck", "dev", "-g",
        "-*CannotBeWrittenWhole*:*CannotBeRun:WholeListOfCalls.*",
        [*"""valgrind --quiet --leak-check=full --error-exitcode=99
        --soname-synonyms=somalloc=nouserintercepts --show-leak-kinds=definite
        --errors-for-leak-kinds=definite --trace-children=yes
        --trace-children-skip=/usr/*,/bin/*""".split(),
         f"--log-file={BUILD}/memcheck/findings/of".replace("%", "%%") + ".%p"]),
}


def asked_about() -> int:
    """What marlin-status says of trees and random devices, and the boots that follow:
    a finding is a line too many. Returns how many tests have passed."""
    folder = TOOLS["sanitizers"].folder
    log = folder / "status.log"
    with locked(folder):
        quietly(log, *trials("sanitize", "--states", "200",
                             "lab/proofs/status.py::test_a_tree",
                             "lab/proofs/status.py::test_random_devices"),
                env={**os.environ, "MARLIN": str(folder / "marlin")})
    passed = re.search(r"^(\d+) passed", read(log), re.MULTILINE)
    print(f"{shown(folder)}/tools/marlin-status: {passed[1]} tests", flush=True)
    return int(passed[1])


def read(file: Path) -> str:
    return file.read_text(errors="replace")


def main():
    options = Options(__doc__)
    options.add_argument("--sanitizers", action="store_true")
    names = list(TOOLS)[:1 if options.parse_args().sanitizers else 2]
    need("build", "private-device", "test", "pytest", "prove", "sanitize")
    tests = sum(TOOLS[name].run() for name in names) + asked_about()
    print(f"sanitize: {tests} tests with {' '.join(names)}: no finding")


if __name__ == "__main__":
    main()
