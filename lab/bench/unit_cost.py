# SPDX-License-Identifier: BSD-2-Clause
"""What the boot unit's restrictions cost: side by side, in one boot of a system, the
program is started under variants of the unit, in turn.

The emulator makes the system's clock from instructions, a nanosecond each: a figure is
the same under every load of this machine."""

import re
import statistics

from lab.carriers.qemu import COUNTED
from lab.debian_systems.machine import System
from lab.debian_systems.parts import CHOSEN, prepare
from lab.debian_systems.scene import device, linked
from lab.words.places import PROJECT

STARTS = 20
PROPERTIES = ("Id,Result,CPUUsageNSec,InactiveExitTimestampMonotonic,"
              "ActiveEnterTimestampMonotonic")

# Every unit stays active until all are told of, so that nothing is forgotten.
MEASURE = f"""
mkdir -p /run/systemd/system
cd /run/lab/units && cp * /run/systemd/system && systemctl daemon-reload
units=$(echo *)
for start in $(seq {STARTS}); do
  for unit in $units; do systemctl start $unit; done
  systemctl show --property={PROPERTIES} $units
  echo
  systemctl stop $units
done >/run/lab/seen/costs
for unit in $units; do
  systemd-analyze security --no-pager $unit | tail -n 1
done >/run/lab/seen/exposure 2>&1
"""


def service(lines: list[str]) -> str:
    """A unit with these lines in its section, and otherwise as the shipped one."""
    return "\n".join(["[Unit]", "DefaultDependencies=no", "[Service]", *lines, ""])


def section(unit: str) -> list[str]:
    """The lines that set something for the program."""
    return re.findall(r"^[A-Z]\w*=.*$", unit.partition("\n[Service]\n")[2], re.M)


def without(lines: list[str], *keys: str) -> list[str]:
    return [line for line in lines if line.partition("=")[0] not in keys]


def only(lines: list[str], *keys: str) -> list[str]:
    return [line for line in lines if line.partition("=")[0] in keys]


CALLS = ("SystemCallFilter", "SystemCallArchitectures", "SystemCallErrorNumber")
PROGRAM = ("Type", "RemainAfterExit", "ExecStart", "SyslogLevel", "SyslogLevelPrefix")
STAYS = ("MemoryDenyWriteExecute", "RestrictAddressFamilies", "RestrictSUIDSGID",
         "DevicePolicy", "ReadOnlyPaths")
LEFT_OUT = ("LockPersonality", "RestrictRealtime", "RestrictNamespaces", "PrivateIPC",
            "PrivateNetwork", "PrivateDevices", "PrivateTmp", "ProtectHome",
            "ProtectHostname", "ProtectClock", "ProtectKernelLogs")


def shipped() -> list[str]:
    text = (PROJECT / "packaging/marlin.service.in").read_text()
    for name, value in (("CMAKE_INSTALL_FULL_LIBEXECDIR", "/usr/libexec"),
                        ("MARLIN_ROOT", "/usr/lib/marlin"), ("MARLIN_LIBRARIES", "")):
        text = text.replace(f"@{name}@", value)
    return section(text)


def variants() -> dict[str, list[str]]:
    unit = shipped()
    return {
        "no restriction": only(unit, *PROGRAM),
        "the list of system calls alone": only(unit, *PROGRAM, *CALLS),
        "as shipped": unit,
        "without the three empty places": [
            line for line in unit if not line.startswith("BindPaths=/")],
        **{f"without {key}": without(unit, key) for key in STAYS},
        **{f"with {key}": [*unit, f"{key}=yes"] for key in LEFT_OUT},
        "with ProtectSystem=strict": [*unit, "ProtectSystem=strict"],
    }


def measure():
    prepare()
    system = System("cost", linked(device()))
    print(f"{'ms of ' + CHOSEN.name:66}{'processor':>10}{'wall':>8}{'exposure':>9}")
    for name, (cpu, wall, rating) in measured(system, variants()).items():
        print(f"{name:66}{cpu:10.1f}{wall:8.1f}{rating:>9}", flush=True)


def written(units: dict[str, str]) -> str:
    """A shell's words that write these files."""
    return "mkdir -p /run/lab/units\n" + "".join(
        f"cat >/run/lab/units/{name} <<'END-OF-UNIT'\n{text}END-OF-UNIT\n"
        for name, text in units.items())


def measured(system: System, variants: dict[str, list[str]]):
    """By name: medians of processor time and wall in ms, and systemd's rating."""
    names = {f"v{number:02}.service": name for number, name in enumerate(variants)}
    units = {file: service(variants[name]) for file, name in names.items()}
    seen = system.boot(written(units) + MEASURE, more=COUNTED, seconds=7200)
    found = {name: ([], []) for name in variants}
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
