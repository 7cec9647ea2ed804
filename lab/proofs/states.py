# SPDX-License-Identifier: BSD-2-Clause
"""Many devices, each composed at random, boot until they have settled and once more:
as the model says, and with every property. A settled device is not changed at all, not
even an inode, except for the link that a last resort makes every time."""

import random

import pytest
from hypothesis import given
from hypothesis import strategies as st
from lab.oracles.trial import boots_until_settled
from lab.words.device import Device
from lab.words.random_devices import compose

BLOCK = 250  # states a test


def blocks(option):
    if option("state"):
        seed, _, number = option("state").partition("/")
        wanted = range(int(number), int(number) + 1)
    else:
        seed = option("seed")
        wanted = range(option("states") or 100_000)
    for start in range(0, len(wanted), BLOCK):
        block = wanted[start:start + BLOCK]
        yield pytest.param(seed, block, id=f"{seed}/{block.start}")


def settle(device: Device, tell: str, count):
    boots = [judged.outcome for judged in boots_until_settled(device, tell)]
    for outcome in boots:
        count("boots of random devices")
        count(f"of them: {outcome}")
    count(f"devices settled after {len(boots) - 1} boots")


@pytest.mark.cases("seed, states", blocks, quick=5)
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
