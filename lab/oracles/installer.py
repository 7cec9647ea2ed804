# SPDX-License-Identifier: BSD-2-Clause
"""The installer of updates on the device of this namespace, and what must hold after
each run of it, however it ended."""

import hashlib
import os
import time

from lab.carriers import boot, namespace
from lab.oracles.trial import fail, trial
from lab.words.device import Device, encoded, sound_device
from lab.words.paths import (DOWNLOADS, ICUTZ, LOCALTIME, RECORD, TIMEZONE, TZ_LATEST,
                             ZONEINFO, update_path)
from lab.words.seen import Call, Entries, as_device

PROGRAM = os.path.join(os.path.dirname(boot.PROGRAM), "tools/marlin-install")
OLD, NEW = "2024a.1.0", "2024b.1.0"
SOURCE = "/var/db/incoming/" + NEW
HIDDEN = ".marlin-install."
NOT_ITS_OWN = (ZONEINFO, ICUTZ, LOCALTIME, RECORD)
DONE, FAILED, BAD_USE, BUSY, NOT_NEWER = (f"exit {status}" for status in range(5))


def manifest(files: dict[str, str]) -> str:
    """What sha256sum(1) prints of these files; contents by path."""
    return "".join(f"{hashlib.sha256(encoded(content)).hexdigest()}  {path}\n"
                   for path, content in sorted(files.items()))


def put_update(device: Device, place: str, release: str, text="", more=None,
               schema="44l"):
    """Three zones and a table in two directories, more files, and the manifest."""
    files = {f"icutz/icutz{schema}.dat": f"ICU {release}{text}",
             "zoneinfo/+VERSION": f"{release}\n",
             "zoneinfo/America/Los_Angeles": f"TZif {text}, west",
             "zoneinfo/Europe/Paris": f"TZif {text}, east",
             "zoneinfo/MET": f"TZif {text}, east"} | (more or {})
    for path, content in (files | {"SHA256SUMS": manifest(files)}).items():
        device.file(f"{place}/{path}", content)


def first() -> Device:
    """The first update of a device."""
    device = sound_device()
    device.directory(DOWNLOADS)
    put_update(device, SOURCE, "2024b")
    return device


def next_one() -> Device:
    """Another is in use and announced; a third is needed no more; and somebody was
    stopped here before, in the middle and shortly before the end."""
    device = first()
    for name in (OLD, "2023d.1.0", NEW):
        put_update(device, update_path(name), name[:5], "older")
    device.drop(f"{update_path(NEW)}/zoneinfo")
    device.point_links_at(OLD)
    device.announce(OLD)
    device.file(f"{DOWNLOADS}{HIDDEN}new/zoneinfo/Europe/Paris", "TZ")
    device.link(f"{TIMEZONE}/{HIDDEN}tz_latest", update_path(NEW))
    return device


def damaged() -> Device:
    """The set that is in use is not whole, and a part of it is gone."""
    device = first()
    put_update(device, update_path(NEW), "2024b")
    device.drop(f"{update_path(NEW)}/zoneinfo/America")
    device.point_links_at(NEW)
    device.announce(NEW)
    return device


def booted() -> Device:
    """What was announced is in use."""
    device = next_one()
    put_update(device, update_path(NEW), "2024b")
    device.point_links_at(NEW)
    device.announce(NEW)
    return device


SCENES = {
    "a first update": (first, [SOURCE]),
    "the next update": (next_one, ["--verify", "/usr/bin/true", SOURCE]),
    "putting back": (damaged, [SOURCE]),
    "pruning": (next_one, ["--prune"]),
    "withdrawing": (next_one, ["--withdraw"]),
    "settling": (booted, ["--settle"]),
}


def run(words: list[str]) -> boot.Booted:
    return boot.run(PROGRAM, *words)


def traced(words: list[str], *options: str) -> boot.Booted:
    return boot.traced(*options, command=[PROGRAM, *words])


def calls(scene: str) -> list[Call]:
    """The system calls of an undisturbed run."""
    make, words = SCENES[scene]
    namespace.build(make())
    traced(words)
    return list(boot.calls())


def below(entries: Entries, place: str) -> dict:
    """What is below a place, by the path from there; owners do not count."""
    return {path.removeprefix(place): (here.kind, here.mode, here.text)
            for path, here in entries.items() if path.startswith(place + "/")}


def names(entries: Entries) -> list[str]:
    return entries[DOWNLOADS.rstrip("/")].names


def hidden(entries: Entries) -> list[str]:
    return [name for name in names(entries) + entries[TIMEZONE].names
            if name.startswith(HIDDEN)]


def announced(entries: Entries) -> str | None:
    return entries[TZ_LATEST].text if TZ_LATEST in entries else None


def announced_at_the_end(words: list[str], before: Entries) -> str | None:
    return {"--prune": announced(before), "--withdraw": None, "--settle": None}.get(
        words[0], update_path(NEW))


def violations(words: list[str], before: Entries, after: Entries) -> list[str]:
    """What must not be after anything that happened to the installer."""
    found = [f"{path} was changed" for path in NOT_ITS_OWN
             if (before.get(path) and before[path].identity) !=
             (after.get(path) and after[path].identity)]
    source = below(before, SOURCE)
    if below(after, SOURCE) != source:
        found.append("the update itself was changed")
    for name in names(after):
        here, was = (below(entries, DOWNLOADS + name) for entries in (after, before))
        is_update = name == NEW and here == source
        if not name.startswith(HIDDEN) and here != was and not is_update:
            found.append(f"{name} is neither what it was nor the update")
    target = announced(after)
    if target not in (announced(before), announced_at_the_end(words, before)):
        found.append(f"{target} is announced")
    if target == update_path(NEW) and below(after, target) not in (
            source, announced(before) == target and below(before, target)):
        found.append(f"{NEW} is announced and not whole")
    if target and target not in after:
        found.append(f"{target} is announced and gone")
    return found


def next_boot(entries: Entries):
    """The next boot takes what is announced, or stays, as the model does."""
    trial(as_device(entries), tell="the next boot", again=True)


def runs_again(words: list[str], before: Entries):
    """Undisturbed: brings it to its end, and nothing is left behind. Where a listing
    broke off, and all is settled for the installer, a pruning finds the rest. The child
    of one that was killed has the lock until it executes sha256sum(1)."""
    settled = words[0] == "--settle" and not announced(namespace.look())
    again = run(["--prune"] if settled else words)
    for _ in range(50):
        if again.ending == BUSY:
            time.sleep(0.02)
            again = run(["--prune"] if settled else words)
    after = namespace.look()
    found = violations(words, before, after)
    found += [f"{name} is left" for name in hidden(after)]
    if again.ending not in (DONE, NOT_NEWER):
        found.append(f"the next run ends with {again.ending}: {again.log}")
    if announced(after) != announced_at_the_end(words, before):
        found.append(f"after the next run {announced(after)} is announced")
    if words[0] in ("--prune", "--settle") and set(names(after)) - {OLD, NEW}:
        found.append(f"the next run leaves {names(after)}")
    fail("the next run", found, before)
