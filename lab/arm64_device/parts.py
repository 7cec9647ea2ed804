# SPDX-License-Identifier: BSD-2-Clause
"""What an emulated arm64 device is made of: the program, built for it, and Debian's
kernel and busybox, from packages that are unpacked in the folder "build" and never
installed. The emulator and the tools that build all this are installed, as root."""

import fcntl
import functools
import re
import shutil
import subprocess
import sys
from pathlib import Path

from lab.carriers.building import build
from lab.carriers.image import run
from lab.words.places import BUILD, PROJECT

WORK = BUILD / "emulator"
PARTS = WORK / "packages"
PROGRAM = BUILD / "arm64-release" / "marlin"
COMPANIONS = [PROGRAM.parent / "tools" / name
              for name in ("marlin-install", "marlin-mend", "marlin-status")]


class Unavailable(Exception):
    """What a device needs cannot be obtained on this machine."""


def prepare():
    """Builds and fetches what is missing; or raises Unavailable."""
    if PARTS.exists() and not (PARTS / "bin/busybox").exists():
        raise Unavailable(f"{PARTS} is there, and not made by this; remove it")
    if subprocess.call([PROJECT / "scripts/packages", "build", "arm64", "device"]):
        raise Unavailable("packages are missing")
    on_path("qemu-system-aarch64")
    WORK.mkdir(parents=True, exist_ok=True)
    with open(WORK / "lock", "w", encoding="ascii") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        build("arm64-release")
        if not PARTS.is_dir():
            print("Fetching a kernel and busybox", file=sys.stderr, flush=True)
            try:
                fetch(PARTS, "arm64", "busybox-static")
            except RuntimeError as reason:
                why = str(reason).strip().splitlines()[-1]
                raise Unavailable(f"the parts cannot be fetched: {why}") from reason


def on_path(program: str):
    if not shutil.which(program):
        raise Unavailable(f"{program} is installed and not on the PATH")


def fetch(place: Path, architecture: str, *names: str, kernel=True):
    """Unpacks the newest kernel for virtual machines, and these packages. With an index
    and a package database of its own, so that this machine's stay as they are."""
    work = place.with_name("fetched")
    shutil.rmtree(work, ignore_errors=True)
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
    (work / "unpacked").rename(place)
    shutil.rmtree(work)


@functools.cache
def part(pattern: str) -> Path:
    """The one file among the parts whose path ends so."""
    [path] = PARTS.rglob(pattern)
    return path
