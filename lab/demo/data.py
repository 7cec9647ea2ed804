# SPDX-License-Identifier: BSD-2-Clause
"""The data of the demonstration, made by make-system and make-update. Real except for
the names of the releases and what `lab/releases.py` invents: in the later ones Lisbon
changes its zone.

Made are a system partition's data, a download, a later one whose ICU data has another
schema, and what a still later system brings; and a program that reads ICU's data.
"""

import shutil
import subprocess
import sys
import tempfile
from pathlib import Path

from lab import releases
from lab.places import BUILD, PROJECT

TARGET = BUILD / "demo/data"
ICU_PROGRAM = TARGET / "icu-clock"
ICU_SOURCE = PROJECT / "lab/readers/icu.cpp"


def prepare():
    try:
        releases.prepare()
        releases.once(TARGET, [
            releases.TARGET / "inputs", shutil.which("zic"), __file__, ICU_SOURCE,
            *sorted(PROJECT.glob("tools/make*"))], make)
    except (releases.NotOfTheForm, subprocess.CalledProcessError) as failed:
        sys.exit(f"demo: {failed}")


def make():
    names = releases.names()
    releases.make_system(names.system, names.icu, TARGET / "system")
    releases.make_system(names.upgrade, names.icu, TARGET / "upgrade")
    releases.make_update(names.update, TARGET / "system", TARGET)
    with tempfile.TemporaryDirectory() as work:
        other = Path(work, "system")
        releases.make_system(names.system, names.other_icu, other)
        releases.make_update(names.refused, other, TARGET)
    releases.output("g++", "-O1", ICU_SOURCE, "-o", ICU_PROGRAM, "-licui18n",
                    "-licuuc")
