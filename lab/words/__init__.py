# SPDX-License-Identifier: BSD-2-Clause
"""What a device is, in plain data: its description, the chosen and the random ones,
what is seen of it, every line and every path. Nothing here boots anything."""
