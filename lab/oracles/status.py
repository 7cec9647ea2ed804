# SPDX-License-Identifier: BSD-2-Clause
"""What marlin-status has to say of a device and of its next boot: what there is, and
what the boot then does. Every answer has to fit the schema and the page."""

import json
import os
import re
import shlex
import subprocess
from errno import ENOENT
from typing import NamedTuple

import jsonschema

from lab.carriers import boot, namespace
from lab.oracles.properties import version_of
from lab.words import lines
from lab.words.device import Device, Node
from lab.words.paths import (DOWNLOADS, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU, RECORD,
                             TZ_LATEST, ZONEINFO)
from lab.words.places import PROJECT
from lab.words.seen import Entries, Seen, as_device

STATUS = os.path.join(os.path.dirname(boot.PROGRAM), "tools", "marlin-status")
NAMES = {"zoneinfo": ZONEINFO, "icutz": ICUTZ, "localtime": LOCALTIME,
         "tz_latest": TZ_LATEST, "record": RECORD, "legacy_icutz": LEGACY_ICUTZ,
         "old_icu": OLD_ICU}
PAGE = (PROJECT / "docs/marlin-status.8").read_text()
REASONS = {  # "update refused older", and the others under STEPS
    f"{name} {does} {reason}"
    for name, rows in re.findall(r"^\.It Cm (\w+)\n([^.]*)", re.search(
        r"^\.Sh STEPS\n(.*?)^\.Sh ", PAGE, re.M | re.S)[1], re.M)
    for does, listed in re.findall(r"(\w+): ([\w, \n]+)", rows)
    for reason in listed.replace(",", "").split()}
# Storage that fails can give these, and no tree.
OF_STORAGE = {"current reset unreadable", "localtime reset unreadable",
              "localtime reset not_replaced", "last_resort reset walk_failed",
              "links found no_dataset"}
NOT_REACHED = {f"{step} not_reached earlier_failure"
               for step in ("current", "usable", "update", "localtime")}


# Closed: no other names may be.
VALIDATOR = jsonschema.Draft202012Validator(json.loads(
    (PROJECT / "docs/marlin-status.schema.json").read_text().replace(
        '"type": "object"', '"type": "object", "additionalProperties": false')))


class Answer(NamedTuple):
    status: int
    output: str
    errors: str

    @property
    def said(self) -> dict:
        said = json.loads(self.output)
        VALIDATOR.validate(said)
        assert self.reasons() <= REASONS | NOT_REACHED
        return said

    def reasons(self) -> set[str]:
        """As the page names them: of the steps, and what is found beside them."""
        said = json.loads(self.output)
        steps = {(step["step"], step["does"], step["reason"])
                 for step in said["next_boot"]["steps"]}
        known = {(step, reason) for step, _, reason in steps}
        found = {(found["subject"], "found", found["code"]) for found in said["reasons"]
                 if (found["subject"], found["code"]) not in known}
        return {" ".join(names) for names in steps | found}


def ask(*options: str, under: str = "", **how) -> Answer:
    """Under a command that is to run it, if one is given."""
    namespace.insist_on_private_device()
    done = subprocess.run([*shlex.split(under), STATUS, *options], timeout=30,
                          capture_output=True, **how)
    return Answer(done.returncode, done.stdout.decode("ascii"),
                  done.stderr.decode("latin-1"))


def unescaped(text: str) -> str:
    return re.sub(r"\\(?:x([0-9a-f]{2})|(\\))",
                  lambda match: chr(int(match[1], 16)) if match[1] else "\\", text)


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
