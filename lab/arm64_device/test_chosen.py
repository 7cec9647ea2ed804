# SPDX-License-Identifier: BSD-2-Clause
"""Every chosen device boots on arm64, with its kernel and file system, and is compared
with the model and the properties as on a private device. The pass runs there as the
owner of the device, who has no capability, as the model has it; as root it runs in the
scenes."""

import pytest

from lab.arm64_device.machine import Machine, ending
from lab.carriers import image
from lab.oracles import side_by_side
from lab.words.chosen_devices import CHOSEN
from lab.words.device import sound_device

BOOT_EACH = side_by_side.each("/var/chosen/*", """
  su owner -c "exec marlin" </dev/null >/dev/null 2>$device/log
  echo $? >$device/status""")


@pytest.fixture(scope="module")
def looks():
    """Two looks at the disk, with a boot of every chosen device in between."""
    here = Machine("chosen")
    here.build(sound_device(), owner=1, chosen=side_by_side.disk(
        {name: make() for name, make in CHOSEN.items()}))
    before = image.look(here.var, "/chosen", "")
    print(here.boot(script=BOOT_EACH).text)
    return before, image.look(here.var, "/chosen", "")


@pytest.mark.parametrize("name", CHOSEN)
def test_a_chosen_device(looks, name):
    side_by_side.judge(name, CHOSEN[name](), looks, lambda status: ending(int(status)))
