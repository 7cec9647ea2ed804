# SPDX-License-Identifier: BSD-2-Clause
"""Where a described device becomes real and boots, and how what boots is built."""
