# SPDX-License-Identifier: BSD-2-Clause
"""The data of the demonstration, made by make-system and make-update. Real except for
the names of the releases and what releases.py, beside this, invents: in the later ones
Lisbon changes its zone.

Made are a system partition's data, a download, a later one whose ICU data has another
schema, and what a still later system brings, each a `zoneinfo` tree beside an `icu` or
`icutz` directory; and a program that reads ICU's data.
"""

import shutil
import tempfile
from pathlib import Path

from lab.carriers import releases
from lab.words.places import BUILD, PROJECT

TARGET = BUILD / "demo/data"
ICU_CLOCK = TARGET / "icu-clock"
ICU_SOURCE = PROJECT / "lab/readers/icu.c"


def prepare():
    releases.prepare()
    releases.once(TARGET, [
        releases.TARGET / "inputs", shutil.which("zic"), __file__, ICU_SOURCE,
        *sorted(PROJECT.glob("tools/make*"))], make)


def names() -> releases.Names:
    """The names of the releases; updates have their versions, such as 2025c.1.0."""
    found = releases.names()
    return found._replace(update=f"{found.update}.1.0", refused=f"{found.refused}.1.0")


def make():
    made = releases.names()
    with tempfile.TemporaryDirectory(dir=TARGET) as work:
        system, upgrade, other = (Path(work, name) for name in
                                  ("system", "upgrade", "other"))
        releases.make_system(made.system, made.icu, system)
        releases.make_system(made.upgrade, made.icu, upgrade)
        releases.make_system(made.system, made.other_icu, other)
        for name, partition in (("update", system), ("refused", other)):
            releases.make_update(getattr(made, name), partition, work)
            Path(work, getattr(names(), name)).rename(TARGET / name)
        for partition in (system, upgrade):
            (partition / "zoneinfo.default").rename(partition / "zoneinfo")
            partition.rename(TARGET / partition.name)
    library = releases.icu_library()
    releases.output("gcc", "-O1", f"-DMAJOR={made.icu[:-1]}", ICU_SOURCE, "-o",
                    ICU_CLOCK, library.replace("libicudata", "libicui18n"))
