# SPDX-License-Identifier: BSD-2-Clause
"""Systems that boot without systemd, by the examples that the package brings."""

import fcntl

import pytest

from lab import lines
from lab.paths import ZONEINFO
from lab.systems import parts
from lab.systems.machine import Seen, System
from lab.systems.scene import device, install_update_here, linked, links, names

pytestmark = pytest.mark.rest
EXAMPLES = "usr/share/doc/marlin/examples"
BUSYBOX = f"""
ln -sfn /usr/lib/lab/busybox usr/sbin/init
{{
  echo '::sysinit:/bin/mount -t proc proc /proc'
  cat {EXAMPLES}/inittab
  echo '::wait:/usr/lib/lab/after'
}} >etc/inittab
"""
SYSVINIT = f"""
cp usr/share/sysvinit/inittab etc/inittab
cp {EXAMPLES}/init-script etc/init.d/marlin
printf '%s\\n' '#!/bin/sh' '### BEGIN INIT INFO' '# Provides: lab' \\
  '# Required-Start: $all' '# Default-Start: 2 3 4 5' '### END INIT INFO' \\
  'exec /usr/lib/lab/after' >etc/init.d/lab
chmod 755 etc/init.d/lab
chroot . update-rc.d marlin defaults
chroot . update-rc.d lab defaults
"""


def sysvinit_root():
    """Made once, beside the one with systemd."""
    with open(parts.AMD64.place / "lock", "w", encoding="ascii") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        if not (parts.AMD64.place / "sysvinit.tar").exists():
            parts.make_root(parts.AMD64, "sysvinit", "sysvinit-core,tzdata,udev")


def system(init: str, name: str, script: str, **how) -> System:
    if init == "busybox":
        return System(name, BUSYBOX + script, **how)
    sysvinit_root()
    return System(name, SYSVINIT + script, tree="sysvinit", **how)


def printed(seen: Seen) -> list[str]:
    return [line.rstrip("\r") for line in seen.console.split("\n")
            if "marlin" in line and not line.startswith("[")]


@pytest.mark.parametrize("init", ["busybox", "sysvinit"])
def test_an_update_and_a_forged_line(init):
    """What commands a console is not let through; the boot after that is quiet."""
    update = names().update
    here = system(init, init, f"""
        {install_update_here()} {linked(device(announced=True))}
        ln -sfn "$(printf '/x\\033[31m')" .{ZONEINFO}""")
    seen = here.boot("rm /var/db/timezone/tz_latest")
    said = printed(seen)
    assert [line.rpartition(": ")[0] for line in said] == [
        "marlin: Bad zoneinfo link /x?[31m", f"marlin: {lines.INVALID_LINKS}"], said
    assert links(device(active=True, announced=True)) == {
        path: text for path, text in seen.links.items() if path.count("/") < 5}
    assert seen.text("reader") == "14:00 CEST\n" and update in seen.text(
        "/var/db/timezone/TZVersionDiffRecord")

    seen = here.boot()
    assert printed(seen) == [] and seen.text("reader") == "14:00 CEST\n"


@pytest.mark.parametrize("init", ["busybox", "sysvinit"])
def test_without_var(init):
    """Where "/var" is read-only and empty the boot goes on."""
    here = system(init, f"{init}-without-var", """
        echo '/dev/nvme0n3 /var ext4 ro 0 0' >etc/fstab
        rm -rf var; mkdir var""", apart="var")
    seen = here.boot()
    said = printed(seen)
    assert said[-1] == "marlin ended with status 134" or init == "busybox", said
    assert any(lines.NO_DATA in line for line in said), said
    assert seen.text("reader") == "12:00 UTC\n"
