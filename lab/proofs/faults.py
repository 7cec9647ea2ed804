# SPDX-License-Identifier: BSD-2-Clause
"""Every file-system call of every chosen boot fails, in turn, with every error number
that such a call can return; for good, too; with a file system that turns read-only,
fills up or runs out of quota; with a record of which a write takes only a part; and
with memory refused wherever the program asks the system for more."""

from errno import (EACCES, EAGAIN, EBUSY, EDQUOT, EEXIST, EFBIG, EINTR, EINVAL, EIO,
                   EISDIR, ELOOP, EMFILE, ENAMETOOLONG, ENFILE, ENODEV, ENOENT, ENOMEM,
                   ENOSPC, ENOTDIR, ENOTEMPTY, ENXIO, EOVERFLOW, EPERM, EROFS, ETXTBSY)

import pytest

from lab.carriers import boot
from lab.oracles.conditions import Fails, WritesInPart, storage_conditions
from lab.oracles.trial import trial, undisturbed
from lab.words.chosen_devices import CHOSEN

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
# Those that mean something of their own, and one that does not; a quick run takes
# these, and one more in turn.
QUICK = {ENOENT, EISDIR, EEXIST, EIO}


def disturbances(option):
    count = 0
    for name, make in CHOSEN.items():
        calls = boot.pass_of(undisturbed(name).calls)
        for number, call in enumerate(calls, start=1):
            count += 1
            once = ERRORS[call.name]
            for_good = [error for error in once if error in LASTING]
            if option("quick"):
                turn = once[count % len(once)]
                once = [error for error in once if error in QUICK or error == turn]
                for_good = [for_good[count % len(for_good)]]
            for error in once:
                yield "a call that fails", name, Fails(number, call, error)
            for error in for_good:
                yield "a failure for good", name, Fails(number, call, error, True)
            if call.name == "write":
                for taken in (0, 1, 8):
                    yield "a write in part", name, WritesInPart(number, call, taken)
        for condition in storage_conditions(make(), calls):
            yield "storage", name, condition


def with_names(option):
    for kind, name, condition in disturbances(option):
        yield pytest.param(kind, name, condition, id=f"{name}: {condition.name}")


@pytest.mark.cases("kind, name, condition", with_names)
def test_a_disturbance(kind, name, condition, count):
    trial(CHOSEN[name](), condition)
    count(kind)
