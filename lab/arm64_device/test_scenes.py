# SPDX-License-Identifier: BSD-2-Clause
"""Sequences of real boots, each on one disk, as root and with a real kernel's errors.

Between two boots a scene says, with the verbs of the description, what the next one is
to do. After it the disk holds just that, nothing else was touched, not even an inode,
and the lines are those given here: nothing comes from the model.
"""

import errno
from types import SimpleNamespace

import pytest

from lab.arm64_device.machine import Machine, NO_BLOCK, NO_FILLER, NO_INODE, shown_links
from lab.carriers import image
from lab.oracles.trial import differences, fail
from lab.words import lines
from lab.words.chosen_devices import made
from lab.words.device import Device, Node
from lab.words.paths import (ICUTZ, RECORD, SYSTEM_ZONEINFO, TIMEZONE, ZONEINFO,
                             update_path)
from lab.words.seen import Seen

SYSTEM, UPDATE = "system", "2024a.1.0"
FIRST_RECORD = "2023c.1.0_2024a.1.0"
REFUSED = lines.NOT_NEWER % (UPDATE, UPDATE)
NO_ZONEINFO = (lines.BAD_LINK % "", lines.INVALID_LINKS)


DOWNLOADED = f"install_update {UPDATE};"
IN_USE = f"{DOWNLOADED} point_links_at {UPDATE}"


def activate(device: Device):
    device.point_links_at(UPDATE)
    device.file(RECORD, FIRST_RECORD)


class Scene:

    def __init__(self, machine: Machine):
        self.machine, self.boots = machine, 0

    def on(self, changes: str, *options: str) -> Device:
        self.machine.build(made(changes), *options)
        return self.machine.device

    def boot(self, *printed, ending="exit 0", reader=None, then=None, **how):
        """Boots, and compares. `printed` are texts, or pairs of a text and the error
        number that ends the line. `reader` is whose data the reader sees; without it
        nobody looks through the links. `then` and `how` are those of Machine.boot."""
        machine, device = self.machine, self.machine.device
        before = machine.look()
        shown = shown_links(device) + [f"reader sees TZif {reader} Paris"]
        console = machine.boot(then=then, **how)
        self.boots += 1
        print(f"--- boot {self.boots}\n{console.text.rstrip()}")
        seen = Seen(before, machine.look(), *console.booted())
        outcome = SimpleNamespace(
            lines=[(text, None) if isinstance(text, str) else text for text in printed],
            ending=ending)
        found = differences(device, outcome, seen)
        if reader:
            found += [f"the device did not say: {text}" for text in shown
                      if text not in console.said]
        fail(f"boot {self.boots}", found, before)
        if "var=" not in how.get("options", ""):
            image.check(machine.var)


@pytest.fixture
def scene(request):
    return Scene(Machine("scenes/" + request.node.name))


# --- What only a real disk does -------------------------------------------------------


def test_disk_without_a_free_block(scene):
    """Links fit into their inodes; only the record finds no room."""
    device = scene.on(DOWNLOADED)
    scene.boot(reader=SYSTEM, then=lambda: device.announce(UPDATE), script=NO_BLOCK)
    activate(device)
    device.file(RECORD, "")
    scene.boot(reader=UPDATE, script=NO_FILLER)
    scene.boot(REFUSED, reader=UPDATE)


def test_disk_without_a_free_inode(scene):
    device = scene.on(DOWNLOADED, "-N", "64")
    scene.boot(reader=SYSTEM, then=lambda: device.announce(UPDATE), script=NO_INODE)
    # The old zoneinfo link's inode serves the new one; for icutz there is none.
    device.point_links_at(None)
    scene.boot((lines.CREATE_SYMLINK % (ICUTZ, update_path(UPDATE) + "/icutz"),
                errno.ENOSPC), (lines.NO_DATA, errno.ENOSPC),
               reader=SYSTEM, script=NO_FILLER)
    activate(device)
    scene.boot(reader=UPDATE)


def link_fails(target, remove, create):
    """The lines of a zoneinfo link that cannot be made anew."""
    return [(lines.REMOVE % ZONEINFO, remove), (lines.ZONEINFO_NOT_UNLINKED, remove),
            (lines.CREATE_SYMLINK % (ZONEINFO, target), create)]


def test_read_only_disk(scene):
    device = scene.on(DOWNLOADED)
    scene.boot(reader=SYSTEM, options="var=ro")
    scene.boot(reader=SYSTEM, then=lambda: device.announce(UPDATE))
    read_only = errno.EROFS, errno.EEXIST
    scene.boot(*link_fails(update_path(UPDATE) + "/zoneinfo", *read_only),
               (lines.NO_DATA, errno.EEXIST), *link_fails(SYSTEM_ZONEINFO, *read_only),
               ending="abort", reader=SYSTEM, options="var=ro")
    activate(device)
    scene.boot(reader=UPDATE)


def test_disk_with_a_bad_sector(scene):
    """Where the directory of the links should be there is only an I/O error."""
    scene.on(IN_USE)
    var = scene.machine.var
    [blocks] = image.debugfs(var, f'blocks "{TIMEZONE.removeprefix("/var")}"')
    bad = ("driver=raw,node-name=var,file.driver=blkdebug,"
           f"file.image.driver=file,file.image.filename={var},"
           "file.inject-error.0.event=read_aio,file.inject-error.0.iotype=read,"
           f"file.inject-error.0.errno=5,file.inject-error.0.sector={int(blocks) * 8}")
    scene.boot((lines.READ_SYMLINK % (TIMEZONE + "/tz_latest"), errno.EIO),
               (lines.NO_DATA, errno.EIO),
               *link_fails(SYSTEM_ZONEINFO, errno.EIO, errno.EIO),
               ending="abort", disk=bad, options="var=errors=continue")
    image.run("e2fsck", "-fp", var)
    scene.boot(reader=UPDATE)


def test_disk_with_a_lost_link(scene):
    """The name of the zoneinfo link leads to an inode that is gone; the disk goes
    read-only on the first error, until it is repaired."""
    device = scene.on(IN_USE)
    device.put(ZONEINFO, Node("something else"))
    var = scene.machine.var
    image.debugfs(var, f'clri "{ZONEINFO.removeprefix("/var")}"', write=True)
    damaged = errno.EUCLEAN  # this kernel finds that before it finds "read only"
    reset = link_fails(SYSTEM_ZONEINFO, damaged, damaged)
    scene.boot((lines.READ_SYMLINK % ZONEINFO, damaged), (lines.INVALID_LINKS, damaged),
               *reset, (lines.NO_DATA, damaged), *reset,
               ending="abort", options="var=errors=remount-ro")
    image.run("e2fsck", "-fy", var, accept=(1,))
    device.point_links_at(None)
    scene.boot(*NO_ZONEINFO, reader=SYSTEM)
