# SPDX-License-Identifier: BSD-2-Clause
"""What the boot unit's restrictions cost: side by side, in one boot of a system, the
program is started under variants of the unit, in turn.

The emulator makes the system's clock from instructions, a nanosecond each: a figure is
the same under every load of this machine."""

import re
import statistics

from lab.carriers.qemu import COUNTED
from lab.debian_systems.machine import System, UNIT
from lab.debian_systems.parts import CHOSEN, prepare
from lab.debian_systems.scene import device, linked

STARTS = 20
PROPERTIES = ("Id,Result,CPUUsageNSec,InactiveExitTimestampMonotonic,"
              "ActiveEnterTimestampMonotonic")

# Each variant is the installed unit, changed by a script for sed. All stay active until
# they are told of, so that nothing is forgotten.
MEASURE = """
cd /run/systemd/system
{variants}
systemctl daemon-reload
units=$(echo v*.service)
for start in $(seq {starts}); do
  for unit in $units; do systemctl start $unit; done
  systemctl show --property={properties} $units
  echo
  systemctl stop $units
done >/run/lab/seen/costs
for unit in $units; do
  systemd-analyze security --no-pager $unit | tail -n 1
done >/run/lab/seen/exposure 2>&1
"""
VARIANT = "sed -E '/^Refuse/d;{change}' /usr/lib/systemd/system/{unit} >{file}\n"

CALLS = "|SystemCallFilter|SystemCallArchitectures|SystemCallErrorNumber"
ONLY = r"/^\[Service/,${{/^(\[Service.|(Type|RemainAfterExit|ExecStart|SyslogLevel|" \
       r"SyslogLevelPrefix{})=)/!d}}"
STAYS = ("MemoryDenyWriteExecute", "RestrictAddressFamilies", "RestrictSUIDSGID",
         "DevicePolicy", "ReadOnlyPaths")
LEFT_OUT = ("LockPersonality", "RestrictRealtime", "RestrictNamespaces", "PrivateIPC",
            "PrivateNetwork", "PrivateDevices", "PrivateTmp", "ProtectHome",
            "ProtectHostname", "ProtectClock", "ProtectKernelLogs")
VARIANTS = {
    "no restriction": ONLY.format(""),
    "the list of system calls alone": ONLY.format(CALLS),
    "as shipped": "", "without the three empty places": "/^BindPaths=\\//d",
    **{f"without {key}": f"/^{key}=/d" for key in STAYS},
    **{f"with {line}": f"$a{line}" for line in (
        *(f"{key}=yes" for key in LEFT_OUT), "ProtectSystem=strict")}}


def measure():
    prepare()
    system = System("cost", linked(device()))
    print(f"{'ms of ' + CHOSEN.name:66}{'processor':>10}{'wall':>8}{'exposure':>9}")
    for name, (cpu, wall, rating) in measured(system).items():
        print(f"{name:66}{cpu:10.1f}{wall:8.1f}{rating:>9}", flush=True)


def measured(system: System):
    """By name: medians of processor time and wall in ms, and systemd's rating."""
    names = {f"v{number:02}.service": name for number, name in enumerate(VARIANTS)}
    variants = "".join(VARIANT.format(change=VARIANTS[name], unit=UNIT, file=file)
                       for file, name in names.items())
    seen = system.boot(
        MEASURE.format(variants=variants, starts=STARTS, properties=PROPERTIES),
        more=COUNTED, seconds=7200)
    found = {name: ([], []) for name in VARIANTS}
    for block in seen.text("costs").strip().split("\n\n"):
        told = dict(line.split("=", 1) for line in block.splitlines())
        if told["Result"] != "success":
            raise RuntimeError(f"{names[told['Id']]}: {told}")
        cpu, wall = found[names[told["Id"]]]
        cpu.append(int(told["CPUUsageNSec"]) / 1e6)
        wall.append((int(told["ActiveEnterTimestampMonotonic"]) -
                     int(told["InactiveExitTimestampMonotonic"])) / 1e3)
    rated = dict(re.findall(r"for (v\d\d\.service): ([\d.]+)", seen.text("exposure")))
    return {name: (statistics.median(found[name][0]), statistics.median(found[name][1]),
                   rated.get(file, "?")) for file, name in names.items()}
