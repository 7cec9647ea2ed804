# SPDX-License-Identifier: BSD-2-Clause
"""The installer on a real disk, as an account without privileges: when the disk is
full, has no inode left or cannot be written it says so in one line and leaves nothing;
then it installs, and the next boot takes the update."""

import pytest

from lab.arm64_device import installing
from lab.arm64_device.machine import NO_BLOCK, NO_FILLER, NO_INODE
from lab.carriers import image
from lab.oracles.installer import HIDDEN, announced, hidden
from lab.words.paths import ICUTZ, ZONEINFO, update_path

UPDATE = "2024a.1.0"
INSTALL = f"""{installing.AS_OWNER}
install() {{
  as_owner marlin-install {installing.UPDATES}{UPDATE}
  status=$?
  say "told $said"
  say "told status $status, hidden: $(ls -aR /var/db | grep -c '^{HIDDEN}')"
}}
"""
TROUBLES = {
    "no block": ((), "No space left on device", NO_BLOCK),
    "no inode": (("-N", "64"), "No space left on device", NO_INODE),
    "read only": ((), "Read-only file system", "mount -o remount,ro /var\n"),
}


@pytest.mark.parametrize("trouble", TROUBLES)
def test_a_disk_that_takes_nothing(machine, trouble):
    options, reason, trouble_made = TROUBLES[trouble]
    here = machine(f"install/{trouble}".replace(" ", "-"))
    installing.build(here, ["2024a"], *options)
    console = here.boot(script=INSTALL + trouble_made + "install\n" +
                        f"mount -o remount,rw /var\n{NO_FILLER}install\n")
    line, failed, success, done = console.told
    assert line.startswith(f"marlin-install: {UPDATE}: cannot ")
    assert line.endswith(f": {reason}; nothing was changed")
    assert failed == "status 1, hidden: 0"
    assert (success, done) == (f"{UPDATE} is announced; the next boot decides",
                               "status 0, hidden: 0")
    found = here.look()
    assert announced(found) == update_path(UPDATE) and not hidden(found)
    here.device.announce(UPDATE)  # as the next boot's description has it
    console = here.boot()
    assert console.booted().ending == "exit 0"
    after = here.look()
    assert after[ZONEINFO].text == f"{update_path(UPDATE)}/zoneinfo"
    assert after[ICUTZ].text == f"{update_path(UPDATE)}/icutz"
    image.check(here.var)
