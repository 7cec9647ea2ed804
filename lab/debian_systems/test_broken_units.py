# SPDX-License-Identifier: BSD-2-Clause
"""The unit and the examples broken on purpose: a scene that passes otherwise fails,
and its report says what is wrong."""

import shutil
from collections.abc import Callable
from typing import NamedTuple

import pytest

from lab.carriers.building import room
from lab.debian_systems import (machine, parts, test_chosen, test_limits, test_ordinary,
                                test_other_inits, test_package_on_a_system, test_probe,
                                test_starts, test_var)

pytestmark = pytest.mark.rest


def without(*begins: str) -> str:
    """What a shell does to the unit in the root directory of a system."""
    return f"sed -Ei '/^({'|'.join(begins)})/d' usr/lib/systemd/system/marlin.service\n"


def added(line: str, section="Service") -> str:
    return (f"sed -i '/^.{section}.$/a {line}' "
            "usr/lib/systemd/system/marlin.service\n")


class Fault(NamedTuple):
    scene: Callable[[], None]
    change: str
    reported: tuple[str, ...]


ENDED = "the unit's result, state and status is "
UNFILTERED = "sed -i \"s/tr -c '.n -~' '?'/cat/\" usr/share/doc/marlin/examples/init*\n"

# This scene installs the unit anew.
STARTED = """mkdir -p etc/systemd/system/marlin.service.d
echo '[Unit]\nRefuseManualStart=no' >etc/systemd/system/marlin.service.d/start.conf
"""


def forged(init: str) -> Callable[[], None]:
    return lambda: test_other_inits.test_an_update_and_a_forged_line(init)


FAULTS = {
    "directories for temporary files": Fault(
        test_var.test_a_read_only_root_without_tmp, added("PrivateTmp=yes"),
        (ENDED + "('resources', 'failed', '0')",)),
    "late": Fault(
        test_ordinary.test_from_its_first_boot_on,
        without("Before=sysinit.target", "DefaultDependencies"), ("the order of ",)),
    "a cycle": Fault(
        test_ordinary.test_from_its_first_boot_on,
        added("After=sysinit.target", "Unit"), ("the journal tells of a cycle",)),
    "priorities from texts": Fault(
        test_ordinary.test_from_its_first_boot_on, without("SyslogLevelPrefix"),
        ("a line is ('marlin', '0', 'stdout'): 'kernel: panic",)),
    "no bound of memory": Fault(
        test_limits.test_a_terabyte_for_a_word, without("LimitAS"),
        (ENDED,)),
    "an initrd": Fault(
        lambda: test_starts.test_a_start("an initrd with the unit"),
        without("ConditionPathExists"), ("what the links say is {}",)),
    "a system call": Fault(
        test_chosen.test_every_device,
        "sed -i 's/ rmdir$//' usr/lib/systemd/system/marlin.service\n",
        ("the boot of: legacy migration", "ended with signal 31")),
    "starts by hand": Fault(
        test_package_on_a_system.test_a_package_comes_and_goes,
        STARTED, ("['refused to stop'] == ",)),
    "open places": Fault(
        lambda: test_probe.test_the_probe_is_refused("rw"),
        without("RootDirectory", "Bind", "ReadOnlyPaths", "DevicePolicy", "LimitCORE") +
        added("SystemCallFilter=rename"),
        ("marlin.service: call rename: No such file or directory",
         "marlin.service: write /usr/entry: done",
         "marlin.service: read /dev/nvme0n1: done",
         "marlin.service: write /proc/1/oom_score_adj: done",
         "marlin.service: limit core: ")),
    "no signals under the profile": Fault(
        test_probe.test_signals_under_the_profile,
        "sed -i /signal/d usr/share/doc/marlin/examples/apparmor\n",
        (ENDED + "('signal', 'failed', '11')",)),
    "a restart": Fault(
        forged("openrc"), "sed -i '/^stop/,$d' usr/share/doc/marlin/examples/openrc\n",
        ("changed",)),
    "commands to a console by busybox": Fault(
        forged("busybox"), UNFILTERED, (r"/x\x1b[31m",)),
    "commands to a console by SysV init": Fault(
        forged("sysv"), UNFILTERED, (r"/x\x1b[31m",)),
}


@pytest.mark.parametrize("name", FAULTS)
def test_a_fault_is_seen(name, monkeypatch):
    scene, change, reported = FAULTS[name]
    place = parts.CHOSEN.place / "scenes" / f"broken {name}".replace(" ", "-")
    monkeypatch.setattr(machine, "room", lambda _: room(place))
    monkeypatch.setattr(
        machine, "make_image", lambda image, script="", **how:
        parts.make_image(image, change + script, **how))
    with pytest.raises((AssertionError, pytest.fail.Exception)) as failed:
        scene()
    report = str(failed.value)
    shutil.rmtree(place)
    assert [text for text in reported if text not in report] == [], report
