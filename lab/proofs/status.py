# SPDX-License-Identifier: BSD-2-Clause
"""What marlin-status says of a device, and of its next boot, is so: it is asked, and
then the device is really booted. Asking leaves no trace on the device.

This takes a user who may have namespaces and is not root: lab.doors.prove starts it so.
"""

import collections
import contextlib
import functools
import itertools
import json
import os
import random
import re
import shutil
import stat
import struct
import subprocess
import tarfile
import termios
from errno import ENOENT
from pathlib import Path
from typing import NamedTuple

import jsonschema
import pytest

from lab.carriers import boot, namespace
from lab.oracles.properties import version_of
from lab.oracles.trial import fail
from lab.words import lines
from lab.words.chosen_devices import CHOSEN
from lab.words.device import Device, Node, sound_device
from lab.words.paths import (DOWNLOADS, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, PLACES,
                             RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TIMEZONE, TZ_LATEST,
                             ZONEINFO, update_path)
from lab.words.places import BUILD, PROJECT
from lab.words.random_devices import compose
from lab.words.seen import Entries, Seen, as_device

SCHEMA = json.loads((PROJECT / "docs/marlin-status.schema.json").read_text())
STATUS = os.path.join(os.path.dirname(boot.PROGRAM), "tools", "marlin-status")
BLOCK = 50
NAMES = {"zoneinfo": ZONEINFO, "icutz": ICUTZ, "localtime": LOCALTIME,
         "tz_latest": TZ_LATEST, "record": RECORD, "legacy_icutz": LEGACY_ICUTZ,
         "old_icu": OLD_ICU}


def closed(schema):
    """The same, in which no other names may be."""
    if isinstance(schema, list):
        return [closed(part) for part in schema]
    if not isinstance(schema, dict):
        return schema
    parts = {name: closed(part) for name, part in schema.items()}
    return parts | {"additionalProperties": False} if "properties" in parts else parts


VALIDATOR = jsonschema.Draft202012Validator(closed(SCHEMA))


class Answer(NamedTuple):
    status: int
    output: str
    errors: str

    @property
    def said(self) -> dict:
        said = json.loads(self.output)
        VALIDATOR.validate(said)
        return said


def ask(*options: str) -> Answer:
    namespace.insist_on_private_device()
    done = subprocess.run([STATUS, *options], capture_output=True, timeout=30)
    return Answer(done.returncode, done.stdout.decode("ascii"),
                  done.stderr.decode("latin-1"))


def unescaped(text: str) -> str:
    return re.sub(r"\\(?:x([0-9a-f]{2})|(\\))",
                  lambda match: chr(int(match[1], 16)) if match[1] else "\\", text)


def times(*places: str) -> dict[bytes, tuple]:
    """Of access, too. Asked without a look that would change them."""
    found = {}
    for place in places:
        for folder, folders, names in os.walk(os.fsencode(place)):
            for path in [folder, *(os.path.join(folder, name)
                                   for name in folders + names)]:
                with contextlib.suppress(PermissionError):
                    status = os.lstat(path)
                    found[path] = (status.st_ino, status.st_atime_ns,
                                   status.st_mtime_ns, status.st_ctime_ns,
                                   status.st_mode)
    return found


# --- What was said, against what there is ------------------------------------------


def said_of(entry: dict) -> tuple:
    return entry["kind"], unescaped(entry.get("target", ""))


def really(device: Device, path: str) -> Node | None:
    """What is there, through links of directories; None if that cannot be asked."""
    try:
        return device.walk(path, follow=False)[2] or Node("none")
    except OSError as failed:
        return Node("none") if failed.errno == ENOENT else None


def link_differences(said: dict, entries: Entries) -> list[str]:
    found = []
    device = as_device(entries)
    kinds = {"dir": "directory", "fifo": "special", "socket": "special"}
    for name, path in NAMES.items():
        node = really(device, path) or Node("unknown")
        kind = kinds.get(node.kind, node.kind)
        text = node.text if kind == "link" else ""
        if said_of(said[name]) != (kind, text):
            found.append(f"{path}: said {said_of(said[name])}, is {kind} {text!r}")
        if name == "record" and kind == "file" and node.permits(4) and (
                unescaped(said[name]["text"]) != node.text[:4096]):
            found.append(f"the record: said {said[name]}, is {node.text!r}")
    return found


def boot_differences(said: dict, seen: Seen) -> list[str]:
    found = link_differences(said["after"], seen.after)
    told = "".join(unescaped(line) + "\n" for line in said["lines"])
    ending = {"normally": "exit 0", "abnormally": "abort"}[said["ends"]]
    if seen.ending != ending:
        found.append(f"said that it ends {said['ends']}, but: {seen.ending}")
    rest = seen.log.removeprefix(told)
    # What follows an abnormal end is the runtime's.
    if told + rest != seen.log or lines.NAME in rest or rest and ending == "exit 0":
        found.append(f"said it prints {told!r}, prints {seen.log!r}")
    return found


def status_differences(said: dict, seen: Seen) -> list[str]:
    before, after = ({path: (here.kind, here.text) for path, here in entries.items()}
                     for entries in (seen.before, seen.after))
    if said["status"] == 0 and (before != after or seen.ending != "exit 0"):
        return ["said that nothing changes"]
    if said["status"] == 1 and before == after:
        return ["said that something changes"]
    if (said["status"] == 0) != (said["reasons"] == []):
        return [f"status {said['status']} for the reasons {said['reasons']}"]
    return []


def name_in(path: str | None, system: dict) -> str:
    return (unescaped(path).removeprefix(DOWNLOADS) if path
            else unescaped(system["version"] or ""))


def reason_differences(said: dict) -> list[str]:
    """Whether the reasons of the two comparisons are true of the data sets."""
    reasons = {step["step"]: step["reason"] for step in said["next_boot"]["steps"]}
    was_reset = "reset" in {step["does"] for step in said["next_boot"]["steps"]
                            if step["step"] == "current"}
    system, update = said["system"], said["announced"]
    current = system if was_reset or not said["current"] else said["current"]
    ours = version_of(name_in(system["path"], system))
    theirs = version_of(name_in(current["path"], system))
    new = version_of(name_in(update["path"], system)) if update else None
    no_version = version_of("")
    true = {
        "fits": lambda: current["schema"] == system["schema"] and not ours > theirs,
        "other_schema": lambda: current["schema"] != system["schema"],
        "older_than_system": lambda: ours > theirs != no_version,
        "no_version": lambda: theirs == no_version and ours > theirs,
    }
    of_update = {
        "none": lambda: update is None,
        "newer": lambda: new > theirs and update["schema"] == system["schema"],
        "same_set": lambda: update["path"] == current["path"],
        "other_schema": lambda: update["schema"] != system["schema"],
        "same_version": lambda: new == theirs != no_version,
        "no_version": lambda: new == no_version,
        "older": lambda: theirs > new != no_version,
    }
    found = []
    for step, table in ("usable", true), ("update", of_update):
        if reasons[step] in table and not table[reasons[step]]():
            found.append(f"said of {step}: {reasons[step]}, which is not so")
    return found


def examine(device: Device, tell: str, count):
    """Asks about a device, boots it, and compares."""
    namespace.build(device)
    before, untouched = namespace.look(), times(*PLACES)
    answer = ask("--json")
    found = [f"changed: {path}" for path, now in times(*PLACES).items()
             if untouched.get(path) != now]
    if answer.status == 77:
        fail(tell, [*found, answer.errors], before)
    said = answer.said
    booted = boot.boot()
    seen = Seen(before, namespace.look(), *booted)
    found += link_differences(said["now"], before)
    found += boot_differences(said["next_boot"], seen)
    found += status_differences(said, seen) + reason_differences(said)
    if answer.status != said["status"] or answer.errors:
        found.append(f"exit status {answer.status}, {answer.errors!r}")
    wrote = any(path in seen.after and seen.after[path].kind == "file"
                for path in seen.changed())
    if wrote != (fact(said, "record") == "activation"):
        found.append(f"said of the record: {fact(said, 'record')}, which is not so")
    fail(tell, found, before)
    for step in said["next_boot"]["steps"]:
        count(f"said: {step['step']} {step['does']}: {step['reason']}")
    count(f"status {answer.status}")


@pytest.mark.parametrize("name", CHOSEN)
def test_a_chosen_device(name, count):
    examine(CHOSEN[name](), name, count)


def blocks(option):
    total = option("states") or (1000 if option("quick") else 20_000)
    return [pytest.param(range(first, first + BLOCK), id=str(first))
            for first in range(0, total, BLOCK)]


@pytest.mark.cases("numbers", blocks)
def test_random_devices(numbers, count):
    for number in numbers:
        examine(compose(random.Random(f"status/{number}")), f"status/{number}", count)
        count("devices asked about")


# --- Trees that lie -----------------------------------------------------------------

TREE = "/tmp/device"
ODD_NAME = "a\nb\033[2J %s\xff\\"
OUTSIDE = "../../../../../../../../../../etc"
AS_ROOT = "/usr/bin/unshare --user --map-root-user --mount /bin/sh -euc".split()
UPDATE = "2024a.1.0"
UPDATES = DOWNLOADS.rstrip("/")
UPDATE_VERSION = update_path(f"{UPDATE}/zoneinfo/+VERSION")
ICU_DATA = update_path(f"{UPDATE}/icutz/icutz44l.dat")
SYSTEM_VERSION = f"{SYSTEM_ZONEINFO}/+VERSION"
STEPS = ("legacy_icu_link", "old_icu", "current", "usable", "update", "record",
         "last_resort", "localtime")


class Tree(Device):
    """A sound device, with what the cases do to it."""

    def __init__(self):
        self.root = sound_device().root
        self.afterwards = []

    def use(self, version):
        self.install_update(version)
        self.point_links_at(version)

    def announce(self, version, schema="44l"):
        self.install_update(version, schema)
        super().announce(version)

    def move(self, path, to):
        self.put(to, self.find(path))
        self.drop(path)

    def sparse(self, path, size):
        self.afterwards.append(lambda: os.truncate(TREE + path, size))

    def null(self, path):
        """A device with the number 0."""
        self.afterwards.append(lambda: os.mknod(TREE + path, stat.S_IFCHR))

    def mark(self, path, name, value):
        self.afterwards.append(lambda: os.setxattr(TREE + path, name, value))

    def stray(self, count):
        self.afterwards.extend(
            functools.partial(os.mknod, f"{TREE}{DOWNLOADS}{number}")
            for number in range(count))


def unpack(*changes: tuple):
    """Has a tree below TREE; a change is a verb of Tree, with its arguments."""
    namespace.insist_on_private_device()
    tree = Tree()
    for verb, *arguments in changes:
        getattr(tree, verb)(*arguments)
    os.makedirs(TREE, exist_ok=True)
    namespace.empty(TREE)
    namespace.build_below(TREE, tree.root, exists=True)
    for change in tree.afterwards:
        change()


class Case(NamedTuple):
    status: int
    changes: tuple
    facts: dict


def case(status: int, *changes: tuple, **facts) -> Case:
    """What is said where. In a name "__" is a step down; the name of a step of the next
    boot stands for its reason."""
    return Case(status, changes, facts)


def fact(said, name: str):
    if name in STEPS:
        name = f"next_boot__steps__{STEPS.index(name)}__reason"
    for part in name.split("__"):
        said = said[int(part)] if part.isdigit() else said[part]
    return said


CASES = {
    "sound": case(0, now__pair="system"),
    "an update": case(0, ("use", UPDATE), now__pair="update", current__version=UPDATE),
    "an announcement": case(1, ("announce", UPDATE), update="newer"),
    "another schema": case(2, ("announce", UPDATE, "45l"), update="other_schema"),
    "an old announcement": case(2, ("announce", "2022a.1.0"), update="older"),
    "the same data again": case(0, ("use", UPDATE), ("announce", UPDATE),
                                update="same_set"),
    "a lost icutz": case(2, ("use", UPDATE), ("drop", ICUTZ),
                         now__pair="update_without_icu"),
    "a stale icutz": case(2, ("use", UPDATE),
                          ("link", ICUTZ, update_path("2023d.1.0/icutz")),
                          now__pair="update_with_other_icu"),
    "an icutz of other words": case(0, ("use", UPDATE),
                                    ("link", ICUTZ, f"tz/{UPDATE}/icutz"),
                                    now__pair="update"),
    "an icutz left over": case(2, ("link", ICUTZ, update_path(UPDATE)),
                               now__pair="system_with_icu"),
    "icutz is a directory": case(2, ("directory", ICUTZ),
                                 now__icutz__kind="directory"),
    "zoneinfo is not the tree": case(
        2, ("use", UPDATE), ("link", ZONEINFO, update_path(f"{UPDATE}/x")),
        now__pair="not_the_tree"),
    "no links": case(1, ("drop", ZONEINFO), now__zoneinfo__kind="none",
                     current="no_link"),
    "a link named none": case(2, ("link", ZONEINFO, "none"),
                              now__zoneinfo={"kind": "link", "target": "none"}),
    "a link named a directory": case(
        2, ("link", ZONEINFO, "(a directory)"),
        now__zoneinfo={"kind": "link", "target": "(a directory)"}),
    "zoneinfo is a file": case(2, ("file", ZONEINFO), now__in_use="none"),
    "zoneinfo is a directory": case(2, ("drop", ZONEINFO),
                                    ("directory", f"{ZONEINFO}/x"),
                                    next_boot__ends="abnormally"),
    "zoneinfo is a FIFO": case(2, ("fifo", ZONEINFO)),
    "zoneinfo is a socket": case(2, ("socket", ZONEINFO)),
    "an odd name": case(
        2, ("announce", ODD_NAME),
        now__tz_latest__target=r"/var/db/timezone/tz/a\x0ab\x1b[2J %s\xff\\"),
    "a forged line": case(
        2, ("link", ZONEINFO, "x\nmarlin: forged: No error"),
        next_boot__lines__0=r"marlin: Bad zoneinfo link x\x0amarlin: forged: "
                            "No error: No such file or directory"),
    "a huge number": case(2, ("announce", "2147483648a"),
                          announced__state="number_too_large"),
    "a huge number in use": case(2, ("use", "2147483648a")),
    "the system's number": case(
        2, ("file", SYSTEM_VERSION, "2147483648a"), ("use", UPDATE),
        next_boot__ends="abnormally", system__version=None, current__fits_system=False),
    "no version": case(2, ("drop", SYSTEM_VERSION), system__version=None),
    "no system tree": case(2, ("drop", SYSTEM_ZONEINFO), system__version=None),
    "no format": case(2, ("drop", f"{SYSTEM_ICU}/icutzformat.txt"),
                      system__schema=None),
    "a version that is a directory": case(
        2, ("drop", SYSTEM_VERSION), ("directory", SYSTEM_VERSION),
        system__version=None),
    "a version that is a FIFO": case(2, ("fifo", SYSTEM_VERSION), system__version=None),
    "an update's version that is a FIFO": case(
        1, ("announce", UPDATE), ("fifo", UPDATE_VERSION)),
    "icu data that is a FIFO": case(
        2, ("announce", UPDATE), ("fifo", ICU_DATA), announced__schema=None),
    "icu data that others may not read": case(
        2, ("announce", UPDATE), ("file", ICU_DATA, "ICU", 0o640),
        announced__schema=None,
        announced__unreadable=[{"path": ICU_DATA, "error": "Others may not read it"}]),
    "an update in use that only root may read": case(
        2, ("use", UPDATE), ("directory", update_path(UPDATE), 0o700),
        reasons__0__code="closed"),
    "a zone that only root may read": case(
        2, ("file", f"{SYSTEM_ZONEINFO}/Europe/Paris", "TZif", 0o600),
        reasons__0__code="closed"),
    "no icu data": case(2, ("announce", UPDATE),
                        ("drop", update_path(f"{UPDATE}/icutz"))),
    "two icu data files": case(
        2, ("use", UPDATE), ("drop", ICU_DATA),
        ("file", update_path(f"{UPDATE}/icutz/icutz45l.dat")),
        ("file", update_path(f"{UPDATE}/icutz/icutz46l.dat")),
        current__has_several_schemas=True),
    "icu data that does not count": case(
        0, ("use", UPDATE), ("link", update_path(f"{UPDATE}/icutz/icutz45l.dat"),
                             ICU_DATA),
        ("file", update_path(f"{UPDATE}/icutz/icutz46l.dat"), "ICU", 0o640),
        current__has_several_schemas=False),
    "an update that is a link to the host": case(
        2, ("link", update_path(UPDATE), OUTSIDE),
        ("link", TZ_LATEST, update_path(UPDATE)), announced__schema=None),
    "a tree that is a link to the host": case(
        2, ("link", SYSTEM_ZONEINFO, "/proc/self/root/usr"), system__version=None),
    "a version that is the host's file": case(
        2, ("link", SYSTEM_VERSION, "/etc/hostname"), system__version=None),
    "a zone that is the host's file": case(
        2, ("link", LOCALTIME, f"{ZONEINFO}{OUTSIDE}/passwd"),
        now__zone_is_file=False),
    "a record that is a link to the host": case(
        2, ("announce", UPDATE), ("link", RECORD, "/etc/passwd"),
        next_boot__after__record={"kind": "link", "target": "/etc/passwd"}),
    "a record that is a directory": case(
        2, ("announce", UPDATE), ("directory", RECORD)),
    "a record that nobody may write": case(
        2, ("announce", UPDATE), ("file", RECORD, "2", 0o444), record="not_opened"),
    "a record that is right, and nobody may write": case(
        2, ("announce", UPDATE), ("file", RECORD, f"2023c.1.0_{UPDATE}", 0o444),
        record="not_opened"),
    "a record that nobody may read": case(
        1, ("announce", UPDATE), ("file", RECORD, "2", 0o200), record="activation"),
    "var is a link inside": case(0, ("move", "/var", "/data"),
                                 ("link", "/var", "data")),
    "var is an absolute link inside": case(0, ("move", "/var", "/data"),
                                           ("link", "/var", "/data")),
    "the tree is a link inside": case(
        0, ("move", SYSTEM_ZONEINFO, "/tree"), ("link", SYSTEM_ZONEINFO, "/tree"),
        system__version="2023c.1.0"),
    "the directory is a link inside": case(
        0, ("move", TIMEZONE, "/var/db/zones"), ("link", TIMEZONE, "/var/db/zones")),
    "the downloads are a link inside": case(
        1, ("announce", UPDATE), ("move", UPDATES, "/updates"),
        ("link", UPDATES, "/updates")),
    # The boot may write below "/var/db" only.
    "the directory is a link elsewhere": case(
        2, ("drop", ZONEINFO), ("move", TIMEZONE, "/zones"),
        ("link", TIMEZONE, "/zones"), next_boot__ends="abnormally"),
    "a directory that nobody may write": case(
        2, ("announce", UPDATE), ("directory", TIMEZONE, 0o555),
        next_boot__ends="abnormally"),
    "a directory that no boot may write, some day": case(
        2, ("directory", TIMEZONE, 0o555), reasons__0__code="not_writable"),
    "a directory that nobody may read": case(2, ("directory", TIMEZONE, 0o000)),
    "downloads that nobody may read": case(0, ("directory", UPDATES, 0o000)),
    "data behind what the boot removes": case(
        2, ("use", UPDATE), ("announce", "2024b.1.0"),
        ("move", update_path("2024b.1.0/icutz"), "/var/db/real"),
        ("link", OLD_ICU, "/var/db/real"),
        ("link", update_path("2024b.1.0/icutz"), OLD_ICU),
        update="changed_by_the_boot"),
    "current data behind what the boot removes": case(
        2, ("use", UPDATE), ("move", update_path(f"{UPDATE}/icutz"), "/var/db/real"),
        ("link", OLD_ICU, "/var/db/real"),
        ("link", update_path(f"{UPDATE}/icutz"), OLD_ICU),
        usable="changed_by_the_boot"),
    "links behind what the boot removes": case(
        2, ("move", TIMEZONE, "/var/db/zones"), ("link", TIMEZONE, "icu"),
        ("link", OLD_ICU, "zones"), current="changed_by_the_boot"),
    "a directory that is its own downloads": case(
        2, ("drop", ZONEINFO), ("link", UPDATES, "."), next_boot__ends="abnormally"),
    "a download that is a link": case(
        0, ("use", UPDATE), ("move", update_path(UPDATE), update_path("real")),
        ("link", update_path(UPDATE), "real"),
        downloads__1={"name": "real", "needed_by": ["zoneinfo", "icutz"]}),
    "downloads that are a file": case(
        0, ("file", UPDATES), downloads=[], downloads_error="Not a directory"),
    "var db is a file": case(2, ("file", "/var/db"), old_icu="unreachable",
                             legacy_icu_link="unreachable"),
    "no var": case(2, ("drop", "/var")),
    "no timezone directory": case(2, ("drop", TIMEZONE), next_boot__ends="abnormally"),
    "no local zone": case(2, ("drop", LOCALTIME),
                          ("drop", f"{SYSTEM_ZONEINFO}/America"), localtime="no_link"),
    "an old local zone": case(
        1, ("link", LOCALTIME, "/usr/share/zoneinfo/Europe/Paris"),
        localtime="former_place"),
    "a local zone that is missing": case(
        2, ("link", LOCALTIME, f"{ZONEINFO}/Europe/Nowhere"), now__zone_is_file=False),
    "a loop of links": case(2, ("link", LOCALTIME, "localtime")),
    "a legacy link": case(2, ("link", LEGACY_ICUTZ, SYSTEM_ICU),
                          legacy_icu_link="no_present_link"),
    "a legacy directory": case(2, ("directory", LEGACY_ICUTZ)),
    "old data": case(1, ("directory", OLD_ICU)),
    "old data that stays": case(2, ("directory", f"{OLD_ICU}/x")),
    "a sparse version": case(1, ("announce", UPDATE),
                             ("sparse", UPDATE_VERSION, 1 << 40)),
    "many downloads": case(0, *(("directory", update_path(f"{number}a.1.0"))
                                for number in range(500))),
    "more strays than anybody reads": case(
        0, ("use", UPDATE), ("stray", 10_100), has_more_downloads=True,
        downloads=[{"name": UPDATE, "needed_by": ["zoneinfo", "icutz"]}]),
}


@pytest.mark.parametrize("name", CASES)
def test_a_tree(name):
    """Of any device: the status, the facts, and not a trace left on it."""
    status, changes, facts = CASES[name]
    unpack(*changes)
    before = times(TREE)
    answer = ask("--root", TREE, "--json")
    assert times(TREE) == before
    assert (answer.status, answer.errors) == (status, ""), answer.output
    for name, value in facts.items():
        assert fact(answer.said, name) == value, name
    rows = ask("--root", TREE)
    assert (rows.status, rows.errors) == (status, "")
    assert re.fullmatch(r"[ -~\n]*", rows.output)
    # Lines of the boot aside, which have it.
    rest = re.sub(r"marlin: .*|20\d\d[a-z]\.1\.0|a\.1\.0", "", rows.output)
    assert ".1.0" not in rest
    check = ask("--root", TREE, "--check")
    assert check.status == status
    assert check.output == "".join(
        f"{reason['subject'].replace('_', ' ')}: {reason['text']}\n"
        for reason in answer.said["reasons"])


def test_too_much_icu_data_cannot_be_told():
    """A bound on memory or time is not a guess: a boot, which may have more, activates
    this."""
    unpack(("announce", UPDATE))
    for number in range(200_000):
        os.mknod(f"{TREE}{update_path(UPDATE)}/icutz/{number}")
    answer = ask("--root", TREE)
    assert answer.status == 77
    assert re.fullmatch("marlin-status: cannot tell: .* takes more than .*\n",
                        answer.errors)


def test_nothing_outside_is_opened():
    """Before the root is the tree, only what the program needs for that."""
    unpack(*(("link", path, "/etc/passwd") for path in (
        SYSTEM_VERSION, f"{SYSTEM_ICU}/icutzformat.txt", RECORD, update_path("x"),
        OLD_ICU, LEGACY_ICUTZ)))
    subprocess.run(["/usr/bin/strace", "-f", "-o", "/tmp/trace", "-e", "trace=%file",
                    STATUS, "--root", TREE], capture_output=True)
    before, _, after = Path("/tmp/trace").read_text().partition('chroot(".")')
    assert not re.search(r'open\w*\([^"]*"/etc', after)
    opened = set(re.findall(
        r'open\w*\([^"]*"([^"]*)"(?!.*resolve=RESOLVE_NO_MAGICLINKS\|RESOLVE_IN_ROOT)',
        before))
    assert opened and opened <= {
        "", TREE, "/proc", "/proc/self/setgroups", "/proc/self/uid_map",
        "/proc/self/gid_map", "self/uid_map"}, opened


def test_what_it_inherits_does_not_count():
    unpack(("announce", UPDATE))
    asked = "--root", TREE, "--json"
    done = subprocess.run(["/usr/bin/env", "--ignore-signal=CHLD", STATUS, *asked],
                          capture_output=True, umask=0o777)
    assert (done.returncode, done.stdout.decode()) == ask(*asked)[:2]


def cannot_tell(why: str) -> Answer:
    return Answer(77, "", f"marlin-status: cannot tell: {why}\n")


# Version 2: the owner, a user, the group, the mask, others; tag, rights and number.
ACL = struct.pack("<I", 2) + b"".join(
    struct.pack("<HHI", tag, rights, os.geteuid() if tag == 2 else 0xffffffff)
    for tag, rights in ((1, 7), (2, 0), (4, 5), (16, 5), (32, 5)))


@pytest.mark.parametrize("path, changes", [
    (LOCALTIME, [("drop", ZONEINFO), ("null", ZONEINFO)]),
    (OLD_ICU, [("null", OLD_ICU)]),
    (TIMEZONE, [("drop", TIMEZONE), ("null", TIMEZONE)]),
    (LEGACY_ICUTZ, [("link", LEGACY_ICUTZ, "x"), ("null", "/var/db/x")]),
    (RECORD, [("announce", UPDATE), ("link", RECORD, "/var/db/x"),
              ("null", "/var/db/x")]),
    (f"{OLD_ICU}/x", [("directory", OLD_ICU), ("null", f"{OLD_ICU}/x")]),
    (OLD_ICU, [("file", OLD_ICU), ("mark", "/var/db", "user.overlay.opaque", b"x"),
               ("mark", OLD_ICU, "user.overlay.whiteout", b"y")]),
    (OLD_ICU, [("file", OLD_ICU), ("mark", OLD_ICU, "user.overlay.metacopy", b"")]),
    (RECORD, [("file", RECORD), ("mark", RECORD, "user.overlay.metacopy", b"")]),
    ("/var/db", [("mark", "/var/db", "system.posix_acl_access", ACL)]),
])
def test_what_an_overlay_does_not_show(path, changes):
    try:
        unpack(*changes)
    except OSError as failed:
        pytest.skip(str(failed))
    assert ask("--root", TREE) == cannot_tell(
        f"{path} looks different in an overlay; is it being changed, or has it an "
        "access list, an overlay attribute or the device number 0?")


def test_a_folder_that_is_not_a_device():
    unpack(("drop", "/var"), ("drop", "/usr"))
    assert ask("--root", TREE) == cannot_tell(
        f"{TREE} is not a device: it has neither /var/db nor {SYSTEM_ZONEINFO}")


def disturbed(call: str, error: str, when="1+") -> subprocess.CompletedProcess:
    return subprocess.run(
        ["/usr/bin/strace", "-f", "-qq", "-o", "/tmp/trace", "-e", f"trace={call}",
         "-e", f"inject={call}:error={error}:when={when}", STATUS, "--root", TREE],
        capture_output=True, text=True)


@pytest.mark.parametrize("call, error", [
    ("unshare", "EPERM"), ("mount", "EINVAL"), ("fsopen", "ENODEV"),
    ("open_tree", "EPERM"), ("chroot", "EPERM")])
def test_where_nothing_can_be_told_it_says_what_to_do(call, error):
    unpack()
    done = disturbed(call, error)
    assert (done.returncode, done.stdout) == (77, "")
    assert done.stderr.endswith("; run this as root, and from outside of a container "
                                "or chroot, with --root\n")


# Of a process that starts or ends.
NOT_ITS_OWN = set("execve brk mprotect arch_prctl set_tid_address set_robust_list rseq "
                  "getrandom exit_group rt_sigaction mmap munmap +++ ---".split())


def failures(option):
    return itertools.product(
        [(0, ("use", UPDATE)), (1, ("announce", UPDATE)), (2, ("announce", "2022a"))],
        ["EIO"] if option("quick") else ["EIO", "EAGAIN", "EINVAL", "ENOENT"])


@pytest.mark.cases("device, error", failures)
def test_a_failing_call(device, error, count):
    """No failure makes anything look better, or ends in silence."""
    status, change = device
    unpack(change)
    subprocess.run(["/usr/bin/strace", "-f", "-qq", "-o", "/tmp/trace", STATUS,
                    "--root", TREE], capture_output=True)
    made = collections.Counter(re.findall(r"^\d+ +(\w+)\(", Path(
        "/tmp/trace").read_text(), re.M))
    for call in made.keys() - NOT_ITS_OWN:
        for number in range(1, made[call] + 1):
            done = disturbed(call, error, number)
            assert done.returncode in (status, 2, 77), (call, number, done)
            assert done.returncode != 77 or done.stderr or call == "write"
            count("calls of marlin-status that fail")


def test_its_end_follows_its_parents():
    """Whatever changes its rights takes that back."""
    unpack()
    disturbed("%process,%creds,prctl", "EIO", 1000)
    trace = Path("/tmp/trace").read_text()
    process = re.search(r"^(\d+) +setresgid\(", trace, re.M)[1]
    rights = r"setgroups|setresgid|capset|prctl\(PR_SET_PDEATHSIG"
    made = re.findall(rf"^{process} +({rights})", trace, re.M)
    assert made[-1].startswith("prctl")


def test_advice_is_tried_first():
    """Removing "zoneinfo" mends a lost "icutz", except where the boot may not write."""
    lost = ("use", UPDATE), ("drop", ICUTZ)
    unpack(*lost)
    assert f"To mend it remove {ZONEINFO}:" in ask("--root", TREE).output
    os.unlink(TREE + ZONEINFO)
    assert ask("--root", TREE).status == 1
    unpack(*lost, ("move", TIMEZONE, "/zones"), ("link", TIMEZONE, "/zones"))
    assert "To mend it" not in ask("--root", TREE).output


def test_a_tree_that_disappears():
    for _ in range(20):
        unpack()
        asked = subprocess.Popen([STATUS, "--root", TREE], stdout=subprocess.DEVNULL,
                                 stderr=subprocess.PIPE)
        shutil.rmtree(TREE)
        errors = asked.communicate(timeout=30)[1].decode()
        assert asked.returncode in (0, 1, 2, 77), errors
        assert asked.returncode == 77 or errors == ""


@pytest.mark.parametrize("words, status, line", [
    (["--rot"], 64, "--rot is not understood; see --help"),
    (["--rock"], 64, "--rock is not understood; see --help"),
    (["-xh"], 64, "-xh is not understood; see --help"),
    (["--root"], 64, "--root needs a directory; see --help"),
    (["--json=x"], 64, "--json=x is not understood; see --help"),
    (["--root="], 64, "--root needs a directory; see --help"),
    (["--json", "--check"], 64, "one of --json and --check is enough; see --help"),
    (["x\033[2J"], 64, r"x\x1b[2J is not expected; see --help"),
    (["--", "--json"], 64, "--json is not expected; see --help"),
    (["--root", "/nowhere"], 77, "cannot tell: /nowhere: No such file or directory"),
    (["--root", "/etc/passwd"], 77, "cannot tell: /etc/passwd: Not a directory"),
])
def test_bad_use_is_one_line(words, status, line):
    assert ask(*words) == Answer(status, "", f"marlin-status: {line}\n")


def test_it_tells_about_itself():
    assert ask("--help").output.startswith("usage: marlin-status ")
    assert re.fullmatch(r"marlin-status \d+\.\d+\.\d+\n", ask("--version").output)


@pytest.mark.parametrize("limit", [[], ["/usr/bin/prlimit", "--fsize=0"]])
@pytest.mark.parametrize("words, failure", [
    (["--root", TREE], b"cannot tell: standard output: "),
    (["--help"], b"standard output: ")])
def test_a_full_standard_output_is_a_failure(words, failure, limit):
    unpack()
    with open("/tmp/full" if limit else "/dev/full", "wb") as full:
        done = subprocess.run([*limit, STATUS, *words], stdout=full,
                              stderr=subprocess.PIPE)
    assert done.returncode == 77
    assert done.stderr.startswith(b"marlin-status: " + failure)


def test_a_record_that_a_limit_on_files_cuts_is_not_told():
    unpack(("announce", UPDATE))
    done = subprocess.run(["/usr/bin/prlimit", "--fsize=5", STATUS, "--root", TREE],
                          capture_output=True)
    assert (done.returncode, done.stdout) == (77, b"")
    assert done.stderr.endswith(b"a limit on the size of files cuts the record\n")


def test_rows_fit_a_terminal():
    """As wide as the terminal is, with colour only there and only if it is wanted."""
    unpack(("link", ZONEINFO, "x" * 300))
    for environment, colours in ({}, True), ({"NO_COLOR": "1"}, False):
        ours, terminal = os.openpty()
        termios.tcsetwinsize(terminal, (24, 60))
        subprocess.run([STATUS, "--root", TREE], stdout=terminal, env=environment)
        os.close(terminal)
        text = b""
        with contextlib.suppress(OSError):
            while piece := os.read(ours, 65536):
                text += piece
        os.close(ours)
        assert (b"\033[" in text) == colours
        plain = re.sub(rb"\033\[\d*m", b"", text)
        assert max(map(len, plain.replace(b"\r", b"").split(b"\n"))) <= 60


def test_an_archive_as_the_page_says():
    here = Path("/tmp/archive")
    here.mkdir()
    page = (PROJECT / "docs/marlin-status.8").read_text()
    command = re.search(r"^\.Dl (mkdir device && .*)", page, re.M)[1]
    unpack()
    with tarfile.open(here / "device.tar", "w") as archive:
        archive.add(TREE, ".")
    run = functools.partial(subprocess.run, ["/bin/sh", "-c", command], cwd=here,
                            env={"PATH": f"{Path(STATUS).parent}:/usr/bin"})
    assert run().returncode == 0

    shutil.rmtree(here / "device")
    with tarfile.open(here / "device.tar", "a") as archive:
        out = tarfile.TarInfo("out")
        out.type, out.linkname = tarfile.SYMTYPE, "/tmp/outside"
        archive.addfile(out)
        for name in "out/file", "/tmp/outside/file", "../../outside/file":
            archive.addfile(tarfile.TarInfo(name))
    assert run(stderr=subprocess.DEVNULL).returncode == 1
    assert not os.path.exists("/tmp/outside")
    shutil.rmtree(here)


@pytest.mark.parametrize("status, change", [
    (0, ("directory", SYSTEM_ZONEINFO)),
    (77, ("announce", UPDATE)),
    (77, ("file", SYSTEM_VERSION, "2023c", 0o600)),
])
def test_a_record_of_another_user(status, change):
    """It is sound only if it is so with the rights of everybody."""
    unpack(("file", RECORD), change)
    done = subprocess.run(
        [*AS_ROOT, f"""
             mount --bind {another_users("/file", "/etc/passwd")} {TREE}{RECORD}
             exec {STATUS} --root {TREE} --check"""], capture_output=True, text=True)
    assert (done.returncode, done.stdout) == (status, "")
    assert done.stderr == ("" if status == 0 else
                           f"marlin-status: cannot tell: {RECORD} belongs to another "
                           "user or group, or has an access list; run this as root\n")


def test_a_directory_of_another_user():
    """Whether the boot may write there, this user cannot try."""
    unpack(("drop", "/var/db"), ("directory", "/var/db"))
    done = subprocess.run(
        [*AS_ROOT, f"""mount --bind {another_users("", "/etc")} {TREE}/var/db
             exec {STATUS} --root {TREE}"""], capture_output=True, text=True)
    assert Answer(done.returncode, done.stdout, done.stderr) == cannot_tell(
        "/var/db belongs to another user or group, or has an access list; run this as "
        "root")


def test_a_record_that_is_mounted():
    unpack(("announce", UPDATE), ("file", RECORD, "old"))
    done = subprocess.run(
        [*AS_ROOT, f"""echo other >/tmp/record
             mount --bind /tmp/record {TREE}{RECORD}
             {STATUS} --root {TREE} --json || [ $? = 1 ]
             echo other | cmp /tmp/record -"""], capture_output=True, text=True)
    assert (done.returncode, done.stderr) == (0, "")
    assert fact(json.loads(done.stdout), "record") == "activation"


def another_users(name: str, otherwise: str) -> str:
    return next(path for path in (f"{BUILD}/prove/another-users{name}", otherwise)
                if os.path.exists(path) and os.stat(path).st_uid != os.geteuid())


@pytest.mark.parametrize("place", ["/var/db/timezone", "/var/db/timezone/tz", "/var/db",
                                   "/var", "/usr/share/icu"])
def test_a_file_system_of_its_own(place):
    """What is mounted inside the device is seen, covered and left alone."""
    unpack(("announce", UPDATE))
    at = TREE + place
    done = subprocess.run(
        [*AS_ROOT, f"""mkdir /tmp/aside && cp -a {at}/. /tmp/aside
             mount -t tmpfs -o mode=755 own {at} && cp -a /tmp/aside/. {at}
             find {TREE} -printf '%p %i %T@ %C@ %l\\n' >/tmp/before
             {STATUS} --root {TREE} --json || [ $? = 1 ]
             find {TREE} -printf '%p %i %T@ %C@ %l\\n' | cmp /tmp/before -
             rm -r /tmp/aside"""],
        capture_output=True, text=True)
    assert done.stderr == ""
    said = json.loads(done.stdout)
    assert fact(said, "update") == "newer"
    assert unescaped(said["next_boot"]["after"]["zoneinfo"]["target"]) == (
        f"{update_path(UPDATE)}/zoneinfo")
    shutil.rmtree("/tmp/aside", ignore_errors=True)
