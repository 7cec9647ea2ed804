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
    for release, lisbon_from in (("2025b", None), ("2025c", 2026)):
        made = tmp_path / "made" / release
        releases.make(made, release, lisbon_from)
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
        env={**os.environ, "marlin": str(PROJECT)})
    assert done.returncode == 0, done.stdout + done.stderr
    shown = done.stdout
    assert "zones that differ from the system's" in shown
    assert "".join(f"  {name}\n" for name in releases.names_of_lisbon()) in shown
    first, last = shown.split("2025c.1.0 for systems with 2025b.1.0")
    assert "there is no link zoneinfo: a reset to the system partition" in first
    for words in ("2025c.1.0 is announced",
                  "2025c.1.0 is activated: newer than 2025b.1.0",
                  "the change is recorded: 2025b.1.0_2025c.1.0"):
        assert words in last


@pytest.mark.parametrize("tool", ["signify", "minisign"])
def test_the_signature(tool, tmp_path):
    """An update that was signed is installed, and one that was changed is not."""
    text = (PROJECT / "docs/integration.md").read_text()
    script = re.search(r"```\n(signify-openbsd -V .*?)```", text, re.DOTALL)[1]
    minisign = re.search(r"`(minisign -V [^`]*)`", text)[1]
    sign = ("signify-openbsd -G -n -p key.pub -s key.sec\n"
            "signify-openbsd -S -s key.sec -m update.tar\n")
    if tool == "minisign":
        script = script.replace("signify-openbsd -V -p /etc/update.pub -m update.tar",
                                minisign)
        sign = ("minisign -G -W -p key.pub -s key.sec\n"
                "minisign -S -s key.sec -m update.tar\n")
    assert tool in script
    for given, here in (("/etc/update.pub", "key.pub"), ("/run/update", "update"),
                        ("marlin-install", "ls -d")):
        script = script.replace(given, here)
    (tmp_path / "2024b.1.0").mkdir()

    def done(*command):
        return subprocess.run(command, cwd=tmp_path, capture_output=True, text=True)

    assert done("tar", "-cf", "update.tar", "2024b.1.0").returncode == 0
    signed = done("/bin/sh", "-euc", sign)
    assert signed.returncode == 0, signed.stderr
    verified = done("/bin/sh", "-c", script)
    assert verified.returncode == 0 and "update/2024b.1.0" in verified.stdout, verified
    with open(tmp_path / "update.tar", "ab") as archive:
        archive.write(b"more")
    refused = done("/bin/sh", "-c", script)
    assert refused.returncode != 0 and "2024b.1.0" not in refused.stdout
