# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/prove [--quick] [PROOF...]
       scripts/prove TEST | --state SEED/N

Shows that nothing breaks the program; docs/proofs.md says what each proof claims. The
last lines give a figure for each. All of them take an hour on two processors; --quick
takes samples, in eight minutes.

  faults     every system call that fails, storage that fails, memory refused
  kills      every instant at which the program can be killed, and pairs of them
  states     many thousand devices composed at random
  load       too much of everything
  log        a log that is lost, or fails in the middle
  lab        the lab's own carriers
  fuzz       hostile texts
  sanitize   the tests under sanitizers and (not with --quick) valgrind
  coverage   lines and branches that the tests run through
  mutants    the program broken on purpose: the tests have to notice

TEST is one test as a failing trial names it, --state one random device; either runs
alone, with its output. MARLIN names another program than build/release/marlin.

Exit status: 0 when everything holds, 1 when something does not, 2 for bad use, 77
when there is no private device here.
"""

import os
import subprocess
import sys
import time

from lab.boot import PROJECT, build

PYTHON = ["/usr/bin/python3", "-B", "-m"]
TRIALS = {
    "faults": ["test_faults.py", "test_memory.py"],
    "kills": ["test_kills.py", "test_windows.py"],
    "states": ["test_states.py"],
    "load": ["test_load.py"],
    "log": ["test_log.py"],
    "lab": ["test_archive.py"],
}
OTHERS = {  # the whole, and with --quick
    "fuzz": (["lab.fuzz", "--seconds", "600"], ["lab.fuzz", "--seconds", "60"]),
    "sanitize": (["lab.sanitize"], ["lab.sanitize", "--sanitizers"]),
    "coverage": (["lab.coverage"], ["lab.coverage"]),
    "mutants": (["lab.mutants"], ["lab.mutants", "--quick", "10", "--seed",
                                  str(int(time.time()))]),
}


def trials(name: str, *arguments: str) -> list[str]:
    """The command that runs tests in workers, each on a private device of its own."""
    workers = min(os.cpu_count() or 1, 8)
    return [*PYTHON, "pytest", "-c", "lab/pytest.ini", f"--rootdir={PROJECT}", "-q",
            "--tx", f"{workers}*popen//python=lab/worker", "--dist", "load",
            "--maxfail", "10", f"--junit-xml=build/prove/{name}.xml", *arguments]


def prove(name: str, command: list[str]) -> tuple[bool, str]:
    """Runs a proof, shows its output, and tells whether it holds, with its last line."""
    print(f"\n--- {name}", flush=True)
    started, last = time.monotonic(), ""
    with subprocess.Popen(command, cwd=PROJECT, stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT, text=True, errors="replace") as run:
        for line in run.stdout:
            print(line, end="", flush=True)
            last = line.strip() or last
    verdict = "does not hold" if run.returncode else "holds"
    took = time.monotonic() - started
    return not run.returncode, f"{name:9} {verdict}, after {took:.0f} s: {last}"


def main(arguments: list[str]) -> int:
    if arguments in (["--help"], ["-h"]):
        print(__doc__, end="")
        return 0
    os.makedirs(f"{PROJECT}/build/prove", exist_ok=True)
    if subprocess.call(["scripts/packages", "build", "prove"], cwd=PROJECT):
        return 1
    if arguments and (arguments[0] == "--state" or "::" in arguments[0]):
        build()
        files = ["lab/test_states.py"] if arguments[0] == "--state" else []
        return subprocess.call(
            trials("alone", "-rs", *files, *arguments), cwd=PROJECT)
    quick = "--quick" in arguments
    chosen = [name for name in arguments if name != "--quick"] or [*TRIALS, *OTHERS]
    for name in chosen:
        if name not in TRIALS and name not in OTHERS:
            print(f"prove: there is no proof {name}; see --help", file=sys.stderr)
            return 2
    build()
    results = [
        prove(name, trials(name, *["--quick"] * quick,
                           *(f"lab/{file}" for file in TRIALS[name]))
              if name in TRIALS else PYTHON + OTHERS[name][quick])
        for name in chosen]
    print("\n" + "\n".join(figure for _, figure in results))
    return 0 if all(holds for holds, _ in results) else 1


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
