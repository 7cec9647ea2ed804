# SPDX-License-Identifier: BSD-2-Clause
"""Boots under the unit's limits and restrictions."""

from lab.debian_systems.machine import System, UNIT, message
from lab.debian_systems.scene import (device, fail, insist, install_update_here, linked,
                                      names)
from lab.words.paths import DOWNLOADS

# Nothing of the word that was there: a line end would be the end of this one, too.
TERABYTE = "rm .{tree}/zoneinfo/+VERSION; truncate -s 1T .{tree}/zoneinfo/+VERSION"


def test_a_terabyte_for_a_word():
    """The word of an update is cut where the unit's memory ends; the boot goes on. The
    kernel itself would refuse none, and end the program later."""
    update = names().update
    system = System("terabyte", f"""
        {install_update_here()} {linked(device(announced=True))}
        {TERABYTE.format(tree=DOWNLOADS + update)}""")
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
