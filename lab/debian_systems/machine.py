# SPDX-License-Identifier: BSD-2-Clause
"""One Debian system in an emulator: its disks, its boots, and what was seen of each.

The first disk is the root, the second carries a script to the system and its answers
back, a third, where there is one, is for the scene.
"""

import io
import json
import subprocess
import tarfile
from dataclasses import dataclass
from pathlib import Path

from lab.carriers import image, qemu
from lab.carriers.building import room
from lab.debian_systems.parts import CHOSEN, make_image

SECONDS = 600  # a boot that takes longer hangs
UNIT = "marlin.service"
STARTING = "7d4958e842da4a758f6c1cdc7b36dcc5"  # the journal's message of this kind


@dataclass
class Seen:
    """One boot of a system."""
    files: dict[str, bytes]  # what the system tells, by name
    links: dict[str, str]  # below "/var/db", and of what owner
    owners: dict[str, tuple[int, int, int]]  # mode, user, group
    console: str

    def __post_init__(self):
        told = [dict(line.split("=", 1) for line in block.splitlines())
                for block in self.text("units").strip().split("\n\n")]
        self.units = {block.get("Id", ""): block for block in told}
        self.journal = [json.loads(line) for line in self.text("journal").splitlines()]

    def text(self, name: str) -> str:
        return self.files.get(name, b"").decode(errors="replace")

    def said_by(self, **fields: str) -> list[dict]:
        """The journal's entries with these fields."""
        return [entry for entry in self.journal
                if all(entry.get(name) == value for name, value in fields.items())]

    def started(self) -> list[dict]:
        """The journal's entries for each start of the unit."""
        return self.said_by(MESSAGE_ID=STARTING, UNIT=UNIT)

    def failed(self) -> list[str]:
        """The units that failed."""
        return [line.split()[0] for line in self.text("failed").splitlines()]

    def at(self, unit: str, what: str) -> int:
        """A unit's time in microseconds since power-on, 0 if it never was."""
        return int(self.units[unit].get(what + "TimestampMonotonic") or 0)


def message(entry: dict) -> str:
    """An entry's text; the journal gives bytes where it takes them for binary."""
    text = entry.get("MESSAGE") or ""
    return text if isinstance(text, str) else bytes(text).decode("latin-1")


class System:
    """In a directory of its own. `script` and the rest are for make_image."""

    def __init__(self, name: str, script="", **how):
        self.directory = room(CHOSEN.place / "scenes" / name)
        self.root, self.told, self.third, self.console = (
            self.directory / name
            for name in ("system.img", "told.tar", "third.img", "console"))
        make_image(self.root, script, third=self.third, **how)

    def replace(self, path: str, text: str):
        """A file of the root, while the system is off."""
        file = self.directory / "file"
        file.write_text(text)
        image.replay_journal(self.root)
        image.debugfs(self.root, f"rm {path}", f"write {file} {path}", write=True)

    def start(self, options: str, more: tuple[str, ...]) -> subprocess.Popen:
        disks = [self.root, self.told] + [self.third] * self.third.exists()
        return qemu.start(
            CHOSEN.processor, qemu.part(CHOSEN.place, "vmlinuz-*"), 1024, self.console,
            "root=/dev/nvme0n1 loglevel=4 systemd.unit=lab.target no_timer_check "
            f"{'' if ' ro ' in f' {options} ' else 'rw '}{options}",
            "-device", "nvme,id=nvme,serial=lab",
            *(word for number, disk in enumerate(disks, 1) for word in (
                "-drive", f"if=none,id=disk{number},format=raw,file={disk}",
                "-device", f"nvme-ns,drive=disk{number},nsid={number}")), *more)

    def boot(self, then="", options="", more: tuple[str, ...] = (),
             seconds=SECONDS) -> Seen:
        """One boot, from power-on to power-off. `then` is what a shell does on the
        system after it has told what was seen; `options` are the kernel's."""
        with tarfile.open(self.told, "w") as archive:
            entry = tarfile.TarInfo("then")
            entry.size = len(then.encode())
            archive.addfile(entry, io.BytesIO(then.encode()))
        with open(self.told, "r+b") as file:
            file.truncate(48 << 20)
        emulator = self.start(options, more)
        qemu.wait(emulator, self.console, "lab: all is told", seconds)
        status = qemu.end(emulator, 10)
        printed = qemu.text_of(self.console)
        try:
            return Seen(*look(self.told), printed)
        except (KeyError, tarfile.TarError) as reason:
            raise RuntimeError(f"the system told nothing (status {status}; {reason}):\n"
                               + printed[-6000:]) from reason


def look(told: Path):
    """What the answers hold: files, links and owners."""
    files, links, owners = {}, {}, {}
    with tarfile.open(told) as archive:
        for entry in archive:
            path = "/" + entry.name
            if path.startswith("/run/lab/seen/") and entry.isfile():
                files[path.removeprefix("/run/lab/seen/")] = archive.extractfile(
                    entry).read()
            if path.startswith("/var/db"):
                owners[path] = (entry.mode, entry.uid, entry.gid)
                if entry.issym():
                    links[path] = entry.linkname
                elif entry.isfile():
                    files[path] = archive.extractfile(entry).read()
    files["reader"]  # which every system tells
    return files, links, owners
