# SPDX-License-Identifier: BSD-2-Clause
"""One file for each claim of docs/proofs.md, and four that drive a tool: `fuzz`,
`mutants`, `sanitize` and `coverage`."""
