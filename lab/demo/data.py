# SPDX-License-Identifier: BSD-2-Clause
"""The data of the demonstration, made by make-system and make-update from this
machine's time-zone rules and ICU library. Real except for one invention: in the later
releases Lisbon changes its zone.

Made are a system partition's data, a download, a later one whose ICU data has another
schema, and what a still later system brings; `names`, which tells what they are called;
and a program that reads ICU's data.
"""

from __future__ import annotations

import json
import os
import shutil
import subprocess
import sys
import tempfile
from pathlib import Path
from types import SimpleNamespace

from lab import releases
from lab.places import BUILD, PROJECT

TARGET = BUILD / "demo/data"
ICU_PROGRAM = TARGET / "icu-clock"


def names() -> SimpleNamespace:
    """Releases of the system, as 2025b, versions of updates, as 2025c.1.0, and ICU's
    schemas, as 72l."""
    return SimpleNamespace(**json.loads((TARGET / "names").read_text()))


def prepare():
    """Makes the data, except where it is there already, made from the same."""
    # Data without read permission for all does not count on a device.
    os.umask(0o022)
    # zic and icupkg are here, and this is not on everybody's path.
    os.environ["PATH"] += ":/usr/sbin"
    try:
        inputs = repr([(str(path), os.stat(path).st_size, os.stat(path).st_mtime_ns)
                       for path in (releases.RULES, releases.icu_library(),
                                    shutil.which("zic"), __file__, releases.__file__,
                                    *sorted(PROJECT.glob("tools/make*")),
                                    PROJECT / "lab/readers/icu.cpp")])
        made_from = TARGET / "inputs"
        if made_from.exists() and made_from.read_text() == inputs:
            return
        if TARGET.exists():
            if not made_from.exists():
                sys.exit(f"demo: {TARGET} is there, and not made by this; remove it")
            shutil.rmtree(TARGET)
        TARGET.mkdir(parents=True)
        made_from.touch()  # from here on it is
        make()
    except (releases.NotOfTheForm, subprocess.CalledProcessError) as failed:
        sys.exit(f"demo: {failed}")
    made_from.write_text(inputs)


def make():
    system = releases.own()
    icu = releases.icu_schema()
    other_icu = f"{int(icu[:-1]) + 1}{icu[-1]}"
    update = releases.after(system)
    refused = releases.after(update)
    upgrade = releases.after(refused)
    (TARGET / "names").write_text(json.dumps({
        "system": system, "update": f"{update}.1.0", "refused": f"{refused}.1.0",
        "upgrade": upgrade, "icu": icu, "other_icu": other_icu}))
    year = int(system[:4])
    with tempfile.TemporaryDirectory() as work:
        # The later releases have the change put off by a year.
        for release, changes in ((system, None), (update, year + 1),
                                 (refused, year + 2), (upgrade, year + 2)):
            releases.make(Path(work, release), release, changes)

        def given(release: str) -> dict[str, str]:
            return {"rules": f"{work}/{release}/tzdata.zi",
                    "icu": f"{work}/{release}/icu"}

        def make_system(release: str, schema: str, place: str):
            releases.run_tool("make-system", **given(release), schema=schema, out=place)

        make_system(system, icu, TARGET / "system")
        make_system(upgrade, icu, TARGET / "upgrade")
        make_system(system, other_icu, f"{work}/other")
        releases.run_tool("make-update", **given(update), system=TARGET / "system",
                          out=TARGET)
        releases.run_tool("make-update", **given(refused), system=f"{work}/other",
                          out=TARGET)
    releases.output("g++", "-O1", PROJECT / "lab/readers/icu.cpp", "-o", ICU_PROGRAM,
                    "-licui18n", "-licuuc")
