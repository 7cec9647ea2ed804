# SPDX-License-Identifier: BSD-2-Clause
"""Where a described device becomes real."""
