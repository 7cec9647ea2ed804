# SPDX-License-Identifier: BSD-2-Clause
"""What marlin-status says of a device, and of its next boot, is so: it is asked, and
then the device is really booted. Asking leaves no trace on the device.

This takes a user who may have namespaces and is not root: lab.prove starts it so.
"""

import contextlib
import json
import os
import random
import re
import shutil
import stat
import subprocess
import termios
from collections.abc import Callable
from errno import ENOENT
from pathlib import Path
from typing import NamedTuple

import pytest

from lab import boot, lines
from lab.carriers import namespace
from lab.device import Device, Node, encoded
from lab.devices import CHOSEN
from lab.paths import (DOWNLOADS, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, RECORD,
                       SYSTEM_ICU, SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO, update_path)
from lab.random_devices import compose
from lab.seen import Entries, Seen, as_device
from lab.trial import fail

STATUS = os.path.join(os.path.dirname(boot.PROGRAM), "tools", "marlin-status")
BLOCK = 50
NAMES = {"zoneinfo": ZONEINFO, "icutz": ICUTZ, "localtime": LOCALTIME,
         "tz_latest": TZ_LATEST, "record": RECORD, "legacy_icutz": LEGACY_ICUTZ,
         "old_icu": OLD_ICU}


class Answer(NamedTuple):
    status: int
    output: str
    errors: str

    @property
    def said(self) -> dict:
        return json.loads(self.output)


def ask(*options: str) -> Answer:
    namespace.insist_on_private_device()
    done = subprocess.run([STATUS, *options], capture_output=True, timeout=30)
    return Answer(done.returncode, done.stdout.decode("ascii"),
                  done.stderr.decode("latin-1"))


def unescaped(text: str) -> str:
    return re.sub(r"\\(?:x([0-9a-f]{2})|(\\))",
                  lambda match: chr(int(match[1], 16)) if match[1] else "\\", text)


def times() -> dict[str, tuple]:
    """Of access, too. Asked without a look that would change them."""
    found = {}
    for place in ("/var/db", "/usr/share"):
        for folder, _, names in os.walk(place):
            for path in [folder, *(os.path.join(folder, name) for name in names)]:
                try:
                    status = os.lstat(path)
                except PermissionError:
                    continue
                found[path] = (status.st_ino, status.st_atime_ns, status.st_mtime_ns,
                               status.st_ctime_ns, status.st_mode)
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
    if said["ends"] == "normally":
        if seen.ending != "exit 0":
            found.append(f"said that it ends normally, but: {seen.ending}")
        if told != seen.log:
            found.append(f"said it prints {told!r}, prints {seen.log!r}")
    else:
        if seen.ending != "abort":
            found.append(f"said that it ends abnormally, but: {seen.ending}")
        # What follows is the runtime's.
        if not seen.log.startswith(told) or lines.NAME in seen.log[len(told):]:
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


def version_of(text: str) -> tuple:
    """A reading of versions that is not the program's."""
    groups = re.fullmatch(r"0*(\d+)([a-z]+)(?:\.(\d+))?(?:\.(\d+))?", text)
    return (-1,) if not groups else (int(groups[1]), groups[2], int(groups[3] or -1),
                                     int(groups[4] or -1))


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
    true = {
        "fits": lambda: current["schema"] == system["schema"] and not ours > theirs,
        "other_schema": lambda: current["schema"] != system["schema"],
        "older_than_system": lambda: ours > theirs != (-1,),
        "no_version": lambda: theirs == (-1,) and ours > theirs,
    }
    of_update = {
        "none": lambda: update is None,
        "newer": lambda: new > theirs and update["schema"] == system["schema"],
        "same_set": lambda: update["path"] == current["path"],
        "other_schema": lambda: update["schema"] != system["schema"],
        "same_version": lambda: new == theirs != (-1,),
        "no_version": lambda: new == (-1,),
        "older": lambda: theirs > new != (-1,),
    }
    found = []
    for step, table in ("usable", true), ("update", of_update):
        if reasons[step] in table and not table[reasons[step]]():
            found.append(f"said of {step}: {reasons[step]}, which is not so")
    return found


def examine(device: Device, tell: str, count):
    """Asks about a device, boots it, and compares."""
    namespace.build(device)
    before, untouched = namespace.look(), times()
    answer = ask("--json")
    found = [f"changed: {path}" for path, now in times().items()
             if untouched.get(path) != now]
    if answer.status == 77:
        fail(f"{tell}: {answer.errors}", found, before)
    said = answer.said
    booted = boot.boot()
    seen = Seen(before, namespace.look(), *booted)
    found += link_differences(said["now"], before)
    found += boot_differences(said["next_boot"], seen)
    found += status_differences(said, seen) + reason_differences(said)
    if answer.status != said["status"] or answer.errors:
        found.append(f"exit status {answer.status}, {answer.errors!r}")
    if found:
        fail(tell, found, before)
    for step in said["next_boot"]["steps"]:
        count(f"said: {step['step']} {step['does']}: {step['reason']}")
    count(f"status {answer.status}")


@pytest.mark.parametrize("name", CHOSEN)
def test_a_chosen_device(name, count):
    examine(CHOSEN[name](), name, count)


def pytest_generate_tests(metafunc):
    if "numbers" in metafunc.fixturenames:
        quick = metafunc.config.getoption("quick")
        total = metafunc.config.getoption("states") or (1000 if quick else 20_000)
        metafunc.parametrize("numbers", [range(first, first + BLOCK) for first in
                                         range(0, total, BLOCK)], ids=str)


def test_random_devices(numbers, count):
    for number in numbers:
        examine(compose(random.Random(f"status/{number}")), f"status/{number}", count)
        count("devices asked about")


# --- Trees that lie -----------------------------------------------------------------

TREE = Path("/tmp/device")
ODD_NAME = "a\nb\033[2J %s\xff\\"


class Tree:
    """A device unpacked below TREE; paths are the device's."""

    def __init__(self):
        if TREE.exists():
            subprocess.run(["/bin/chmod", "-R", "u+rwx", TREE], check=True)
            shutil.rmtree(TREE)
        for folder in ("/var/db/timezone/tz", SYSTEM_ZONEINFO + "/Europe", SYSTEM_ICU):
            self.directory(folder)
        self.file(SYSTEM_ZONEINFO + "/+VERSION", "2023c\n")
        self.file(SYSTEM_ZONEINFO + "/Europe/Paris", "TZif")
        self.file(SYSTEM_ICU + "/icutzformat.txt", "44l\n")
        self.link(ZONEINFO, SYSTEM_ZONEINFO)
        self.link(LOCALTIME, f"{ZONEINFO}/Europe/Paris")

    @staticmethod
    def at(path: str) -> bytes:
        return os.fsencode(TREE) + encoded(path)

    def drop(self, path):
        place = self.at(path)
        if os.path.isdir(place) and not os.path.islink(place):
            shutil.rmtree(place)
        elif os.path.lexists(place):
            os.unlink(place)

    def directory(self, path, mode=0o755):
        os.makedirs(self.at(path), exist_ok=True)
        os.chmod(self.at(path), mode)

    def file(self, path, text="", mode=0o644):
        self.drop(path)
        Path(os.fsdecode(self.at(path))).write_bytes(encoded(text))
        os.chmod(self.at(path), mode)

    def sparse(self, path, size):
        self.file(path)
        os.truncate(self.at(path), size)

    def link(self, path, target):
        self.drop(path)
        os.symlink(encoded(target), self.at(path))

    def fifo(self, path):
        self.drop(path)
        os.mkfifo(self.at(path))

    def socket(self, path):
        self.drop(path)
        os.mknod(self.at(path), 0o644 | stat.S_IFSOCK)

    def move(self, path, to):
        os.rename(self.at(path), self.at(to))

    def update(self, version, schema="44l"):
        self.directory(f"{update_path(version)}/zoneinfo/Europe")
        self.directory(f"{update_path(version)}/icutz")
        self.file(f"{update_path(version)}/zoneinfo/+VERSION", version.split(".")[0])
        self.file(f"{update_path(version)}/zoneinfo/Europe/Paris", "TZif")
        self.file(f"{update_path(version)}/icutz/icutz{schema}.dat", "ICU")

    def use(self, version):
        self.update(version)
        self.link(ZONEINFO, f"{update_path(version)}/zoneinfo")
        self.link(ICUTZ, f"{update_path(version)}/icutz")

    def announce(self, version, schema="44l"):
        self.update(version, schema)
        self.link(TZ_LATEST, update_path(version))


class Case(NamedTuple):
    change: Callable[[Tree], object]
    status: int
    facts: dict  # dotted name -> what is said there


def fact(said, name: str):
    for part in name.split("."):
        said = said[int(part)] if part.isdigit() else said[part]
    return said


def case(status: int, *changes: Callable[[Tree], object], **facts) -> Case:
    return Case(lambda tree: [change(tree) for change in changes], status,
                {name.replace("__", "."): value for name, value in facts.items()})


def does(step: str) -> str:
    """The place of a step in the list of them."""
    steps = "legacy_icu_link old_icu current usable update record last_resort localtime"
    return f"next_boot__steps__{steps.split().index(step)}__reason"


OUTSIDE = "../../../../../../../../../../etc"
CASES = {
    "sound": case(0, now__pair="system"),
    "an update": case(0, lambda t: t.use("2024a.1.0"), now__pair="update",
                      current__version="2024a.1.0"),
    "an announcement": case(1, lambda t: t.announce("2024a.1.0"),
                            **{does("update"): "newer"}),
    "another schema": case(2, lambda t: t.announce("2024a.1.0", "45l"),
                           **{does("update"): "other_schema"}),
    "an old announcement": case(2, lambda t: t.announce("2022a.1.0"),
                                **{does("update"): "older"}),
    "the same data again": case(0, lambda t: t.use("2024a.1.0"),
                                lambda t: t.announce("2024a.1.0"),
                                **{does("update"): "same_set"}),
    "a lost icutz": case(2, lambda t: t.use("2024a.1.0"), lambda t: t.drop(ICUTZ),
                         now__pair="update_without_icu"),
    "a stale icutz": case(2, lambda t: t.use("2024a.1.0"),
                          lambda t: t.link(ICUTZ, update_path("2023d.1.0/icutz")),
                          now__pair="update_with_other_icu"),
    "an icutz left over": case(2, lambda t: t.link(ICUTZ, update_path("2024a.1.0")),
                               now__pair="system_with_icu"),
    "icutz is a directory": case(2, lambda t: t.directory(ICUTZ),
                                 now__icutz__kind="directory"),
    "zoneinfo is not the tree": case(
        2, lambda t: t.use("2024a.1.0"),
        lambda t: t.link(ZONEINFO, update_path("2024a.1.0/x")),
        now__pair="not_the_tree"),
    "no links": case(1, lambda t: t.drop(ZONEINFO), now__zoneinfo__kind="none",
                     **{does("current"): "no_link"}),
    "a link named none": case(2, lambda t: t.link(ZONEINFO, "none"),
                              now__zoneinfo={"kind": "link", "target": "none"}),
    "a link named a directory": case(
        2, lambda t: t.link(ZONEINFO, "(a directory)"),
        now__zoneinfo={"kind": "link", "target": "(a directory)"}),
    "zoneinfo is a file": case(2, lambda t: t.file(ZONEINFO), now__in_use="none"),
    "zoneinfo is a directory": case(2, lambda t: t.drop(ZONEINFO),
                                    lambda t: t.directory(ZONEINFO + "/x"),
                                    next_boot__ends="abnormally"),
    "zoneinfo is a FIFO": case(2, lambda t: t.fifo(ZONEINFO)),
    "zoneinfo is a socket": case(2, lambda t: t.socket(ZONEINFO)),
    "an odd name": case(
        2, lambda t: t.announce(ODD_NAME),
        now__tz_latest__target=r"/var/db/timezone/tz/a\x0ab\x1b[2J %s\xff\\"),
    "a forged line": case(
        2, lambda t: t.link(ZONEINFO, "x\nmarlin: forged: No error"),
        next_boot__lines__0=r"marlin: Bad zoneinfo link x\x0amarlin: forged: "
                            "No error: No such file or directory"),
    "a huge number": case(2, lambda t: t.announce("2147483648a"),
                          announced__state="number_too_large"),
    "a huge number in use": case(2, lambda t: t.use("2147483648a")),
    "the system's number": case(
        2, lambda t: t.file(SYSTEM_ZONEINFO + "/+VERSION", "2147483648a"),
        lambda t: t.use("2024a.1.0"), next_boot__ends="abnormally",
        system__version=None, current__fits_system=False),
    "no version": case(2, lambda t: t.drop(SYSTEM_ZONEINFO + "/+VERSION"),
                       system__version=None),
    "no system tree": case(2, lambda t: t.drop(SYSTEM_ZONEINFO), system__version=None),
    "no format": case(2, lambda t: t.drop(SYSTEM_ICU + "/icutzformat.txt"),
                      system__schema=None),
    "a version that is a directory": case(
        2, lambda t: t.drop(SYSTEM_ZONEINFO + "/+VERSION"),
        lambda t: t.directory(SYSTEM_ZONEINFO + "/+VERSION"), system__version=None),
    "a version that is a FIFO": case(2, lambda t: t.fifo(SYSTEM_ZONEINFO + "/+VERSION"),
                                     system__version=None),
    "an update's version that is a FIFO": case(
        1, lambda t: t.announce("2024a.1.0"),
        lambda t: t.fifo(update_path("2024a.1.0/zoneinfo/+VERSION"))),
    "icu data that is a FIFO": case(
        2, lambda t: t.announce("2024a.1.0"),
        lambda t: t.fifo(update_path("2024a.1.0/icutz/icutz44l.dat")),
        announced__schema=None),
    "icu data that others may not read": case(
        2, lambda t: t.announce("2024a.1.0"),
        lambda t: os.chmod(t.at(update_path("2024a.1.0/icutz/icutz44l.dat")), 0o640),
        announced__schema=None),
    "no icu data": case(2, lambda t: t.announce("2024a.1.0"),
                        lambda t: t.drop(update_path("2024a.1.0/icutz"))),
    "two icu data files": case(
        2, lambda t: t.use("2024a.1.0"),
        lambda t: t.file(update_path("2024a.1.0/icutz/icutz45l.dat")),
        lambda t: t.file(update_path("2024a.1.0/icutz/icutz46l.dat")),
        lambda t: t.drop(update_path("2024a.1.0/icutz/icutz44l.dat"))),
    "an update that is a link to the host": case(
        2, lambda t: t.link(update_path("2024a.1.0"), OUTSIDE),
        lambda t: t.link(TZ_LATEST, update_path("2024a.1.0")), announced__schema=None),
    "a tree that is a link to the host": case(
        2, lambda t: t.drop(SYSTEM_ZONEINFO),
        lambda t: t.link(SYSTEM_ZONEINFO, "/proc/self/root/usr"), system__version=None),
    "a version that is the host's file": case(
        2, lambda t: t.link(SYSTEM_ZONEINFO + "/+VERSION", "/etc/hostname"),
        system__version=None),
    "a zone that is the host's file": case(
        2, lambda t: t.link(LOCALTIME, ZONEINFO + OUTSIDE + "/passwd"),
        now__zone_is_file=False),
    "a record that is a link to the host": case(
        2, lambda t: t.announce("2024a.1.0"), lambda t: t.link(RECORD, "/etc/passwd"),
        next_boot__after__record={"kind": "link", "target": "/etc/passwd"}),
    "a record that is a directory": case(
        2, lambda t: t.announce("2024a.1.0"), lambda t: t.directory(RECORD)),
    "var is a link inside": case(0, lambda t: t.move("/var", "/data"),
                                 lambda t: t.link("/var", "data")),
    "var is an absolute link inside": case(0, lambda t: t.move("/var", "/data"),
                                           lambda t: t.link("/var", "/data")),
    "the tree is a link inside": case(
        0, lambda t: t.move(SYSTEM_ZONEINFO, "/tree"),
        lambda t: t.link(SYSTEM_ZONEINFO, "/tree"), system__version="2023c.1.0"),
    "the directory is a link inside": case(
        0, lambda t: t.move("/var/db/timezone", "/var/db/zones"),
        lambda t: t.link("/var/db/timezone", "/var/db/zones")),
    "the downloads are a link inside": case(
        1, lambda t: t.announce("2024a.1.0"), lambda t: t.move(DOWNLOADS, "/updates"),
        lambda t: t.link("/var/db/timezone/tz", "/updates")),
    # The boot may write below "/var/db" only.
    "the directory is a link elsewhere": case(
        2, lambda t: t.drop(ZONEINFO),
        lambda t: t.move("/var/db/timezone", "/zones"),
        lambda t: t.link("/var/db/timezone", "/zones"), next_boot__ends="abnormally"),
    "a directory that nobody may write": case(
        2, lambda t: t.announce("2024a.1.0"),
        lambda t: t.directory("/var/db/timezone", 0o555), next_boot__ends="abnormally"),
    "a directory that nobody may read": case(
        2, lambda t: t.directory("/var/db/timezone", 0o000)),
    "downloads that nobody may read": case(
        0, lambda t: t.directory("/var/db/timezone/tz", 0o000)),
    "data behind what the boot removes": case(
        2, lambda t: t.use("2024a.1.0"), lambda t: t.announce("2024b.1.0"),
        lambda t: t.move(update_path("2024b.1.0/icutz"), "/var/db/real"),
        lambda t: t.link(OLD_ICU, "/var/db/real"),
        lambda t: t.link(update_path("2024b.1.0/icutz"), OLD_ICU),
        **{does("update"): "changed_by_the_boot"}),
    "current data behind what the boot removes": case(
        2, lambda t: t.use("2024b.1.0"),
        lambda t: t.move(update_path("2024b.1.0/icutz"), "/var/db/real"),
        lambda t: t.link(OLD_ICU, "/var/db/real"),
        lambda t: t.link(update_path("2024b.1.0/icutz"), OLD_ICU),
        **{does("usable"): "changed_by_the_boot"}),
    "links behind what the boot removes": case(
        2, lambda t: t.move("/var/db/timezone", "/var/db/zones"),
        lambda t: t.link("/var/db/timezone", "icu"),
        lambda t: t.link(OLD_ICU, "zones"),
        **{does("current"): "changed_by_the_boot"}),
    "a directory that is its own downloads": case(
        2, lambda t: t.drop(ZONEINFO), lambda t: t.drop("/var/db/timezone/tz"),
        lambda t: t.link("/var/db/timezone/tz", "."), next_boot__ends="abnormally"),
    "a download that is a link": case(
        0, lambda t: t.use("2024a.1.0"),
        lambda t: t.move(update_path("2024a.1.0"), update_path("real")),
        lambda t: t.link(update_path("2024a.1.0"), "real"),
        downloads__1={"name": "real", "needed_by": ["zoneinfo", "icutz"]}),
    "downloads that are a file": case(
        0, lambda t: t.drop("/var/db/timezone/tz"),
        lambda t: t.file("/var/db/timezone/tz"), downloads=[],
        downloads_error="Not a directory"),
    "var db is a file": case(2, lambda t: t.drop("/var/db"),
                             lambda t: t.file("/var/db"),
                             **{does("old_icu"): "unreachable"}),
    "no var": case(2, lambda t: t.drop("/var")),
    "no timezone directory": case(2, lambda t: t.drop("/var/db/timezone"),
                                  next_boot__ends="abnormally"),
    "nothing at all": case(2, lambda t: t.drop("/var"), lambda t: t.drop("/usr")),
    "no local zone": case(2, lambda t: t.drop(LOCALTIME),
                          **{does("localtime"): "no_link"}),
    "an old local zone": case(
        1, lambda t: t.link(LOCALTIME, "/usr/share/zoneinfo/Europe/Paris"),
        **{does("localtime"): "former_place"}),
    "a local zone that is missing": case(
        2, lambda t: t.link(LOCALTIME, ZONEINFO + "/Europe/Nowhere"),
        now__zone_is_file=False),
    "a loop of links": case(2, lambda t: t.link(LOCALTIME, "localtime")),
    "a legacy link": case(2, lambda t: t.link(LEGACY_ICUTZ, SYSTEM_ICU),
                          **{does("legacy_icu_link"): "no_present_link"}),
    "a legacy directory": case(2, lambda t: t.directory(LEGACY_ICUTZ)),
    "old data": case(1, lambda t: t.directory(OLD_ICU)),
    "old data that stays": case(2, lambda t: t.directory(OLD_ICU + "/x")),
    "a sparse version": case(
        1, lambda t: t.announce("2024a.1.0"),
        lambda t: t.sparse(update_path("2024a.1.0/zoneinfo/+VERSION"), 1 << 40)),
    "many downloads": case(
        0, lambda t: [t.directory(update_path(f"{n}a.1.0")) for n in range(500)]),
}


@pytest.mark.parametrize("name", CASES)
def test_a_tree(name):
    """Whatever it holds: the status, the facts, and not a trace left on it."""
    change, status, facts = CASES[name]
    namespace.insist_on_private_device()
    change(Tree())
    before = of_tree()
    answer = ask("--root", str(TREE), "--json")
    assert of_tree() == before
    assert (answer.status, answer.errors) == (status, ""), answer.output
    for name, value in facts.items():
        assert fact(answer.said, name) == value, name
    rows = ask("--root", str(TREE))
    assert (rows.status, rows.errors) == (status, "")
    assert re.fullmatch(r"[ -~\n]*", rows.output)
    # Lines of the boot aside, which have it.
    rest = re.sub(r"marlin: .*|20\d\d[a-z]\.1\.0|a\.1\.0", "", rows.output)
    assert ".1.0" not in rest
    check = ask("--root", str(TREE), "--check")
    assert check.status == status
    assert check.output == "".join(f"{reason}\n" for reason in answer.said["reasons"])


def of_tree() -> dict:
    found = {}
    for folder, folders, names in os.walk(os.fsencode(TREE)):
        for path in [folder, *(os.path.join(folder, name) for name in names + folders)]:
            with contextlib.suppress(PermissionError):
                status = os.lstat(path)
                found[path] = (status.st_ino, status.st_mode, status.st_mtime_ns,
                               status.st_ctime_ns, stat.S_ISLNK(status.st_mode)
                               and os.readlink(path))
    return found


def test_too_much_icu_data_cannot_be_told():
    """A bound on memory or time is not a guess."""
    tree = Tree()
    tree.announce("2024a.1.0", "45l")
    folder = tree.at(update_path("2024a.1.0/icutz/"))
    for number in range(200_000):
        os.mknod(folder + b"%d" % number)
    answer = ask("--root", str(TREE))
    assert answer.status in (2, 77)
    assert answer.status == 2 or re.fullmatch(
        "marlin-status: cannot tell: .*\n", answer.errors)


def test_nothing_outside_is_opened():
    """Before the root is the tree, only what the program needs for that."""
    tree = Tree()
    for path in (SYSTEM_ZONEINFO + "/+VERSION", SYSTEM_ICU + "/icutzformat.txt", RECORD,
                 update_path("x"), OLD_ICU, LEGACY_ICUTZ):
        tree.link(path, "/etc/passwd")
    subprocess.run(["/usr/bin/strace", "-f", "-o", "/tmp/trace", "-e", "trace=%file",
                    STATUS, "--root", TREE], capture_output=True)
    before, _, after = Path("/tmp/trace").read_text().rpartition('chroot(".")')
    assert not re.search(r'open\w*\([^"]*"/etc', after)
    opened = set(re.findall(r'open\w*\([^"]*"([^"]*)"', before))
    assert opened and opened <= {
        "", str(TREE), "/proc", "/proc/self/setgroups", "/proc/self/uid_map",
        "/proc/self/gid_map", "self/mountinfo", "/root", "var/db", "/var/db",
        "/var/db/timezone", "/var/db/timezone/tz"}, opened


def test_a_tree_that_disappears():
    for _ in range(20):
        Tree()
        asked = subprocess.Popen([STATUS, "--root", TREE], stdout=subprocess.DEVNULL,
                                 stderr=subprocess.PIPE)
        shutil.rmtree(TREE)
        errors = asked.communicate(timeout=30)[1].decode()
        assert asked.returncode in (0, 1, 2, 77), errors
        assert asked.returncode == 77 or errors == ""


@pytest.mark.parametrize("words, status, line", [
    (["--rot"], 64, "--rot is not understood; see --help"),
    (["--rock"], 64, "--rock is not understood; see --help"),
    (["-xh"], 64, "-x is not understood; see --help"),
    (["--root"], 64, "--root needs a directory; see --help"),
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


def test_a_full_standard_output_is_a_failure():
    Tree()
    with open("/dev/full", "wb") as full:
        done = subprocess.run([STATUS, "--root", TREE], stdout=full,
                              stderr=subprocess.PIPE)
    assert done.returncode == 77
    assert done.stderr.startswith(b"marlin-status: cannot tell: standard output: ")


def test_rows_fit_a_terminal():
    """As wide as the terminal is, with colour only there and only if it is wanted."""
    Tree().link(ZONEINFO, "x" * 300)
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


@pytest.mark.parametrize("place", ["/var/db/timezone", "/var/db/timezone/tz", "/var/db",
                                   "/var", "/usr/share/icu"])
def test_a_file_system_of_its_own(place):
    """What is mounted inside the device is seen, covered and left alone."""
    tree = Tree()
    tree.announce("2024a.1.0")
    at = os.fsdecode(tree.at(place))
    done = subprocess.run(
        ["/usr/bin/unshare", "--user", "--map-root-user", "--mount", "/bin/sh", "-euc",
         f"""mkdir /tmp/aside && cp -a {at}/. /tmp/aside
             mount -t tmpfs -o mode=755 own {at} && cp -a /tmp/aside/. {at}
             find {TREE} -printf '%p %i %T@ %C@ %l\\n' >/tmp/before
             {STATUS} --root {TREE} --json || [ $? = 1 ]
             find {TREE} -printf '%p %i %T@ %C@ %l\\n' | cmp /tmp/before -
             rm -r /tmp/aside"""],
        capture_output=True, text=True)
    assert done.stderr == ""
    said = json.loads(done.stdout)
    assert fact(said, does("update").replace("__", ".")) == "newer"
    assert unescaped(said["next_boot"]["after"]["zoneinfo"]["target"]) == (
        f"{update_path('2024a.1.0')}/zoneinfo")
    shutil.rmtree("/tmp/aside", ignore_errors=True)
