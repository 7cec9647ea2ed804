# SPDX-License-Identifier: BSD-2-Clause
"""Tests that boot emulated devices; they are skipped where there can be none."""

import pytest

from lab.arm64_device import parts
from lab.arm64_device.machine import Machine
from lab.carriers.qemu import Unavailable


@pytest.fixture(scope="module")
def machine(request):
    """Makes a device in a directory of its own."""
    try:
        parts.prepare()
    except Unavailable as reason:
        pytest.skip(f"no device can be made here: {reason}")
    return Machine
