# SPDX-License-Identifier: BSD-2-Clause
"""A device that can install: updates to copy are on its system partition, and an
account owns nothing but "/var/db/timezone/tz" and its own announcement."""

from lab.arm64_device.machine import Machine, zones
from lab.carriers import image
from lab.oracles.installer import put_update
from lab.words.device import sound_device
from lab.words.paths import DOWNLOADS, TIMEZONE

UPDATES = "/usr/share/updates/"
ACCOUNT = 1  # "owner", in the device's passwd
# What the account runs, with all that it prints in $said.
AS_OWNER = 'as_owner() { said=$(su owner -c "exec $*" 2>&1); }\n'


def build(machine: Machine, releases: list[str], *options: str):
    device = sound_device()
    device.directory(DOWNLOADS)
    device.directory(TIMEZONE, 0o1775)
    for release in releases:
        compiled = zones(f"U{release[2:].upper()}")
        put_update(device, f"{UPDATES}{release}.1.0", release, more={
            "icutz/icutz44l.dat": f"ICU data of {release}\n" * 5000,
            **{f"zoneinfo/{zone}": text for zone, text in compiled.items()}})
    machine.build(device, *options, megabytes=32)
    image.debugfs(machine.var, f"sif /db/timezone gid {ACCOUNT}",
                  f"sif /db/timezone/tz uid {ACCOUNT}", write=True)
