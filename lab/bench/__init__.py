# SPDX-License-Identifier: BSD-2-Clause
"""What a boot costs; scripts/bench opens it."""
