# SPDX-License-Identifier: BSD-2-Clause
"""Measures the part of a device's boot that the pass takes.

The emulator counts instructions and makes the device's clock from them: one
nanosecond each, so that a figure is the same on every machine and under every
load. What the disk takes comes on top, on a real device.
"""

from lab.arm64_device.machine import Machine
from lab.carriers.qemu import COUNTED
from lab.words.device import sound_device

NEVER_IDLE = "nohlt"  # without work count on, instead of jumping to the next timer
MARKS = "pass begins", "pass ended with status", "readers are done"


def measure():
    machine, device = Machine("boot-cost"), sound_device()
    device.install_update("2024a.1.0")
    machine.build(device)
    print(f"{'boot, instructions as nanoseconds':42}{'before it':>12}{'the pass':>12}"
          f"{'until ready':>12}{'share':>9}")
    for title, then in (
            ("never updated", lambda: device.announce("2024a.1.0")),
            ("an update is activated", None),
            ("the same update announced again", None)):
        console = machine.boot(then, seconds=300, options=NEVER_IDLE, more=COUNTED)
        begin, end, ready = (1000 * console.find(mark)[0] for mark in MARKS)
        print(f"{title:42}{begin:9.2f} ms{end - begin:9.2f} ms{ready:9.2f} ms"
              f"{(end - begin) / ready:9.1%}")
