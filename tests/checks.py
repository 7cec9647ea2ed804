# SPDX-License-Identifier: BSD-2-Clause
"""Checks of the texts that no compiler reads: the rules of the source, the deliberate
oddities, the documents, the manual pages, the commits.

usage: tests/checks.py [source_rules | deliberate | documents | manual_pages |
                        commits]...

Without an argument: all. Exit status: 0 when everything holds, 1 when something does
not, 2 for bad use.
"""

import os
import re
import shutil
import subprocess
import sys
from collections.abc import Iterator
from pathlib import Path

PROJECT = Path(__file__).resolve().parents[1]
sys.path.insert(0, str(PROJECT))
from lab.doors import ci  # noqa: E402
from lab.words import lines  # noqa: E402
from lab.words.command import Options  # noqa: E402

os.chdir(PROJECT)
PRODUCT = [path for folder in ("driver", "dataset", "support")
           for path in sorted(Path(folder).iterdir())]
TEST_NAME = re.compile(r"\b[A-Z][A-Za-z]+\.[A-Z][A-Za-z0-9]+\b")


def matching_lines(path: Path, pattern: str) -> Iterator[str]:
    for number, line in enumerate(path.read_text().splitlines(), 1):
        if re.search(pattern, line):
            yield f"{path}:{number}: {line.strip()}"


def comments_in(path: Path) -> list[str]:
    """Each comment as one line, so that a name may stand on the next one."""
    blocks = re.findall(r"(?:^ *//.*\n)+", path.read_text(), re.M)
    return [" ".join(re.sub(r"(?m)^ *//", "", block).split()) for block in blocks]


def differences(left: set[str], where_left: str, right: set[str],
                where_right: str) -> Iterator[str]:
    for only in sorted(left - right):
        yield f"in {where_left}, not in {where_right}: {only}"
    for only in sorted(right - left):
        yield f"in {where_right}, not in {where_left}: {only}"


# Each check yields what does not hold.

def source_rules() -> Iterator[str]:
    above = {"support": "driver|dataset|tools|tests", "dataset": "driver|tools|tests",
             "driver": "tools|tests"}
    for path in PRODUCT:
        for line in matching_lines(path, rf'#include "({above[path.parts[0]]})/'):
            yield f"{line}: a dependency must not point upwards"
        # Two functions have this name.
        unqualified = r"^(?!.*//)(?!bool remove\().*(?<!fsutil::)(?<!std::)\bremove\("
        for line in matching_lines(path, unqualified):
            yield f"{line}: must be fsutil::remove() or std::remove()"

    programs = re.findall(r"marlin_test\(\w+ \w+ (\w+) ([^)]*)\)",
                          Path("tests/CMakeLists.txt").read_text())
    yield from differences(
        {f"{folder}/{name}_test.cpp" for folder, names in programs
         for name in names.split()}, "tests/CMakeLists.txt",
        {str(path)[6:] for path in Path("tests").rglob("*_test.cpp")}, "tests/")

    floors = re.findall(r"^\| \[`(\w+)/`\]", Path("docs/proofs.md").read_text(), re.M)
    yield from differences({path.parent.name for path in Path("lab").glob("*/*.py")},
                           "lab/", set(floors), "docs/proofs.md")
    for path in Path("lab").glob("*/**/*.py"):
        for floor in re.findall(r"^ *from lab\.(\w+)", path.read_text(), re.M):
            if floor not in floors[:floors.index(path.parts[1]) + 1]:
                yield f"{path}: imports lab.{floor}, a later row of docs/proofs.md"

    for path in (Path(name) for name in ci.files("*") if name[0] != "."):
        is_source = (path.suffix in (".c", ".cmake", ".cpp", ".h", ".py", ".sh")
                     or path.name == "CMakeLists.txt" or os.access(path, os.X_OK))
        if is_source and not re.match(
                "(.*\n){0,2}.*SPDX-License-Identifier: BSD-2-Clause", path.read_text()):
            yield f"{path}: no licence line"


def deliberate() -> Iterator[str]:
    """Each comment "Deliberate:" stands above its code and names tests that exist."""
    tests = {f"{suite}.{case}" for path in Path("tests").rglob("*_test.cpp")
             for suite, case in re.findall(r"\bTEST(?:_F|_P)?\(\s*(\w+),\s*(\w+)\)",
                                           path.read_text())}
    found = 0
    for path in PRODUCT:
        comments = comments_in(path)
        if path.read_text().count("Deliberate:") != str(comments).count("Deliberate:"):
            yield f"{path}: a deliberate oddity beside code, not above it"
        for comment in comments:
            for name in TEST_NAME.findall(comment):
                if name not in tests:
                    yield f"{path}: there is no test {name}"
            # One comment may tell of two oddities.
            for oddity in comment.split("Deliberate:")[1:]:
                found += 1
                if not TEST_NAME.search(oddity.partition("Pinned by ")[2]):
                    yield f"{path}: no test pins: {oddity.strip()}"
    if not found:
        yield "no comment says what is deliberate"


def documents() -> Iterator[str]:
    """Links and paths lead somewhere; a table can be read in its source; no figure is
    still to be filled in."""
    def anchors(path: Path) -> set[str]:
        headings = re.findall(r"^#+ (.*)", path.read_text(), re.M)
        return {re.sub(r"[^a-z0-9-]", "", heading.lower().replace(" ", "-"))
                for heading in headings}

    for path in [*Path().glob("*.md"), *Path("docs").glob("*.md")]:
        for link in re.findall(r"\]\(([^) ]+)\)", path.read_text()):
            name, _, anchor = link.partition("#")
            target = path.parent / name if name else path
            if link.startswith("http"):
                continue
            if not target.exists():
                yield f"{path}: there is no {name}"
            elif anchor and anchor not in anchors(target):
                yield f"{path}: no heading for {link}"
        for name in re.findall(r"`((?!build)\w+/[^`\s:]*)", path.read_text()):
            if Path(name.split("/")[0]).is_dir() and not Path(name).exists():
                yield f"{path}: there is no {name}"
        for line in matching_lines(path, r"^\|.*[^|]{201}"):
            yield f"{line[:60]} ...: a cell of more than 200 characters"
        for line in matching_lines(path, "FIGURE"):
            yield f"{line}: a figure is missing"


def manual_pages() -> Iterator[str]:
    """They are well formed, of the project's version, and tell what the program does:
    the same warnings, the same steps, the same default zone."""
    pages = sorted(Path("docs").glob("*.[1-9]"))
    marlin = Path("docs/marlin.8").read_text()
    code = "\n".join(re.sub(r"^ *//.*", "", path.read_text(), flags=re.M)
                     for path in PRODUCT)

    pieces = re.findall(r'::warn\(\s*((?:"[^"]*"\s*)+)', code)
    texts = {"".join(re.findall(r'"([^"]*)"', piece)) for piece in pieces}
    calls = len(re.findall(r"\bv?warnx?c?\(", code))
    if calls != len(pieces) or calls == 0:
        yield f"of {calls} warnings in the program {len(pieces)} could be read"
    diagnostics = re.search(r"^\.Sh DIAGNOSTICS\n(.*?)^\.Sh ", marlin, re.M | re.S)[1]
    told = set(re.findall(r"^\.It (.*)", diagnostics, re.M))
    yield from differences(texts, "the program", told, "DIAGNOSTICS")
    yield from differences(texts, "the program", set(lines.FORMATS),
                           "lab/words/lines.py")

    # The lines by which marlin-status knows what a boot does.
    known = Path("tools/status/explanation.cpp").read_text()
    named = re.search(r"namespace lines \{\n(.*?)\n\}", known, re.S)[1]
    for text in re.findall(r'=\s*"([^"]*)";', named):
        if text not in texts:
            yield f"marlin-status looks for a line that no boot prints: {text}"

    zones = re.findall(r'default_zone\[\] = "([^"]+)"', code)
    told_zones = re.findall(r"default zone, ([\w/]+)", marlin)
    if len(zones) != 1 or told_zones != zones:
        yield f"the default zone is {zones} in the program, {told_zones} in the page"

    startup = Path("driver/startup.cpp").read_text()
    steps = re.findall(r"^// +(\d+)\. ", startup, re.M)
    told = re.findall(r"^\.It$", re.search(r"\.Bl -enum\n(.*?)\.El", marlin, re.S)[1],
                      re.M)
    if steps != [str(number) for number, _ in enumerate(told, 1)] or not steps:
        yield f"a boot has the steps {steps}, and {len(told)} in docs/marlin.8"

    version = re.search(r"^project\([^)]*\bVERSION ([\d.]+)",
                        Path("CMakeLists.txt").read_text(), re.M)[1]
    for page in pages:
        if re.findall(r"^\.Os marlin (.*)", page.read_text(), re.M) != [version]:
            yield f"{page} is not of version {version}"
    newest = re.search(r"^## (\S+) - [\d-]+(?:, unreleased)?$",
                       Path("CHANGELOG.md").read_text(), re.M)[1]
    if newest != version:
        yield f"the newest release in CHANGELOG.md is {newest}, not {version}"

    try:
        lint = subprocess.run(["mandoc", "-T", "lint", "-W", "warning", *pages],
                              capture_output=True, text=True)
        if lint.returncode != 0:
            yield lint.stdout + lint.stderr
    except FileNotFoundError:
        yield "mandoc is not installed (Debian package mandoc)"


def commits() -> Iterator[str]:
    """A subject can be read in a list, and the history is a line: since the day of this
    rule, and where there is a history."""
    if not Path(".git").exists() or not shutil.which("git"):
        return
    log = subprocess.run(
        ["git", "-c", f"safe.directory={PROJECT}", "log",
         "--since=2026-11-22T12:20:00Z", "--format=%h\t%p\t%s"],
        capture_output=True, text=True)
    yield from log.stderr.splitlines()
    for commit, parents, subject in (line.split("\t", 2)
                                     for line in log.stdout.splitlines()):
        if len(subject) > 72:
            yield f"{commit}: a subject of more than 72 characters"
        if " " in parents:
            yield f"{commit}: a merge; rebase in its place"


CHECKS = {check.__name__: check
          for check in (source_rules, deliberate, documents, manual_pages, commits)}


def main() -> int:
    options = Options(__doc__)
    options.add_names("checks", CHECKS)
    failures = [f"{name}: {failure}" for name in options.parse_args().checks
                for failure in CHECKS[name]()]
    print(*failures, sep="\n", end="\n" if failures else "", file=sys.stderr)
    return 1 if failures else 0


if __name__ == "__main__":
    sys.exit(main())
