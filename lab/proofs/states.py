# SPDX-License-Identifier: BSD-2-Clause
"""Many devices, each composed at random, boot until they have settled and once more:
as the model says, and with every property. A settled device is not changed at all, not
even an inode, except for the link that a last resort makes every time."""

import itertools
import random

import pytest
from hypothesis import given
from hypothesis import strategies as st

from lab.oracles import properties
from lab.oracles.trial import fail, trial
from lab.words.device import Device
from lab.words.random_devices import compose

BLOCK = 250  # states a test


def blocks(option):
    if option("state"):
        seed, _, number = option("state").partition("/")
        wanted = range(int(number), int(number) + 1)
    else:
        seed = option("seed")
        wanted = range(option("states") or (20_000 if option("quick") else 100_000))
    for start in range(0, len(wanted), BLOCK):
        block = wanted[start:start + BLOCK]
        yield pytest.param(seed, block, id=f"{seed}/{block.start}")


def most_boots(lines: str) -> int:
    """How many can change a device; the next one must not.

    What the second can still change, with the reason:
    - An update older than the system's data was activated right after a reset. The
      second boot resets it, and then it is not newer than what is in use.
    - An update was refused that is newer than the system's data, but not than the data
      that was given up for it. The second boot activates it.
    - The legacy link leads somewhere only through "localtime", which the first boot has
      made. The second boot moves it.
    A legacy link that cannot be deleted is moved once more by the boot after the last
    reset, which took icutz away.
    """
    return 3 if "l" in lines else 2


def settle(device: Device, tell: str, count):
    """Boots a device until it has settled, and once more."""
    contents = None
    for turn in itertools.count(1):
        what = f"{tell}, boot {turn}"
        _, seen = trial(device, tell=what, again=turn > 1)
        judged = properties.Judged(seen)
        found = properties.shortcomings(judged)
        count("boots of random devices")
        count(f"of them: {judged.outcome}")
        last, contents = contents, device.contents()
        if contents == last:
            count(f"devices settled after {turn - 1} boots")
            found += properties.changed_by_a_settled_boot(judged)
        elif turn > most_boots(judged.lines):
            found.append(f"has not settled after {turn - 1} boots")
        fail(what, found, seen.before)
        if contents == last:
            return


@pytest.mark.cases("seed, states", blocks)
def test_states(seed, states, count):
    for number in states:
        count("states")
        settle(compose(random.Random(f"{seed}/{number}")),
               f"state {seed}/{number} (alone: scripts/prove --state {seed}/{number})",
               count)


@given(source=st.randoms(use_true_random=False))
def test_a_device_that_can_be_shrunk(source):
    """The same devices, drawn so that one that fails is made as small as it can be."""
    settle(compose(source), "a drawn device", lambda title: None)
