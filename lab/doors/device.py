# SPDX-License-Identifier: BSD-2-Clause
"""Builds the program for arm64 and boots it on an emulated device: a real kernel, a
read-only system partition, an ext4 disk for "/var". With --systems it boots whole
Debian systems instead, with the package installed.

What is needed is installed, as root, and a kernel is fetched into the folder "build".
Exit status: 0 when all is as expected, otherwise 1; 2 for bad use; 77 when a device
cannot be emulated here.
"""

import argparse
import os
import subprocess
import sys

from lab.words.command import Options, number
from lab.words.places import PROJECT


def main() -> int:
    parser = Options(prog="scripts/device", description=__doc__,
                     formatter_class=argparse.RawDescriptionHelpFormatter)
    mode = parser.add_mutually_exclusive_group(required=True)
    mode.add_argument("--tests", nargs="*", metavar="TEST", help="every chosen device, "
                      "sequences of boots on one disk, some power cuts; or these tests")
    mode.add_argument("--power-cuts", type=number, metavar="N", help="cuts the "
                      "power at N random instants of a life, and checks what is left")
    mode.add_argument("--boot-cost", action="store_true",
                      help="measures the part of a boot that the pass takes")
    mode.add_argument("--systems", nargs="*", metavar="TEST", help="Debian systems "
                      "with the package: the boot unit, other inits; or these tests")
    mode.add_argument("--unit-cost", action="store_true",
                      help="measures what each restriction of the boot unit costs")
    parser.add_argument("--quick", action="store_true",
                        help="of the systems only those that scripts/ci boots")
    parser.add_argument("--on", choices=("amd64", "arm64", "debian-11", "debian-13"),
                        default="amd64", help="of --systems and --unit-cost: another "
                        "system than Debian 12 on amd64; arm64 is half as fast")
    parser.add_argument("--seed", type=int, help="of what chance decides in a life")
    options = parser.parse_args()
    if subprocess.call([PROJECT / "scripts/packages", "pytest"]):
        return 77
    os.environ["MARLIN_SYSTEMS"] = options.on
    # After the options are understood: these take pytest.
    import pytest
    from lab.arm64_device import machine
    from lab.bench import boot_cost, unit_cost
    from lab.carriers.qemu import Unavailable
    from lab.debian_systems import parts as systems
    from lab.proofs import cuts
    run = ["-c", "lab/pytest.ini", f"--rootdir={PROJECT}", "-n", "2", "--dist"]
    try:
        if options.systems is not None:
            systems.prepare()
            return pytest.main([*run, "load", "--durations=0", *(
                ["-m", "not rest"] if options.quick else []),
                *(options.systems or ["lab/debian_systems"])])
        if options.unit_cost:
            unit_cost.measure()
            return 0
        machine.prepare()
        if options.tests is not None:
            return pytest.main([*run, "loadfile",
                                *(options.tests or ["lab/arm64_device",
                                                    "lab/proofs/cuts.py"])])
        if options.power_cuts:
            cuts.run(options.power_cuts, options.seed)
        else:
            boot_cost.measure()
    except Unavailable as reason:
        print(f"SKIPPED: {reason}", file=sys.stderr)
        return 77
    except RuntimeError as reason:
        print(f"FAILED: {reason}")
        return 1
    return 0


if __name__ == "__main__":
    sys.exit(main())
