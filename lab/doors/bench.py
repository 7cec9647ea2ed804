# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/bench [--rounds N]
       scripts/bench --check | --record | --growth | --hardening | --parsers |
                     --companions | --status | --making

Measures marlin, as it ships, inside a private device. Without an option: beside the
least that its system calls can cost ("the floor", lab/bench/floor.c), its own dynamic
builds and a shell script that does the same job (lab/bench/boot), in one table, from
user-space instructions to the size of the file.

  --rounds N    how many pairs of timings a ratio is taken from (default 11)
  --check       compares instructions, system calls and size of the static build with
                lab/bench/baseline.txt; fails when one has grown by more than 3
                percent, for calls by a single one
  --record      writes lab/bench/baseline.txt anew
  --growth      how cost grows with what is found on the device; fails when it does not
                grow in step; writes the plot docs/growth.svg
  --hardening   what each hardening option costs
  --parsers     the two parsers, against std::regex
  --companions  marlin-install with an update of 1 MB, which may take 100 ms beside
                fsync(2) and 16 MB; marlin-mend, which has to cost less than marlin
  --status      marlin-status, on a large device and on hostile ones; takes minutes
  --making      the time that make-system and make-update take; of a processor each
                may take 10 s

Installs the Debian packages that it needs. Instructions are those of an environment
that holds only PATH: each variable more costs some 550 in the C library's start-up, for
every program alike.
"""

import json
import os
import re
import shlex
import shutil
import subprocess
import sys
import tempfile
import time
from collections.abc import Iterable, Iterator
from pathlib import Path

from lab.bench.measure import SCENES
from lab.bench.status import rows as status_rows
from lab.carriers import releases
from lab.carriers.building import build, need
from lab.words.command import Options, number
from lab.words.places import BUILD

BUILDS = BUILD / "bench"
PROGRAMS = f"{BUILDS}/static/lab/bench"
FLOOR = f"{PROGRAMS}/floor_SCENE"
BASELINE = Path("lab/bench/baseline.txt")
PICTURE = Path("docs/growth.svg")


def run(*command: str, **options) -> str:
    """What a command prints, on either stream unless told; it must not fail."""
    options = {"stderr": subprocess.STDOUT} | options
    ran = subprocess.run(command, stdout=subprocess.PIPE, text=True, **options)
    if ran.returncode != 0:
        print(f"{ran.stdout}bench: failed: {shlex.join(command)}", file=sys.stderr)
        sys.exit(ran.returncode)
    return ran.stdout


def built(name: str, *arguments: str, targets=("marlin",)) -> str:
    """The release build with something changed, stripped."""
    folder = build("release", *arguments, folder=BUILDS / name, targets=targets)
    run("strip", "-o", f"{folder}.stripped", f"{folder}/marlin")
    return f"{folder}.stripped"


def built_static(*targets: str) -> str:
    """The program as it ships; and what else is measured, with these targets."""
    return built("static", "-DMARLIN_BENCH=ON", "-DCMAKE_C_COMPILER=gcc", targets=(
        "marlin", *(f"floor_{scene}" for scene in SCENES), *targets))


def measured(job: str, *arguments: str):
    return json.loads(run("scripts/private-device", "--", sys.executable, "-B", "-m",
                          "lab.bench.measure", job, *arguments, stderr=None))


def size_of(program: str) -> int:
    return os.path.getsize(program.replace("SCENE", "quiet"))


def print_table(columns: str, rows: Iterable, words=1):
    """The first columns are words, all others are numbers."""
    from tabulate import tabulate  # Only main() makes sure that it is there.
    titles = columns.split(", ")
    sides = ["left"] * words + ["right"] * (len(titles) - words)
    print(tabulate(rows, titles, "pipe", disable_numparse=True, colalign=sides))


def table(rounds: int):
    programs = {
        "floor": FLOOR,
        "marlin, static": built_static(),
        "marlin, dynamic": built("dynamic", "-DMARLIN_STATIC=OFF"),
        "only libc dynamic": built(
            "libc", "-DMARLIN_STATIC=OFF",
            "-DCMAKE_EXE_LINKER_FLAGS=-static-libstdc++ -static-libgcc"),
        "shell script": "lab/bench/boot"}
    counts = measured("counts", *programs.values())
    walls = measured("wall", str(rounds), *programs.values())
    rows = []
    for scene in SCENES:
        least = counts[scene][0][0]
        for name, (count, calls, peak), (wall, ratio, low, high) in zip(
                programs, counts[scene], walls[scene]):
            rows.append((scene, name, count, count - least, f"{count / least:.2f}",
                         calls, peak, f"{wall:.0f}", f"{ratio:.3f}",
                         f"{low:.3f} to {high:.3f}"))
    print_table("Scene, Program, Instructions, beyond, x floor, Calls, Peak kB, "
                "Wall us, x floor, in rounds", rows, words=2)
    print("\nStripped files, in bytes:", "; ".join(
        f"{name} {size_of(file)}" for name, file in list(programs.items())[:-1]))
    print("Wall time of the shell script against marlin, static:", ", ".join(
        f"{scene} {row[-1][1] / row[1][1]:.2f}" for scene, row in walls.items()))
    print(f"""Wall: the median of {rounds} rounds of 20 runs each; its ratio is taken \
round by round, against the floor timed next to it.
Beyond: instructions that are not the floor's. The environment held only PATH; every \
variable more adds to the floor, and so to all alike.""")


def parsers():
    built_static("parsers")
    timed = json.loads(run(f"{PROGRAMS}/parsers", "--benchmark_format=json",
                           stderr=subprocess.DEVNULL))
    rows = []
    for operation in timed["benchmarks"]:
        # The difference of two counts, so that the program's start is not in it.
        few, many = (int(re.search(r"Collected *: (\d+)", run(
            "valgrind", "--tool=callgrind", "--callgrind-out-file=/dev/null",
            f"{PROGRAMS}/parsers", "--repeat", operation["name"], number))[1])
            for number in ("1000", "2000"))
        rows.append((operation["name"], f"{operation['cpu_time']:.1f}",
                     (many - few) // 1000))
    print_table("Operation, ns, Instructions", rows)


def making():
    """Beside the usual update one in which every zone file is another."""
    releases.prepare()
    names = releases.names()
    with tempfile.TemporaryDirectory() as work:
        system, other = Path(work, "system"), Path(work, "other")

        def timed(job, *arguments) -> tuple[str, str]:
            started, before = time.monotonic(), os.times()
            job(*arguments)
            used = os.times()
            processor = sum(used[2:4]) - sum(before[2:4])
            return f"{time.monotonic() - started:.2f}", f"{processor:.2f}"

        whole = timed(releases.make_system, names.system, names.icu, system)
        update = timed(releases.make_update, names.update, system, work)
        shutil.copytree(system, other)
        run("zic", "-b", "fat", "-d", f"{other}/zoneinfo.default", str(releases.RULES))
        all_differ = timed(releases.make_update, names.refused, other, work)
        size = sum(path.stat().st_size for path in Path(
            work, f"{names.update}.1.0").rglob("*") if path.is_file())
    rows = [("make-system", *whole), ("make-update", *update),
            ("make-update, all files differ", *all_differ)]
    print_table("Job, Seconds, of a processor", rows)
    # One thing is done after the other: unless the machine is busy both are the same.
    if any(float(processor) > 10 for *_, processor in rows):
        sys.exit("making takes too long")
    print(f"\nThe update has {size} bytes, in files.")


def growth():
    rows = measured("growth", built_static())
    print_table("Series, Size, Instructions, Calls, Peak kB", rows)
    series = {}
    for name, *point in rows:
        series.setdefault(name, []).append(point)
    if found := [fault for name in series for fault in out_of_step(name, series[name])]:
        sys.exit("\n".join(found))
    data = "".join(
        f"${name.replace('-', '_')} << END\n" +
        "".join(" ".join(map(str, point)) + "\n" for point in points) + "END\n"
        for name, points in series.items())
    drawn = run("gnuplot", "-", "lab/bench/growth.gnuplot", input=data, stderr=None)
    PICTURE.write_text("".join(line.rstrip() + "\n" for line in drawn.splitlines()))
    print(f"bench: wrote {PICTURE}", file=sys.stderr)


def out_of_step(series: str, points: list[list[int]]) -> Iterator[str]:
    """Every point lies near the line from the first to the last: in instructions and
    calls nearer than in memory, which comes in larger pieces."""
    sizes, *columns = zip(*points)
    for name, column, share, slack in zip(("instructions", "calls", "memory"), columns,
                                          (0.02, 0.02, 0.1), (10, 10, 100)):
        whole = column[-1] - column[0]
        for size, value in zip(sizes, column):
            off = value - column[0] - whole * (size - sizes[0]) / (sizes[-1] - sizes[0])
            if abs(off) > share * whole + slack:
                yield (f"{series} does not grow in step: at {size} its {name} are off "
                       f"by {off:.0f}")


TOOLCHAIN = ("compiler", "libc", "instrument")


def all_figures() -> dict[str, str]:
    """By name, in the order of the baseline."""
    static = built_static()
    figures = dict(zip(TOOLCHAIN, (
        "g++ " + run("g++", "-dumpfullversion").strip(),
        run("getconf", "GNU_LIBC_VERSION").strip(),
        run("valgrind", "--version").strip())))
    for scene, (floor, marlin) in measured("counts", FLOOR, static).items():
        for owner, (count, calls, _) in (("", marlin), ("floor.", floor)):
            figures[f"{owner}instructions.{scene}"] = str(count)
            figures[f"{owner}calls.{scene}"] = str(calls)
    return figures | {"size": str(size_of(static)), "floor.size": str(size_of(FLOOR))}


def record():
    BASELINE.write_text(
        "# SPDX-License-Identifier: BSD-2-Clause\n"
        "# What scripts/bench --check compares with; written by --record.\n" +
        "".join(f"{name} {figure}\n" for name, figure in all_figures().items()))
    print(f"bench: wrote {BASELINE}", file=sys.stderr)


def check():
    compare(dict(line.split(" ", 1) for line in BASELINE.read_text().splitlines()
                 if not line.startswith("#")), all_figures())


def compare(was: dict[str, str], now: dict[str, str]):
    """The floor stands for everything that is not ours: compiler, C library, instrument
    and processor. Where one of them differs from the record, the floor shows it, and
    what is compared is the floor of this run plus what marlin had beyond the floor when
    it was recorded."""
    if lacking := [f"{name} is only in {'the baseline' if name in was else 'this run'}"
                   for name in sorted(was.keys() ^ now.keys())]:
        sys.exit("\n".join(lacking))
    differs = [name for name in was if was[name] != now[name]
               and name.startswith((*TOOLCHAIN, "floor."))]
    for name in differs:
        print(f"differs from the record: {name}, {was[name]}, here {now[name]}")
    if (any(name.startswith(("floor.calls", "floor.size")) for name in differs)
            and not any(name in TOOLCHAIN for name in differs)):
        sys.exit("The floor itself has changed; if that is meant: --record")
    if differs:
        print("Not the recorded toolchain or processor: what is compared is the floor "
              "of this run plus the recorded distance from the floor.")
    grown = shrunk = 0
    for name in was:
        if not name.startswith(("instructions.", "calls.", "size")):
            continue
        here, expected = int(now[name]), int(was[name])
        if differs:
            expected += int(now[f"floor.{name}"]) - int(was[f"floor.{name}"])
        percent = 100 * (here - expected) / expected
        bad = here > expected if name.startswith("calls.") else percent > 3
        print(f"{name:24} {here:8}, expected {expected:8}  {percent:+6.2f} %"
              f"{'  GROWN' if bad else ''}")
        grown += bad
        shrunk += percent < -3
    if grown:
        sys.exit(f"{grown} figures have grown; if that is meant: --record")
    if shrunk and not differs:
        print("Some have shrunk by more than 3 %: --record keeps the gain.")


# All flags of a release build without hardening, not even what a compiler does unasked.
# Those that follow take precedence.
BARE = ("-O3 -DNDEBUG -ffunction-sections -fdata-sections -fno-stack-protector "
        "-fno-stack-clash-protection -U_FORTIFY_SOURCE -fcf-protection=none "
        "-Wl,--gc-sections,-z,norelro,-z,lazy,-z,noseparate-code")
FIXED, PIE = "-fno-pie -static -no-pie", "-fPIE -static-pie"
PACKED = f"{PIE} -Wl,-z,pack-relative-relocs"
PROTECTIONS = {
    "stack protector, strong": "-fstack-protector-strong",
    "_FORTIFY_SOURCE=2": "-D_FORTIFY_SOURCE=2", "full RELRO": "-Wl,-z,relro,-z,now",
    "separate code": "-Wl,-z,separate-code",
    "stack clash protection": "-fstack-clash-protection",
    "_GLIBCXX_ASSERTIONS": "-D_GLIBCXX_ASSERTIONS"}
HARDENING = {"none": FIXED, "static-pie": PIE, "static-pie, packed": PACKED,
             **{name: f"{FIXED} {option}" for name, option in PROTECTIONS.items()},
             "all of these": " ".join([PACKED, *PROTECTIONS.values()])}


def hardening():
    files = [built(f"hardening-{index}", "-DMARLIN_STATIC=OFF",
                   "-DMARLIN_HARDENING=OFF", "-DCMAKE_EXE_LINKER_FLAGS_RELEASE=",
                   f"-DCMAKE_CXX_FLAGS_RELEASE={BARE} {flags}")
             for index, flags in enumerate(HARDENING.values())]
    files.append(built_static())
    counts = measured("counts", FLOOR, *files)
    # The one scene in which an exception is thrown.
    quiet, thrown = counts["quiet"][1:], counts["localtime"][1:]
    print_table("Option, Instructions, more, a bad link, more, Calls, Peak kB, Bytes", [
        (name, count, count - quiet[0][0], bad, bad - thrown[0][0], calls, peak,
         size_of(file)) for name, file, (count, calls, peak), (bad, *_)
        in zip([*HARDENING, "what ships"], files, quiet, thrown)])


def companions():
    marlin = built_static("marlin-install", "marlin-mend")
    tools = [f"{BUILDS}/static/tools/marlin-{name}" for name in ("install", "mend")]
    run("strip", *tools)
    figures = measured("companions", marlin, *tools)
    (milliseconds, kilobytes), (boot, mend) = figures["install"], figures["quiet"]
    print(f"marlin-install, an update of {figures['bytes']:,} bytes: "
          f"{milliseconds:.0f} ms, {kilobytes:,} kB")
    print_table("Quiet boot, Instructions, Calls, Peak kB, Bytes", [
        ("marlin", *boot, size_of(marlin)), ("marlin-mend", *mend, size_of(tools[1]))])
    if milliseconds > 100 or kilobytes > 16_000:
        sys.exit("marlin-install takes too much")
    if any(here >= there for here, there in zip(mend, boot)):
        sys.exit("marlin-mend costs as much as marlin")


def status():
    built_static("marlin-status")
    print_table("Device, Milliseconds, MB, Exit status", status_rows())


def main():
    parser = Options(__doc__)
    parser.add_argument("--rounds", type=number, default=11)
    jobs = parser.add_mutually_exclusive_group()
    for job in (check, record, growth, hardening, parsers, companions, status, making):
        jobs.add_argument(f"--{job.__name__}", dest="job", action="store_const",
                          const=job, default=table)
    options = parser.parse_args()
    name = options.job.__name__
    more = [f"bench-{name}"] if name in ("table", "growth", "parsers") else []
    more += ["demo"] if name == "making" else []
    need("build", "private-device", "bench", *more)
    options.job(*[options.rounds] * (options.job is table))


if __name__ == "__main__":
    main()
