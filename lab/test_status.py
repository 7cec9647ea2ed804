# SPDX-License-Identifier: BSD-2-Clause
"""What marlin-status says of a device, and of its next boot, is so: it is asked, and
then the device is really booted. Asking leaves no trace on the device.

This takes a user who may have namespaces and is not root: lab.prove starts it so.
"""

import json
import os
import random
import re
import subprocess
from errno import ENOENT
from typing import NamedTuple

import pytest

from lab import boot, lines
from lab.carriers import namespace
from lab.device import Device, Node
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
    before, after = (as_device(entries).contents() for entries in
                     (seen.before, seen.after))
    if said["status"] == 0 and (before != after or seen.ending != "exit 0"):
        return ["said that nothing changes"]
    if said["status"] == 1 and before == after:
        return ["said that something changes"]
    if (said["status"] == 0) != (said["reasons"] == []):
        return [f"status {said['status']} for the reasons {said['reasons']}"]
    return []


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
    found += status_differences(said, seen)
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
