# SPDX-License-Identifier: BSD-2-Clause
"""The mutants of mutants_by_hand.txt, which tells the format."""

import re
from pathlib import Path

TEXT = Path(__file__).with_suffix(".txt").read_text()


def edits(body: str) -> list[tuple[str, str, str]]:
    """(file, before, after) of each edit."""
    def lines(sign: str, edit: str) -> str:
        return "\n".join(line[2:] for line in edit.splitlines() if line[0] == sign)

    return [(edit.partition("\n")[0], lines("-", edit), lines("+", edit))
            for edit in re.split(r"^  ", body, flags=re.M)[1:]]


# (name, edits, the sentence that is broken)
MUTANTS = [(name, edits(body), sentence) for name, sentence, body in re.findall(
    r"^([a-z0-9][\w-]*): (.*)\n((?:[-+ ].*\n|[-+]\n)+)", TEXT, re.M | re.A | re.I)]
