# SPDX-License-Identifier: BSD-2-Clause
"""What a carrier holds, and what a boot showed of itself: plain data again."""

from __future__ import annotations

import os
import stat
from dataclasses import dataclass, field
from typing import NamedTuple

from lab.words.device import Device, Node

KINDS = {stat.S_IFDIR: "dir", stat.S_IFREG: "file", stat.S_IFLNK: "link",
         stat.S_IFIFO: "fifo", stat.S_IFSOCK: "socket"}


@dataclass
class Entry:
    """What stands at one path. `identity` differs where something was changed or
    made anew, even to the same content."""
    kind: str
    mode: int
    text: str = ""  # a file's content, a link's target
    names: list[str] = field(default_factory=list)  # a directory's, as listed
    identity: tuple = ()


Entries = dict[str, Entry]  # by path


def kind_and_mode(status: os.stat_result) -> tuple[str, int]:
    kind = KINDS.get(stat.S_IFMT(status.st_mode), "something else")
    return kind, stat.S_IMODE(status.st_mode)


class Call(NamedTuple):
    """One system call. `call` is the machine's name for it and `number` counts the
    calls of that name; `name` and `path` are the model's."""
    call: str
    number: int
    name: str
    path: str | None
    injected: bool  # it was made to fail
    error: str | None  # such as "ENOENT"


@dataclass
class Seen:
    """A boot from outside."""
    before: Entries
    after: Entries
    ending: str  # "exit 0", "abort", "killed" or "signal N"
    log: str  # standard error, as printed
    calls: list[Call] = field(default_factory=list)  # of a boot that was traced

    def changed(self) -> set[str]:
        """Paths at which something was made, removed, changed or made anew."""
        before, after = self.before, self.after
        return {path for path in before.keys() | after.keys()
                if path not in before or path not in after
                or before[path].identity != after[path].identity}


def as_device(entries: Entries) -> Device:
    """A description of what was seen, in the order of the listings."""
    device = Device()
    for path, here in entries.items():
        if here.kind == "dir":
            device.directory(path, here.mode)
        else:
            device.put(path, Node(here.kind, here.mode, here.text))
    return device
