# SPDX-License-Identifier: BSD-2-Clause
"""Boots under the unit's limits of memory and time, and without its directory."""

import pytest

from lab.debian_systems.machine import System, UNIT, message
from lab.debian_systems.scene import device, fail, insist, names, updated
from lab.words.paths import DOWNLOADS


def test_a_terabyte_for_a_word():
    """The word of an update is cut where the unit's memory ends; the boot goes on. The
    kernel itself would refuse none, and end the program later."""
    update = names().update
    word = f".{DOWNLOADS}{update}/zoneinfo/+VERSION"
    # Nothing of the one that was there: its line end would be the end of this, too.
    system = System("terabyte", f"{updated()} rm {word}; truncate -s 1T {word}")
    seen = system.boot(options="sysctl.vm.overcommit_memory=1")
    insist(seen, (), device(active=True, announced=True), reader="14:00 CEST",
           record=f"{names().system}.1.0_{update}")


def test_no_directory():
    """Nothing makes it either. The journal names it."""
    system = System("no-directory", """
        mkdir -p etc/tmpfiles.d
        ln -s /dev/null etc/tmpfiles.d/marlin.conf""")
    seen = system.boot()
    said = [message(entry) for entry in seen.said_by(UNIT=UNIT)]
    fail(seen, [] if any("/var/db/timezone" in text for text in said) else
         [f"the journal names no directory: {said}"])
    assert seen.links == {} and seen.failed() == [] and not seen.started()
    assert seen.units[UNIT]["ActiveState"] == "inactive"
    assert seen.at("sysinit.target", "ActiveEnter")
    assert seen.text("reader") == "12:00 UTC\n"


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


@pytest.mark.rest
def test_an_update_on_a_disk_that_never_answers():
    update = names().update
    place = DOWNLOADS + update
    system = System("never-answers", f"""
        {updated()}
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
