# SPDX-License-Identifier: BSD-2-Clause
"""Everything that boots the program many times and judges it.

`device` describes a device, a module of `carriers` makes it real, `boot` runs the
program there under one of the `conditions`, `seen` is what that left, and `trial`
compares it with what `model` and `properties` expect.
"""
