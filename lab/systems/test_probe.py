# SPDX-License-Identifier: BSD-2-Clause
"""What a program can do in marlin's place, under the unit as it ships and with the
lean example beside it; and what a profile adds to that."""

import pytest

from lab.paths import RECORD
from lab.systems.machine import UNIT, Seen, System, message
from lab.systems.scene import (device, fail, insist, install_update_here, linked, names)

LEAN = "/usr/share/doc/marlin/examples/lean.conf"
APPARMOR = "/usr/share/doc/marlin/examples/apparmor"
# All else is refused. The program is the owner of what is root's, and this is.
DONE = {"write /var/db/entry", "write /var/db/timezone/entry",
        "read /etc/shadow", "read /run/secret"}


def results(seen: Seen, unit: str) -> dict[str, str]:
    """What the probe printed, by what it tried."""
    return dict(map(str.strip, message(entry).split(":", 1))
                for entry in seen.said_by(_SYSTEMD_UNIT=unit)
                if ":" in message(entry))


LIMITS = {"limit memory": str(640 << 20), "limit core": "0"}


def shortcomings(tried: dict[str, str], may: set[str]) -> list[str]:
    """What was not refused, or not even tried, or has no limit."""
    done = {what for what, result in tried.items() if result == "done"}
    return ([f"{what}: done" for what in sorted(done - may)] +
            [f"{what}: {tried.get(what)}" for what in sorted(may - done)] +
            [f"{what}: {tried.get(what)}" for what, limit in LIMITS.items()
             if tried.get(what) != limit] +
            ["too little was tried"] * (len(tried) < 60))


def test_the_probe_is_refused():
    system = System("probe", f"""
        cp usr/lib/lab/probe/marlin usr/libexec/marlin
        {linked(device())}
        printf 'd /run/secrets 0755 - - -\\nf /run/secret 0600 - - - secret\\n' \\
          >etc/tmpfiles.d/secret.conf""")
    seen = system.boot(f"""
        cd /run/systemd/system
        grep -v ^Refuse /usr/lib/systemd/system/{UNIT} >lean.service
        mkdir lean.service.d
        cp {LEAN} lean.service.d
        grep -Ev '^(Refuse|InaccessiblePaths)' /usr/lib/systemd/system/{UNIT} \
          >open.service
        systemctl daemon-reload
        systemctl start lean.service open.service""")
    capabilities = {what: result.strip() for what, result in results(
        seen, "open.service").items() if what.startswith("Cap")}
    assert set(capabilities.values()) == {"0" * 16} and len(capabilities) == 5
    lean = {what for what in DONE if what.startswith("write")}
    fail(seen, [f"{unit}: {text}" for unit, may in (
        (UNIT, DONE), ("lean.service", lean))
                for text in shortcomings(results(seen, unit), may)])


@pytest.mark.parametrize("enforced", [True, False], ids=["enforced", "not loaded"])
def test_a_record_that_is_a_link(enforced):
    """Only the profile forbids to write to what it names."""
    other, update = "/var/db/other", names().update
    system = System("apparmor", f"""
        {install_update_here()} {linked(device(announced=True))}
        echo kept >.{other}
        ln -s {other} .{RECORD}
        mkdir -p etc/systemd/system/{UNIT}.d
        echo '[Unit]\nAfter=apparmor.service' >etc/systemd/system/{UNIT}.d/order.conf
        rm etc/systemd/system/apparmor.service
        rm -f etc/apparmor.d/[a-z]*.*
        {f"cp .{APPARMOR} etc/apparmor.d/usr.libexec.marlin" if enforced else ""}""")
    seen = system.boot("cat /sys/kernel/security/apparmor/profiles")
    made = device(active=True, announced=True)
    made.link(RECORD, other)
    insist(seen, (), made, reader="14:00 CEST")
    assert seen.text(other) == ("kept\n" if enforced else
                                f"{names().system}.1.0_{update}")
