# SPDX-License-Identifier: BSD-2-Clause
"""usage: lab.proofs.fuzz [--seconds N] [TARGET...]

Runs the fuzz targets in tests/fuzz, or some of them, with their engine: two at a time,
each from its seeds and from what earlier runs added to them in build/fuzz/corpus. An
input that breaks a property is left in build/fuzz/findings.

  --seconds N   how long each target runs (default 60)

Exit status: 0 without a finding, 1 with one, 2 for bad use.
"""

import re
from concurrent.futures import ThreadPoolExecutor
from pathlib import Path

from lab.carriers.building import build, need, quietly, room, show_end
from lab.words.command import Options, number, say
from lab.words.places import BUILD, PROJECT

PLACE = BUILD / "fuzz"
TARGETS = ["version_text", "icu_file_name", "zoneinfo_link", "first_word", "telling"]


# The format of seeds is told at the head of each file; tests/fuzz/replay.cpp reads it
# too.
def unescaped(line: str) -> bytes:
    if not re.fullmatch(r'"([ -\[\]-~]|\\x[0-9a-f]{2})*"', line):
        raise ValueError(f"not a seed: {line}")
    return line[1:-1].encode("ascii").decode("unicode_escape").encode("latin-1")


def unpack_seeds(target: str) -> Path:
    """The directory that the engine reads: a file for each seed."""
    directory, seeds = room(PLACE / "seeds" / target), f"tests/fuzz/{target}.seeds"
    for index, line in enumerate((PROJECT / seeds).read_text("ascii").splitlines()):
        if not line.startswith("#"):
            (directory / f"{index:04}").write_bytes(unescaped(line))
    return directory


def fuzz(target: str, seconds: int) -> tuple[bool, int]:
    """Whether there is no finding, and the number of runs."""
    corpus = PLACE / "corpus" / target
    corpus.mkdir(parents=True, exist_ok=True)
    log = PLACE / "log" / target
    status = quietly(
        log, PLACE / f"tests/fuzz/fuzz_{target}", f"-max_total_time={seconds}",
        "-max_len=1100", "-timeout=10", "-rss_limit_mb=1024", "-print_final_stats=1",
        f"-artifact_prefix={PLACE}/findings/{target}-", corpus, unpack_seeds(target),
        check=False)
    stated = re.search(r"^stat::number_of_executed_units: *(\d+)",
                       log.read_text(errors="replace"), re.MULTILINE)
    runs = int(stated[1]) if stated else 0
    if status:
        show_end(log)
        say(f"fuzz: {target}: a finding, in {PLACE}/findings")
    else:
        print(f"fuzz: {target}: no finding in {runs} runs, {seconds} s", flush=True)
    return not status, runs


def main() -> int:
    options = Options(__doc__)
    options.add_argument("--seconds", type=number, default=60)
    options.add_names("targets", TARGETS)
    arguments = options.parse_args()
    targets = arguments.targets

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
    return 0 if all_clean else 1


if __name__ == "__main__":
    raise SystemExit(main())
