# SPDX-License-Identifier: BSD-2-Clause
"""systemd as a reader, over the life of an update: the calendar timers of its first
process, and timedatectl. /etc/localtime leads to a zone by name."""

import pytest

from lab.debian_systems.machine import System
from lab.debian_systems.scene import (ZONE, announce, device, insist, install_update,
                                      linked, names)
from lab.words import lines
from lab.words.paths import SYSTEM_ZONEINFO, ZONEINFO

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


def test_an_update_from_its_announcement_to_the_upgrade_past_it():
    made = names()
    refused = lines.NOT_NEWER % (made.refused, made.update)
    system = System("readers", LINKS + linked(device()))
    scenes = (
        ("its data", (), device(), "11:00", "13:00 WEST",
         f"{install_update()} {announce()}"),
        ("an update", (), device(active=True, announced=True), "10:00", "14:00 CEST",
         f"""cp -R /usr/lib/lab/data/refused /var/db/timezone/tz/{made.refused}
             ln -sfn /var/db/timezone/tz/{made.refused} /var/db/timezone/tz_latest"""),
        ("refused", (refused,), None, "10:00", "14:00 CEST",
         f"echo 2099a >{SYSTEM_ZONEINFO}/+VERSION"),
        ("an upgrade", (lines.INCOMPATIBLE, refused), None, "11:00", "13:00 WEST", ""))
    for name, printed, links, noon, reader, then in scenes:
        seen = system.boot(ASKED + then)
        insist(seen, printed, links, reader=reader)
        assert f" 2027-07-01 {noon}:00 UTC" in seen.text("timer"), name
        assert seen.text("zone") == f"Timezone={ZONE}\n", name
