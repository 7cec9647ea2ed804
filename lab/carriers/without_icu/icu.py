# SPDX-License-Identifier: BSD-2-Clause
"""Stands before python3-icu on the path, as if that were not installed: the ICU data of
a Debian release is older than its rules, and make-update would say so."""

raise ImportError
