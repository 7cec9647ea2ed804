# SPDX-License-Identifier: BSD-2-Clause
"""Mutants that no rule makes, each of which breaks one sentence of what the program
must do: (name, [(file, before, after), ...], sentence). `before` is found exactly once
in its file."""

MUTANTS: list[tuple[str, list[tuple[str, str, str]], str]] = []
