# SPDX-License-Identifier: BSD-2-Clause
"""A device that is read from a directory or an archive is the one that was there."""

import subprocess

import pytest

from lab.carriers import archive, namespace
from lab.devices import CHOSEN


def parts(device):
    return {path: (node.kind, node.mode if node.kind != "link" else None, node.text)
            for path, node in device.everything() if path.startswith(archive.PARTS)}


@pytest.mark.parametrize("name", CHOSEN)
def test_a_device_that_is_read(name):
    device = CHOSEN[name]()
    device.fifo(f"{archive.SYSTEM_ICU}/fifo")
    device.link(f"{archive.TIMEZONE}/%s\n", "a \xff \0b".partition("\0")[0])
    namespace.build(device)
    assert parts(archive.read("/")) == parts(device)
    subprocess.run(["/usr/bin/tar", "-cf", "/tmp/device.tar", "-C", "/", "./var/db",
                    "./usr/share"], check=True)
    assert parts(archive.read("/tmp/device.tar")) == parts(device)


@pytest.mark.parametrize("source", ["/var", "/nowhere", "/etc/passwd"])
def test_no_device(source):
    namespace.wipe()
    with pytest.raises(archive.NoDevice):
        archive.read(source)
