# SPDX-License-Identifier: BSD-2-Clause
"""The host's side of an emulator: Debian's kernel and programs for it, from packages
that are unpacked in the folder "build" and never installed; its command; its console, a
file; and the wait until it has ended."""

import contextlib
import re
import shutil
import subprocess
import time
from collections.abc import Iterator
from pathlib import Path
from typing import NamedTuple

from lab.carriers.building import locked, room
from lab.carriers.image import run
from lab.words.command import say
from lab.words.places import PROJECT

# The machine's clock counts a nanosecond for each instruction.
COUNTED = ("-icount", "shift=0,sleep=off")


class Unavailable(Exception):
    """What an emulated machine needs cannot be obtained on this one."""


class Processor(NamedTuple):
    """As Debian names it."""
    architecture: str
    qemu: tuple[str, ...]
    console: str


AMD64 = Processor("amd64", ("qemu-system-x86_64", "-M", "q35"), "ttyS0")
ARM64 = Processor("arm64", ("qemu-system-aarch64", "-M", "virt", "-cpu", "cortex-a57"),
                  "ttyAMA0")


@contextlib.contextmanager
def preparing(processor: Processor, place: Path, *purposes: str) -> Iterator[None]:
    """Has a folder to itself, with what the purposes take installed; there are then a
    kernel and busybox in "packages". Raises Unavailable, also for a RuntimeError."""
    parts = place / "packages"
    if parts.exists() and not (parts / "bin/busybox").exists():
        raise Unavailable(f"{parts} is there, and not made by this; remove it")
    if subprocess.call([PROJECT / "scripts/packages", *purposes]):
        raise Unavailable("packages are missing")
    if not shutil.which(processor.qemu[0]):
        raise Unavailable(f"{processor.qemu[0]} is installed and not on the PATH")
    with locked(place):
        try:
            fetch(parts, processor.architecture, "busybox-static", kernel=True)
            yield
        except RuntimeError as reason:
            why = str(reason).strip().splitlines()[-1]
            raise Unavailable("the parts cannot be fetched, which takes a mirror of "
                              f"Debian: {why}") from reason


def fetch(place: Path, architecture: str, *names: str, kernel=False):
    """Unpacks these packages, and the newest kernel for virtual machines, unless it was
    done before. With an index and a package database of its own, so that this machine's
    stay as they are."""
    if place.is_dir():
        return
    say(f"Fetching packages: {', '.join(names)}")
    work = room(place.with_name("fetched"))
    for directory in ("lists/partial", "cache/archives/partial", "unpacked"):
        (work / directory).mkdir(parents=True)
    (work / "status").touch()
    settings = {"APT::Architecture": architecture, "APT::Architectures::": architecture,
                "APT::Sandbox::User": "root", "Dir::State": work,
                "Dir::State::lists": work / "lists", "Dir::Cache": work / "cache",
                "Dir::State::status": work / "status"}

    def apt(tool, *words):
        options = [word for item in settings.items() for word in ("-o", "%s=%s" % item)]
        return run(tool, "-qq", *options, *words, cwd=work)

    apt("apt-get", "update")
    if kernel:
        newest = apt("apt-cache", "depends", f"linux-image-cloud-{architecture}")
        found = re.search(r"^ *Depends: (linux-image-[0-9]\S*)$", newest, re.MULTILINE)
        if not found:
            raise RuntimeError(f"no kernel for {architecture} in the package index")
        names += found[1],
    apt("apt-get", "download", *names)
    for package in work.glob("*.deb"):
        run("dpkg-deb", "-x", package, work / "unpacked")
    # As those of Debian 13 are.
    run("find", work, "-name", "*.ko.xz", "-exec", "unxz", "{}", "+")
    (work / "unpacked").rename(place)
    shutil.rmtree(work)


def part(place: Path, pattern: str) -> Path:
    """The one file of those fetched whose path ends so."""
    [path] = (place / "packages").rglob(pattern)
    return path


def start(processor: Processor, kernel: Path, megabytes: int, console: Path,
          parameters: str, *more: str | Path) -> subprocess.Popen:
    """`parameters` are the kernel's, `more` the words for disks and the like."""
    console.unlink(missing_ok=True)
    return subprocess.Popen([
        *processor.qemu, "-accel", "tcg", "-m", str(megabytes), "-nodefaults",
        "-no-reboot", "-display", "none", "-serial", f"file:{console}", "-kernel",
        kernel, "-append", f"console={processor.console} panic=-1 {parameters}", *more],
        stdin=subprocess.DEVNULL)


def text_of(console: Path) -> str:
    return console.read_text(errors="replace") if console.exists() else ""


def wait(emulator: subprocess.Popen, console: Path, text: str, seconds: float) -> bool:
    """Whether the console says so before the time is over or the machine off."""
    end = time.monotonic() + seconds
    while text not in text_of(console):
        if time.monotonic() > end or emulator.poll() is not None:
            return text in text_of(console)
        time.sleep(0.1)
    return True


def end(emulator: subprocess.Popen, seconds: float) -> int:
    """Its status, negative when it had to be killed."""
    with contextlib.suppress(subprocess.TimeoutExpired):
        emulator.wait(seconds)
    emulator.kill()
    return emulator.wait()
