# SPDX-License-Identifier: BSD-2-Clause
"""usage: tests/imports.py NM FILE...

What the program takes from the C library is a short list: nothing of the environment,
of locales, locks, syncs, working directories or standard output is on it. FILE are the
program's objects and libraries; those of sanitizers, coverage, the language and its
library are not looked at.
"""

import re
import subprocess
import sys

FUNCTIONS = set("""
    access close fts_close fts_open fts_read fts_set open read readlink remove setvbuf
    signal stat stderr strerror symlink unlink warn write
    bcmp memchr memcmp memcpy memmove memset strcmp strlen strtol
    fcntl
""".split())  # the last one on platforms with data-protection classes

used = {name.replace("64", "") for name in re.findall(
    r"\bU (\w+)$", subprocess.run([sys.argv[1], "-u", *sys.argv[2:]], check=True,
                                  stdout=subprocess.PIPE, text=True).stdout, re.M)
        if not name.startswith("_")}
for name in sorted(used - FUNCTIONS):
    print(f"the program uses {name}()", file=sys.stderr)
sys.exit(1 if used - FUNCTIONS or not used else 0)
