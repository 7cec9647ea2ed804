# SPDX-License-Identifier: BSD-2-Clause
"""The part of scripts/bench that runs inside the private device; prints JSON:
measure counts FLOOR MARLIN, measure companions MARLIN INSTALL MEND.

In the path of the floor "SCENE" stands for the scene's name.
"""

import functools
import json
import os
import shutil
import sys
import time

from lab.bench.costs import costs, instructions, peak, run
from lab.carriers import namespace
from lab.oracles.installer import SOURCE, put_update
from lab.words.chosen_devices import FIRST, made
from lab.words.device import sound_device
from lab.words.paths import DOWNLOADS
from lab.words.seen import as_device


SCENES = {name: functools.partial(made, changes) for name, changes in {
    "quiet": "", "update": "install_update 2024a.1.0; point_links_at 2024a.1.0",
    "activation": FIRST, "reset": "install_update 2022a.1.0; point_links_at 2022a.1.0",
    "localtime": "link LOCALTIME /nowhere"}.items()}


def placed(scene: str, programs) -> list[str]:
    """A program is the same number of instructions only by a path of the same length:
    each is copied to a path of its own."""
    for index, program in enumerate(programs):
        os.makedirs(f"/tmp/{index}", exist_ok=True)
        shutil.copy(program.replace("SCENE", scene), f"/tmp/{index}/program")
    return [f"/tmp/{index}/program" for index in range(len(programs))]


def counts(*programs: str) -> dict[str, list]:
    """The costs of each scene, in the order of the programs."""
    found = {}
    for scene, describe in SCENES.items():
        restore = functools.partial(namespace.build, describe())
        found[scene], left = [], []
        for command in placed(scene, programs):
            found[scene].append(costs(command, restore))
            left.append(sorted(as_device(namespace.look()).in_words().splitlines()))
            restore()
            if instructions(command) != found[scene][-1][0]:
                sys.exit(f"measure: {scene}: not twice the same count")
        if left[0] != left[1]:
            sys.exit(f"measure: {scene}: the floor leaves {left[0]}, not {left[1]}")
    return found


def companions(marlin: str, install: str, mend: str) -> dict:
    """What the installer takes for an update of 1 MB on a disk where fsync(2) costs
    nothing, in ms and kB, the fastest of some runs; and what marlin and the mend take
    on the same quiet boot: instructions, calls, kB."""
    device = sound_device()
    device.directory(DOWNLOADS)
    put_update(device, SOURCE, "2024b", more={"icutz/icutz44l.dat": "x" * 200_000} | {
        f"zoneinfo/Area{number % 20}/Zone{number}": f"TZif {number}".ljust(1243)
        for number in range(600)})
    times = []
    for _ in range(11):
        namespace.build(device)
        started = time.monotonic()
        run(install, SOURCE)
        times.append((time.monotonic() - started) * 1000)
    namespace.build(device)
    return {"bytes": sum(len(text) for path, text in device.contents().items()
                         if path.startswith(SOURCE)),
            "install": [min(times), peak(install, SOURCE)[0]],
            "quiet": [costs(command, functools.partial(
                namespace.build, SCENES["update"]()))
                for command in placed("quiet", [marlin, mend])]}


if __name__ == "__main__":
    namespace.insist_on_private_device()
    os.umask(0o022)
    job = {"counts": counts, "companions": companions}[sys.argv[1]]
    print(json.dumps(job(*sys.argv[2:])))
