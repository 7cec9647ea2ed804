# SPDX-License-Identifier: BSD-2-Clause
"""An update on a disk that never answers: the boot waits, but not long."""

import pytest

from lab.debian_systems.machine import System, UNIT
from lab.debian_systems.scene import device, insist, install_update_here, linked, names
from lab.words.paths import DOWNLOADS

pytestmark = pytest.mark.rest
# Once this is read, the emulator lets through a byte a second.
USED_UP = """[Unit]
DefaultDependencies=no
RequiresMountsFor={place}
Before=marlin.service
[Service]
ExecStart=/bin/cat /dev/nvme1n1
StandardOutput=null
ExecStartPost=/bin/sleep 3
"""


def test_an_update_on_a_disk_that_never_answers():
    update = names().update
    place = DOWNLOADS + update
    system = System("never-answers", f"""
        {install_update_here()} {linked(device(announced=True))}
        echo '/dev/nvme1n1 {place} ext4 ro 0 0' >etc/fstab
        cat >etc/systemd/system/used-up.service <<'END'
{USED_UP.format(place=place)}END
        mkdir -p etc/systemd/system/sysinit.target.wants
        ln -s ../used-up.service etc/systemd/system/sysinit.target.wants
        """, apart="." + place)
    disk, system.third = system.third, system.third.with_name("none")
    seen = system.boot(options="nvme_core.io_timeout=4000000", more=(
        "-object", "throttle-group,id=slow,x-bps-read=1,x-bps-read-max=8000000",
        "-blockdev", "driver=throttle,node-name=slow,throttle-group=slow,file.driver="
        f"raw,file.file.driver=file,file.file.filename={disk}",
        "-device", "nvme,id=second,serial=slow",
        "-device", "nvme-ns,drive=slow,bus=second,nsid=1"), seconds=400)
    insist(seen, (), None, ended=("timeout", "failed", "15"), failed=[UNIT],
           reader="13:00 WEST")
    waited = seen.at(UNIT, "ExecMainExit") - seen.at(UNIT, "ExecMainStart")
    assert 29_000_000 < waited < 40_000_000
