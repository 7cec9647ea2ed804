# SPDX-License-Identifier: BSD-2-Clause
"""usage: lab.proofs.mutants [--quick N [--seed S]] [--only TEXT] [--list]

Breaks the program on purpose and shows which breaks no test notices. Mutants of
driver/, dataset/ and support/ are made by rule, in one place at a time: an operator, a
constant, a text, a name, a condition, a statement, two neighbours; and by hand, each to
break a sentence of what the program must do: mutants_by_hand.txt. Every one is built in
a copy of the project and the test programs run against it, the one named after its
folder first, slow tests last, up to the first failure; one that hangs is killed too.
Others break what lies between two programs: mutants_between.txt. A quick run of lives
has to notice each of these.
Survivors are printed, and mutants from the lists that do not build.

Those that change nothing that anybody could notice are listed, with a reason each, in
mutants_equivalent.txt. Exit status: 0 when there is no other, 1 when there is, 2 for
bad use. The copies, up to one for each processor, and their builds are in
build/mutants.

  --quick N     only N mutants, chosen at random
  --seed S      of that choice (default 1)
  --only TEXT   only mutants with TEXT in their line of output
  --list        prints the mutants, builds nothing
"""

import os
import random
import re
import subprocess
import sys
import time
from collections import Counter
from collections.abc import Iterator
from concurrent.futures import ThreadPoolExecutor
from itertools import chain
from pathlib import Path
from typing import NamedTuple

from lab.carriers.building import copy_the_project, locked, need, trials
from lab.words.command import Options, number
from lab.words.places import BUILD, PROJECT

PLACE = BUILD / "mutants"
FOLDERS = ("support", "dataset", "driver")
SLOW = 200  # milliseconds; a test that takes longer comes last
# What the mutants take.
HEADERS = ("clocale cstdlib exception fcntl.h stdexcept sys/file.h sys/stat.h "
           "unistd.h").split()


class Mutant(NamedTuple):
    kind: str
    texts: dict[str, str]  # of the files that it changes
    shown: str
    key: str  # in mutants_equivalent.txt


NAMES = """
    true false   false true   begin end   end begin   back front   rfind find
    starts_with ends_with   ends_with starts_with   find_if find_if_not
    find_if_not find_if   remove_prefix remove_suffix   remove_suffix remove_prefix
    is_digit is_letter   is_letter is_digit   major minor   minor major   from to
    legacy present   present legacy   system current   current system   latest current
    update current   active current   corrected target   ENOENT ENOTDIR   F_OK R_OK
    S_ISREG S_ISCHR   S_IROTH S_IRGRP   O_RDONLY O_RDWR   O_WRONLY O_RDWR
    FTS_F FTS_SL   FTS_D FTS_DP   FTS_SKIP FTS_AGAIN   FTS_PHYSICAL FTS_LOGICAL
    SIG_IGN SIG_DFL   SIGPIPE SIGHUP   _IOLBF _IONBF   fsutil::remove std::remove
    std::remove ::unlink   make_shared<mln_icu> make_shared<mln_zoneinfo>
""".split()
OPERATORS = {"==": "!=", "!=": "==", "<": "<= >", ">": ">= <", "<=": "< >", ">=": "> <",
             "&&": "||", "||": "&&", "+": "-", "-": "+", "+=": "-= =", "&": "|"}
REPLACED = [  # what stands in the group of a pattern, and by what
    *((rf"(?<![\w:])({name})(?![\w<>:])", [other])
      for name, other in zip(NAMES[::2], NAMES[1::2])),
    *((rf"(?<= )({re.escape(operator)})(?= |\n)", others.split())
      for operator, others in OPERATORS.items()),
    (r"(?<![\w!])(!)(?=[\w(:])", [""]),
    (r"catch \((\.\.\.)\)", ["char", "int", "const std::exception&"])]
MOVABLE = (r"(?!\s|for\b|return\b|throw\b|using\b|(?:inline )?constexpr\b)"
           r"(?:[^;{}]|\{[^;{}]*\})+;")
NEIGHBOURS = re.compile(rf"(?<=[;:{{}}])\s*\n\s*(?=({MOVABLE})\s*\n\s*({MOVABLE}))")
STATEMENT = re.compile(
    r"(?:(?<=[;{})])|(?<=else))\s+"
    r"((?:throw|return)\b[^;{}]*;|[*\w:.>[\]-]+(?:\(| \+?= )[^;]*;)")


def code_of(source):
    """The code alone: of the same length, no comment, text or directive."""
    def blank(match):
        text = match.group()
        if text[0] in "\"'":
            return text[0] + "_" * (len(text) - 2) + text[0]
        return re.sub(r"[^\n]", " ", text)
    return re.sub(r'//[^\n]*|^#[^\n]*|static_assert[^;]*;|"(?:\\.|[^"\\])*"|'
                  r"'(?:\\.|[^'\\])+'", blank, source, flags=re.M)


def skip(code, place):
    """The place behind a byte, or behind the bracket that opens there."""
    depth = 0
    while place < len(code):
        depth += (code[place] in "([{") - (code[place] in ")]}")
        place += 1
        if depth <= 0:
            return place
    return place


def operand_before(code, end):
    before = re.compile(r"([;,{(?]\s*|(&&|\|\|| [=|+:-]|return)\s+)$")
    start = end
    while not before.search(code, max(start - 60, 0), start):
        depth = 0
        while True:  # one byte, or one pair of brackets
            start -= 1
            depth += (code[start] in ")]}") - (code[start] in "([{")
            if depth <= 0:
                break
    return start


def operand_after(code, start):
    end = start
    while not re.match(r"[;,)}\]?]| ?(&&|\|\|)| [=|+:-] ", code[end:end + 4]):
        end = skip(code, end)
    return end


def changes(source):
    """Yields (start, end, replacement): the rules, one after the other."""
    code = code_of(source)

    for found in re.finditer(r'"_*"', code):  # texts
        start, end = found.start() + 1, found.end() - 1
        text = source[start:end]
        middle = len(text) // 2
        other = "z" if text[middle:middle + 1] == "y" else "y"
        yield start, end, text[:middle] + other + text[middle + 1:]
        yield start, end, text[:-1]
        yield start, end, text + text[-1:]
    for found in re.finditer(r"'_+'", code):  # characters
        byte = ord(eval(source[found.start():found.end()]))
        for other in (byte - 1, byte + 1):
            yield *found.span(), f"'\\{other:03o}'"
    for found in re.finditer(r"(?<![\w.<])\d+(?![\w.])", code):  # numbers
        octal = re.match("0.", found.group())
        number = int(found.group(), 8 if octal else 10)
        for other in {number + 1, abs(number - 1)}:
            yield *found.span(), f"0{other:o}" if octal else str(other)

    for pattern, others in REPLACED:
        for found in re.finditer(pattern, code):
            for other in others:
                yield *found.span(1), other
    paths = (PROJECT / "support/paths.h").read_text()
    places = re.findall(r"char (\w+)\[\] =", paths)
    for found in re.finditer(r"paths::(\w+)", code):
        if found[1] in places:
            yield *found.span(1), places[places.index(found[1]) - 1]
    for found in re.finditer(r" (&&|\|\||[|+])\s+", code):  # operands
        yield operand_before(code, found.start()), found.end(), ""
        yield found.start(), operand_after(code, found.end()), ""
    for found in re.finditer(r"\b(?:if|while) (\()", code):  # conditions
        for other in ("true", "false"):
            yield found.end(), skip(code, found.start(1)) - 1, other
    for found in re.finditer(r"\s+\? ", code):
        for other in ("true", "false"):
            yield operand_before(code, found.start()), found.start(), other

    for found in re.finditer(r"[\w>]\((?=[^()]*[,(])", code):  # arguments
        starts, here = [found.end()], found.end()
        while here < len(code) and code[here] != ")":
            here = skip(code, here)
            if code[here - 1] == ",":
                starts.append(here)
        starts.append(here + 1)
        for a, b, c in zip(starts, starts[1:], starts[2:]):
            first, second = source[a:b - 1].strip(), source[b:c - 1].strip()
            if "const " not in first:  # a declaration's names mean nothing
                yield a, c - 1, f"{second}, {first}"

    for found in STATEMENT.finditer(code):  # statements
        if not re.match("return |.* = delete;", found[1]):
            yield *found.span(1), ";"
        if found[1].startswith("throw "):
            yield *found.span(1), "throw 0;"
        if re.match(r"return (?!{|0;|false;|std::nullopt;)", found[1]):
            yield *found.span(1), "return {};"
    for found in NEIGHBOURS.finditer(code):  # statements and members, swapped
        (start, middle), (rest, end) = found.span(1), found.span(2)
        first, second = source[start:middle], source[rest:end]
        # In a header the order of functions means nothing, unless they are virtual.
        if ("#pragma once" not in source or "(" not in first + second or
                first.startswith("virtual") and second.startswith("virtual")):
            yield start, end, second + source[middle:rest] + first


def by_rule() -> Iterator[Mutant]:
    for path in (path for folder in FOLDERS
                 for path in sorted((PROJECT / folder).glob("*.*"))):
        source, file = path.read_text(), str(path.relative_to(PROJECT))
        known, times = {source}, Counter()
        for start, end, text in sorted(changes(source)):
            changed = source[:start] + text + source[end:]
            if changed in known:
                continue
            known.add(changed)
            first, last = source.rfind("\n", 0, start) + 1, source.find("\n", end)
            change = " -> ".join(
                " ".join(re.sub(r" //.*", "", part).split()) for part in (
                    source[first:last], source[first:start] + text + source[end:last]))
            # The same change of the same line in two places: told apart by a number.
            times[change] += 1
            if times[change] > 1:
                change += f" ({times[change]})"
            line = source.count("\n", 0, start) + 1
            yield Mutant("by rule", {file: changed}, f"{file}:{line}: {change}",
                         f"{file}: {change}")


def listed(name: str) -> Iterator[tuple[str, str]]:
    """(sentence, line) for each line below a sentence; a deeper line goes on."""
    text = Path(__file__).with_name(f"mutants_{name}.txt").read_text()
    for paragraph in re.findall(r"^[^\s#].*\n(?: .*\n)+", text, re.M):
        sentence, *lines = re.split(r"\n  (?! )", paragraph.rstrip())
        for line in lines:
            yield sentence, line


def from_list(kind: str) -> Iterator[Mutant]:
    for sentence, line in listed(kind.replace(" ", "_")):
        texts = {}
        for edit in line.split("\n    and "):
            file, before, after = re.fullmatch(
                r"(\S+): (.*?) -> (.*)", " ".join(edit.split())).groups()
            text = texts.get(file) or (PROJECT / file).read_text()
            form = r"\s+".join(map(re.escape, before.split()))
            if len(found := [*re.finditer(form, text)]) != 1:
                sys.exit(f"mutants: {kind}: found {len(found)} times: {edit}")
            start, end = found[0].span()
            after = after.replace("@", text[start:end])
            texts[file] = text[:start] + after + text[end:]
        shown = f"{kind}: {sentence}: {' '.join(line.split())}"
        yield Mutant(kind, texts, shown, shown)


def run(seconds: int, *command, file_size="unlimited") -> tuple[bool, str]:
    """Whether a command succeeds within this time, and its output. Limited is what a
    mutant could take from the machine."""
    limits = ["env", "--ignore-signal=XFSZ",
              # Ten times as long by the clock, for a machine that has more to do.
              "timeout", "--signal=KILL", str(10 * seconds),
              "prlimit", f"--fsize={file_size}", f"--cpu={seconds}", f"--as={4 << 30}"]
    done = subprocess.run([*limits, *command], text=True, errors="replace",
                          stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT)
    return done.returncode == 0, done.stdout


class Tree:
    """A copy of the project, and its build."""

    def __init__(self, name: str, *settings: str):
        self.root = PLACE / name
        copy_the_project(self.root)
        subprocess.run(
            ["cmake", "-S", self.root, "-B", self.root / "build", "-G", "Ninja",
             *settings, "-DCMAKE_BUILD_TYPE=None",
             "-DCMAKE_CXX_FLAGS=-O0 -w -D_GLIBCXX_ASSERTIONS -fsanitize=return " +
             " ".join(f"-include {header}" for header in HEADERS)],
            check=True, stdout=subprocess.DEVNULL)
        built, output = self.build("all")
        if not built:
            sys.exit(f"{output}\nmutants: the unchanged project does not build")
        self.insist_on_passing()

    def insist_on_passing(self):
        """Tests the copy as it is; finds each program's slow tests."""
        self.slow = {}
        for path in sorted(self.root.glob("build/tests/*_test")):
            program = path.name
            self.slow[program] = []
            output = self.run_tests(program, slow=None)[1]
            self.slow[program] = [
                test for result, test, took in re.findall(
                    r"\[ +(OK|FAILED) +\] (\S+) \((\d+) ms\)", output)
                if result == "FAILED" or int(took) >= SLOW]
            for slow in (False, True):
                passed, output = self.run_tests(program, slow=slow)
                if not passed:
                    sys.exit(f"{output}\nmutants: {program} fails as it is")
        if not self.slow or not self.test_imports():
            sys.exit("mutants: no test program was built, or the imports fail as is")

    def build(self, target: str):
        return run(900, "ninja", "-C", self.root / "build", "-j2", target)

    def run_tests(self, program: str, *options: str, slow=False):
        seconds, sign, file_size = {
            None: (90, "-", "unlimited"),  # all of them
            False: (30, "-", 256 << 20), True: (90, "", "unlimited")}[slow]
        return run(seconds, self.root / "build/tests" / program, *options,
                   f"--gtest_filter={sign}{':'.join(self.slow[program])}",
                   file_size=file_size)

    def test_imports(self) -> bool:
        """The test that is not in a program."""
        build = self.root / "build"
        return run(30, "/usr/bin/python3", "-B", self.root / "tests/imports.py", "nm",
                   *build.glob("libmarlin_*.a"), *build.glob("CMakeFiles/marlin.dir/"
                                                             "driver/*.o"))[0]

    def fate_of(self, mutant: Mutant) -> str:
        originals = {file: (self.root / file).read_text() for file in mutant.texts}
        try:
            for file, text in mutant.texts.items():
                (self.root / file).write_text(text)
            return self.tested(next(iter(originals)).split("/")[0] + "_test")
        finally:
            for file, text in originals.items():
                (self.root / file).write_text(text)

    def tested(self, favourite: str) -> str:
        programs = sorted(self.slow, key=lambda name: (name != favourite, name))
        if not self.build("marlin")[0]:
            return "not built"
        for program in programs:
            # A test that does not compile any more has noticed something.
            if not (self.build(f"tests/{program}")[0] and
                    self.run_tests(program, "--gtest_fail_fast")[0]):
                return "killed"
        if not self.test_imports():
            return "killed"
        for program in programs:
            if self.slow[program] and not self.run_tests(program, slow=True)[0]:
                return "killed"
        return "survivor"


class Lives(Tree):
    """A copy of the project with the companions; lives are its only test."""

    def __init__(self):
        super().__init__("lives", "-DBUILD_TESTING=OFF", "-DMARLIN_STATIC=ON")

    def insist_on_passing(self):
        passed, output = self.live()
        if not passed:
            sys.exit(f"{output}\nmutants: lives fail as it is")

    def live(self) -> tuple[bool, str]:
        command = trials("mutant", "--quick", "--unshrunk", "-x", "lab/proofs/life.py")
        done = subprocess.run(command, cwd=PROJECT, capture_output=True, text=True,
                              env=os.environ | {"MARLIN": f"{self.root}/build/marlin"})
        return done.returncode == 0, done.stdout + done.stderr

    def tested(self, favourite: str) -> str:
        if not self.build("all")[0]:
            return "not built"
        passed, output = self.live()
        if not passed and "FAILED" not in output:
            sys.exit(f"{output}\nmutants: lives did not come to an end")
        return "survivor" if passed else "killed"


def fates(trees: list[Tree], mutants: list[Mutant]) -> Iterator[tuple[Mutant, str]]:
    """Every mutant with its fate. Each worker has a tree to itself."""
    def fate(mutant):
        tree = trees.pop()
        try:
            return mutant, tree.fate_of(mutant)
        finally:
            trees.append(tree)

    with ThreadPoolExecutor(len(trees)) as pool:
        yield from pool.map(fate, mutants)


def figures(counts: Counter) -> str:
    return (f"{counts.total() - counts['not built']} built and tested "
            f"({counts['not built']} more do not build), {counts['killed']} killed, "
            f"{counts['equivalent']} equivalent, "
            f"{counts['survivor']} unexplained survivors")


def main() -> int:
    parser = Options(__doc__)
    parser.add_argument("--quick", type=number)
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--only", default="")
    parser.add_argument("--list", action="store_true")
    options = parser.parse_args()
    need("build", "private-device", "test", "mutants", "pytest", "prove")

    mutants, equivalent = [*by_rule(), *from_list("by hand"), *from_list("between")], {
        " ".join(line.split()): reason for reason, line in listed("equivalent")}
    for key in equivalent.keys() - {mutant.key for mutant in mutants}:
        sys.exit(f"mutants: explained, but there is none: {key}")
    mutants = [mutant for mutant in mutants if options.only in mutant.shown]
    if options.quick and options.quick < len(mutants):
        mutants = [mutants[index] for index in sorted(
            random.Random(options.seed).sample(range(len(mutants)), options.quick))]
    if options.list:
        print(*(mutant.shown for mutant in mutants), sep="\n")
        return 0

    with locked(PLACE):
        return judge(mutants, equivalent,
                     f", seed {options.seed}" if options.quick else "")


def judge(mutants: list[Mutant], equivalent: dict[str, str], chosen: str) -> int:
    """Tries all of them and tells their fates."""
    lived = [mutant for mutant in mutants if mutant.kind == "between"]
    others = [mutant for mutant in mutants if mutant.kind != "between"]
    wanted = min(os.cpu_count() or 1, 1 + len(others) // 100) if others else 0
    trees = [Tree(f"tree{number}", "-DBUILD_TESTING=ON", "-DMARLIN_TOOLS=OFF",
                  "-DCMAKE_GTEST_DISCOVER_TESTS_DISCOVERY_MODE=PRE_TEST")
             for number in range(wanted)]
    begun, wrong = time.monotonic(), False
    counts = {"by rule": Counter(), "by hand": Counter(), "between": Counter()}
    told = chain(fates(trees, others) if others else (),
                 fates([Lives()], lived) if lived else ())
    for done, (mutant, fate) in enumerate(told, 1):
        explained = mutant.key in equivalent
        if fate == "survivor" and explained:
            fate = "equivalent"
        elif explained or fate == "survivor" or (
                fate == "not built" and mutant.kind != "by rule"):
            print(f"{fate}{', though explained' * explained}: {mutant.shown}",
                  flush=True)
            wrong = True
        counts[mutant.kind][fate] += 1
        if sys.stderr.isatty():
            print(f"\r{done} of {len(mutants)} ", end="", file=sys.stderr)
    for kind, some in counts.items():
        print(f"{kind}: {figures(some)}")
    print(f"mutants: {figures(sum(counts.values(), Counter()))}; "
          f"{time.monotonic() - begun:.0f} s{chosen}")
    return int(wrong)


if __name__ == "__main__":
    sys.exit(main())
