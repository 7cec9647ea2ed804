# SPDX-License-Identifier: BSD-2-Clause
"""Tests that boot emulated devices; where none can be had they are skipped."""

import pytest

from lab.arm64_device import parts
from lab.arm64_device.machine import Machine


@pytest.fixture(scope="module")
def machine(request):
    """Makes a device in a directory of its own."""
    try:
        parts.prepare()
    except parts.Unavailable as reason:
        pytest.skip(f"no device can be had here: {reason}")
    return Machine
