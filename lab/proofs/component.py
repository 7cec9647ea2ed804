# SPDX-License-Identifier: BSD-2-Clause
"""The third component of CONTRIBUTING.md, as it is written there: the change is applied
to a copy of the project, which is built. marlin-install, marlin-status and the boot
know the component then."""

import os
import re
import subprocess
import sys

from lab.carriers import boot, namespace
from lab.carriers.building import copy_the_project, locked, need, quietly, trials
from lab.oracles.installer import DONE, NEW, SOURCE, first, put_update, run
from lab.proofs.status import ask
from lab.words.paths import TIMEZONE, TZ_LATEST, ZONEINFO, update_path
from lab.words.places import BUILD, PROJECT

PLACE = BUILD / "component"
LINK = f"{TIMEZONE}/leapseconds"
LEAP = f"{update_path(NEW)}/leapseconds"


def test_a_set_of_three_components():
    device = first()
    put_update(device, SOURCE, "2024b", more={"leapseconds": "of the update"})
    namespace.build(device)
    assert run([SOURCE]) == (DONE, "")
    assert namespace.look()[LEAP].text == "of the update"
    asked = ask("--check")
    assert asked.status == 1 and "2024b.1.0 is activated" in asked.output, asked
    assert boot.boot() == ("exit 0", "")
    assert namespace.look()[LINK].text == LEAP
    assert ask("--check") == (0, "", "")

    for link in (ZONEINFO, TZ_LATEST):
        os.unlink(link)
    assert boot.boot().ending == "exit 0"
    assert LINK not in namespace.look()

    os.symlink(LEAP, LINK)
    said = ask("--json").said
    assert said["downloads"] == [{"name": NEW, "needed_by": ["leapseconds"]}]
    assert run(["--prune"]) == (DONE, "")
    assert LEAP in namespace.look()


def main() -> int:
    need("build", "private-device", "pytest", "prove", "component")
    text = (PROJECT / "CONTRIBUTING.md").read_text()
    change = re.search(r"(?s)```diff\n(.*?)```", text)[1]
    program = PLACE / "build/release/marlin"
    with locked(PLACE.with_suffix(".lock")):
        copy_the_project(PLACE)
        subprocess.run(["patch", "-p0", "-F0", "-s", "-d", PLACE], input=change,
                       text=True, check=True)
        log = BUILD / "component.log"
        quietly(log, "cmake", "-S", PLACE, "--preset", "release")
        quietly(log, "cmake", "--build", program.parent)
        return subprocess.call(trials("component", "lab/proofs/component.py"),
                               cwd=PLACE, env=os.environ | {"MARLIN": str(program)})


if __name__ == "__main__":
    sys.exit(main())
