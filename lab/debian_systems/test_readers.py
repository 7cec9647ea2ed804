# SPDX-License-Identifier: BSD-2-Clause
"""systemd as a reader: the calendar timers of its first process, and timedatectl.
/etc/localtime leads to a zone by name."""

import pytest

from lab.debian_systems.machine import System
from lab.debian_systems.scene import ZONE, device, insist, install_and_announce, linked
from lab.words.paths import ZONEINFO

pytestmark = pytest.mark.rest
LINKS = f"""
rm -rf usr/share/zoneinfo
ln -s {ZONEINFO} usr/share/zoneinfo
ln -sfn /usr/share/zoneinfo/{ZONE} etc/localtime
rm etc/systemd/system/dbus.socket
"""
ASKED = """
asked() {
  systemctl stop systemd-timedated  # which reads the link when it starts
  TZ=UTC systemctl show --value noon.timer -p NextElapseUSecRealtime
  timedatectl show -p Timezone
}
systemd-run --on-calendar='2027-07-01 12:00' --unit=noon true
asked >/run/lab/seen/names
"""
REPLACED = """
ln -sfn /var/db/timezone/localtime /etc/localtime
asked >/run/lab/seen/localtime
timedatectl set-timezone Asia/Tokyo
{ asked; readlink /etc/localtime /var/db/timezone/localtime; } >/run/lab/seen/set
"""


def noon_and_zone(hour: int, zone: str) -> str:
    return f"Thu 2027-07-01 {hour:02}:00:00 UTC\nTimezone={zone}\n"


def test_an_update():
    system = System("readers", LINKS + linked(device()))
    for links, noon, reader, then in (
            (device(), 11, "13:00 WEST", install_and_announce()),
            (device(active=True, announced=True), 10, "14:00 CEST", REPLACED)):
        seen = system.boot(ASKED + then)
        insist(seen, (), links, reader=reader)
        assert seen.text("names") == noon_and_zone(noon, ZONE)
    assert seen.text("localtime") == noon_and_zone(10, "")
    assert seen.text("set") == noon_and_zone(3, "Asia/Tokyo") + (
        f"../usr/share/zoneinfo/Asia/Tokyo\n{ZONEINFO}/{ZONE}\n")
