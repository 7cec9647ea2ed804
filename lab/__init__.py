# SPDX-License-Identifier: BSD-2-Clause
"""Everything that boots the program many times and judges it, in floors; each imports
only from those above it in the list of docs/proofs.md.
"""
