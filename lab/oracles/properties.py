# SPDX-License-Identifier: BSD-2-Clause
"""What has to hold of any boot: what, not how.

The second of two oracles. It looks only at what a boot found, left and printed: what
may be in use, what may be activated, what the record says, which line follows which,
that every reset, refusal and correction has its reason, and that nothing else is
touched. It knows nothing of the model's boot, so that a mistake that the model and the
program share is noticed.
"""

import os
import re
from typing import NamedTuple

from lab.words import lines
from lab.words.paths import (DEFAULT_LOCALTIME, DEFAULT_ZONE, DOWNLOADS,
                             FORMER_ZONEINFO, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU,
                             RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TIMEZONE, TZ_LATEST,
                             ZONEINFO)
from lab.words.seen import Entries, Seen, as_device

# --- What a boot prints ------------------------------------------------------

# Every line, by a letter; the first text that fits counts.
LETTERS = {
    "r": lines.READ_SYMLINK, "c": lines.CREATE_SYMLINK, "u": lines.REMOVE,
    "m": lines.NOT_MIGRATED, "l": lines.LEGACY_NOT_REMOVED,
    "z": lines.ZONEINFO_NOT_UNLINKED, "i": lines.ICU_NOT_UNLINKED,
    "v": lines.VERSION_GROUPS, "w": lines.VERSION, "n": lines.NO_SCHEMA,
    "f": lines.WALK_NOT_STARTED,
    "b": lines.BAD_LINK, "p": lines.BAD_PATH, "I": lines.INVALID_LINKS,
    "S": lines.INCOMPATIBLE, "U": lines.NO_DATA, "N": lines.NOT_NEWER,
    "C": lines.CORRECTING, "D": lines.LOCALTIME_INVALID % DEFAULT_ZONE}
PATTERNS = {letter: re.compile(lines.pattern(text), re.DOTALL)
            for letter, text in LETTERS.items()}
LINE = re.compile(f"{lines.NAME}(.*?): (%s)\n" % "|".join(
    map(re.escape, sorted(lines.ERROR_TEXTS))), re.DOTALL)

# What a step of a boot may print, in letters.
VERSION = "(vw)?"  # reads a version
START = "([rc]m)?(ul)?" + VERSION  # moves the legacy link, reads the system's
DATA_SET = VERSION + "n?"  # reads a data set
RESET = VERSION + "(ui)?"
LOST = f"([rb]I{RESET}{VERSION}|{DATA_SET}S{RESET})"  # gives up what is in use
REFUSED = f"({DATA_SET}N)?"
ACTIVATED = "n?(ui)?"
ZONE = "(C|[rC]?D)?"

# What a boot can come to, and what it may print then.
OUTCOMES = {
    "untouched": START + DATA_SET + REFUSED,
    "links kept": START + DATA_SET + REFUSED + ZONE,
    "reset": START + LOST + REFUSED + ZONE,
    "activation": START + DATA_SET + ACTIVATED + ZONE,
    "reset and activation": START + LOST + ACTIVATED + ZONE,
    # Without memory a walk is not started: "f".
    "last resort":
        f"{START}(r|f|({DATA_SET}|{LOST})([pf]|{ACTIVATED}c)?)U{RESET}{ZONE}",
    # The last resort fails, without a word where the system's release has a
    # number that is too great; or the repair of the local time fails.
    "abort": f"{START}[^UCD]*(U({VERSION}(uz)?c)?|(U{RESET})?(r|Cc?)?Dc)",
}


def letters(log, ending):
    """A log in letters; "?" is what no boot prints."""
    found, end = "", 0
    while line := LINE.match(log, end):
        found += next((letter for letter, form in PATTERNS.items()
                       if form.fullmatch(line[1])), "?")
        end = line.end()
    # The runtime's own words on an exception that nobody caught may follow.
    only_the_runtime = ending == "abort" and not log.startswith(lines.NAME, end)
    return found if end == len(log) or only_the_runtime else found + "?"


# --- What a device says ------------------------------------------------------


class DataSet(NamedTuple):
    text: str
    version: tuple
    schema: str


class Sight:
    """A device as it was seen, and what a program can read there."""
    def __init__(self, entries: Entries):
        # Everything below "/var/db/timezone" has that name here, also where that is
        # a link to another directory.
        if TIMEZONE in entries and entries[TIMEZONE].text == "moved":
            entries = {re.sub("^/var/db/moved", TIMEZONE, path): here
                       for path, here in entries.items() if path != TIMEZONE}
        self.entries = entries
        self.device = as_device(entries)

    def kind(self, path):
        return self.entries[path].kind if path in self.entries else None

    def link(self, path):
        """The target of a link as far as a program reads it, or None."""
        return self.entries[path].text[:1024] if self.kind(path) == "link" else None

    def find(self, path, follow=True):
        """(directory, node), each None where a program finds none."""
        try:
            directory, _, node = self.device.walk(path, follow)
            return directory, node
        except OSError:
            return None, None

    def leads_somewhere(self, path):
        return self.find(path)[1] is not None

    def can_be_made(self, path):
        directory, node = self.find(path, follow=False)
        return directory is not None and directory.permits(3) and node is None

    def can_go(self, path):
        directory, node = self.find(path, follow=False)
        return node is not None and node.kind != "dir" and directory.permits(3)

    def can_be_written(self, path):
        directory, node = self.find(path)
        if node is None:
            return directory is not None and directory.permits(3)
        return node.kind == "file" and node.permits(2)

    def first_word(self, path):
        node = self.find(path)[1]
        readable = node is not None and node.kind == "file" and node.permits(4)
        words = re.findall(r"[^ \t-\r]+", node.text) if readable else []
        return words[0] if words else ""

    def schema(self, directory):
        """That of the first file of ICU data, in the order of the directory."""
        node = self.find(directory)[1]
        if node is not None and node.kind == "dir" and node.permits(5):
            for name, entry in node.entries.items():
                match = re.fullmatch(r"icutz([0-9]+[lbe])\.dat", name)
                if match and entry.kind == "file" and entry.mode & 0o004:
                    return match[1]
        return ""

    def data_set(self, path):
        """None for a version with a number that is too great."""
        if path == "":
            text = self.first_word(SYSTEM_ZONEINFO + "/+VERSION") + ".1.0"
            schema = self.first_word(SYSTEM_ICU + "/icutzformat.txt")
        else:
            text = path[len(DOWNLOADS):]
            schema = self.schema(path + "/icutz")
        version = version_of(text)
        return DataSet(text, version, schema) if version else None


def version_of(text):
    """Compares as versions do; None for a number that is too great."""
    match = re.fullmatch(r"0*([0-9]+)([a-z]+)(?:\.0*([0-9]+))?(?:\.0*([0-9]+))?", text)
    if not match:
        return -1, "", -1, -1
    year, name, major, minor = match.groups("-1")
    if any(len(number) > 10 or int(number) >= 1 << 31
           for number in (year, major, minor)):
        return None
    return int(year), name, int(major), int(minor)


def shown(text):
    """As printf shows a text: up to its first NUL."""
    return text.partition("\0")[0]


def is_download(path):
    return path.startswith(DOWNLOADS) and len(path) > len(DOWNLOADS)


def data_set_of(zoneinfo):
    """The path of the data set that a link to a tree names: of the system
    partition's the empty one; None where it names none."""
    if zoneinfo == SYSTEM_ZONEINFO:
        return ""
    path = (zoneinfo or "").rpartition("/")[0]
    return path if is_download(path) else None


# --- Properties --------------------------------------------------------------


class Judged:
    """A boot from outside: what it found, what it left, what it printed."""

    def __init__(self, seen: Seen):
        self.seen = seen
        self.before, self.after = before, after = Sight(seen.before), Sight(seen.after)
        self.log, self.ending = seen.log, seen.ending
        self.lines = letters(seen.log, seen.ending)
        self.changed = Seen(before.entries, after.entries, "", "").changed()
        self.relinked = ZONEINFO in self.changed
        self.activated = (self.relinked and
                          after.link(ZONEINFO) not in (None, SYSTEM_ZONEINFO))

        self.system = before.data_set("")
        named = data_set_of(before.link(ZONEINFO))
        self.current_is_named = named is not None
        self.current = before.data_set(named or "")
        # Empty: nothing; None: what cannot be read.
        self.announced = (before.link(TZ_LATEST) if TZ_LATEST in before.entries else "")
        self.update = (before.data_set(self.announced)
                       if is_download(self.announced or "") else None)

    @property
    def outcome(self):
        if self.ending == "abort":
            return "abort"
        if "U" in self.lines:
            return "last resort"
        if not self.relinked:
            return "links kept" if self.changed else "untouched"
        reset = "I" in self.lines or "S" in self.lines or not self.activated
        return " and ".join(["reset"] * reset + ["activation"] * self.activated)

    def fits_the_system(self, data_set):
        """Whether a data set may stay in use."""
        return (data_set and self.system and data_set.schema == self.system.schema
                and data_set.version >= self.system.version)


def shortcomings(boot: Judged, *without) -> list[str]:
    """What does not hold of an undisturbed boot of any device, without some rules."""
    rules = [of_the_log, of_the_legacy_link, of_obsolete_icu, of_activation,
             of_the_record, of_everything_else]
    if boot.ending == "exit 0" and boot.system:
        rules += [of_the_choice, of_zoneinfo, of_localtime]
    return [f"does not hold: {what}"
            for rule in rules if rule not in without
            for what, holds in rule(boot) if not holds]


def of_the_log(boot):
    yield (f"{boot.outcome} can print {boot.lines}",
           re.fullmatch(OUTCOMES[boot.outcome], boot.lines))
    yield f"it ends with {boot.ending}", boot.ending == (
        "abort" if boot.lines.endswith("c") or not boot.system else "exit 0")


def of_the_choice(boot):
    """A reset, a refusal, an activation: exactly where there is a reason."""
    current, update, system = boot.current, boot.update, boot.system
    better = (current and update and update.schema == system.schema
              and update.version > current.version)
    hopeless = (boot.announced != "" and not update or not current
                or better and boot.before.kind(ICUTZ) == "dir")
    yield "the last resort is for what cannot be read or linked", (
        ("U" in boot.lines) == bool(hopeless))
    if hopeless:
        return
    yield "links are invalid if they name no data set", (
        ("I" in boot.lines) == (not boot.current_is_named))
    yield "data is given up if it is older than the system's, or does not fit", (
        ("S" in boot.lines) == (not boot.fits_the_system(current)))
    yield "a better update is activated", boot.activated == bool(better)
    yield "an update that is not better is refused", (
        ("N" in boot.lines) == bool(update and not better))
    if "N" in boot.lines:
        yield "the refusal names both versions", (
            lines.NOT_NEWER % (shown(update.text), shown(current.text)) in boot.log)


def of_zoneinfo(boot):
    target = boot.after.link(ZONEINFO)
    path = data_set_of(target)
    yield "zoneinfo names the system's tree, or an update that fits or is new", (
        target == SYSTEM_ZONEINFO or boot.activated
        or path and boot.fits_the_system(boot.before.data_set(path)))


def of_activation(boot):
    if not boot.activated:
        return
    current, update = boot.current, boot.update
    yield "what is activated was announced", update and (
        boot.after.link(ZONEINFO) == boot.announced + "/zoneinfo"
        and boot.after.link(ICUTZ) == boot.announced + "/icutz")
    yield "what is activated is of the system's schema", (
        update and boot.system and update.schema == boot.system.schema)
    yield "what is activated is newer than what the links named", (
        update and current and update.version > current.version)


def of_the_record(boot):
    link = boot.before.link(RECORD)
    record = os.path.join(os.path.dirname(RECORD), link) if link else RECORD
    if boot.activated and boot.before.can_be_written(RECORD):
        # Where the current data was given up, the system's was active in between.
        active = boot.system if "S" in boot.lines else boot.current
        yield "the record names what was active and the update", (
            active and boot.update and record in boot.after.entries
            and boot.after.entries[record].text == f"{active.text}_{boot.update.text}")
    else:
        yield "without an activation the record stays", record not in boot.changed


def of_the_legacy_link(boot):
    """It moves to icutz, and goes even if it cannot move. One that leads nowhere
    stays until the other links are made anew."""
    before, after = boot.before, boot.after
    stands = before.leads_somewhere(LEGACY_ICUTZ)
    moves = stands and not before.leads_somewhere(ICUTZ)
    can_move = (before.link(LEGACY_ICUTZ) is not None and before.can_be_made(ICUTZ))
    in_the_way = before.kind(ICUTZ) == "dir"
    yield "only what cannot move is reported", (
        ("m" in boot.lines) == (moves and not can_move))
    yield "only a legacy link that cannot go is reported", (
        ("l" in boot.lines) == (stands and not before.can_go(LEGACY_ICUTZ)))
    if before.can_go(LEGACY_ICUTZ) and (stands or boot.relinked and not in_the_way):
        yield "the legacy link goes", LEGACY_ICUTZ not in after.entries
    else:
        yield "the legacy link stays", LEGACY_ICUTZ not in boot.changed

    if boot.relinked and not boot.activated and not in_the_way:
        yield "a reset leaves no icutz", ICUTZ not in after.entries
    elif moves and can_move and not boot.relinked:
        yield "icutz is what the legacy link was", (
            after.link(ICUTZ) == before.link(LEGACY_ICUTZ))
    elif not boot.relinked:
        yield "icutz stays", ICUTZ not in boot.changed


def of_obsolete_icu(boot):
    before = boot.before
    directory, node = before.find(OLD_ICU, follow=False)
    empty = node is not None and node.kind == "dir" and not node.entries
    if before.can_go(OLD_ICU) or empty and directory.permits(3):
        yield '"/var/db/icu" goes', OLD_ICU not in boot.after.entries
    else:
        yield '"/var/db/icu" stays', OLD_ICU not in boot.changed


def of_localtime(boot):
    old = boot.before.link(LOCALTIME) or ""
    new = boot.after.link(LOCALTIME)
    if old.startswith(ZONEINFO):
        yield "localtime stays", LOCALTIME not in boot.changed
        return
    corrected = ZONEINFO + old.removeprefix(FORMER_ZONEINFO)
    is_former = old.startswith(FORMER_ZONEINFO)
    yield "only a former localtime is corrected", ("C" in boot.lines) == is_former
    if is_former and boot.after.leads_somewhere(corrected):
        yield "localtime is corrected", new == corrected and "D" not in boot.lines
    else:
        yield "localtime is the default", (
            new == DEFAULT_LOCALTIME and "D" in boot.lines)


def of_everything_else(boot):
    """Data, other people's files, "tz_latest": down to their identity."""
    own = {ZONEINFO, ICUTZ, LOCALTIME, LEGACY_ICUTZ, OLD_ICU, RECORD}
    if boot.before.link(RECORD) == "record.real":
        own.add(os.path.dirname(RECORD) + "/record.real")
    directories = {os.path.dirname(path) for path in boot.changed & own}
    for path in sorted(boot.changed - own - directories):
        yield f"{path} is not touched", False
    if LOCALTIME in boot.changed:
        yield "localtime is not changed without a word", (
            "C" in boot.lines or "D" in boot.lines)


# --- Of a sound device, after any boot before ----------------------------------------

OWN = {ZONEINFO, ICUTZ, LOCALTIME, RECORD}


def not_ready(seen: Seen) -> list[str]:
    """What readers of time-zone data miss after an undisturbed boot."""
    after, found = Sight(seen.after), []
    if seen.ending != "exit 0":
        found.append(f"ended with {seen.ending}")
    path = data_set_of(after.link(ZONEINFO))
    if path is None or path != "" and (
            "/" in path.removeprefix(DOWNLOADS) or
            after.schema(path + "/icutz") != after.data_set("").schema):
        found.append("zoneinfo names no usable tree")
    if not (after.link(LOCALTIME) or "").startswith(ZONEINFO):
        found.append("localtime is not accepted")
    return found


def data_changes(start: Entries, after: Entries) -> list[str]:
    """Changes of data sets, of the announcement, and files that nobody put there; also
    right after a kill."""
    found = []
    for path in sorted(start.keys() | after.keys()):
        here, was = after.get(path), start.get(path)
        if path == TZ_LATEST or path.startswith(("/usr/share", DOWNLOADS)):
            if not (here and was and here.identity == was.identity and
                    here.text == was.text):
                found.append(f"{path} has changed")
        elif was is None and path not in OWN:
            found.append(f"{path} is a stray file")
    return found


def changed_by_a_settled_boot(boot: Judged) -> list[str]:
    """What was changed, though nothing was left to do: a last resort at every boot
    makes one link anew, in its directory."""
    ignored = {ZONEINFO, TIMEZONE} if "U" in boot.lines else set()
    return [f"a settled device: {path} was changed"
            for path in sorted(boot.changed - ignored)]
