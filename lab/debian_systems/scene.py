# SPDX-License-Identifier: BSD-2-Clause
"""What must be seen of every boot of a system, and the words that scenes use."""

import re

import pytest

from lab.carriers import real_data
from lab.debian_systems.machine import Seen, UNIT, message
from lab.words import lines
from lab.words.device import Device, sound_device
from lab.words.paths import DEFAULT_ZONE, DOWNLOADS, RECORD, TZ_LATEST

LOCALTIME_INVALID = lines.LOCALTIME_INVALID % DEFAULT_ZONE
NEW = (lines.BAD_LINK % "", lines.INVALID_LINKS, LOCALTIME_INVALID)
ZONE = "Europe/Lisbon"  # the one that an update changes


def names():
    return real_data.names()


def device(active=False, announced=False, zone=ZONE) -> Device:
    """Links as they are on a system: `names().update` is installed, and more."""
    made, update = sound_device(), names().update
    made.choose_zone(zone)
    if active:
        made.point_links_at(update)
    if announced:
        made.announce(update)
    return made


def linked(made: Device) -> str:
    """What a shell does in a root directory to have these links."""
    return "".join(f"mkdir -p .{path.rpartition('/')[0]}\nln -sfn '{text}' .{path}\n"
                   for path, text in links(made).items())


def links(made: Device) -> dict[str, str]:
    return {path: node.text for path, node in made.everything() if node.kind == "link"}


def install() -> str:
    """In the root directory of a system, booted or not."""
    return (f"mkdir -p .{DOWNLOADS}\n"
            f"cp -R usr/lib/lab/data/update .{DOWNLOADS}{names().update}\n")


def updated(made: Device | None = None) -> str:
    """An update is installed there, and announced, or the links are others."""
    return install() + linked(made or device(announced=True))


def install_and_announce() -> str:
    """On a booted system."""
    return f"cd /\n{install()}ln -sfn {DOWNLOADS}{names().update} {TZ_LATEST}\n"


def pattern(text: str) -> str:
    return re.escape(f"{lines.NAME}{text}: ") + "(" + "|".join(
        map(re.escape, sorted(lines.ERROR_TEXTS))) + ")"


def shortcomings(seen: Seen, printed, made: Device | None, record=None,
                 reader="13:00 WEST", ended=("success", "active", "0"),
                 failed=()) -> list[str]:
    """Where a boot is not as it must be. `printed` are texts of the program's, or
    whole lines that begin with a space; `ended` is how systemd puts it."""
    found = []

    def compare(what, got, wanted):
        if got != wanted:
            found.append(f"{what} is {got!r}, expected {wanted!r}")

    unit = seen.units[UNIT]
    compare("the unit's result, state and status",
            (unit["Result"], unit["ActiveState"], unit["ExecMainStatus"]), ended)
    compare("the number of starts", len(seen.started()), 1)
    times = [seen.at("local-fs.target", "ActiveEnter"),
             seen.at(UNIT, "ExecMainStart"),
             seen.at(UNIT, "ExecMainExit"), seen.at("sysinit.target", "ActiveEnter")]
    if times != sorted(times) or not all(times):
        found.append(f"the order of local-fs.target, {UNIT} and sysinit.target is not "
                     f"that of {times}")
    found += [f"the journal tells of a cycle: {message(entry)}"
              for entry in seen.journal if "ordering cycle" in message(entry)]
    compare("what failed", sorted(seen.failed()), sorted(failed))
    found += log_shortcomings(seen, printed)
    if made:
        compare("what the links say", {path: text for path, text in seen.links.items()
                                       if path.count("/") < 5}, links(made))
    if record is not None:
        compare("the record", seen.text(RECORD), record)
    if reader:
        compare("what a reader sees", seen.text("reader").strip(), reader)
    return found


def log_shortcomings(seen: Seen, printed) -> list[str]:
    """Whole lines, in order, each the program's, or the mend's, and a warning."""
    found, said = [], seen.said_by(_SYSTEMD_UNIT=UNIT)
    for entry in said:
        of = entry.get("SYSLOG_IDENTIFIER"), entry.get("PRIORITY"), entry["_TRANSPORT"]
        mend = message(entry).startswith("marlin-mend: ")
        if of != ("marlin-mend" if mend else "marlin", "4", "stdout"):
            found.append(f"a line is {of}: {message(entry)!r}")
    got = [message(entry) for entry in said]
    wanted = [re.escape(text[1:]) if text.startswith(" ") else pattern(text)
              for text in printed]
    if len(got) != len(wanted) or not all(map(re.fullmatch, wanted, got)):
        found.append(f"the program's lines are {got}, expected {list(printed)}")
    return found


def insist(seen: Seen, *arguments, **more):
    fail(seen, shortcomings(seen, *arguments, **more))


def fail(seen: Seen, found: list[str]):
    if found:
        about = [f"  {entry['PRIORITY']} {message(entry)}" for entry in seen.journal
                 if UNIT in (entry.get("UNIT"), entry.get("_SYSTEMD_UNIT"))
                 or "marlin" in message(entry)]
        pytest.fail("\n".join([*found, "The journal:", *about[:60],
                               "What the system was told to do, and printed:",
                               seen.text("then")[-1500:]]), False)
