# SPDX-License-Identifier: BSD-2-Clause
"""The data of the demonstration, made from this machine's time-zone rules and ICU
library. Real but for one invention: in the later releases Lisbon changes its zone.

Made are a system partition's data, a download, a later one whose ICU data has another
format, and what a still later system brings, each a `zoneinfo` tree beside an `icu`
or `icutz` directory; and `names`, which tells what they are called.
"""

from __future__ import annotations

import json
import os
import re
import shutil
import subprocess
import sys
import tempfile
from pathlib import Path
from types import SimpleNamespace

from lab.places import BUILD

TARGET = BUILD / "demo/data"
RULES = Path("/usr/share/zoneinfo/tzdata.zi")
# Lisbon's last line.
LISBON = r"^(Z Europe/Lisbon .*\n(?:[^RLZ].*\n)*?0 (\S+) WE%sT)$"
RESOURCES = "zoneinfo64.res\ntimezoneTypes.res\nmetaZones.res\nwindowsZones.res\n"


def names() -> SimpleNamespace:
    """Releases of the system, as 2025b, versions of updates, as 2025c.1.0, and ICU's
    formats, as 72l."""
    return SimpleNamespace(**json.loads((TARGET / "names").read_text()))


def output(*command) -> bytes:
    done = subprocess.run(command, stdout=subprocess.PIPE)
    if done.returncode:
        sys.exit(f"demo: {command[0]} failed, and with it the data")
    return done.stdout


def find(what: str, pattern: str, text: str) -> re.Match[str]:
    found = re.search(pattern, text, re.MULTILINE)
    if not found:
        sys.exit(f"demo: this machine has no {what} of the expected form")
    return found


def prepare():
    """Makes the data, except where it is there already, made from the same."""
    # Data without read permission for all does not count on a device.
    os.umask(0o022)
    # zic and icupkg are here, and this is not on everybody's path.
    os.environ["PATH"] += ":/usr/sbin"
    library = find("ICU library", r"^/.*/libicudata\.a$",
                   output("dpkg", "-L", "libicu-dev").decode())[0]
    inputs = repr([(str(path), os.stat(path).st_size, os.stat(path).st_mtime_ns)
                   for path in (RULES, library, shutil.which("zic"), __file__)])
    made_from = TARGET / "inputs"
    if made_from.exists() and made_from.read_text() == inputs:
        return
    if TARGET.exists():
        if not made_from.exists():
            sys.exit(f"demo: {TARGET} is there, and not made by this; remove it")
        shutil.rmtree(TARGET)
    TARGET.mkdir(parents=True)
    made_from.touch()  # from here on it is
    make(RULES.read_text(), library)
    made_from.write_text(inputs)


def make(rules: str, library: str):
    system = find("release", r"\A# version (\d{4}[a-z]+)\b", rules)[1]
    # All of ICU's data is one object, whose name ends in the version and the letter of
    # the byte order.
    member = find("ICU data", r"^icudt((\d+)([lbe]))_dat\.o$",
                  output("ar", "t", library).decode())
    icu, other_icu = member[1], f"{int(member[2]) + 1}{member[3]}"
    update = release_after(system)
    refused = release_after(update)
    upgrade = release_after(refused)
    (TARGET / "names").write_text(json.dumps({
        "system": system, "update": f"{update}.1.0", "refused": f"{refused}.1.0",
        "upgrade": upgrade, "icu": icu, "other_icu": other_icu}))

    # Without the trees for other clocks, and the link to this machine's zone.
    shutil.copytree(RULES.parent, TARGET / "system/zoneinfo", symlinks=True,
                    ignore=shutil.ignore_patterns("posix", "right", "localtime"))
    (TARGET / "system/zoneinfo/+VERSION").write_text(f"{system}\n")
    find("zone of Lisbon", LISBON, rules)
    # The later releases have the change put off by a year.
    for data_set, release, years in (("update", update, 1), ("refused", refused, 2),
                                     ("upgrade", upgrade, 2)):
        tree = TARGET / data_set / "zoneinfo"
        tree.mkdir(parents=True)
        # From Western to Central European Time when a year begins, as in 1992.
        changed = re.sub(LISBON, rf"\1 {int(system[:4]) + years}\n1 \2 CE%sT", rules,
                         flags=re.MULTILINE)
        source = tree / "tzdata.zi"
        source.write_text(re.sub("^.*", f"# version {release}", changed, count=1))
        output("zic", "-d", tree, source)
        (tree / "+VERSION").write_text(f"{release}\n")

    with tempfile.TemporaryDirectory() as work:
        package, wanted = f"{work}/icudt{icu}.dat", f"{work}/list.txt"
        Path(work, "object").write_bytes(output("ar", "p", library, member[0]))
        output("objcopy", "-O", "binary", "-j", ".rodata", f"{work}/object", package)
        Path(wanted).write_text(RESOURCES)
        output("icupkg", "-x", wanted, "-d", work, package)
        for directory, format in (("system/icu", icu), ("upgrade/icu", icu),
                                  ("update/icutz", icu), ("refused/icutz", other_icu)):
            (TARGET / directory).mkdir()
            output("icupkg", "-s", work, "-a", wanted, "new",
                   TARGET / directory / f"icutz{format}.dat")
    for system_partition in "system", "upgrade":
        (TARGET / system_partition / "icu/icutzformat.txt").write_text(f"{icu}\n")


def release_after(release: str) -> str:
    """As releases are named: 2025b is followed by 2025c, and 2025z by 2025za."""
    if release.endswith("z"):
        return release + "a"
    return release[:-1] + chr(ord(release[-1]) + 1)
