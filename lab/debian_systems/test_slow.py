# SPDX-License-Identifier: BSD-2-Clause
"""A device ten times slower than the emulator is without any load: the boot unit's time
suffices."""

import pytest

from lab.debian_systems.machine import System
from lab.debian_systems.scene import device, insist, install_update_here, linked, names

pytestmark = pytest.mark.rest
# 64 ns for each instruction; without load the emulator takes some 6.
SLOW = ("-icount", "shift=6,sleep=off")


@pytest.mark.parametrize("root", ["rw", "ro"])
def test_an_update(root):
    """On a root that can be written; and on one that cannot, without /tmp."""
    apart = "echo '/dev/nvme0n3 /var ext4 defaults 0 0' >etc/fstab; rmdir tmp"
    system = System(f"slow-{root}", f"""
        {install_update_here()} {linked(device(announced=True))}
        {apart if root == "ro" else ""}""", apart="var" * (root == "ro"))
    seen = system.boot(options=root, more=SLOW, seconds=3600)
    insist(seen, (), device(active=True, announced=True), reader="14:00 CEST",
           record=f"{names().system}.1.0_{names().update}")
