# SPDX-License-Identifier: BSD-2-Clause
"""An emulated arm64 device: the program, built for it, with Debian's kernel and
busybox; its disks, its boots, and its console.

The system partition is read-only and holds the program; "/var" is a disk of its own.
The console is a file, in which every line begins with the kernel's time.
"""

import os
import re
import subprocess
import tempfile
from collections.abc import Callable
from pathlib import Path

from lab.carriers import image, qemu
from lab.carriers.boot import Booted, ending_of
from lab.carriers.building import build, room
from lab.carriers.namespace import build_below
from lab.words import lines
from lab.words.device import Device, Node, decoded
from lab.words.paths import ICUTZ, LOCALTIME, TZ_LATEST, ZONEINFO
from lab.words.places import BUILD
from lab.words.seen import Entries

WORK, BUILT = BUILD / "emulator", BUILD / "arm64-release"
PROGRAMS = "marlin", "tools/marlin-install", "tools/marlin-mend"
GUEST = Path(__file__).parent / "guest"
MODULES = ("drivers/virtio/virtio_ring", "drivers/virtio/virtio",
           "drivers/virtio/virtio_mmio", "drivers/block/virtio_blk")
# What fills the disk of "/var", in the language of the device's shell.
NO_BLOCK = """
dd if=/dev/zero of=/var/filler bs=65536 2>/dev/null
dd if=/dev/zero of=/var/filler2 bs=4096 2>/dev/null
"""
NO_INODE = """
mkdir /var/filler
i=0
while touch /var/filler/$i 2>/dev/null; do i=$((i + 1)); done
"""
NO_FILLER = "rm -rf /var/filler*\n"
LINKS = (ZONEINFO, ICUTZ, LOCALTIME, TZ_LATEST)


def prepare():
    """Builds and fetches what is missing; or raises qemu.Unavailable."""
    with qemu.preparing(qemu.ARM64, WORK, "build", "arm64", "device"):
        build("arm64-release")


def with_shell(folders: str, programs: dict[str, Path]) -> Device:
    """Empty folders, and programs by their places."""
    made = Device()
    for name in folders.split():
        made.directory(f"/{name}")
    busybox = qemu.part(WORK, "bin/busybox")
    for path, program in {"/bin/busybox": busybox, **programs}.items():
        made.file(path, decoded(program.read_bytes()), 0o755)
    return made


def make_first_memory(archive: Path, script: str):
    """What the kernel unpacks at first: enough to mount the disks, and what the device
    is to do when it is up."""
    memory = with_shell("dev device proc sys", {"/init": GUEST / "init", **{
        f"/modules/{path.name}": path for name in MODULES
        for path in (WORK / "packages").rglob(f"kernel/{name}.ko")}})
    memory.file("/script", script)
    with tempfile.TemporaryDirectory() as staging:
        build_below(staging, memory.root, exists=True)
        image.run("bsdtar", "-c", "--format", "newc", "-f", archive, "-C", staging, ".")


def system_partition(device: Device) -> Node:
    """The program, a shell, and the system's own data."""
    system = with_shell("dev proc run sys tmp", {
        "/sbin/boot": GUEST / "boot",
        **{f"/sbin/{Path(name).name}": BUILT / name for name in PROGRAMS}})
    system.file("/etc/passwd", "owner:x:1:1::/:/run/bin/sh\n")
    system.put("/usr/share", device.find("/usr/share"))
    return system.root


def shown_links(device: Device) -> list[str]:
    """What a boot that ends with this device says of its links."""
    contents = device.contents()
    return [f"{os.path.basename(path)} -> {contents.get(path, 'none')}"
            for path in LINKS]


def ending(status: int) -> str:
    """As in Seen; the device's shell tells a signal as a status above 128."""
    return ending_of(status - 128 if status > 128 else status << 8)


class Console:
    """What a boot printed: lines with the kernel's time in seconds."""

    def __init__(self, path: Path):
        self.text = qemu.text_of(path)
        # Whole ones only: the power may have been cut within a line.
        matches = re.findall(r"^\[ *(\d+\.\d+)\] ?(.*)\n", self.text, re.MULTILINE)
        self.lines = [(float(at), text) for at, text in matches]
        self.said = [text.removeprefix("device: ") for _, text in self.lines
                     if text.startswith("device: ")]

    def failure(self, what: str) -> RuntimeError:
        return RuntimeError(f"{what}:\n{self.text[-6000:]}")

    def find(self, start: str) -> tuple[float, str]:
        """The time and the rest of the device's first line that begins so."""
        for at, text in self.lines:
            if text.startswith("device: " + start):
                return at, text.removeprefix("device: " + start)
        raise self.failure(f"the console never said: {start}")

    def booted(self) -> Booted:
        """The boot's own pass; the kernel may have printed in between."""
        begin, _ = self.find("pass begins")
        end, status = self.find("pass ended with status ")
        return Booted(ending(int(status)), "".join(
            f"{text}\n" for at, text in self.lines if begin <= at <= end
            and text.startswith((lines.NAME, "terminate called"))))


def relink(before: dict[str, str], after: dict[str, str]) -> str:
    """What the device's shell does to links so that one description becomes the
    other; an announcement is replaced as installers of updates do it."""
    removed = [f"rm {path}\n" for path in before if path not in after]
    return "".join(removed + [
        f"ln -s {text} {path}.next && mv -T {path}.next {path}\n"
        for path, text in after.items() if before.get(path) != text])


def plain(name: str, path: Path) -> str:
    """An image as the emulator's block device of this name."""
    return f"driver=raw,node-name={name},file.driver=file,file.filename={path}"


class Machine:
    """One device, in a directory of its own. `device` describes it."""

    def __init__(self, name: str):
        self.directory = room(WORK / name)
        self.system, self.var, self.memory, self.console = (
            self.directory / part for part in
            ("system.img", "var.img", "memory", "console"))

    def build(self, device: Device, *options: str, megabytes=32, owner=0,
              **beside: Node):
        """Makes both disks of a described device, with what is to stand in "/var"
        beside its own; the options are of mke2fs."""
        self.device = device
        image.build(self.system, system_partition(device), 14, "-O", "^has_journal")
        self.built = image.digest(self.system)
        root = Node("dir", 0o755, entries={"db": device.find("/var/db"), **beside})
        image.build(self.var, root, megabytes, *options, owner=owner)

    def look(self, var: Path | None = None) -> Entries:
        """Everything on the device, or on it with another disk. Raises if anything at
        all on the system partition has changed since it was built."""
        if image.digest(self.system) != self.built:
            raise RuntimeError("the system partition was changed")
        return {**image.look(self.system, "/usr/share", "/usr/share"),
                **image.look(var or self.var, "/db", "/var/db")}

    def start(self, script="", options="", disk="", more=()) -> subprocess.Popen:
        """`script` is what the device does when it is up, in its shell's language;
        `options` are the kernel's, or var=OPTIONS of the mount; `disk` is the
        emulator's block device instead of the plain image, `more` are words for it."""
        make_first_memory(self.memory, script)
        return qemu.start(
            qemu.ARM64, qemu.part(WORK, "vmlinuz-*"), 256, self.console,
            f"loglevel=5 printk.devkmsg=on {options}", "-initrd", self.memory,
            "-blockdev", f"{plain('system', self.system)},read-only=on",
            "-blockdev", disk or plain("var", self.var),
            "-device", "virtio-blk-device,drive=var",
            "-device", "virtio-blk-device,drive=system", *more)

    def boot(self, then: Callable[[], object] | None = None, script="", seconds=120,
             **how) -> Console:
        """One boot from power on to power off. `then` changes links in the
        description after the pass, and the device's shell does the same."""
        before = self.device.contents()
        if then:
            then()
        script = relink(before, self.device.contents()) + script
        emulator = self.start(script, **how)
        self.wait_for(emulator, "shut down", seconds)
        if qemu.end(emulator, 10):
            raise Console(self.console).failure("the device did not shut down")
        return Console(self.console)

    def wait_for(self, emulator: subprocess.Popen, text: str, seconds=120):
        """Until the console says so."""
        if not qemu.wait(emulator, self.console, f"device: {text}\n", seconds):
            emulator.kill()
            raise Console(self.console).failure(f"the console never said: {text}")
