# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/package [release | arm64-release | armhf-release]

Makes the Debian package of a release preset, or of all, and checks it and the boot
unit in it: lab/proofs/package.py. The packages stay in build/packaging. Installs what
that takes, as root.

Exit status: 0 when all checks passed, another when one failed, 2 for bad use.
"""

import subprocess

from lab.carriers.building import need, pytest
from lab.words.command import Options
from lab.words.places import PROJECT

PRESETS = ["release", "arm64-release", "armhf-release"]


def main() -> int:
    options = Options(__doc__)
    options.add_argument("preset", nargs="?", choices=PRESETS)
    chosen = options.parse_args().preset
    need("build", "private-device", "pytest", "package", "arm64", "armhf")
    presets = [chosen] if chosen else PRESETS
    return subprocess.call(
        pytest("-v", *(f"--preset={name}" for name in presets),
               "lab/proofs/package.py"),
        cwd=PROJECT)


if __name__ == "__main__":
    raise SystemExit(main())
