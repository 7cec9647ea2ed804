# SPDX-License-Identifier: BSD-2-Clause
"""Everything that boots the program many times and judges it."""
