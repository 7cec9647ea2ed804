# SPDX-License-Identifier: BSD-2-Clause
"""The sets of a device as its links name them, and what the programs between two boots
may do with each. Written from what is promised, by what is seen on the device alone."""

from lab.oracles import properties
from lab.oracles.installer import below, manifest
from lab.words.paths import (DOWNLOADS, ICUTZ, LEGACY_ICUTZ, LOCALTIME, TZ_LATEST,
                             ZONEINFO, update_path)
from lab.words.seen import Entries


def names_of(entries: Entries) -> list[str]:
    tz = entries.get(DOWNLOADS.rstrip("/"))
    return [name for name in tz.names if not name.startswith(".")] if tz else []


def link(entries: Entries, path: str) -> str:
    here = entries.get(path)
    return here.text if here and here.kind == "link" else ""


def set_of(entries: Entries, path: str) -> str:
    """The name of the set that a link leads into, by its text."""
    target = link(entries, path)
    return target[len(DOWNLOADS):].split("/")[0] if target.startswith(DOWNLOADS) else ""


def needed(entries: Entries) -> set[str]:
    links = ZONEINFO, ICUTZ, LOCALTIME, TZ_LATEST, LEGACY_ICUTZ
    return {set_of(entries, path) for path in links} - {""}


def whole(entries: Entries, name: str) -> bool:
    """Whether a set is as its manifest says."""
    path = update_path(name)
    files = {place[1:]: text for place, (kind, _, text) in below(entries, path).items()
             if kind == "file"}
    sums = files.pop("SHA256SUMS", None)
    return sums == manifest(files) and entries[path].mode == 0o755


def fits(sight: properties.Sight, name: str) -> bool:
    schema = sight.schema(update_path(name) + "/icutz")
    return bool(schema) and schema == sight.data_set("").schema


def is_newer(name: str, *than: str) -> bool:
    version = properties.version_of(name)
    return all(version > properties.version_of(other) for other in than)


def is_due(entries: Entries, name: str) -> bool:
    """Whether the next boot would take a set, if it were announced."""
    sight = properties.Sight(entries)
    in_use = set_of(entries, ZONEINFO) or sight.data_set("").text
    return is_newer(name, in_use) and fits(sight, name)


def is_welcome(entries: Entries, name: str) -> bool:
    """Whether an update is not refused for its age: what is in use or announced, and is
    not whole, gives way to itself."""
    sight, lost = properties.Sight(entries), not whole(entries, name)
    in_use, promised = (set_of(entries, path) for path in (ZONEINFO, TZ_LATEST))
    if lost and name == in_use:
        return True
    than = [in_use] * (update_path(in_use) in entries)
    if fits(sight, promised) and not (lost and name == promised):
        than.append(promised)
    return is_newer(name, sight.data_set("").text, *than)


def mixed(entries: Entries) -> bool:
    """Whether the two links are of different data."""
    tree = properties.data_set_of(link(entries, ZONEINFO))
    icu = entries.get(ICUTZ)
    if not icu and properties.Sight(entries).leads_somewhere(LEGACY_ICUTZ):
        # A boot moves a link, and removes all else.
        icu = entries[LEGACY_ICUTZ] if link(entries, LEGACY_ICUTZ) else None
    if tree is None or icu and icu.kind != "link":
        return False
    return icu is not None if tree == "" else not icu or icu.text != f"{tree}/icutz"
