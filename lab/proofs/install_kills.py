# SPDX-License-Identifier: BSD-2-Clause
"""The installer is killed at every system call, before the call takes effect, and
therefore also after the one before it. What is announced then is the old update or the
new one, and whole; the next boot takes it or stays; and the next run does the rest."""

import pytest

from lab.carriers import namespace
from lab.oracles.installer import (NEW, SCENES, announced, calls, next_boot, runs_again,
                                   traced, violations)
from lab.oracles.trial import fail
from lab.proofs.kills import kills
from lab.words.paths import update_path


def kills_of_the_installer(_):
    for scene in SCENES:
        for kill in kills(calls(scene)):
            yield pytest.param(scene, kill, id=f"{scene}: {kill.name}")


@pytest.mark.cases("scene, kill", kills_of_the_installer, quick=4)
@pytest.mark.parametrize("boots_first", [True, False])
def test_a_kill_of_the_installer(scene, kill, boots_first, count):
    make, words = SCENES[scene]
    namespace.build(make())
    before = namespace.look()
    told = traced(words, *kill.options(None))
    after = namespace.look()
    found = violations(words, before, after)
    if told.ending != "killed" or told.log:
        found.append(f"ended with {told.ending}, printed {told.log!r}")
    fail(kill.name, found, before)
    is_new = announced(after) == update_path(NEW)
    count("kills that leave the new update announced" if is_new else
          "kills that leave the old announcement")
    if not boots_first:
        runs_again(words, before)
    next_boot(namespace.look())
