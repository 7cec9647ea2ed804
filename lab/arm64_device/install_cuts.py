# SPDX-License-Identifier: BSD-2-Clause
"""Cuts the power of an emulated device at random instants while updates are installed.

The device installs one update after the other, as an account that owns nothing but
"/var/db/timezone/tz" and its own announcement; now and then it boots one, prunes, or
withdraws the announcement. After each cut what is announced is the last that an
installer said it had announced, or the one that it was about to; it is whole, to the
byte, as is every other set with a name; and the next boot takes it or stays, as the
model does.
"""

import collections
import re

from lab.arm64_device.machine import Console, Machine, zones
from lab.arm64_device.power_cuts import Victim, insist
from lab.carriers import image
from lab.oracles.installer import announced, below, manifest, names
from lab.words.device import Device, sound_device
from lab.words.paths import DOWNLOADS, TIMEZONE
from lab.words.seen import Entries

TEMPLATE = "/usr/share/template"
NUMBERED = ("/zoneinfo/+VERSION", "/icutz/icutz44l.dat")  # end with the set's number
ZONES = ("America/Los_Angeles", "Europe/Paris", "Europe/Lisbon", "Asia/Tokyo")
ACCOUNT = 1  # "owner", in the device's passwd

SEAL = "seal() { (cd $1; sha256sum $(find * -type f | sort) >SHA256SUMS); }"
LOOP = f"""
{SEAL}
as_owner() {{ su owner -c "exec marlin-install $*" >/dev/kmsg 2>&1; }}
make() {{
  rm -rf /run/update
  mkdir /run/update
  cp -r {TEMPLATE} /run/update/$1
  for file in {' '.join(NUMBERED)}; do echo $n >>/run/update/$1$file; done
  seal /run/update/$1
}}
run() {{
  local what="$1"
  shift
  say "$what begins"
  "$@"
  say "$what ended with status $?"
}}
run "prune 0" as_owner --prune
say "hidden: $(ls -A {TIMEZONE} {DOWNLOADS} | grep -c '^[.]marlin')"
say "loop begins"
while :; do
  n=$((n + 1))
  make 2024a.1.$n
  run "install $n" as_owner /run/update/2024a.1.$n
  case $((n % 6)) in
    1) run "boot $n" marlin 2>/dev/kmsg ;;
    2) run "prune $n" as_owner --prune ;;
    4) run "boot $n" marlin 2>/dev/kmsg; run "prune $n" as_owner --prune ;;
    5) run "withdraw $n" as_owner --withdraw ;;
  esac
done
"""


def installing_device() -> Device:
    """A device that can install: an update to copy is on its system partition, and the
    account has a place of its own."""
    device = sound_device()
    for zone in ZONES:
        device.file(f"{TEMPLATE}/zoneinfo/{zone}", zones("U24A")["Europe/Paris"])
    device.file(f"{TEMPLATE}/zoneinfo/+VERSION", "2024a\n")
    device.file(f"{TEMPLATE}/icutz/icutz44l.dat", "ICU data\n" * 20_000)
    device.directory(DOWNLOADS)
    device.directory(TIMEZONE, 0o1775)
    return device


def give_to_account(machine: Machine):
    """What it needs, and nothing more."""
    image.debugfs(machine.var, f"sif /db/timezone gid {ACCOUNT}",
                  f"sif /db/timezone/tz uid {ACCOUNT}", write=True)


class Installer(Victim):
    name = "install-cuts"
    loop = LOOP
    longest = 6

    def make_disk(self):
        self.machine.build(installing_device(), "-J", "size=4", megabytes=32)
        give_to_account(self.machine)
        self.found = self.machine.look()
        self.template = below(self.found, TEMPLATE)
        self.number, self.allowed = 0, {None}

    def cut(self) -> tuple[str, int]:
        """What was going on, and how many blocks were lost."""
        console, lost = self.cut_power(self.number)
        insist([f"the console did not say: {text}" for text in (
            "prune 0 ended with status 0", "hidden: 0") if text not in console.said])
        doing = self.follow(console)
        self.check(self.found)
        return doing, lost

    def follow(self, console: Console) -> str:
        """Learns from what the device said which announcements there can be, and what
        it was about to do."""
        doing = "nothing"
        for what, number, told in re.findall(
                r"^(install|withdraw|prune|boot) (\d+) (.*)$",
                "\n".join(console.said), re.M):
            begins = told == "begins"
            if not begins and told != "ended with status 0":
                raise RuntimeError(f"{what}: {told}")
            doing = what if begins else "nothing"
            if what == "install":
                self.number = int(number)
            if what in ("install", "withdraw"):
                after = {int(number) if what == "install" else None}
                self.allowed = self.allowed | after if begins else after
        return doing

    def check(self, entries: Entries):
        """What a cut left."""
        text = announced(entries)
        wanted = {number and f"{DOWNLOADS}2024a.1.{number}" for number in self.allowed}
        if text not in wanted:
            raise RuntimeError(f"announced is {text}, not one of {wanted}")
        self.allowed = {text and int(text.rpartition(".")[2])}
        sets = {name for name in names(entries) if not name.startswith(".")}
        if text and text.removeprefix(DOWNLOADS) not in sets:
            raise RuntimeError(f"{text} is announced and missing")
        for name in sets:
            self.check_set(entries, name)

    def check_set(self, entries: Entries, name: str):
        start, number = DOWNLOADS + name, name.rpartition(".")[2]
        here = below(entries, start)
        wanted = {path: (kind, mode, text + f"{number}\n" * (path in NUMBERED))
                  for path, (kind, mode, text) in self.template.items()}
        wanted["/SHA256SUMS"] = "file", 0o644, manifest({
            path[1:]: text for path, (kind, _, text) in wanted.items()
            if kind == "file"})
        insist([f"{name}{path} is not as it was in the update"
                for path in sorted(here.keys() | wanted.keys())
                if here.get(path) != wanted.get(path)])
        if entries[start].mode != 0o755:
            raise RuntimeError(f"{start} is not open to all")


def run(count: int, seed: int | None = None):
    """Raises RuntimeError when a device is not as it has to be after a power cut."""
    totals, victim = collections.Counter(), Installer(seed)
    with victim.on_trial():
        for number in range(1, count + 1):
            told = victim.allowed
            doing, lost = victim.cut()
            changed = "another" if victim.allowed != told else "the same"
            totals.update([doing, "with losses"] if lost else [doing])
            print(f"cut {number}/{count}, during {doing}: {lost} blocks lost; "
                  f"announced is {changed} as before", flush=True)
    during = ", ".join(f"{totals[what]} during {what}" for what in
                       ("install", "prune", "withdraw", "boot", "nothing"))
    print(f"\n{count} power cuts, {victim.number} installations: {during}; "
          f"{totals['with losses']} lost blocks that had been written. What was "
          "announced was always whole, and the old or the new.")
