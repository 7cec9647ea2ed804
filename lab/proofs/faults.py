# SPDX-License-Identifier: BSD-2-Clause
"""Every file-system call of every chosen boot fails, in turn, with every error number
that such a call can return; for good, too; with a file system that turns read-only,
fills up or runs out of quota; with a record of which a write takes only a part; and
with memory refused wherever the program asks the system for more, which is the one way
to a directory walk that cannot be started."""

from collections.abc import Iterator
from errno import (EACCES, EAGAIN, EBUSY, EDQUOT, EEXIST, EFBIG, EINTR, EINVAL, EIO,
                   EISDIR, ELOOP, EMFILE, ENAMETOOLONG, ENFILE, ENODEV, ENOENT, ENOMEM,
                   ENOSPC, ENOTDIR, ENOTEMPTY, ENXIO, EOVERFLOW, EPERM, EROFS, ETXTBSY)

import pytest

from lab.carriers import boot, namespace
from lab.oracles import properties
from lab.oracles.conditions import Fails, WritesInPart, refusals, storage_conditions
from lab.oracles.trial import fail, real, recovers, trial, undisturbed
from lab.words.chosen_devices import CHOSEN
from lab.words.seen import Call, Seen, as_device

# What a walk along a path can fail with.
WALK = [EACCES, EIO, ELOOP, ENAMETOOLONG, ENOENT, ENOMEM, ENOTDIR]
# What a change of a directory can fail with, too. Where files are copied when they are
# written, a removal as well takes space.
CHANGE = WALK + [EDQUOT, ENOSPC, EPERM, EROFS]
OPEN = WALK + [EAGAIN, EINTR, EMFILE, ENFILE, ENODEV, ENXIO, EOVERFLOW, EPERM]

ERRORS = {
    "access": WALK,
    "readlink": WALK + [EINVAL],
    "symlink": CHANGE + [EEXIST],
    "unlink": CHANGE + [EBUSY, EISDIR],
    "rmdir": CHANGE + [EBUSY, EINVAL, ENOTEMPTY],
    "open": OPEN,
    "create": OPEN + [EBUSY, EDQUOT, EISDIR, ENOSPC, EROFS, ETXTBSY],
    "read": [EAGAIN, EINTR, EINVAL, EIO, EISDIR, ENOMEM],
    "write": [EAGAIN, EDQUOT, EFBIG, EINTR, EIO, ENOMEM, ENOSPC, EPERM],
    "close": [EDQUOT, EINTR, EIO, ENOSPC],
    "stat": WALK + [EOVERFLOW],
    "lstat": WALK + [EOVERFLOW],
    "fstat": [EIO, ENOMEM, EOVERFLOW],
    "fchdir": [EACCES, EIO, ENOTDIR],
    "getdents": [EINVAL, EIO, ENOENT, ENOMEM],
}
# Those that do not go away by themselves.
LASTING = {EACCES, EDQUOT, EIO, EMFILE, ENFILE, ENOMEM, ENOSPC, EPERM, EROFS}


def failures(calls: list[Call], errors=ERRORS) -> Iterator[Fails]:
    """Each call with each of its errors, once and, if that can be, for good."""
    for number, call in enumerate(calls, start=1):
        for error in errors.get(call.name, []):
            yield Fails(number, call, error)
            if error in LASTING:
                yield Fails(number, call, error, for_good=True)


def disturbances(_):
    for name, make in CHOSEN.items():
        calls = boot.pass_of(undisturbed(name).calls)
        in_part = [WritesInPart(number, call, taken) for taken in (0, 1, 8)
                   for number, call in enumerate(calls, 1) if call.name == "write"]
        for condition in (*failures(calls), *in_part,
                          *storage_conditions(make(), calls)):
            yield pytest.param(name, condition, id=f"{name}: {condition.name}")


@pytest.mark.cases("name, condition", disturbances, quick=4)
def test_a_disturbance(name, condition, count):
    trial(CHOSEN[name](), condition)
    count(condition.kind)


@pytest.mark.parametrize("name", CHOSEN)
def test_memory_is_refused(name, count):
    """Every property holds, but that of the choice: what the program could not read it
    could not choose. Then the device recovers."""
    real(name)
    for condition in refusals(boot.PROGRAM):
        _, before = real(name)
        seen = Seen(before, {}, *boot.traced(*condition.options()))
        refused = [call.call for call in boot.calls() if call.injected]
        assert refused[:2] == ["brk", "mmap"]
        seen.after = namespace.look()
        judged = properties.Judged(seen)
        fail(condition.name, properties.shortcomings(judged, properties.of_the_choice) +
             properties.data_changes(before, seen.after), before)
        count("refusals of memory")
        count("refusals of memory to a walk", judged.lines.count("f"))
        recovers(name, as_device(seen.after), before)
