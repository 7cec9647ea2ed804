# SPDX-License-Identifier: BSD-2-Clause
"""The other ways in which a system starts, and devices that lack something."""

import json
from typing import NamedTuple

import pytest

from lab.carriers.building import build
from lab.debian_systems.machine import message, System, UNIT
from lab.debian_systems.parts import CHOSEN
from lab.debian_systems.scene import (NEW, device, insist, install_and_announce, linked,
                                      names, updated)
from lab.words import lines
from lab.words.device import Device
from lab.words.paths import DEFAULT_ZONE, ICUTZ, ZONEINFO
from lab.words.places import BUILD

pytestmark = pytest.mark.rest
# The system once more, beside the disk, with a module that its kernel does not have.
INITRD = """
touch etc/initrd-release
ln -s usr/lib/systemd/systemd init
mkdir etc/systemd/system/systemd-volatile-root.service.d
printf '[Service]\\nExecStartPre=%s insmod %s\\n' /usr/lib/lab/busybox \
  /usr/lib/lab/overlay.ko >etc/systemd/system/systemd-volatile-root.service.d/lab.conf
bsdtar -c --format newc --exclude './usr/lib/lab/[dmp]*' --exclude './usr/share/*' \
  --exclude './usr/lib/udev/hwdb*' --exclude './usr/bin/perl*' {without} \
  -f ../initrd .
rm etc/initrd-release init
"""
INITRD_OPTIONS = "rd.systemd.unit=initrd.target rootflags=x-systemd.device-timeout=500"
# What tells what was seen runs in the emergency mode too, which another mount causes.
EMERGENCY = """
echo '/dev/nvme0n9 /data ext4 x-systemd.device-timeout=3s 0 0' >etc/fstab
mkdir -p data etc/systemd/system/emergency.target.wants
sed 's/^.Unit.$/&\\nDefaultDependencies=no\\nAfter=marlin.service/' \
  usr/lib/systemd/system/lab.service >etc/systemd/system/emergency-lab.service
ln -s ../emergency-lab.service etc/systemd/system/emergency.target.wants
"""
ELSEWHERE = """
mkdir -p data
mv var/db/timezone data
ln -s /data/timezone var/db/timezone
"""
MEND = f"""
mkdir -p etc/systemd/system
cp -R usr/share/doc/marlin/examples/{UNIT}.d etc/systemd/system
"""
# As docs/integration.md has it.
DROP_IN = f"""
mkdir -p etc/systemd/system/{UNIT}.d
cat >etc/systemd/system/{UNIT}.d/data.conf <<'END'
[Unit]
ConditionPathIsSymbolicLink=
ConditionPathExists=!/etc/initrd-release
RequiresMountsFor=/data/timezone
[Service]
BindPaths=/data/timezone
END
"""


class Start(NamedTuple):
    change: str = ""
    options: str = ""
    printed: tuple = NEW
    made: Device | None = device(zone=DEFAULT_ZONE)
    reader: str = "05:00 PDT"


def starts() -> dict[str, Start]:
    made, mixed = names(), device(active=True, announced=True)
    mixed.drop(ICUTZ)
    unknown = lines.VERSION_GROUPS % (".1.0", 0), lines.VERSION % ".1.0"
    return {
        "an initrd with the unit": Start(INITRD.format(without=""), INITRD_OPTIONS),
        "an initrd without it": Start(INITRD.format(
            without="--exclude '*/marlin.service'"), INITRD_OPTIONS),
        "a root on an overlay": Start(
            INITRD.format(without=""), f"{INITRD_OPTIONS} systemd.volatile=overlay"),
        "a var in memory": Start(options="systemd.volatile=state"),
        "a link to a data partition": Start(updated() + ELSEWHERE + DROP_IN, "", (),
                                            None, "14:00 CEST"),
        "the mend": Start(
            updated(mixed) + MEND, "",
            (f" marlin-mend: {ZONEINFO} did not fit {ICUTZ}; marlin makes both anew",
             *NEW[:2]), device(active=True, announced=True), "14:00 CEST"),
        "no ICU data": Start(
            updated() + "rm -r usr/share/icu\n", "",
            (lines.NOT_NEWER % (made.update, f"{made.system}.1.0"),),
            device(announced=True), "13:00 WEST"),
        "no zones": Start(
            updated() + "rm -r usr/share/zoneinfo.default\n", "", 2 * unknown,
            device(active=True, announced=True), "14:00 CEST"),
    }


@pytest.mark.parametrize("name", starts())
def test_a_start(name):
    start = starts()[name]
    system = System(name.replace(" ", "-"), start.change)
    initrd = system.directory / "initrd"
    seen = system.boot(options=start.options, more=(
        "-initrd", str(initrd)) * initrd.exists())
    insist(seen, start.printed, start.made, reader=start.reader)


def test_a_program_with_libraries():
    """Of the C++ library the system has none of its own."""
    folder = build(CHOSEN.preset, "-DMARLIN_STATIC=OFF", "-DMARLIN_TOOLS=OFF",
                   folder=BUILD / "dynamic")
    seen = System("libraries", updated() + f"""
        DESTDIR=$PWD cmake --install {folder}
        for library in libstdc++.so.6 libgcc_s.so.1; do
          cp $({CHOSEN.compiler} -print-file-name=$library) usr/lib
        done""").boot()
    insist(seen, (), device(active=True, announced=True), reader="14:00 CEST")


def test_an_emergency():
    seen = System("emergency", EMERGENCY).boot()
    assert len(seen.started()) == 1 and seen.text("reader") == "05:00 PDT\n"
    assert not seen.at("sysinit.target", "ActiveEnter")


def test_a_link_to_a_data_partition_is_named():
    """Without the drop-in nothing is changed, and the journal says why."""
    seen = System("elsewhere", updated() + ELSEWHERE).boot()
    said = [message(entry) for entry in seen.said_by(UNIT=UNIT)]
    assert any("PathIsSymbolicLink=!/var/db/timezone" in text for text in said), said
    assert not seen.started() and seen.text("reader") == "13:00 WEST\n"


CONTAINERS = {"plain": "", "state": "--volatile=state", "overlay": "--volatile=overlay",
              "read-only": "--read-only --tmpfs=/var"}
INSIDE = """[Unit]
DefaultDependencies=no
Requires=sysinit.target
After=sysinit.target
[Service]
Type=oneshot
ExecStart=/bin/sh -c '\\
  journalctl -b -o json -u marlin.service >/seen/journal; \\
  readlink /var/db/timezone/zoneinfo /var/db/timezone/localtime >/seen/links'
ExecStopPost=/bin/systemctl poweroff --force
"""


def test_containers():
    """Each boots as a new device does, and the unit says nothing else."""
    boots = "".join(f"""
        rm -rf /var/db /run/lab/seen/{name}; mkdir /run/lab/seen/{name}
        systemd-nspawn -q -b -D /mnt --register=no --keep-unit {how} \\
          --bind=/run/lab/seen/{name}:/seen systemd.unit=inside.service
        """ for name, how in CONTAINERS.items())
    seen = System("containers", f"""
        mkdir seen
        cat >etc/systemd/system/inside.service <<'END'\n{INSIDE}END""").boot(f"""
        /usr/lib/lab/busybox insmod /usr/lib/lab/overlay.ko
        mount --bind / /mnt{boots}""", seconds=1500)
    for name in CONTAINERS:
        warnings = [text for text in map(json.loads, seen.text(
            f"{name}/journal").splitlines()) if int(text["PRIORITY"]) <= 4]
        assert [text["MESSAGE"].rpartition(": ")[0] for text in warnings] == [
            f"marlin: {text}" for text in NEW], name
        assert seen.text(f"{name}/links").split() == [
            "/usr/share/zoneinfo.default", "/var/db/timezone/zoneinfo/" + DEFAULT_ZONE]


@pytest.mark.skipif(CHOSEN.suite != "trixie", reason="systemd has it from 254 on")
def test_a_soft_reboot():
    """It takes the update that was announced since."""
    seen = System("soft-reboot", linked(device()) + """
        sed -i /^FailureAction/d usr/lib/systemd/system/lab.service""").boot(f"""
        [ -e /run/again ] && exit
        touch /run/again
        {install_and_announce()}
        systemctl soft-reboot
        sleep 1000""")
    assert len(seen.started()) == 2 and seen.text("reader") == "14:00 CEST\n"
