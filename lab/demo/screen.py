# SPDX-License-Identifier: BSD-2-Clause
"""What the demonstration looks like: headings, paragraphs, and the device before and
after a boot as a difference. With colours on a terminal."""

import locale
import os
import sys
import textwrap
from collections.abc import Iterable

WIDTH, NAME = 72, 13  # columns: of the whole, and of the names of rows

COLOURED = "FORCE_COLOR" in os.environ or (
    sys.stdout.isatty() and "NO_COLOR" not in os.environ
    and os.environ.get("TERM", "dumb") != "dumb")
BOLD, DIM, RED, GREEN, YELLOW = (
    (f"\x1b[{code}m" if COLOURED else "") for code in (1, 2, 31, 32, 33))
DASH = "─" if locale.nl_langinfo(locale.CODESET) == "UTF-8" else "-"


def paint(colour: str, text: str) -> str:
    return f"{colour}{text}\x1b[0m" if colour else text


def rule(title: str):
    """A heading, across the screen."""
    line = DASH * (WIDTH - len(title) - 4)
    print(f"\n{DASH * 2} {paint(BOLD, title)} {line}")


def say(text: str, colour=""):
    """A paragraph, however it is broken in the source."""
    print("\n" + paint(colour, textwrap.fill(
        " ".join(text.split()), WIDTH - 3, initial_indent="  ", subsequent_indent="  ",
        break_on_hyphens=False)))


def field(name: str, *lines: str):
    for line in lines:
        print(f"  {name:<{NAME - 2}}{line}")
        name = ""


def changes(was: dict[str, str], found: dict[str, str], remade=()):
    """What was found before a boot, "-", and after it, "+", or both times; `remade` are
    those that were made again."""
    print()
    for name, before in was.items():
        after = found[name]
        name = f"{name:<{NAME - 2}}"
        if before != after:
            print(paint(RED, f"- {name}{before}"))
            print(paint(GREEN, f"+ {name}{after}"))
        elif name.rstrip() in remade:
            print(paint(GREEN, f"~ {name}{after}, made again"))
        else:
            print(paint(DIM, f"  {name}{after}"))


def broken(text: str) -> list[str]:
    """As lines that fit beside a name."""
    return textwrap.wrap(text, WIDTH - NAME, break_on_hyphens=False)


def printed(lines: Iterable[str]):
    """Lines of a boot."""
    parts = [paint(YELLOW, part) for line in lines for part in broken(line)]
    field("printed", *parts or ["nothing"])
