# SPDX-License-Identifier: BSD-2-Clause
"""What a system is made of: a Debian root with systemd, Debian's kernel, the package
as it ships, and the demonstration's real data. The first two are fetched once, into the
folder "build"; each system has a disk of its own."""

import os
from pathlib import Path
from typing import NamedTuple

from lab.carriers import qemu, real_data
from lab.carriers.building import package
from lab.carriers.image import run
from lab.debian_systems.foreign import run_with_qemu
from lab.words.command import say
from lab.words.places import BUILD

WORK = BUILD / "systems"
GUEST = Path(__file__).parent / "guest"
ROOT_PACKAGES = "apparmor,dbus,systemd,systemd-container,systemd-sysv,tzdata,udev"
INITS = {"sysvinit": ("sysvinit-core", "initscripts", "sysv-rc", "insserv", "startpar"),
         "openrc": ("openrc", "librc1", "libeinfo1")}
# Nobody asks these systems anything, and nobody reads on them.
LEFT_OUT = [word for place in ("doc", "info", "locale", "man", "lintian")
            for word in (f"--dpkgopt=path-exclude=/usr/share/{place}/*",
                         f"--dpkgopt=path-include=/usr/share/{place}/marlin*")]


class Kind(NamedTuple):
    """A processor, the preset and the compiler that build for it, and the release of
    Debian."""
    name: str
    processor: qemu.Processor
    preset: str
    compiler: str
    packages: tuple[str, ...] = ()  # that this takes beside those of "systems"
    suite: str = "bookworm"

    @property
    def place(self) -> Path:
        return WORK / self.name


AMD64 = Kind("amd64", qemu.AMD64, "release", "gcc")
ARM64 = Kind("arm64", qemu.ARM64, "arm64-release", "aarch64-linux-gnu-gcc",
             ("arm64", "device", "systems-arm64"))
# All with the kernel of Debian 12.
ALL = {each.name: each for each in (
    AMD64, ARM64, AMD64._replace(name="debian-11", suite="bullseye"),
    AMD64._replace(name="debian-13", suite="trixie"))}
# scripts/device sets the variable.
CHOSEN = ALL[os.environ.get("MARLIN_SYSTEMS", AMD64.name)]


def prepare():
    """Builds and fetches what is missing; or raises qemu.Unavailable."""
    place, architecture = CHOSEN.place, CHOSEN.processor.architecture
    with qemu.preparing(CHOSEN.processor, place, "build", "demo", "systems",
                        *CHOSEN.packages):
        for init, names in INITS.items():
            qemu.fetch(place / init, architecture, *names)
        if not (place / "root.tar").exists():
            say("Making a Debian system, in two minutes or three")
            make_root()
        real_data.prepare()
        package(CHOSEN.preset, CHOSEN.place)
        # In marlin's place it has to have its name.
        run(CHOSEN.compiler, "-static", "-O1", "-Wall", "-o", place / "marlin",
            Path(__file__).with_name("probe.c"))


def make_root():
    made = CHOSEN.place / "root.new.tar"
    make = run_with_qemu if CHOSEN is ARM64 and os.geteuid() == 0 else run
    make("mmdebstrap", "--quiet", "--variant=essential",
         f"--architectures={CHOSEN.processor.architecture}",
         f"--include={ROOT_PACKAGES}",
         "--aptopt=Acquire::Languages \"none\"", *LEFT_OUT, CHOSEN.suite, made)
    made.rename(CHOSEN.place / "root.tar")


IMAGE = r"""
umask 022
place=$1 guest=$2 data=$3 package=$4 image=$5 script=$6 apart=$7 third=$8 mb=$9
root=$(dirname "$image")/root
rm -rf "$root"
mkdir "$root"
tar -x -f "$place/root.tar" -C "$root" --no-same-owner --exclude='./dev/*'
dpkg --root="$root" --force-script-chrootless --force-architecture --log=/dev/null \
  --install "$package"
cp -R "$guest/." "$root"
cd "$root"
cp -R "$data/system/zoneinfo" usr/share/zoneinfo.default
mkdir -p usr/share/icu usr/lib/lab/data usr/lib/lab/probe
cp -R "$data/system/icu/." usr/share/icu
cp -R "$data/update" "$data/refused" usr/lib/lab/data
cp "$package" usr/lib/lab
cp "$place/marlin" usr/lib/lab/probe
cp "$place/packages/bin/busybox" usr/lib/lab
find "$place/packages" -name overlay.ko -exec cp {} usr/lib/lab \;
(umask 077; echo secret >root/secret)
ln -sfn /var/db/timezone/localtime etc/localtime
rm -f etc/fstab
# These take time, and nobody waits for them; some need a "/tmp" or a "/var".
for unit in apparmor.service dbus.socket dpkg-db-backup.timer \
  e2scrub_all.timer fstrim.timer ldconfig.service systemd-binfmt.service \
  systemd-hwdb-update.service systemd-journal-catalog-update.service \
  systemd-pstore.service systemd-random-seed.service \
  systemd-tmpfiles-clean.timer systemd-update-done.service \
  systemd-update-utmp.service tmp.mount; do
  ln -s /dev/null etc/systemd/system/$unit
done
printf '%032d\n' 1 >etc/machine-id
printf 'installer:x:1001:1001::/:/bin/sh\n' >>etc/passwd
eval "$script"
make() {
  rm -f "$1"
  mke2fs -q -t ext4 -b 4096 -m 0 -E root_owner=0:0,lazy_itable_init=0 -d "$2" "$1" "$3"
}
if [ -n "$apart" ]; then
  make "$third" "$apart" "${mb}M"
  rm -rf "$apart"
  mkdir "$apart"
fi
cd /
make "$image" "$root" 512M
rm -rf "$root"
"""


def make_image(image: Path, script="", apart="",
               third: Path | None = None, megabytes=32):
    """A system's disk, after a shell did what the script says in its root directory;
    what is below the directory `apart` goes to a disk of its own. In a user namespace:
    the user who runs this owns all, as root."""
    [package] = CHOSEN.place.glob("*.deb")
    run("bwrap", "--unshare-user", "--uid", 0, "--gid", 0, "--dev-bind", "/", "/",
        "sh", "-euc", IMAGE, "-", CHOSEN.place, GUEST, real_data.TARGET, package, image,
        script, apart, third or "", megabytes)
