# SPDX-License-Identifier: BSD-2-Clause
"""The installer is killed at every system call, before the call takes effect, and
therefore also after the one before it. What is announced then is the old update or the
new one, and whole; the next boot takes it or stays; and the next run does the rest."""

import pytest

from lab.carriers import boot, namespace
from lab.oracles.installer import (NEW, SCENES, announced, calls, next_boot, runs_again,
                                   traced, violations)
from lab.oracles.trial import fail
from lab.words.paths import update_path


def kills(option):
    # strace makes the first call itself.
    found = [pytest.param(scene, call, id=f"{scene}: {call.call} {call.number}, "
                                          f"{call.name} {call.path or ''}")
             for scene in SCENES for call in calls(scene)[1:]]
    return found[::4] if option("quick") else found


@pytest.mark.cases("scene, call", kills)
@pytest.mark.parametrize("boots_first", [True, False])
def test_a_kill_of_the_installer(scene, call, boots_first, count):
    make, words = SCENES[scene]
    namespace.build(make())
    before = namespace.look()
    told = traced(words, *boot.killing(call.call, call.number))
    after = namespace.look()
    found = violations(words, before, after)
    if told.ending != "killed" or told.log:
        found.append(f"ended with {told.ending}, printed {told.log!r}")
    fail("the kill", found, before)
    is_new = announced(after) == update_path(NEW)
    count("kills that leave the new update announced" if is_new else
          "kills that leave the old announcement")
    if not boots_first:
        runs_again(words, before)
    next_boot(namespace.look())
