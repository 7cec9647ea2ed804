# SPDX-License-Identifier: BSD-2-Clause
"""An emulated arm64 device: `machine` boots it with its own kernel and disks, and the
other modules and tests use it. scripts/device opens all of this."""
