# SPDX-License-Identifier: BSD-2-Clause
"""The package on a running system: installed, installed again, upgraded, masked,
removed and purged, and the boots after that."""

import pytest

from lab.debian_systems.machine import System, UNIT, message
from lab.debian_systems.scene import device, fail, insist, linked
from lab.words.paths import ZONEINFO

pytestmark = pytest.mark.rest
NEWER = """
cd /run
dpkg-deb -R /usr/lib/lab/marlin_*.deb newer
sed -i 's/^Version: .*/Version: 99/' newer/DEBIAN/control
sed -i 's/^Description=.*/&, Newer/' newer/usr/lib/systemd/system/marlin.service
dpkg-deb -b newer newer.deb
"""
AFTER = "find / -xdev -path '*marlin*' -not -path '*/lab/*' >/run/lab/seen/left\n"


def states(seen, name: str) -> list[str]:
    return seen.text(name).split()


def test_a_package_comes_and_goes():
    system = System("package", linked(device()))
    tell = f"systemctl show --value -p ActiveState,InvocationID {UNIT}"
    seen = system.boot(f"""set -e
        {tell} >/run/lab/seen/before
        dpkg -i /usr/lib/lab/marlin_*.deb
        {NEWER}
        dpkg -i newer.deb
        dpkg -s marlin | grep '^Version: 99$'
        systemctl daemon-reload
        systemctl show -p Description {UNIT} | grep 'Links, Newer$'
        {tell} >/run/lab/seen/after
        systemctl start {UNIT} || echo refused to start
        systemctl stop {UNIT} || echo refused to stop
        systemctl mask {UNIT}""")
    insist(seen, (), device())
    told = seen.text("then")
    assert told.endswith("ended with status 0\n"), told
    refused = [line for line in told.splitlines() if line.startswith("refused")]
    assert refused == ["refused to start", "refused to stop"]
    assert states(seen, "before") == states(seen, "after")

    seen = system.boot(f"set -e; systemctl unmask {UNIT}; dpkg -r marlin")
    assert seen.units[UNIT]["LoadState"] == "masked"
    fail(seen, not_run(seen))

    seen = system.boot(f"set -e; dpkg -P marlin; {AFTER}"
                       f"dpkg -i /usr/lib/lab/marlin_*.deb; systemctl daemon-reload\n"
                       "systemctl start systemd-tmpfiles-clean.service\n"
                       f"{tell} >/run/lab/seen/new")
    assert seen.units[UNIT]["LoadState"] == "not-found"
    assert seen.links.get(ZONEINFO) and seen.text("reader") == "13:00 WEST\n"
    fail(seen, not_run(seen) + [f"left behind: {path}" for path in
                                states(seen, "left")])
    assert states(seen, "new") == ["inactive"], "installed, and run at once"

    insist(system.boot(), (), device())


def not_run(seen) -> list[str]:
    """What tells that the program was started, or that its absence did harm."""
    return ([message(entry) for entry in seen.started()] +
            [message(entry) for entry in seen.said_by(SYSLOG_IDENTIFIER="marlin")] +
            [f"failed: {unit}" for unit in seen.failed()])
