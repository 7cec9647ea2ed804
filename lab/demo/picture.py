# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/picture [FILE]

Draws docs/demo.svg, or FILE: what scripts/demo shows of an update that is
activated, and its summary. Runs the demonstration and installs what it needs,
as root.
"""

import html
import os
import re
import subprocess
import sys
from collections.abc import Iterator

from lab.places import PROJECT

TITLE = "What scripts/demo shows"
HEADINGS = ("── 3  ", "── In short")
COLUMN, LINE, MARGIN, BAR = 8.43, 19, 18, 30
SEQUENCE = re.compile(r"\x1b\[([0-9]*)m")
STYLES = {
    "1": ' style="font-weight:bold;fill:#ffffff"',
    "2": ' style="fill:#8b949e"',
    "31": ' style="fill:#ff7b72"',
    "32": ' style="fill:#7ee787"',
    "33": ' style="fill:#e3b341"',
}


def told() -> list[str]:
    """The lines of two of the demonstration's sections."""
    print("Running scripts/demo", file=sys.stderr)
    demo = subprocess.run(
        [f"{PROJECT}/scripts/demo"], stdout=subprocess.PIPE, encoding="utf-8",
        env={**os.environ, "FORCE_COLOR": "1", "LC_ALL": "C.UTF-8"})
    if demo.returncode:
        sys.exit("picture: the demonstration failed")
    sections = [section for section in re.split(r"\n(?=──)", demo.stdout)
                if SEQUENCE.sub("", section).startswith(HEADINGS)]
    if len(sections) != len(HEADINGS):
        sys.exit("picture: the scenes are not where they used to be")
    return "\n".join(sections).rstrip("\n").split("\n")


def picture(lines: list[str]) -> Iterator[str]:
    width = max(len(SEQUENCE.sub("", line)) for line in lines) * COLUMN + 2 * MARGIN
    height = len(lines) * LINE + BAR + 2 * MARGIN
    yield (f'<svg xmlns="http://www.w3.org/2000/svg" width="{width:.0f}"'
           f' height="{height:.0f}" viewBox="0 0 {width:.0f} {height:.0f}"'
           f' role="img" aria-label="{TITLE}">\n<title>{TITLE}</title>')
    yield '<rect width="100%" height="100%" rx="8" fill="#161b22"/>'
    for index, colour in enumerate(("#ff5f56", "#ffbd2e", "#27c93f")):
        yield f'<circle cx="{MARGIN + 4 + index * 20}" cy="18" r="6" fill="{colour}"/>'
    yield ('<g font-family="ui-monospace,SFMono-Regular,Menlo,Consolas,'
           "'DejaVu Sans Mono',monospace\" font-size=\"14\" fill=\"#d0d7de\">")
    style, y = "", BAR + MARGIN + 10
    for line in lines:
        column = 0
        # Texts and codes by turns. Texts are broken at gaps: SVG folds blanks, and
        # fonts differ in width.
        for index, part in enumerate(SEQUENCE.split(line)):
            if index % 2:
                style = STYLES.get(part, "")
                continue
            for text in re.finditer(r"\S+(?: \S+)*", part):
                x = MARGIN + (column + text.start()) * COLUMN
                yield (f'<text x="{x:.1f}" y="{y}"'
                       f' textLength="{len(text[0]) * COLUMN:.1f}"'
                       f' lengthAdjust="spacingAndGlyphs"{style}>'
                       f"{html.escape(text[0])}</text>")
            column += len(part)
        y += LINE
    yield "</g>\n</svg>\n"


def main() -> int:
    match sys.argv[1:]:
        case ["--help"]:
            print(__doc__.strip())
            return 0
        case []:
            file = f"{PROJECT}/docs/demo.svg"
        case [file] if not file.startswith("-"):
            os.makedirs(os.path.dirname(os.path.abspath(file)), exist_ok=True)
        case _:
            print("picture: one file at most; see --help", file=sys.stderr)
            return 2
    drawn = "\n".join(picture(told()))
    with open(file, "w", encoding="utf-8") as svg:
        svg.write(drawn)
    print(f"Wrote {os.path.relpath(file)}", file=sys.stderr)
    return 0


if __name__ == "__main__":
    sys.exit(main())
