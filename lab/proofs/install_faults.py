# SPDX-License-Identifier: BSD-2-Clause
"""Every system call of an installation fails, in turn, with every error number that
such a call can return, once and for good; so do those of pruning and withdrawing; and
memory is refused wherever it asks the system for more. Afterwards the old or the new
update is announced, and whole; one line tells the reason; the next boot takes what is
announced, or stays; and the next run is undisturbed."""

import re
from errno import (EAGAIN, EDQUOT, EEXIST, EINTR, EIO, EMLINK, ENOLCK, ENOSPC,
                   ENOTDIR, ENOTEMPTY, EPERM, EROFS, EXDEV, errorcode)

import pytest

from lab.carriers import boot, namespace
from lab.oracles.conditions import refusals
from lab.oracles.installer import (BUSY, DONE, FAILED, HIDDEN, NEW, NOT_NEWER, PROGRAM,
                                   SCENES, announced, calls, hidden, names, next_boot,
                                   runs_again, traced, violations)
from lab.oracles.trial import fail
from lab.proofs.faults import CHANGE, ERRORS, LASTING, OPEN
from lab.words.paths import DOWNLOADS, update_path

MORE = {
    "create": OPEN + [EDQUOT, EEXIST, ENOSPC, EROFS],
    "mkdir": CHANGE + [EEXIST, EMLINK],
    "link": CHANGE + [EEXIST, EMLINK, EXDEV],
    "rename": CHANGE + [EEXIST, ENOTEMPTY, EXDEV],
    "chmod": [EIO, EPERM, EROFS],
    "fsync": [EDQUOT, EIO, ENOSPC, EROFS],
    "flock": [EAGAIN, EIO, ENOLCK],
}
EXPECTED = {**ERRORS, **MORE}
# No run that met such a failure may say that it is done.
# One that means that a name is taken may lead to another name.
TAKEN = {EEXIST, ENOTDIR, ENOTEMPTY}
TELLING = {"create", "mkdir", "link", "rename", "symlink", "chmod", "fsync", "write"}


def disturbances(option):
    quick = option("quick")
    for scene in SCENES:
        made = calls(scene)
        # After the last of these only what nobody needs is deleted, as far as that can
        # be done; so are leftovers before the first, which a withdrawal does not need.
        synced = [number for number, call in enumerate(made) if call.name == "fsync"]
        telling = range(synced[0] * (scene == "withdrawing"), synced[-1] + 1)
        start = boot.beginning(made)
        for number, call in enumerate(made[start:], start):
            errors = EXPECTED.get(call.name, [])
            if quick and errors:
                errors = [errors[number % len(errors)]]
            for error in sorted(errors):
                lasting = error in LASTING and not (quick and number % 4)
                for when in [str(call.number)] + [f"{call.number}+"] * lasting:
                    yield pytest.param(
                        scene, call, error, when, number in telling,
                        id=f"{scene}: {call.call} {when}, {call.name} "
                           f"{call.path or ''} {errorcode[error]}")


@pytest.mark.cases("scene, call, error, when, telling", disturbances)
def test_a_call_that_fails(scene, call, error, when, telling, count):
    make, words = SCENES[scene]
    namespace.build(make())
    before = namespace.look()
    told = traced(words, *boot.failing(call.call, error, when))
    after = namespace.look()
    found = violations(words, before, after)
    lines = told.log.splitlines()
    retried = error == EINTR or call.name == "rename" and error in TAKEN
    telling = telling and call.name in TELLING and not retried
    if telling and told.ending == DONE:
        found.append("it says that it is done")
    if told.ending not in (DONE, FAILED, BUSY, NOT_NEWER):
        found.append(f"it ends with {told.ending}")
    # A line that tells it cannot be written either.
    mute = call.name == "write" and when.endswith("+")
    if len(lines) != (told.ending != DONE and not mute):
        found.append(f"it ends with {told.ending} and prints {told.log!r}")
    if words[0][0] != "-":
        is_new = announced(after) == update_path(NEW)
        said = told.ending == DONE or any("; it is announced, but" in line
                                          for line in lines)
        if is_new != said and not mute:
            found.append(f"announced is {announced(after)}, it says {told.log!r}")
    if any("nothing was changed" in line for line in lines):
        if announced(after) != announced(before):
            found.append("something was changed")
    if scene == "a first update" and not when.endswith("+"):
        # One failing call cannot keep it from deleting what it has made.
        found += [f"{name} is left" for name in hidden(after)]
        if (NEW in names(after)) != (announced(after) is not None):
            found.append("what is there is not what is announced")
    fail(f"{told}", found, before)
    count(f"that end with {told.ending}")
    runs_again(words, before)
    next_boot(namespace.look())


@pytest.mark.parametrize("scene", SCENES)
def test_memory_is_refused(scene, count):
    make, words = SCENES[scene]
    namespace.build(make())
    for condition in refusals(PROGRAM, *words):
        namespace.build(make())
        before = namespace.look()
        told = traced(words, *condition.options())
        after = namespace.look()
        found = violations(words, before, after)
        failed = told.ending == FAILED
        if not failed and told.ending != DONE or told.log.count("\n") != failed:
            found.append("this is not one line and its status")
        fail(f"{told}, {condition.name}", found, before)
        count(f"refusals of memory that end with {told.ending}")
        runs_again(words, before)


@pytest.mark.parametrize("scene, fails, name", [
    # What another user left stands in the way of a directory of its name only.
    ("the next update", boot.failing("unlinkat", EPERM, "1+"), HIDDEN + "new"),
    ("the next update", [], NEW), ("pruning", [], f"({NEW}|2023d.1.0)")])
def test_a_set_of_another_user(scene, fails, name):
    make, words = SCENES[scene]
    namespace.build(make())
    before = namespace.look()
    told = traced(words, *boot.inject("geteuid", "retval=4711", "1+"), *fails)
    assert told.ending == FAILED
    assert re.fullmatch(f"marlin-install: (.*: )?{DOWNLOADS}{name} belongs to another "
                        "user, who has to remove it(; .*)?\n", told.log)
    fail(f"{told}", violations(words, before, namespace.look()), before)
