# SPDX-License-Identifier: BSD-2-Clause
"""Real programs that read time-zone data, on a device that follows the links."""
