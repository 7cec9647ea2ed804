# SPDX-License-Identifier: BSD-2-Clause
"""Runs the fuzz targets in tests/fuzz with their engine, and keeps their seeds.

Two at a time, each from its seeds and from what earlier runs added to them in
build/fuzz/corpus. An input that breaks a property is left in build/fuzz/findings.

Exit status: 0 without a finding, 1 with one, 2 for bad use.
"""

import argparse
import re
import shutil
import subprocess
import sys
from concurrent.futures import ThreadPoolExecutor
from pathlib import Path

from lab.doors import build, need
from lab.places import BUILD, PROJECT

PLACE = BUILD / "fuzz"
TARGETS = ["version_text", "icu_file_name", "zoneinfo_link", "first_word", "mounts"]

# The format is told in the first line of every file; tests/fuzz/replay.cpp reads
# it too.
FORMAT = (r"# One seed a line, between the outer quotes. \\ and \n as in C; any other"
          r" byte that" "\n"
          r"# is not printable ASCII is \x and two digits. Sorted; lab/fuzz.py --keep"
          r" adds to it." "\n")


def escaped(seed: bytes) -> str:
    def as_text(byte: int) -> str:
        if byte == ord("\\"):
            return r"\\"
        if byte == ord("\n"):
            return r"\n"
        return chr(byte) if 0x20 <= byte < 0x7F else f"\\x{byte:02x}"

    return f'"{"".join(map(as_text, seed))}"'


def unescaped(line: str) -> bytes:
    if not re.fullmatch(r'"([ -\[\]-~]|\\\\|\\n|\\x[0-9a-f]{2})*"', line):
        raise ValueError(f"not a seed: {line}")

    def as_byte(match: re.Match[str]) -> str:
        escape = match[0]
        return {r"\\": "\\", r"\n": "\n"}.get(escape) or chr(int(escape[2:], 16))

    return re.sub(r"\\(\\|n|x..)", as_byte, line[1:-1]).encode("latin-1")


def seeds_file(target: str) -> Path:
    return PROJECT / "tests/fuzz" / f"{target}.seeds"


def read_seeds(target: str) -> list[bytes]:
    lines = seeds_file(target).read_text("ascii").splitlines()
    return [unescaped(line) for line in lines if not line.startswith("#")]


def write_seeds(target: str, seeds: set[bytes]) -> None:
    lines = [escaped(seed) + "\n" for seed in sorted(seeds)]
    seeds_file(target).write_text(FORMAT + "".join(lines), "ascii")


def unpack_seeds(target: str) -> Path:
    """The directory that the engine reads: a file for each seed."""
    directory = PLACE / "seeds" / target
    shutil.rmtree(directory, ignore_errors=True)
    directory.mkdir(parents=True)
    for number, seed in enumerate(read_seeds(target)):
        (directory / f"{number:04}").write_bytes(seed)
    return directory


def run_engine(target: str, *arguments: str | Path) -> tuple[bool, str]:
    """Whether the engine ends without a finding, and its output, kept as a log."""
    ended = subprocess.run(
        [PLACE / f"tests/fuzz/fuzz_{target}", *arguments], text=True, errors="replace",
        stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    (PLACE / "log" / target).write_text(ended.stdout)
    return ended.returncode == 0, ended.stdout


def fuzz(target: str, seconds: int) -> tuple[bool, int]:
    """Whether there is no finding, and the number of runs."""
    corpus = PLACE / "corpus" / target
    corpus.mkdir(parents=True, exist_ok=True)
    clean, output = run_engine(
        target, f"-max_total_time={seconds}", "-max_len=1100", "-timeout=10",
        "-rss_limit_mb=1024", "-print_final_stats=1",
        f"-artifact_prefix={PLACE}/findings/{target}-", corpus, unpack_seeds(target))
    stated = re.search(r"^stat::number_of_executed_units: *(\d+)", output, re.M)
    runs = int(stated[1]) if stated else 0
    if clean:
        print(f"fuzz: {target}: no finding in {runs} runs, {seconds} s", flush=True)
    else:
        last_lines = "\n".join(output.splitlines()[-60:])
        print(f"{last_lines}\nfuzz: {target}: a finding, in {PLACE}/findings",
              file=sys.stderr, flush=True)
    return clean, runs


def keep(target: str) -> None:
    """Adds to the seeds what reaches more than they do."""
    directory = unpack_seeds(target)
    merged, output = run_engine(target, "-merge=1", directory,
                                PLACE / "corpus" / target)
    if not merged:
        sys.exit(f"{output}fuzz: {target}: the seeds cannot be merged")
    seeds = {path.read_bytes() for path in directory.iterdir()}
    write_seeds(target, seeds)
    print(f"fuzz: {target}: {len(seeds)} seeds, {sum(map(len, seeds))} bytes")


def main() -> int:
    def number_of_seconds(text: str) -> int:
        if not re.fullmatch("[1-9][0-9]{0,5}", text):
            raise argparse.ArgumentTypeError("it needs a number from 1 to 999999")
        return int(text)

    parser = argparse.ArgumentParser(
        "fuzz", description=__doc__,
        formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--seconds", type=number_of_seconds, default=60, metavar="N",
                        help="how long each target runs (default: 60)")
    parser.add_argument("--keep", action="store_true",
                        help="add to the seeds what reaches more than they do")
    parser.add_argument("targets", nargs="*", metavar="TARGET",
                        help=f"{', '.join(TARGETS)}; default: all")
    arguments = parser.parse_args()
    targets = arguments.targets or TARGETS
    for target in targets:
        if target not in TARGETS:
            parser.error(f"there is no target {target}")

    for directory in ("findings", "log"):
        (PLACE / directory).mkdir(parents=True, exist_ok=True)
    need("build", "fuzz")
    build("fuzz")
    with ThreadPoolExecutor(max_workers=2) as two_at_a_time:
        results = list(two_at_a_time.map(
            lambda target: fuzz(target, arguments.seconds), targets))
    all_clean = all(clean for clean, _ in results)
    runs = sum(runs for _, runs in results)
    print(f"fuzz: {len(targets)} targets, {runs} runs, {arguments.seconds} s each:",
          "no finding" if all_clean else "findings", flush=True)
    if arguments.keep and all_clean:
        for target in targets:
            keep(target)
    return 0 if all_clean else 1


if __name__ == "__main__":
    sys.exit(main())
