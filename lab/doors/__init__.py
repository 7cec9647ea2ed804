# SPDX-License-Identifier: BSD-2-Clause
"""What the commands in scripts/ open."""
