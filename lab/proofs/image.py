# SPDX-License-Identifier: BSD-2-Clause
"""The image of docs/integration.md is made and boots. Takes root, a network and
minutes: see scripts/readers."""

import re

import pexpect
import pytest

from lab.carriers import releases
from lab.carriers.building import package
from lab.words.places import PROJECT

SECONDS = 400


class Console(pexpect.spawn):
    """The serial line of a system."""

    def answer(self, command: str) -> str:
        """What a command prints, on one line, and its status."""
        # As it is typed, the end is not yet what is waited for.
        self.sendline(f'echo "A:$({command} 2>&1):$?:""Z"')
        self.expect_exact(":Z\r")
        return self.before.rpartition("A:")[2].replace("\r", "")


@pytest.fixture(scope="module")
def console(tmp_path_factory):
    """A system from the recipe, logged in."""
    place = tmp_path_factory.mktemp("image")
    release = releases.names().system
    releases.make_system(release, releases.icu_schema(), place / "system")
    package("release", place)
    text = (PROJECT / "docs/integration.md").read_text()
    recipe = re.search(r"(?s)<!-- image -->\n```\n(.*?)```\n<!-- end -->", text)[1]
    make, boot = recipe.split("qemu-system", 1)
    releases.output("/bin/sh", "-euc", make, cwd=place)
    with Console("/bin/sh", ["-euc", f"exec qemu-system{boot}"], SECONDS, cwd=place,
                 encoding="utf-8", codec_errors="replace") as there:
        there.expect_exact("login: ")
        there.sendline("root")
        there.expect_exact(":~# ")
        yield there


def test_marlin_ran(console):
    told = console.answer("journalctl -q -o cat -u marlin")
    for words in ("Bad zoneinfo link", "localtime link invalid; resetting to America"):
        assert words in told
    assert console.answer("readlink /var/db/timezone/zoneinfo") == (
        "/usr/share/zoneinfo.default:0")
    assert console.answer("date -d @1782900000 +%H:%M-%Z") == "03:00-PDT:0"


def test_a_timer(console):
    """PID 1, which knows its zone, has started before there was a link."""
    console.answer("systemd-run --on-calendar='2040-07-01 12:00' --unit=noon true")
    timer = "TZ=UTC systemctl show noon.timer -p NextElapseUSecRealtime"
    assert " 2040-07-01 19:00:00 UTC" in console.answer(timer)
