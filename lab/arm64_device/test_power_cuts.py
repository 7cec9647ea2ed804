# SPDX-License-Identifier: BSD-2-Clause
"""A few power cuts of each kind; scripts/device makes as many as one likes."""

from lab.arm64_device import install_cuts, power_cuts


def test_power_cuts(machine):
    power_cuts.run(10)


def test_power_cuts_with_the_mend(machine):
    power_cuts.run(4, mend=True)


def test_power_cuts_during_installations(machine):
    install_cuts.run(4)
