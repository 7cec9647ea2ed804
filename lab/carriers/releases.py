# SPDX-License-Identifier: BSD-2-Clause
"""Releases of the time-zone rules and of ICU's data to make data sets from: this
machine's own, under other names, and with one invention. From 1 January of a year on
Lisbon has Central European Time, in the rules and in ICU's data alike."""

from __future__ import annotations

import calendar
import datetime
import json
import os
import re
import shutil
import subprocess
import sys
import tempfile
from pathlib import Path
from typing import NamedTuple

from lab.words.command import stop
from lab.words.places import BUILD, PROJECT

TARGET = BUILD / "releases"
WITHOUT_ICU = Path(__file__).with_name("without_icu")
RULES = Path("/usr/share/zoneinfo/tzdata.zi")
# Lisbon's last line.
LISBON = r"(?m)^(Z Europe/Lisbon .*\n(?:[^RLZ].*\n)*?0 (\S+) WE%sT)$"
RESOURCES = "metaZones.res timezoneTypes.res windowsZones.res zoneinfo64.res".split()


def output(*command, **options) -> bytes:
    done = subprocess.run(command, stdout=subprocess.PIPE, **options)
    if done.returncode:
        stop(1, f"failed: {' '.join(map(str, command))}")
    return done.stdout


def find(what: str, pattern: str, text: str) -> re.Match[str]:
    if found := re.search(pattern, text, re.MULTILINE):
        return found
    stop(1, f"this machine has no {what} of the expected form")


def tool(name: str, **options: str | Path) -> list[str]:
    """The command of make-update or make-system, which cannot ask ICU."""
    words = [f"--{option}={value}" for option, value in options.items()]
    return ["/usr/bin/env", f"PYTHONPATH={WITHOUT_ICU}", "/usr/bin/python3", "-B",
            str(PROJECT / "tools" / name), *words]


def once(target: Path, inputs: list, make):
    """Has a directory made, except where it is there already, made from the same."""
    # Data without read permission for all does not count on a device.
    os.umask(0o022)
    inputs = repr([(str(path), os.stat(path).st_size, os.stat(path).st_mtime_ns)
                   for path in inputs])
    made_from = target / "inputs"
    if made_from.exists() and made_from.read_text() == inputs:
        return
    if target.exists():
        if not made_from.exists():
            stop(1, f"{target} is there, and not made by this; remove it")
        shutil.rmtree(target)
    target.mkdir(parents=True)
    made_from.touch()  # from here on it is
    make()
    made_from.write_text(inputs)


def own() -> str:
    """The release of this machine's rules."""
    return find("release", r"\A# version (\d{4}[a-z]+)\b", RULES.read_text())[1]


def after(release: str) -> str:
    """As releases are named: 2025b is followed by 2025c, and 2025z by 2025za."""
    if release.endswith("z"):
        return release + "a"
    return release[:-1] + chr(ord(release[-1]) + 1)


def icu_library() -> str:
    """The library with all of ICU's data that this machine's ICU tools have."""
    return find("ICU library", r" => (/.*/libicudata\.so\S*)",
                output("ldd", shutil.which("icupkg")).decode())[1]


def icu_schema() -> str:
    """As 72l: the version of the ICU library and the letter of its byte order."""
    version = find("ICU library", r"\.so\.(\d+)$", icu_library())[1]
    return version + sys.byteorder[0]


class Names(NamedTuple):
    """Releases, as 2025b, and ICU's schemas, as 72l."""
    system: str
    update: str  # Lisbon changes in the year after the system's
    refused: str  # and here a year later; its ICU data gets another schema
    upgrade: str  # the same, of a later system
    icu: str
    other_icu: str

    @property
    def year(self) -> int:
        """From its beginning on Lisbon has another time."""
        return int(self.system[:4]) + 1


def names() -> Names:
    return Names(**json.loads((TARGET / "names").read_text()))


def names_of_lisbon() -> list[str]:
    """What the rules call Lisbon's zone; in some of Debian's releases WET, too."""
    rules = (TARGET / names().system / "tzdata.zi").read_text()
    return sorted(["Europe/Lisbon",
                   *re.findall(r"(?m)^L Europe/Lisbon (\S+)$", rules)])


def prepare():
    """Makes four releases, each in a directory with its name."""
    # zic and icupkg are here, and this is not on everybody's path.
    os.environ["PATH"] += ":/usr/sbin"
    once(TARGET, [RULES, icu_library(), __file__], make_all)


def make_all():
    system, icu = own(), icu_schema()
    update = after(system)
    refused = after(update)
    made = Names(system, update, refused, after(refused), icu,
                 f"{int(icu[:-1]) + 1}{icu[-1]}")
    for release, lisbon_from in ((system, None), (update, made.year),
                                 (refused, made.year + 1),
                                 (made.upgrade, made.year + 1)):
        make(TARGET / release, release, lisbon_from)
    (TARGET / "names").write_text(json.dumps(made._asdict()))


def make(place: Path, release: str, lisbon_from: int | None = None):
    """A release, as tzdata.zi and as ICU's files in the directory icu."""
    place.mkdir(parents=True)
    rules = re.sub("^.*", f"# version {release}", RULES.read_text(), count=1)
    if lisbon_from:
        find("zone of Lisbon", LISBON, rules)
        # From Western to Central European Time when a year begins, as in 1992.
        rules = re.sub(LISBON, rf"\1 {lisbon_from}\n1 \2 CE%sT", rules)
    (place / "tzdata.zi").write_text(rules)
    icu, source = place / "icu", place / "zoneinfo64.txt"
    icu.mkdir()
    icu_files(icu)
    source.write_text(icu_text(icu, release, lisbon_from))
    output("genrb", "-q", "-d", icu, source)


def icu_files(folder: Path):
    """ICU's four resource files, out of its library, whose constants are its data."""
    with tempfile.TemporaryDirectory() as work:
        package, wanted = f"{work}/icudt{icu_schema()}.dat", Path(work, "list.txt")
        output("objcopy", "-O", "binary", "-j", ".rodata", icu_library(), package)
        wanted.write_text("\n".join(RESOURCES) + "\n")
        output("icupkg", "-x", wanted, "-d", folder, package)


def icu_text(folder: Path, release: str, lisbon_from: int | None) -> str:
    """The source of zoneinfo64.res, with what is different in a release."""
    text = output("derb", "-c", "-s", folder, "zoneinfo64.res").decode("utf-8-sig")
    # What derb does not tell: without it ICU would look for a parent.
    text = re.sub("(?m)^zoneinfo64{", "zoneinfo64:table(nofallback){", text)
    find("release of ICU's data", '^ +TZVersion *{ *"[^"]+"', text)
    text = re.sub('(?m)(^ +TZVersion *{ *")[^"]+', rf"\g<1>{release}", text)
    if lisbon_from is None:
        return text
    listed = find("names of zones", r"^ +Names\{([^}]*)\}", text)[1]
    names = re.findall('"([^"]+)"', listed)
    # Each zone is a table, or a number that stands for another.
    zones = list(re.finditer(r"^        (?:\{\n.*?^        \}|:int \{.*?\})", text,
                             re.MULTILINE | re.DOTALL))
    if len(zones) != len(names):
        stop(1, "this machine's ICU data has zones of another form")
    lisbon = zones[names.index("Europe/Lisbon")]
    return (text[:lisbon.start()] + central(lisbon[0], lisbon_from)
            + text[lisbon.end():])


def central(entry: str, year: int) -> str:
    """An ICU zone that has been at UTC since its last transition, with Europe's summer
    time by a rule, and has UTC+1 from a year on. The transitions until then, which
    were by the rule, are written out."""
    def last_sunday(year: int, month: int) -> int:
        last = datetime.datetime(year, month, 31, 1, tzinfo=datetime.timezone.utc)
        return int(last.timestamp()) - 86400 * ((last.weekday() + 1) % 7)

    def field(name: str, kind: str) -> str:
        return find("zone of Lisbon in ICU's data", rf"\b{name}:{kind} {{ (.*?) }}",
                    entry)[1]

    offsets = [int(offset) for offset in field("typeOffsets", "intvector").split(", ")]
    types = list(zip(offsets[::2], offsets[1::2]))
    summer, winter, final = (types.index(kind) for kind in
                             ((0, 3600), (0, 0), (3600, 0)))
    added = []
    for before in range(int(field("finalYear", "int")), year):
        added += [(last_sunday(before, 3), summer), (last_sunday(before, 10), winter)]
    added.append((calendar.timegm((year, 1, 1, 0, 0, 0)), final))
    known = int(field("trans", "intvector").split(", ")[-1])
    added = [(moment, kind) for moment, kind in added if moment > known]
    for name, value in (("finalRaw", 3600), ("finalYear", year)):
        entry = re.sub(rf"({name}:int {{ )\d+", rf"\g<1>{value}", entry)
    entry = re.sub(r"(trans:intvector { [^}]*[0-9])", r"\g<1>" + "".join(
        f", {moment}" for moment, _ in added), entry)
    return re.sub(r"(typeMap:binary { [0-9a-f]+)", r"\g<1>" + "".join(
        f"{kind:02x}" for _, kind in added), entry)


def make_system(release: str, schema: str, out: Path):
    output(*tool("make-system", **given(release), schema=schema, out=out))


def make_update(release: str, system: Path, out: Path):
    output(*tool("make-update", **given(release), system=system, out=out))


def given(release: str) -> dict[str, Path]:
    """The options that name a release."""
    return {"rules": TARGET / release / "tzdata.zi", "icu": TARGET / release / "icu"}
