# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/bench [--check | --record | --companions]

Measures marlin, as it ships, inside a private device, beside the least that its system
calls can cost: "the floor", lab/bench/floor.py.

  --check       what is done without an option: compares instructions, system calls and
                size with lab/bench/baseline.json; fails when one has grown by more than
                3 percent, for calls by a single one
  --record      writes lab/bench/baseline.json anew
  --companions  marlin-install with an update of 1 MB, which may take 100 ms beside
                syncfs(2) and 16 MB; marlin-mend, which has to cost less than marlin

Installs the Debian packages that it needs. Instructions are those of an environment
that holds only PATH: each variable more costs some 550 in the C library's start-up, for
every program alike.
"""

import json
import os
import subprocess
import sys
from pathlib import Path

from lab.bench.floor import compile_floor
from lab.carriers.building import build, need
from lab.words.command import Options, stop
from lab.words.places import BUILD

PLACE = BUILD / "bench/static"
FLOOR = f"{PLACE}/floor_SCENE"
BASELINE = Path("lab/bench/baseline.json")


def output(*command: str) -> str:
    return subprocess.run(command, stdout=subprocess.PIPE, text=True,
                          check=True).stdout.strip()


def built(*targets: str) -> str:
    """The program as it ships, stripped; and what else is measured."""
    build("release", folder=PLACE, targets=("marlin", *targets))
    output("strip", "-o", f"{PLACE}.stripped", f"{PLACE}/marlin")
    return f"{PLACE}.stripped"


def measured(job: str, *arguments: str):
    return json.loads(output("scripts/private-device", "--", sys.executable, "-B", "-m",
                             "lab.bench.measure", job, *arguments))


def all_figures() -> dict:
    """Of each, what marlin takes and what the floor takes; and by what it was built."""
    from lab.bench.measure import SCENES  # It takes pytest, which main() installs.
    marlin = built()
    for scene, describe in SCENES.items():
        compile_floor(describe(), Path(FLOOR.replace("SCENE", scene)))
    figures = {"toolchain": [f"g++ {output('g++', '-dumpfullversion')}",
                             output("getconf", "GNU_LIBC_VERSION"),
                             output("valgrind", "--version")]}
    for scene, (floor, own) in measured("counts", FLOOR, marlin).items():
        print(f"{scene}: takes {own[2]} kB, the floor {floor[2]}")
        for what, *both in zip(("instructions", "calls"), own, floor):
            figures[f"{scene} {what}"] = both
    figures["size"] = [os.path.getsize(file)
                       for file in (marlin, FLOOR.replace("SCENE", "quiet"))]
    return figures


def record():
    told = (f"  {json.dumps(name)}: {json.dumps(both)}"
            for name, both in all_figures().items())
    BASELINE.write_text("{\n" + ",\n".join(told) + "\n}\n")
    print(f"bench: wrote {BASELINE}", file=sys.stderr)


def check():
    """The floor stands for everything that is not ours: compiler, C library, instrument
    and processor. What is compared is the floor of this run plus what marlin had beyond
    the floor when it was recorded."""
    was, now = json.loads(BASELINE.read_text()), all_figures()
    if lacking := was.keys() ^ now.keys():
        stop(1, f"not in the baseline and in this run: {', '.join(sorted(lacking))}")
    built_by, here_by = was.pop("toolchain"), now["toolchain"]
    grown = 0
    for name, (own, floor) in was.items():
        here, here_floor = now[name]
        expected = own - floor + here_floor
        percent = 100 * (here - expected) / expected
        bad = percent > (0 if name.endswith("calls") else 3)
        print(f"{name:24} {here:8}, expected {expected:8}, floor {here_floor:8}  "
              f"{percent:+6.2f} %{'  GROWN' if bad else ''}")
        grown += bad
    if grown and built_by != here_by:
        stop(77, f"recorded with {' and '.join(built_by)}, which this machine lacks: "
             "what grows may be another's code")
    if grown:
        stop(1, f"{grown} figures have grown; if that is meant: --record")


def companions():
    marlin = built("marlin-install", "marlin-mend")
    tools = [f"{PLACE}/tools/marlin-{name}" for name in ("install", "mend")]
    output("strip", *tools)
    figures = measured("companions", marlin, *tools)
    (milliseconds, kilobytes), (boot, mend) = figures["install"], figures["quiet"]
    print(f"marlin-install, an update of {figures['bytes']:,} bytes: "
          f"{milliseconds:.0f} ms, {kilobytes:,} kB")
    for name, taken in (("marlin", boot), ("marlin-mend", mend)):
        print(f"a quiet boot, {name}: {taken[0]:,} instructions, {taken[1]} calls, "
              f"{taken[2]} kB")
    if milliseconds > 100 or kilobytes > 16_000:
        stop(1, "marlin-install takes too much")
    if any(here >= there for here, there in zip(mend, boot)):
        stop(1, "marlin-mend costs as much as marlin")


def main():
    parser = Options(__doc__)
    jobs = parser.add_mutually_exclusive_group()
    for job in (check, record, companions):
        jobs.add_argument(f"--{job.__name__}", dest="job", action="store_const",
                          const=job, default=check)
    options = parser.parse_args()
    need("build", "private-device", "pytest", "bench")
    options.job()


if __name__ == "__main__":
    main()
