# SPDX-License-Identifier: BSD-2-Clause
"""A device as a description: plain data, built with verbs.

Byte strings are Python strings in which every character stands for one byte
(latin-1), so that lengths are byte counts and texts compare as bytes do.
"""

from __future__ import annotations

import os
from collections.abc import Iterator
from dataclasses import dataclass
from errno import EACCES, ELOOP, ENAMETOOLONG, ENOENT, ENOTDIR

from lab.words.paths import (ICUTZ, LOCALTIME, PLACES, SYSTEM_ICU, SYSTEM_ZONEINFO,
                             TIMEZONE, TZ_LATEST, ZONEINFO, update_path)


def encoded(text: str) -> bytes:
    return text.encode("latin-1")


def decoded(raw: bytes) -> str:
    return raw.decode("latin-1")


def failure(number: int) -> OSError:
    """What a call that fails with this error number raises."""
    return OSError(number, os.strerror(number))


@dataclass(eq=False)
class Node:
    """Anything that can stand at a path."""
    kind: str  # dir, file, link, fifo, socket or device
    mode: int = 0o777  # of a link: without meaning
    text: str = ""  # a file's content, a link's target
    entries: dict[str, Node] | None = None  # a directory's, in listing order

    def permits(self, wanted: int) -> bool:
        """Whether the owner, which the program runs as, may: 4, 2, 1 or sums."""
        return self.mode >> 6 & wanted == wanted

    def insist_on(self, wanted: int):
        if not self.permits(wanted):
            raise failure(EACCES)

    def everything(self, path: str) -> Iterator[tuple[str, Node]]:
        """Every (path, node) from here, which is at this path, downwards."""
        yield path, self
        for name, child in (self.entries or {}).items():
            yield from child.everything(f"{path}/{name}")


def names_in(path: str) -> list[str]:
    return [name for name in path.split("/") if name]


class Device:
    """A tree of nodes below "/usr/share" and "/var/db"."""

    def __init__(self):
        self.root = Node("dir", 0o755, entries={})
        for path in PLACES:
            self.directory(path)

    # --- One entry -----------------------------------------------------------

    def directory(self, path: str, mode=0o755) -> Node:
        """Makes a directory, and those that lead to it."""
        here = self.made(path)
        here.mode = mode
        return here

    def made(self, path: str) -> Node:
        here = self.root
        for name in names_in(path):
            here = here.entries.setdefault(name, Node("dir", 0o755, entries={}))
        return here

    def put(self, path: str, node: Node):
        parent, _, name = path.rpartition("/")
        self.made(parent).entries[name] = node

    def file(self, path: str, content="", mode=0o644):
        self.put(path, Node("file", mode, content))

    def link(self, path: str, target: str):
        self.put(path, Node("link", text=target))

    def fifo(self, path: str, mode=0o644):
        self.put(path, Node("fifo", mode))

    def socket(self, path: str, mode=0o644):
        self.put(path, Node("socket", mode))

    def drop(self, path: str):
        parent, _, name = path.rpartition("/")
        self.find(parent).entries.pop(name, None)

    # --- What integrators and installers of updates do -------------------------

    def install_system(self, release="2023c", schema="44l"):
        self.file(f"{SYSTEM_ZONEINFO}/+VERSION", f"{release}\n")
        self.file(f"{SYSTEM_ZONEINFO}/America/Los_Angeles", "TZif system LA")
        self.file(f"{SYSTEM_ZONEINFO}/Europe/Paris", "TZif system Paris")
        self.file(f"{SYSTEM_ICU}/icutzformat.txt", f"{schema}\n")

    def install_update(self, version: str, schema="44l"):
        path = update_path(version)
        self.file(f"{path}/zoneinfo/+VERSION", f"{version.partition('.')[0]}\n")
        self.file(f"{path}/zoneinfo/America/Los_Angeles", f"TZif {version} LA")
        self.file(f"{path}/zoneinfo/Europe/Paris", f"TZif {version} Paris")
        self.file(f"{path}/icutz/icutz{schema}.dat", f"ICU {version}")

    def announce(self, version: str):
        self.link(TZ_LATEST, update_path(version))

    def point_links_at(self, version: str | None):
        """None stands for the system partition."""
        if version is None:
            self.link(ZONEINFO, SYSTEM_ZONEINFO)
            self.drop(ICUTZ)
        else:
            self.link(ZONEINFO, f"{update_path(version)}/zoneinfo")
            self.link(ICUTZ, f"{update_path(version)}/icutz")

    def choose_zone(self, zone: str):
        self.link(LOCALTIME, f"{ZONEINFO}/{zone}")

    # --- Looking ---------------------------------------------------------------

    def find(self, path: str) -> Node | None:
        """The node at a path; links and permissions are not looked at."""
        here = self.root
        for name in names_in(path):
            if here.kind != "dir" or name not in here.entries:
                return None
            here = here.entries[name]
        return here

    def everything(self) -> Iterator[tuple[str, Node]]:
        """Every (path, node) of the device."""
        for path in PLACES:
            yield from self.find(path).everything(path)

    def contents(self) -> dict[str, str]:
        """The texts of all files and links, by path."""
        return {path: node.text for path, node in self.everything()
                if node.kind != "dir"}

    def in_words(self) -> str:
        """A line for every entry except directories that only hold others."""
        return "\n".join(f"{path}: {described(node)}"
                         for path, node in self.everything()
                         if not (node.entries and node.mode == 0o755))

    def walk(self, path: str, follow: bool) -> tuple[Node, str, Node | None]:
        """What the kernel finds at a path: (directory, name, node), the node None
        where only the last name is missing. Raises OSError as the kernel fails."""
        if not path:
            raise failure(ENOENT)
        if len(path) > 4095:
            raise failure(ENAMETOOLONG)
        way, todo, links = [self.root], names_in(path), 0
        must_be_directory = path.endswith("/")
        directory, name = None, None
        while todo:
            directory, name = way[-1], todo.pop(0)
            if directory.kind != "dir":
                raise failure(ENOTDIR)
            directory.insist_on(1)
            if name == ".":
                continue
            if name == "..":
                if len(way) > 1:
                    way.pop()
                continue
            if len(name) > 255:
                raise failure(ENAMETOOLONG)
            node = directory.entries.get(name)
            if node is None:
                if todo:
                    raise failure(ENOENT)
                return directory, name, None
            if node.kind == "link" and (todo or follow or must_be_directory):
                links += 1
                if links > 40:
                    raise failure(ELOOP)
                if node.text.startswith("/"):
                    way = [self.root]
                if not todo and node.text.endswith("/"):
                    must_be_directory = True
                todo = names_in(node.text) + todo
                continue
            way.append(node)
        if must_be_directory and way[-1].kind != "dir":
            raise failure(ENOTDIR)
        return directory, name, way[-1]


def described(entry) -> str:
    """A node, or an entry that was seen, in words."""
    mode, text = f"{entry.mode:04o}", entry.text
    if len(text) >= 300:
        text = f"{text[:100]!r}... of {len(text)} bytes, hash {hash(text)}"
    return {
        "dir": f"a directory, mode {mode}", "file": f"a file, mode {mode}, {text!r}",
        "link": f"a link to {text!r}", "fifo": f"a FIFO, mode {mode}",
        "socket": f"a socket, mode {mode}"}.get(entry.kind, entry.kind)


def sound_device() -> Device:
    """A system partition, links to it, and a zone that somebody chose."""
    device = Device()
    device.directory(TIMEZONE + "/tz")
    device.install_system()
    device.point_links_at(None)
    device.choose_zone("Europe/Paris")
    return device
