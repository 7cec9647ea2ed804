# SPDX-License-Identifier: BSD-2-Clause
"""Shows an emulated device: an update is announced, then activated; or gives a prompt
on it."""

import subprocess

from lab.arm64_device.machine import Machine, shown_links
from lab.words import lines
from lab.words.device import sound_device
from lab.words.paths import RECORD
from lab.words.seen import as_device


def new_machine(name: str) -> Machine:
    machine, device = Machine(name), sound_device()
    device.install_update("2024a.1.0")
    device.install_update("2024b.1.0")
    machine.build(device)
    return machine


def show():
    machine = new_machine("show")
    for title, then in (
            ("System 2023c, never updated; then 2024a is announced",
             lambda: machine.device.announce("2024a.1.0")),
            ("The next boot activates it", None),
            ("And the one after that finds it announced again", None)):
        print(f"\n--- {title}", flush=True)
        for at, text in machine.boot(then).lines:
            if text.startswith(("device: ", lines.NAME, "terminate called")):
                print(f"  {at:8.3f} s  {text}")
    print("\n--- On the disk")
    device = as_device(machine.look())
    for text in shown_links(device):
        print(f"  timezone/{text}")
    print("  timezone/TZVersionDiffRecord:", device.contents().get(RECORD, "none"))


def shell() -> int:
    script = ("echo 'The updates 2024a.1.0 and 2024b.1.0 are in /var/db/timezone/tz. "
              "\"poweroff -f\" ends it.'\nsetsid cttyhack sh\n")
    return subprocess.run(new_machine("shell").command(script), check=False).returncode
