# SPDX-License-Identifier: BSD-2-Clause
"""A directory or a tar archive that holds a device's "/var/db" and "/usr/share" as
var/db and usr/share: read into a description, never changed, nothing unpacked."""

import os
import stat
import tarfile

from lab.device import Device, Node, decoded, encoded
from lab.paths import LEGACY_ICUTZ, OLD_ICU, SYSTEM_ICU, SYSTEM_ZONEINFO, TIMEZONE
from lab.seen import kind_and_mode

# What a boot looks at; the rest of a device's "/var/db" and "/usr/share" stays out.
PARTS = (TIMEZONE, LEGACY_ICUTZ, OLD_ICU, SYSTEM_ZONEINFO, SYSTEM_ICU)
LONGEST = 1 << 20  # bytes of a file; of all but words a boot reads nothing


class NoDevice(Exception):
    """There is no device in a directory or archive, or it cannot be read."""


def read(source: str) -> Device:
    """The device in a directory or archive. Raises NoDevice."""
    device = Device()
    try:
        if os.path.isdir(source):
            for part in PARTS:
                read_below(source.rstrip("/"), part, device)
        else:
            read_archive(source, device)
    except (OSError, tarfile.TarError) as reason:
        raise NoDevice(f"{source}: {reason}") from reason
    if not (device.find(TIMEZONE) or device.find(SYSTEM_ZONEINFO)):
        raise NoDevice(f"{source} has neither var/db/timezone nor "
                       "usr/share/zoneinfo.default")
    return device


def read_below(source: str, path: str, device: Device):
    raw = encoded(source + path)
    try:
        kind, mode = kind_and_mode(os.lstat(raw))
    except FileNotFoundError:
        return
    if kind == "dir":
        device.directory(path)
        for name in os.listdir(raw):
            read_below(source, f"{path}/{decoded(name)}", device)
        device.directory(path, mode)
    elif kind == "link":
        device.link(path, decoded(os.readlink(raw)))
    elif kind == "file":
        with open(raw, "rb") as file:
            device.file(path, decoded(file.read(LONGEST)), mode)
    else:
        device.put(path, Node("fifo", mode))


def read_archive(source: str, device: Device):
    with tarfile.open(source, encoding="latin-1") as archive:
        for member in archive:
            path = "/" + member.name.removeprefix("./").strip("/")
            if not path.startswith(PARTS):
                continue
            mode = stat.S_IMODE(member.mode)
            if member.isdir():
                device.directory(path, mode)
            elif member.issym():
                device.link(path, member.linkname)
            elif member.isfile() or member.islnk():
                content = archive.extractfile(member).read(LONGEST)
                device.file(path, decoded(content), mode)
            else:
                device.put(path, Node("fifo", mode))
