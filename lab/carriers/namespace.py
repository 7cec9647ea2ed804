# SPDX-License-Identifier: BSD-2-Clause
"""The carrier of most trials: a private mount namespace, in which "/var/db" and
"/usr/share" are file systems in memory and this process has no capability."""

import functools
import os
import stat
from pathlib import Path

from lab.words.device import Device, Node, decoded, encoded
from lab.words.paths import PLACES
from lab.words.seen import Entries, Entry, as_device, kind_and_mode

INSIDE = "MARLIN_PRIVATE_DEVICE"  # in the environment of what runs there


@functools.cache
def insist_on_private_device():
    """Called first by everything that builds, boots or looks at a device: looking
    changes permissions as well, where it has to. Ends the process elsewhere."""
    if reason := why_not_private():
        raise SystemExit(f"refusing to touch this machine: {reason}")


def why_not_private() -> str:
    """Why this process may not touch the device's places; empty if it may."""
    if INSIDE not in os.environ:
        return "this is not a private device"
    kinds = {}
    for line in Path("/proc/self/mountinfo").read_text("latin-1").splitlines():
        before, after = line.split(" - ", 1)
        kinds[before.split()[4]] = after.split()[0]
    places = ("/",) + PLACES
    for place in places:
        if kinds.get(place) != "tmpfs":
            return f"{place} is not a throw-away file system in memory"
    if len({os.stat(place).st_dev for place in places}) != len(places):
        return "/var/db and /usr/share are not file systems of their own"
    if "CapEff:\t0000000000000000" not in Path("/proc/self/status").read_text():
        return "this process has capabilities, so permissions mean nothing"
    return ""


def wipe():
    """Leaves an empty device."""
    insist_on_private_device()
    for place in PLACES:
        os.chmod(place, 0o755)
        empty(place)


def empty(directory):
    with os.scandir(directory) as entries:
        for entry in list(entries):
            if entry.is_dir(follow_symlinks=False):
                os.chmod(entry.path, 0o700)
                empty(entry.path)
                os.rmdir(entry.path)
            else:
                os.unlink(entry.path)


def build(device: Device):
    """Makes the described device real, and has the description learn in which order
    its directories are listed."""
    wipe()
    for path in PLACES:
        build_below(path, device.find(path), exists=True)


def build_below(path: str, node: Node, exists=False):
    raw = encoded(path)
    if node.kind == "link":
        os.symlink(encoded(node.text), raw)
        return
    if node.kind == "dir":
        if not exists:
            os.mkdir(raw)
        for name, child in node.entries.items():
            build_below(path + "/" + name, child)
        node.entries = {name: node.entries[name]
                        for name in map(decoded, os.listdir(raw))}
    elif node.kind == "file":
        with open(raw, "xb") as file:
            file.write(encoded(node.text))
    else:
        kinds = {"fifo": stat.S_IFIFO, "socket": stat.S_IFSOCK}
        os.mknod(raw, kinds[node.kind] | 0o600)
    os.chmod(raw, node.mode)


def look() -> Entries:
    """Everything on the device."""
    insist_on_private_device()
    entries = {}
    for place in PLACES:
        look_below(place, entries)
    return entries


def look_below(path: str, entries: Entries):
    raw = encoded(path)
    status = os.lstat(raw)
    kind, mode = kind_and_mode(status)
    # Looking where the owner may not takes a change of the mode and back, which
    # leaves a trace in the time of change.
    locked = (kind == "dir" and mode & 0o500 != 0o500
              or kind == "file" and not mode & 0o400)
    here = entries[path] = Entry(kind, mode)
    here.identity = (status.st_ino, status.st_mtime_ns,
                     None if locked else status.st_ctime_ns)
    if locked:
        os.chmod(raw, 0o700)
    if kind == "link":
        here.text = decoded(os.readlink(raw))
    elif kind == "file":
        with open(raw, "rb") as file:
            here.text = decoded(file.read())
    elif kind == "dir":
        here.names = [decoded(name) for name in os.listdir(raw)]
        for name in here.names:
            look_below(path + "/" + name, entries)
    if locked:
        os.chmod(raw, mode)


def description_of(path: Path) -> Node:
    """A node for what stands at any path of this machine."""
    entries, source = {}, decoded(os.fsencode(path))
    look_below(source, entries)
    return as_device(entries).find(source)
