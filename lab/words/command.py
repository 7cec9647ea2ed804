# SPDX-License-Identifier: BSD-2-Clause
"""What the commands behind scripts/ have in common: options, one line for bad use, and
an end without a traceback when they are interrupted."""

import argparse
import re
import signal
import sys
from collections.abc import Iterable
from pathlib import Path

# lab/proofs/coverage.py, say, or lab/doors/bench.py.
NAME = next((name for name in reversed(Path(sys.argv[0]).with_suffix("").parts)
             if name != "__main__"), "")


def say(text: str):
    print(text, file=sys.stderr, flush=True)


def stop(status: int, text: str):
    say(f"{NAME}: {text}")
    sys.exit(status)


class Options(argparse.ArgumentParser):
    """Command-line options; `usage`, if it is given, is all that --help prints."""

    def __init__(self, usage="", **options):
        super().__init__(**{"prog": f"scripts/{NAME}", "allow_abbrev": False} | options)
        # An interrupted program just ends, as does one that nobody reads.
        signal.signal(signal.SIGINT, signal.SIG_DFL)
        signal.signal(signal.SIGPIPE, signal.SIG_DFL)
        self.text = usage

    def format_help(self):
        return self.text or super().format_help()

    def add_names(self, title: str, names: Iterable[str]):
        """Any of these names, in any number; without one, all of them."""
        def known(text: str) -> str:
            if text not in names:
                raise argparse.ArgumentTypeError(f"{text!r} is none of " +
                                                 ", ".join(names))
            return text

        self.add_argument(title, nargs="*", type=known, default=list(names))

    def error(self, message):
        self.exit(2, f"{Path(self.prog).name}: {message}; see --help\n")


def number(text: str) -> int:
    """What an option that needs a number makes of its text."""
    if not re.fullmatch("[1-9][0-9]{0,5}", text):
        raise argparse.ArgumentTypeError("it needs a number from 1 to 999999")
    return int(text)
