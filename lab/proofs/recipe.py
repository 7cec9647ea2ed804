# SPDX-License-Identifier: BSD-2-Clause
"""The commands of docs/integration.md, from a release of the rules to a device."""

import os
import re
import shutil
import subprocess
import tarfile

import pytest

from lab.carriers import releases
from lab.words.places import PROJECT


@pytest.fixture
def given(tmp_path):
    """A folder with what the recipe starts from: two releases and their ICU files."""
    for release, city in (("2025b", "Lisbon"), ("2025c", "Paris")):
        made = tmp_path / "made" / release
        releases.make(made, release, city)
        with tarfile.open(tmp_path / f"tzdata{release}.tar.gz", "w:gz") as archive:
            archive.add(made / "tzdata.zi", "tzdata.zi")
        shutil.copytree(made / "icu", tmp_path / "icu" / release / "44/le")
    shutil.rmtree(tmp_path / "made")
    return tmp_path


def test_the_recipe(given):
    text = (PROJECT / "docs/integration.md").read_text()
    recipe = re.search(r"(?s)<!-- recipe -->\n```\n(.*?)```\n<!-- end -->", text)[1]
    done = subprocess.run(
        ["/bin/sh", "-euc", recipe], cwd=given, capture_output=True, text=True,
        env={**os.environ, "marlin": str(PROJECT),
             "PYTHONPATH": str(releases.WITHOUT_ICU)})
    assert done.returncode == 0, done.stdout + done.stderr
    shown = done.stdout
    assert "zones that differ from the system's" in shown
    assert "".join(f"  {name}\n" for name in releases.names_of_lisbon()) in shown
    first, last = shown.split("2025c.1.0 for systems with 2025b.1.0")
    assert "there is no link zoneinfo: a reset to the system partition" in first
    for words in ("2025c.1.0 is announced; the next boot decides",
                  "2025c.1.0 is in use and no longer announced",
                  "in use      the update 2025c.1.0", '"2025b.1.0_2025c.1.0"',
                  "sound: the next boot changes nothing"):
        assert words in last
