# SPDX-License-Identifier: BSD-2-Clause
"""Whole Debian systems that boot in an emulator, with the package installed: `parts`
are what they are made of, `machine` boots them, and the tests say what must be seen.
scripts/device --systems opens all of this."""
