# SPDX-License-Identifier: BSD-2-Clause
"""Releases of the time-zone rules and of ICU's data to make data sets from: this
machine's own, under other names, and with one invention: in later ones Lisbon has the
time of another city, in the rules and in ICU's data alike."""

from __future__ import annotations

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
YEAR = 2027  # in which programs are asked for the time
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
    update: str  # Lisbon has Central European Time
    refused: str  # and here Eastern; its ICU data gets another schema
    upgrade: str  # the same, of a later system
    icu: str
    other_icu: str


def names() -> Names:
    return Names(**json.loads((TARGET / "names").read_text()))


def names_of_lisbon() -> list[str]:
    """What the rules call Lisbon's zone; in some of Debian's releases WET, too."""
    rules = (TARGET / names().system / "tzdata.zi").read_text()
    return sorted(["Europe/Lisbon", *re.findall(r"(?m)^L Europe/Lisbon (\S+)$", rules)])


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
    for release, city in ((system, "Lisbon"), (update, "Paris"), (refused, "Athens"),
                          (made.upgrade, "Athens")):
        make(TARGET / release, release, city)
    (TARGET / "names").write_text(json.dumps(made._asdict()))


def make(place: Path, release: str, city: str):
    """A release, as tzdata.zi and as ICU's files in the directory icu, in which Lisbon
    has this city's time."""
    place.mkdir(parents=True)
    rules = re.sub("^.*", f"# version {release}", RULES.read_text(), count=1)

    def zone(city: str) -> str:
        return find(f"zone of {city}",
                    rf"^Z Europe/{city} ((?:.*\n)(?:[^RLZ].*\n)*)", rules)[1]

    rules = rules.replace(zone("Lisbon"), zone(city))
    (place / "tzdata.zi").write_text(rules)
    icu, source = place / "icu", place / "zoneinfo64.txt"
    icu.mkdir()
    icu_files(icu)
    source.write_text(icu_text(icu, release, city))
    output("genrb", "-q", "-d", icu, source)


def icu_files(folder: Path):
    """ICU's four resource files, out of its library, whose constants are its data."""
    with tempfile.TemporaryDirectory() as work:
        package, wanted = f"{work}/icudt{icu_schema()}.dat", Path(work, "list.txt")
        output("objcopy", "-O", "binary", "-j", ".rodata", icu_library(), package)
        wanted.write_text("\n".join(RESOURCES) + "\n")
        output("icupkg", "-x", wanted, "-d", folder, package)


def icu_text(folder: Path, release: str, city: str) -> str:
    """The source of zoneinfo64.res, with what is different in a release."""
    text = output("derb", "-c", "-s", folder, "zoneinfo64.res").decode("utf-8-sig")
    # What derb does not tell: without it ICU would look for a parent.
    text = re.sub("(?m)^zoneinfo64{", "zoneinfo64:table(nofallback){", text)
    find("release of ICU's data", '^ +TZVersion *{ *"[^"]+"', text)
    text = re.sub('(?m)(^ +TZVersion *{ *")[^"]+', rf"\g<1>{release}", text)
    listed = find("names of zones", r"^ +Names\{([^}]*)\}", text)[1]
    names = re.findall('"([^"]+)"', listed)
    # Each zone is a table, or a number that stands for another.
    zones = re.findall(r"(?ms)^        (?:\{\n.*?^        \}|:int \{.*?\})", text)
    if len(zones) != len(names):
        stop(1, "this machine's ICU data has zones of another form")
    lisbon, other = (zones[names.index(f"Europe/{name}")] for name in ("Lisbon", city))
    return text.replace(lisbon, other)


def make_system(release: str, schema: str, out: Path):
    output(*tool("make-system", **given(release), schema=schema, out=out))


def make_update(release: str, system: Path, out: Path):
    output(*tool("make-update", **given(release), system=system, out=out))


def given(release: str) -> dict[str, Path]:
    """The options that name a release."""
    return {"rules": TARGET / release / "tzdata.zi", "icu": TARGET / release / "icu"}
