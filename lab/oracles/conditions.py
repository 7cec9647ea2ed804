# SPDX-License-Identifier: BSD-2-Clause
"""What goes wrong while the program runs, told to strace and to the model alike.

The calls of a pass are counted from 1, as those of an undisturbed boot of the same
device: until the condition shows, both are the same.
"""

from __future__ import annotations

from errno import EDQUOT, ENOMEM, ENOSPC, EROFS, errorcode

from lab.carriers import boot
from lab.oracles.model import Outcome
from lab.words.device import Device
from lab.words.paths import RECORD
from lab.words.seen import Call


class Condition:
    """Nothing goes wrong. The others say in the same way what does."""

    name = kind = "nothing fails"
    killed_before = None  # a call of the pass

    def options(self, outcome: Outcome) -> list[str]:
        """How strace brings it about; `outcome` is the model's boot."""
        return []

    def fault(self, number: int, name: str, path: str | None) -> int | None:
        """The error number with which a call of the model's boot fails."""
        return None

    def amend(self, device: Device, outcome: Outcome):
        """Changes in what the model expects that no failing call explains."""


def described(number: int, call: Call) -> str:
    return f"call {number}, {call.name} {call.path or ''}".rstrip()


# What the model calls by several names and the machine by one.
SHARED = {"openat": {"open", "create"}, "open": {"open", "create"},
          "unlinkat": {"unlink", "rmdir"}, **dict.fromkeys(
              ["newfstatat", "fstatat64", "statx"], {"stat", "lstat", "fstat"})}


class Fails(Condition):
    """One call fails; for good: so does every later one of the machine's name."""

    def __init__(self, number: int, call: Call, error: int, for_good=False):
        self.number, self.call, self.error = number, call, error
        self.name = f"{described(number, call)} fails with {errorcode[error]}"
        self.kind = "a failure for good" if for_good else "a call that fails"
        self.when, self.later = f"{call.number}", set()
        if for_good:
            self.name += ", as do all of its kind that follow"
            self.when += "+"
            self.later = SHARED.get(call.call, {call.name})

    def options(self, outcome):
        return boot.failing(self.call.call, self.error, self.when)

    def fault(self, number, name, path):
        fails = number == self.number or number > self.number and name in self.later
        return self.error if fails else None


class Storage(Fails):
    """The file system changes for good: calls of several kinds fail from then on."""

    kind = "storage"

    def __init__(self, number: int, undisturbed: list[Call], kind: str, error: int,
                 names: set[str]):
        self.number, self.undisturbed = number, undisturbed
        self.error, self.later = error, names
        self.name = f"{kind} before {described(number, undisturbed[number - 1])}"

    def options(self, outcome):
        found = []
        so_far = [call.call for call in self.undisturbed[:self.number - 1]]
        for machine, name in boot.NAMES.items():
            if name in self.later & {"symlink", "unlink", "rmdir"}:
                found += boot.failing(machine, self.error,
                                      f"{so_far.count(machine) + 1}+")
        # The record's calls share their names with harmless ones. But there is one
        # of each, and only where nothing has failed before.
        for failed in outcome.failed:
            if outcome.calls[failed - 1][0] in ("create", "write"):
                same = self.undisturbed[failed - 1]
                found += boot.failing(same.call, self.error, same.number)
        return found


def storage_conditions(device: Device, undisturbed: list[Call]):
    """One of each kind for every call at which it would show first. A record that is
    there already is emptied, however full the disk."""
    growing = {"symlink", "write"} | (set() if device.find(RECORD) else {"create"})
    for kind, error, names in (
            ("the file system turns read-only", EROFS,
             {"symlink", "unlink", "rmdir", "create"}),
            ("the disk is full", ENOSPC, growing),
            ("the quota is used up", EDQUOT, growing)):
        for number, call in enumerate(undisturbed, start=1):
            if call.name in names:
                yield Storage(number, undisturbed, kind, error, names)


class WritesInPart(Condition):
    """The record's write takes only so many bytes. strace has the program believe so
    and writes none: only what follows has to be there."""

    kind = "a write in part"

    def __init__(self, number: int, call: Call, taken: int):
        self.number, self.call, self.taken = number, call, taken
        self.name = f"{described(number, call)} takes {taken} bytes"

    def options(self, outcome):
        return boot.inject(self.call.call, f"retval={self.taken}", self.call.number)

    def amend(self, device, outcome):
        record = device.find(RECORD)
        record.text = record.text[self.taken:] if self.taken else ""
        outcome.failed = [self.number]
        if self.taken:
            outcome.calls.insert(self.number, ("write", None))


class Killed(Condition):
    """Killed before a call of the pass, by its number there. The other two are those of
    boot.killing."""

    def __init__(self, call: str, turn: int, killed_before: int):
        self.call, self.turn, self.killed_before = call, turn, killed_before
        self.name = f"killed before {call} number {turn}"

    def options(self, outcome):
        return boot.killing(self.call, self.turn)


class MemoryRefused(Condition):
    """The system gives no memory at a request of the program's, nor in another way.
    Without a reserve the program asks for a few pages each time."""

    traced = ["-E", "MALLOC_TOP_PAD_=0", "-e", f"trace={boot.TRACED},brk,mmap"]

    def __init__(self, turn: int, mapped: int):
        self.turn, self.mapped = turn, mapped
        self.name = f"memory is refused at brk number {turn}"

    def options(self, outcome=None):
        # brk(2) itself never fails: it returns where the heap ends.
        return [*self.traced, *boot.failing("mmap", ENOMEM, f"{self.mapped + 1}+"),
                *boot.inject("brk", "retval=0", self.turn)]


def refusals(*command: str) -> list[MemoryRefused]:
    """One at each request, from the program's first look at the device on."""
    boot.traced(*MemoryRefused.traced, command=command)
    undisturbed = list(boot.calls())
    start = boot.beginning(undisturbed)
    # A loader may have mapped what it loaded.
    mapped = sum(call.call == "mmap" for call in undisturbed[:start])
    return [MemoryRefused(call.number, mapped) for call in undisturbed[start:]
            if call.call == "brk"]
