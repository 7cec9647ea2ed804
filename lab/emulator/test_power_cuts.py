# SPDX-License-Identifier: BSD-2-Clause
"""A few power cuts; scripts/device --power-cuts makes as many as one likes."""

from lab.emulator import power_cuts


def test_power_cuts(machine):
    power_cuts.run(10)
