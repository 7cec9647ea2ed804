# SPDX-License-Identifier: BSD-2-Clause
"""A system whose root can be written, as Debian installs it: from its first boot on."""

import json

from lab.debian_systems.machine import System, UNIT
from lab.debian_systems.scene import (NEW, ZONE, device, insist, install_and_announce,
                                      links, names)
from lab.words import lines
from lab.words.paths import (DEFAULT_ZONE, DOWNLOADS, ICUTZ, LOCALTIME, RECORD,
                             TIMEZONE, TZ_LATEST, ZONEINFO)

# The file systems on disks; what was changed from the program's start on.
CHANGED = f"""
day=$(systemctl show --timestamp=us+utc --property=ExecMainStartTimestamp {UNIT})
find / -xdev -newerct "${{day#* }}" >/run/lab/seen/changed
"""

# What the next boot will do, as marlin-status says.
ASKED = """
/usr/lib/lab/busybox insmod /usr/lib/lab/overlay.ko
marlin-status --json >/run/lab/seen/status || :
"""


def foretold(seen) -> tuple[int, dict[str, str]]:
    """The status, and the links after the next boot."""
    said = json.loads(seen.text("status"))
    after = said["next_boot"]["after"]
    return said["status"], {
        f"/var/db/timezone/{name}": after[name]["target"]
        for name in ("zoneinfo", "icutz", "localtime", "tz_latest")
        if after[name]["kind"] == "link"}


def test_from_its_first_boot_on():
    """Also, an installer of updates owns the directory of updates from then on."""
    system, update = System("life"), names().update
    seen = system.boot(f"""
        ln -sfn {ZONEINFO}/{ZONE} {LOCALTIME}
        {install_and_announce()}
        chown installer: {DOWNLOADS} && chmod 775 {DOWNLOADS}
        {ASKED}""")
    first = device(zone=DEFAULT_ZONE)
    insist(seen, NEW, first, reader="05:00 PDT")
    assert seen.owners[TIMEZONE] == (0o755, 0, 0) == seen.owners[DOWNLOADS.rstrip("/")]
    assert foretold(seen) == (1, links(device(active=True, announced=True)))

    for printed, then in (((), CHANGED),
                          ([lines.NOT_NEWER % (update, update)], f"rm {TZ_LATEST}")):
        seen = system.boot(then)
        insist(seen, printed, device(active=True, announced=True), reader="14:00 CEST",
               record=f"{names().system}.1.0_{update}")
        owner = seen.owners[DOWNLOADS.rstrip("/")]
        assert owner == (0o775, 1001, 1001)
        if not printed:
            assert {path for path in seen.text("changed").splitlines()
                    if path not in ("/dev", "/run")
                    and not path.startswith("/var/log")} == {
                        TIMEZONE, ZONEINFO, ICUTZ, RECORD}

    seen = system.boot(f"""
        rm {ZONEINFO} && ln -s "$(printf '/x\\n<0>kernel: panic')" {ZONEINFO}
        rm {LOCALTIME} {RECORD}""")
    insist(seen, (), device(active=True), reader="14:00 CEST")

    seen = system.boot()
    insist(seen, [" marlin: Bad zoneinfo link /x",
                  " <0>kernel: panic: No such file or directory", lines.INVALID_LINKS,
                  NEW[2]], device(zone=DEFAULT_ZONE), reader="05:00 PDT")
    assert not seen.said_by(PRIORITY="0")
