# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/picture [FILE]

Draws docs/demo.svg, or FILE: what scripts/demo shows of an update that is
activated. Runs the demonstration and installs what it needs, as root.
"""

import io
import os
import re
import subprocess
from pathlib import Path

from lab.carriers.building import need
from lab.demo.screen import WIDTH
from lab.words.command import Options, say, stop
from lab.words.places import PROJECT, shown

TITLE = "One boot, as scripts/demo shows it"
HEADING = re.compile(r"── \S*3  ")  # behind a colour


def told() -> str:
    """One of the demonstration's sections."""
    say("Running scripts/demo")
    demo = subprocess.run(
        [PROJECT / "scripts/demo"], stdout=subprocess.PIPE, encoding="utf-8",
        env={**os.environ, "FORCE_COLOR": "1", "LC_ALL": "C.UTF-8"})
    if demo.returncode:
        stop(1, "the demonstration failed")
    [section] = filter(HEADING.match, re.split(r"\n(?=──)", demo.stdout))
    return section.rstrip("\n")


def picture(text: str) -> str:
    # Only main() makes sure that this package is there.
    from rich.console import CONSOLE_SVG_FORMAT, Console
    from rich.text import Text
    screen = Console(record=True, width=WIDTH, file=io.StringIO())
    screen.print(Text.from_ansi(text), end="")
    # Nothing is fetched from anywhere to look at it, and blanks stay in every viewer.
    form = re.sub(r" *@font-face \{\{.*?\}\}\n", "", CONSOLE_SVG_FORMAT, flags=re.S)
    form = form.replace("<svg", f'<svg role="img" aria-label="{TITLE}" '
                        'xml:space="preserve"', 1)
    # A text has its width: no line needs an edge where it is cut.
    svg = screen.export_svg(title=TITLE, code_format=form.replace("{lines}", ""),
                            unique_id="demo")
    return re.sub(r' clip-path="url\(#demo-line-\d+\)"', "", svg)


def main():
    options = Options(__doc__)
    options.add_argument("file", nargs="?", type=Path, metavar="FILE",
                         default=PROJECT / "docs/demo.svg")
    file = options.parse_args().file.absolute()
    need("picture")
    file.parent.mkdir(parents=True, exist_ok=True)
    file.write_text(picture(told()), encoding="utf-8")
    say(f"Wrote {shown(file)}")


if __name__ == "__main__":
    main()
