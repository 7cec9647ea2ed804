# SPDX-License-Identifier: BSD-2-Clause
"""Every system call of an installation fails, in turn, with every error number that
such a call can return, once and for good; so do those of pruning and withdrawing; and
memory is refused wherever it asks the system for more. Afterwards the old or the new
update is announced, and whole; one line tells the reason; the next boot takes what is
announced, or stays; and the next run is undisturbed."""

import os
import re
from errno import (EAGAIN, EDQUOT, EEXIST, EINTR, EIO, EMFILE, EMLINK, ENFILE,
                   ENOLCK, ENOMEM, ENOSPC, ENOTDIR, ENOTEMPTY, EPERM, EROFS, EXDEV)

import pytest

from lab.carriers import boot, namespace
from lab.oracles.conditions import refusals
from lab.oracles.installer import (BUSY, DONE, FAILED, HIDDEN, NEW, NOT_NEWER, OLD,
                                   PROGRAM, SCENES, SOURCE, announced, below, calls,
                                   hidden, names, next_boot, runs_again, traced,
                                   violations)
from lab.oracles.trial import fail
from lab.proofs.faults import CHANGE, ERRORS, OPEN, failures
from lab.words.paths import DOWNLOADS, update_path

EXPECTED = ERRORS | {
    "create": OPEN + [EDQUOT, EEXIST, ENOSPC, EROFS],
    "mkdir": CHANGE + [EEXIST, EMLINK],
    "link": CHANGE + [EEXIST, EMLINK, EXDEV],
    "rename": CHANGE + [EEXIST, ENOTEMPTY, EXDEV],
    "chmod": [EIO, EPERM, EROFS],
    "fsync": [EDQUOT, EIO, ENOSPC, EROFS],
    "flock": [EAGAIN, EIO, ENOLCK],
    "memfd_create": [EMFILE, ENFILE, ENOMEM],
    "clone3": [EAGAIN, ENOMEM],
    "wait4": [EINTR],
}
# One that means that a name is taken may lead to another name.
TAKEN = {EEXIST, ENOTDIR, ENOTEMPTY}
# No run in which one of these fails may say that it is done.
TELLING = {"create", "mkdir", "link", "rename", "symlink", "chmod", "fsync", "write",
           "memfd_create", "clone3"}


def disturbances(_):
    for scene in SCENES:
        made = calls(scene)
        # After the last of these only what nobody needs is deleted, as far as that can
        # be done; so are leftovers before the first, which a withdrawal does not need.
        start = boot.beginning(made)
        made = made[start:]
        synced = [number for number, call in enumerate(made, 1) if call.name == "fsync"]
        telling = range(synced[0] * (scene == "withdrawing"), synced[-1] + 1)
        for fails in failures(made, EXPECTED):
            retried = (fails.error == EINTR or
                       fails.call.name == "rename" and fails.error in TAKEN)
            yield pytest.param(
                scene, fails, fails.number in telling and not retried and
                fails.call.name in TELLING, id=f"{scene}: {fails.name}")


@pytest.mark.cases("scene, fails, telling", disturbances, quick=7)
def test_a_call_that_fails(scene, fails, telling, count):
    make, words = SCENES[scene]
    namespace.build(make())
    before = namespace.look()
    told = traced(words, *fails.options(None))
    after = namespace.look()
    found = violations(words, before, after)
    lines = told.log.splitlines()
    if telling and told.ending == DONE:
        found.append("it says that it is done")
    if told.ending not in (DONE, FAILED, BUSY, NOT_NEWER):
        found.append(f"it ends with {told.ending}")
    # A line that tells it cannot be written either.
    mute = "write" in fails.later
    if len(lines) != (told.ending != DONE and not mute):
        found.append(f"it ends with {told.ending} and prints {told.log!r}")
    if words[-1] == SOURCE:
        is_new = (announced(after) == update_path(NEW) and
                  below(after, update_path(NEW)) == below(after, SOURCE))
        said = told.ending == DONE or re.search(
            "; it is announced, but|; all else is done", told.log) is not None
        if is_new != said and not mute:
            found.append(f"announced is {announced(after)}, it says {told.log!r}")
    if any("nothing was changed" in line for line in lines):
        if announced(after) != announced(before) or hidden(after):
            found.append("something was changed")
    if scene == "a first update" and not fails.later:
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


@pytest.mark.parametrize("scene, own, fails, name", [
    # What another account left stands in the way of a directory of its name only.
    ("the next update", 2, boot.failing("unlinkat", EPERM, "1+"), HIDDEN + "new"),
    ("the next update", 3, [], NEW), ("pruning", 2, [], "2023d.1.0"),
    # Nevertheless that is settled.
    ("settling", 2, [], f"({OLD}|2023d.1.0)")])
def test_a_set_of_another_account(scene, own, fails, name):
    """Only so many of the questions who it is are answered with the owner."""
    refused_in(scene, [*boot.inject("geteuid", "retval=4711", f"{own + 1}+"), *fails],
               f"marlin-install: (.*: )?{DOWNLOADS}{name} belongs to another account, "
               "which has to remove it(; .*)?\n")
    assert scene != "settling" or announced(namespace.look()) is None


@pytest.mark.parametrize("scene", SCENES)
@pytest.mark.parametrize("first", [2, 3])
def test_a_place_of_another_account(scene, first):
    """Its owner could exchange what is checked for what is not."""
    if first == 3 and SCENES[scene][1][-1] != SOURCE:
        pytest.skip("it makes no directory")
    place = DOWNLOADS + (f"{HIDDEN}new" if first == 3 else "")
    refused_in(scene, boot.inject("geteuid", "retval=4711", first),
               f'marlin-install: (.*: )?{place} belongs to ([^ ]*); run this as that '
               r'account, as in "runuser -u \2 -- marlin-install ..."(; .*)?\n')


@pytest.mark.skipif(os.geteuid() != 0, reason="only root is refused")
def test_an_audit_of_another_account():
    refused_in("settling", boot.inject("geteuid", "retval=4711", 2),
               f"marlin-install: {DOWNLOADS} belongs to .*; run this as .*\n",
               ["--audit"])


def refused_in(scene, options, line, other_words=None):
    make, words = SCENES[scene]
    words = other_words or words
    namespace.build(make())
    before = namespace.look()
    told = traced(words, *options)
    assert told.ending == FAILED and re.fullmatch(line, told.log), f"{told}"
    fail(f"{told}", violations(words, before, namespace.look()), before)
