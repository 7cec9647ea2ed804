# SPDX-License-Identifier: BSD-2-Clause
"""A system that boots without systemd, by the example for busybox."""

import pytest

from lab import lines
from lab.paths import ZONEINFO
from lab.systems.machine import Seen, System
from lab.systems.scene import device, install_update_here, linked, links, names

pytestmark = pytest.mark.rest
EXAMPLES = "usr/share/doc/marlin/examples"
BUSYBOX = f"""
ln -sfn /usr/lib/lab/busybox usr/sbin/init
{{
  echo '::sysinit:/bin/mount -t proc proc /proc'
  echo '::sysinit:/bin/mount -t devtmpfs devtmpfs /dev'
  cat {EXAMPLES}/inittab
  echo '::wait:/usr/lib/lab/after'
}} >etc/inittab
"""


def printed(seen: Seen) -> list[str]:
    return [line.rstrip("\r") for line in seen.console.split("\n")
            if "marlin" in line and not line.startswith("[")]


def test_an_update_and_a_forged_line():
    """What commands a console is not let through; the boot after that is quiet."""
    update = names().update
    here = System("busybox", BUSYBOX + f"""
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


def test_without_var():
    """Where "/var" is read-only and empty the boot goes on."""
    here = System("busybox-without-var", BUSYBOX + """
        echo '/dev/nvme0n3 /var ext4 ro 0 0' >etc/fstab
        rm -rf var; mkdir var""", apart="var")
    seen = here.boot()
    said = printed(seen)
    assert any(lines.NO_DATA in line for line in said), said
    assert seen.text("reader") == "12:00 UTC\n"
