# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/prove [--quick] [PROOF...]
       scripts/prove TEST | --state SEED/N | --story 'EVENT; EVENT'

Shows that nothing breaks the program; docs/proofs.md says what each proof claims. The
last lines give a figure for each. All of them take an hour on two processors; --quick
takes samples, in a quarter of an hour.

{proofs}
TEST is one test as a failing trial names it, --state one random device, --story one
life; each runs alone, with its output. MARLIN names another program than
build/release/marlin.

Exit status: 0 when everything holds, 1 when something does not, 2 for bad use, 77
when there is no private device here.
"""

import os
import subprocess
import time

from lab.carriers import releases
from lab.carriers.building import build_program, need, trials
from lab.words.command import Options
from lab.words.places import BUILD, PROJECT

TRIALS = {  # each of files in lab/proofs, with what it shows
    "faults": (["faults"], "every call that fails, storage that fails, memory refused"),
    "kills": (["kills", "windows"],
              "every instant at which the program can be killed, and pairs of them"),
    "states": (["states"], "many thousand devices composed at random"),
    "life": (["life"], "what happens to a device, one thing after the other"),
    "load": (["load"], "too much of everything"),
    "log": (["log"], "a log that is lost, or fails in the middle"),
    "status": (["status"], "what marlin-status says, against what then happens"),
    "install": (["install_faults", "install_kills", "install_races"],
                "the installer of updates: calls that fail, kills, several at once"),
    "make": (["make"], "what makes updates and a system's data, and what it refuses")}
OTHERS = {  # programs in lab/proofs, with their arguments for the whole and for --quick
    "component": ([], [], "the third component of CONTRIBUTING.md"),
    "fuzz": (["--seconds", "600"], ["--seconds", "60"], "hostile texts"),
    "sanitize": ([], ["--sanitizers"],
                 "the tests under sanitizers and (not with --quick) valgrind"),
    "coverage": ([], [], "lines and branches that the tests run through"),
    "mutants": ([], ["--quick", "10", "--seed", str(int(time.time()))],
                "the program broken on purpose: the tests have to notice")}


def prove(name: str, command: list[str]) -> tuple[bool, str]:
    """Runs a proof and shows its output: whether it holds, with its last line."""
    print(f"\n--- {name}", flush=True)
    started, last, figures = time.monotonic(), "", ""
    with subprocess.Popen(command, cwd=PROJECT, stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT, text=True, errors="replace") as run:
        for line in run.stdout:
            print(line, end="", flush=True)
            last = line.strip() or last
            if line.startswith("figures: "):
                figures = line.removeprefix("figures: ").strip() + "; "
    verdict = "does not hold" if run.returncode else "holds"
    took = time.monotonic() - started
    return (not run.returncode,
            f"{name:9} {verdict}, after {took:.0f} s: {figures}{last}")


def main() -> int:
    options = Options(__doc__.format(proofs="".join(
        f"  {name:10} {about}\n" for name, (*_, about) in (TRIALS | OTHERS).items())))
    options.add_argument("--quick", action="store_true")
    options.add_argument("--state")
    options.add_argument("--story")
    options.add_argument("proofs", nargs="*")
    chosen = options.parse_args()
    alone = [name for name in chosen.proofs if "::" in name]
    if chosen.state:
        alone = ["lab/proofs/states.py", "--state", chosen.state]
    if chosen.story:
        alone = ["lab/proofs/life.py", "--story", chosen.story]
    for name in chosen.proofs:
        if not alone and name not in TRIALS and name not in OTHERS:
            options.error(f"'{name}' is not a proof")
    makes = any("make" in name for name in alone or chosen.proofs or TRIALS)
    need("build", "private-device", "pytest", "prove", *["demo"] * makes)
    (BUILD / "prove").mkdir(exist_ok=True)
    if os.geteuid() == 0:
        # To a user without privileges any file of the machine is another's.
        foreign = BUILD / "prove/another-users"
        foreign.mkdir(exist_ok=True)
        (foreign / "file").touch()
        (foreign / "closed").touch(0o600)
        for path in foreign, *foreign.iterdir():
            os.chown(path, 1, 1)
    build_program()
    if makes:
        releases.prepare()
    if alone:
        return subprocess.call(trials("alone", "-rs", *alone), cwd=PROJECT)
    results = [
        prove(name, trials(name, *["--quick"] * chosen.quick,
                           *(f"lab/proofs/{test}.py" for test in TRIALS[name][0]))
              if name in TRIALS else
              ["/usr/bin/python3", "-B", "-m", f"lab.proofs.{name}",
               *OTHERS[name][chosen.quick]])
        for name in chosen.proofs or [*TRIALS, *OTHERS]]
    print("\n" + "\n".join(figure for _, figure in results))
    return 0 if all(holds for holds, _ in results) else 1


if __name__ == "__main__":
    raise SystemExit(main())
