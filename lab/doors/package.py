# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/package [release | arm64-release]

Makes the Debian package of a release preset, or of both, and checks it and the boot
unit in it: lab/proofs/package.py. The packages stay in build/packaging. Installs what
that takes, as root.

Exit status: 0 when all checks passed, another when one failed, 2 for bad use.
"""

import subprocess

from lab.carriers.building import need, pytest
from lab.words.command import Options
from lab.words.places import PROJECT


def main() -> int:
    options = Options(__doc__)
    options.add_argument("preset", nargs="?", choices=["release", "arm64-release"])
    chosen = options.parse_args().preset
    need("build", "private-device", "pytest", "package", "arm64")
    presets = [chosen] if chosen else ["release", "arm64-release"]
    return subprocess.call(
        pytest("-v", *(f"--preset={name}" for name in presets),
               "lab/proofs/package.py"),
        cwd=PROJECT)


if __name__ == "__main__":
    raise SystemExit(main())
