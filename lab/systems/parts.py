# SPDX-License-Identifier: BSD-2-Clause
"""What a system is made of: a Debian root with systemd, Debian's kernel, the package
as it ships, and the demonstration's real data. All of it is made once, in the folder
"build"; of the root's image every system has a copy."""

import fcntl
import shutil
import subprocess
import sys
from pathlib import Path
from typing import NamedTuple

from lab.carriers.image import run
from lab.demo import data
from lab.doors import build
from lab.emulator.parts import Unavailable, fetch
from lab.places import BUILD, PROJECT

WORK = BUILD / "systems"
GUEST = Path(__file__).parent / "guest"
ROOT_PACKAGES = "systemd,systemd-sysv,udev,tzdata,dbus,kmod,dash"
MEGABYTES = 512
# Nobody asks these systems anything, and nobody reads on them.
LEFT_OUT = [word for place in ("doc", "info", "locale", "man", "lintian")
            for word in (f"--dpkgopt=path-exclude=/usr/share/{place}/*",
                         f"--dpkgopt=path-include=/usr/share/{place}/marlin*")]


class Processor(NamedTuple):
    """A Debian architecture, the preset that builds for it, and the machine."""
    name: str
    preset: str
    compiler: str
    qemu: tuple[str, ...]
    console: str

    @property
    def place(self) -> Path:
        return WORK / self.name

    @property
    def kernel(self) -> Path:
        [kernel] = (self.place / "packages").rglob("vmlinuz-*")
        return kernel


AMD64 = Processor("amd64", "release", "gcc", ("qemu-system-x86_64", "-M", "q35"), "ttyS0")
ARM64 = Processor("arm64", "arm64-release", "aarch64-linux-gnu-gcc", (
    "qemu-system-aarch64", "-M", "virt", "-cpu", "cortex-a57"), "ttyAMA0")


def prepare(processor=AMD64):
    """Builds and fetches what is missing; or raises Unavailable."""
    if subprocess.call([PROJECT / "scripts/packages", "build", "arm64", "demo",
                        "device", "systems"]):
        raise Unavailable("packages are missing")
    place = processor.place
    place.mkdir(parents=True, exist_ok=True)
    with open(place / "lock", "w", encoding="ascii") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        try:
            if not (place / "packages").is_dir():
                tell("Fetching a kernel")
                fetch(place / "packages", processor.name, "busybox-static")
            if not (place / "root.tar").exists():
                tell("Making a Debian system, in a minute or two")
                make_root(processor)
        except RuntimeError as reason:
            raise Unavailable(f"no Debian system can be made: {reason}") from reason
        data.prepare()
        make_package(processor)
        make_image(processor)


def tell(text: str):
    print(text, file=sys.stderr, flush=True)


def make_root(processor: Processor):
    made = processor.place / "root.new.tar"
    run("mmdebstrap", "--quiet", "--variant=essential",
        f"--architectures={processor.name}", f"--include={ROOT_PACKAGES}",
        "--aptopt=Acquire::Languages \"none\"", *LEFT_OUT, "bookworm", made)
    made.rename(processor.place / "root.tar")


def make_package(processor: Processor):
    """As scripts/package does, without its checks."""
    folder = build(processor.preset)
    for old in processor.place.glob("*.deb"):
        old.unlink()
    run("cpack", "--config", folder / "CPackConfig.cmake", "-B", processor.place,
        cwd=folder)


def package(processor=AMD64) -> Path:
    [file] = processor.place.glob("marlin_*.deb")
    return file


IMAGE = r"""
umask 022
place=$1 package=$2 guest=$3 data=$4 megabytes=$5
root=$place/root
rm -rf "$root"
mkdir "$root"
tar -x -f "$place/root.tar" -C "$root" --no-same-owner --exclude='./dev/*'
dpkg --root="$root" --force-script-chrootless --force-architecture --log=/dev/null \
  --install "$package"
cp -R "$guest/." "$root"
cp -R "$data/system/zoneinfo" "$root/usr/share/zoneinfo.default"
mkdir -p "$root/usr/share/icu" "$root/usr/lib/lab/data"
cp -R "$data/system/icu/." "$root/usr/share/icu"
cp -R "$data/update" "$data/refused" "$root/usr/lib/lab/data"
cp "$package" "$root/usr/lib/lab"
mkdir "$root/usr/lib/lab/probe"
mv "$place/marlin" "$root/usr/lib/lab/probe"
(umask 077; echo secret >"$root/root/secret")
ln -sfn /var/db/timezone/localtime "$root/etc/localtime"
rm -f "$root/etc/fstab"
printf '%032d\n' 1 >"$root/etc/machine-id"
printf 'installer:x:1001:1001::/:/bin/sh\n' >>"$root/etc/passwd"
rm -f "$place/system.img"
mke2fs -q -t ext4 -b 4096 -m 0 -E root_owner=0:0,lazy_itable_init=0 \
  -d "$root" "$place/system.img" "${megabytes}M"
rm -rf "$root"
"""


def make_image(processor: Processor):
    """In a user namespace: whoever runs this owns all, as root."""
    # In marlin's place it has to have its name.
    run(processor.compiler, "-static", "-O1", "-o", processor.place / "marlin",
        PROJECT / "packaging/probe.c")
    run("bwrap", "--unshare-user", "--uid", 0, "--gid", 0, "--dev-bind", "/", "/",
        "sh", "-euc", IMAGE, "-", processor.place, package(processor), GUEST,
        data.TARGET, MEGABYTES)


def copy_of_image(processor: Processor, place: Path):
    place.mkdir(parents=True, exist_ok=True)
    run("cp", "--sparse=always", processor.place / "system.img", place / "system.img")


def room(place: Path) -> Path:
    """An empty directory."""
    shutil.rmtree(place, ignore_errors=True)
    place.mkdir(parents=True)
    return place
