# SPDX-License-Identifier: BSD-2-Clause
"""Every chosen device boots under the unit's restrictions and is compared with the
model and the properties; so are devices with links of two data sets, with the mend."""

from lab.carriers import image
from lab.carriers.boot import ending_of
from lab.debian_systems.machine import System, UNIT
from lab.oracles import side_by_side
from lab.words.chosen_devices import CHOSEN, NEXT, made
from lab.words.device import Device, Node
from lab.words.paths import ICUTZ, ZONEINFO
from lab.words.seen import Entries

MEND = f"/usr/share/doc/marlin/examples/{UNIT}.d/mend.conf"
MIXED = {f"mixed {number}": f"{NEXT} drop ICUTZ; {to}" for number, to in enumerate([
    "link ZONEINFO U/zoneinfo; link ICUTZ OLD/icutz", "link ZONEINFO U/zoneinfo",
    "link ZONEINFO SYSTEM; link ICUTZ OLD/icutz",
    "link ZONEINFO SYSTEM; link ICUTZ TZ/gone/icutz"])}
MENDED = f"marlin-mend: {ZONEINFO} did not fit {ICUTZ}; marlin makes both anew\n"

# Different from the unit, on purpose: a call that it refuses kills here, so that no
# refusal goes unnoticed; a missing directory does not keep it from starting; the log is
# a file, to be compared to the byte; and it is started by hand, many times.
PREPARE = f"""
cp {MEND} /run/mend.conf
cd /run/systemd/system
grep -v ^Refuse /usr/lib/systemd/system/{UNIT} >chosen.service
mkdir chosen.service.d
cat >chosen.service.d/lab.conf <<END
[Unit]
StartLimitIntervalSec=0
ConditionPathIsDirectory=
[Service]
SystemCallErrorNumber=
StandardError=append:/run/lab/said
END
systemctl daemon-reload
mount /dev/nvme0n3 /mnt
"""
RUN = """
  rm -f /run/lab/said
  systemctl restart chosen
  cp /run/lab/said $device/log
  systemctl show --value -p ExecMainCode,ExecMainStatus chosen >$device/status"""
WITH_THE_MEND = """
cp /run/mend.conf chosen.service.d
systemctl daemon-reload
"""


def ending(status: str) -> str:
    exited, number = map(int, status.split())
    return ending_of(number << 8 if exited == 1 else number)


def test_every_device():
    chosen = {name: make() for name, make in CHOSEN.items()}
    links_of_two = {name: made(changes) for name, changes in MIXED.items()}
    system = System("chosen")
    image.build(system.third, Node("dir", 0o755, entries={
        "chosen": side_by_side.disk(chosen), "mixed": side_by_side.disk(links_of_two)}),
        64)

    def look():
        return [image.look(system.third, part, "") for part in ("/chosen", "/mixed")]

    before = look()
    seen = system.boot(PREPARE + side_by_side.each("/mnt/chosen/*", RUN) + WITH_THE_MEND
                       + side_by_side.each("/mnt/mixed/*", RUN) + "umount /mnt\n")
    print(seen.text("then"))
    looks, with_the_mend = zip(before, look())
    for name, make in CHOSEN.items():
        side_by_side.judge(name, make(), looks, ending)
    for name, changes in MIXED.items():
        device = made(changes)
        as_mended(f"/{side_by_side.directory(name)}", device, *with_the_mend)
        side_by_side.judge(name, device, with_the_mend, ending)


def as_mended(place: str, device: Device, before: Entries, after: Entries):
    """What was seen from the mend's end on, where there is no zoneinfo link."""
    device.drop(ZONEINFO)
    del before[place + ZONEINFO]
    for file, gone in ("listed", ZONEINFO + "\0"), ("log", MENDED):
        text = after[f"{place}/{file}"].text
        assert gone in text, text
        after[f"{place}/{file}"].text = text.replace(gone, "")
