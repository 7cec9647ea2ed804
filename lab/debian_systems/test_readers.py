# SPDX-License-Identifier: BSD-2-Clause
"""systemd as a reader: the calendar timers of its first process, and timedatectl.
/etc/localtime leads to a zone by name."""

import pytest

from lab.debian_systems.machine import System
from lab.debian_systems.scene import (ZONE, announce, device, insist, install_update,
                                      linked)
from lab.words.paths import ZONEINFO

pytestmark = pytest.mark.rest
LINKS = f"""
rm -rf usr/share/zoneinfo
ln -s {ZONEINFO} usr/share/zoneinfo
ln -sfn /usr/share/zoneinfo/{ZONE} etc/localtime
rm etc/systemd/system/dbus.socket
"""
ASKED = """
systemd-run --on-calendar='2027-07-01 12:00' --unit=noon true
TZ=UTC systemctl show noon.timer -p NextElapseUSecRealtime >/run/lab/seen/timer
timedatectl show -p Timezone >/run/lab/seen/zone
"""


def test_an_update():
    system = System("readers", LINKS + linked(device()))
    for links, noon, reader, then in (
            (device(), "11:00", "13:00 WEST", f"{install_update()} {announce()}"),
            (device(active=True, announced=True), "10:00", "14:00 CEST", "")):
        seen = system.boot(ASKED + then)
        insist(seen, (), links, reader=reader)
        assert f" 2027-07-01 {noon}:00 UTC" in seen.text("timer")
        assert seen.text("zone") == f"Timezone={ZONE}\n"
