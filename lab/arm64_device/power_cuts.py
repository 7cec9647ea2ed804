# SPDX-License-Identifier: BSD-2-Clause
"""Cuts the power of an emulated device at random instants.

The device runs the pass over and over, with changing announcements, while others sync
the disk; then the emulator is killed. What had not been flushed is kept or lost at
random, the disk is checked after its journal has been replayed, and the device boots
again: that boot's pass is to do what the model does with the state found on the disk,
and it is where the next cut happens. With the mend switched on no boot may leave
links of two sets; each that a cut left is booted without the mend as well, on a copy.
"""

import collections
import contextlib
import random
import re
import shutil
import time

from lab.arm64_device import power_log
from lab.arm64_device.machine import Console, LINKS, Machine, plain, shown_links
from lab.carriers import image
from lab.oracles import model, properties
from lab.oracles.trial import log_differences
from lab.words.device import Device, sound_device
from lab.words.paths import (FORMER_ZONEINFO, ICUTZ, LEGACY_ICUTZ, LOCALTIME, RECORD,
                             TZ_LATEST, ZONEINFO, update_path)
from lab.words.seen import Entries, as_device

UPDATES = 150  # 2024a.1.1 and so on, each newer than the one before
ANOTHER_SCHEMA = "2030a.1.0"

# How the disk is mounted, and what else goes on: nothing that syncs, others who
# sync now and then or all the time; or every change of a directory is on the
# disk before the next, as the mount asks for, so that each state in the middle
# of a pass can be found. The last is the rule, because it finds the most.
OTHERS = (("rw", ""), ("rw", "(while :; do sync; usleep 30000; done) &\n"),
          ("rw", "(while :; do sync; done) &\n"), *(3 * [("dirsync", "")]))

LOOP = f"""
replace() {{ ln -sfn "$1" "$2.next"; mv -T "$2.next" "$2"; }}
say "loop begins"
while [ $n -lt {UPDATES} ]; do
  n=$((n + 1))
  latest={update_path('2024a.1.$n')}
  case $((n % 8)) in
    3) replace {FORMER_ZONEINFO}/Europe/Paris {LOCALTIME} ;;
    4) ln -s "$(readlink {ICUTZ})" {LEGACY_ICUTZ} ;;
    6) latest={update_path(ANOTHER_SCHEMA)} ;;
  esac
  replace $latest {TZ_LATEST}
  say "pass $n begins"
  marlin 2>/dev/kmsg
  say "pass $n ended with status $?"
done
say "loop ended"
while :; do sleep 1; done
"""
OF_THE_LOOP = {TZ_LATEST, TZ_LATEST + ".next", LOCALTIME + ".next", LEGACY_ICUTZ}


def insist(found: list[str]):
    """Raises if anything is not as it has to be."""
    if found:
        raise RuntimeError("; ".join(found))


def number_of(device: Device, path: str) -> int | None:
    """The number of the update that a link names; None for no update."""
    target = device.contents().get(path, "")
    found = re.match(r"/var/db/timezone/tz/2024a\.1\.(\d+)", target)
    return int(found[1]) if found else None


def described(device: Device) -> str:
    """The state of the links in words, with "update" for whichever number it is."""
    zoneinfo, icutz = number_of(device, ZONEINFO), number_of(device, ICUTZ)
    if not device.find(ZONEINFO):
        pair = "zoneinfo missing, icutz " + ("missing" if icutz is None else "there")
    elif zoneinfo == icutz:
        pair = "the system's" if icutz is None else "one update's"
    elif zoneinfo is None:
        pair = "MIXED: zoneinfo system, icutz update"
    elif icutz is None:
        pair = "MIXED: zoneinfo update, icutz missing"
    else:
        older = "older" if icutz < zoneinfo else "newer"
        pair = f"MIXED: zoneinfo update, icutz of an {older} one"
    return pair + ("" if device.find(LOCALTIME) else ", localtime missing")


def kind_of_record(device: Device) -> str:
    """A record is written and never synced: the disk may know of the file but not
    of its bytes yet; the next activation writes it anew."""
    record = device.contents().get(RECORD)
    if record is None:
        return "none"
    if not record.strip("\0"):
        return "of NUL bytes" if record else "empty"
    if not re.fullmatch(r"(2023c\.1\.0|2024a\.1\.\d+)_2024a\.1\.\d+", record):
        raise RuntimeError(f"the record holds {record!r}")
    return "whole"


def mended(device: Device) -> Device:
    """The device without the link "zoneinfo", if that and "icutz" are of two sets."""
    if "MIXED" in described(device):
        device.drop(ZONEINFO)
    return device


def check_recovery(console: Console, entries: Entries, mend=False):
    """The first pass of a boot that found this is to do what the model does."""
    device = as_device(entries)
    if mend:
        mended(device)
    insist(log_differences(model.boot(device), console.booted()))
    insist([f"after the pass not: {text}" for text in shown_links(device)
            if text not in console.said])
    _, zone = console.find("reader sees zone ")
    if zone not in ("S23CP", "S23CL", "U24AP", "U24AL"):
        raise RuntimeError(f"a reader sees zone {zone}")
    if mend and "MIXED" in described(device):
        raise RuntimeError(f"after the mend: {described(device)}")


def within_pass(console: Console) -> bool:
    passes = [text for text in console.said if re.match(r"pass \d+ ", text)]
    insist([text for text in passes if not text.endswith(("begins", "status 0"))])
    return bool(passes) and passes[-1].endswith("begins")


class Victim:
    """A device whose power is cut again and again; `found` is what the next boot
    finds."""

    name = "power-cuts"
    loop = LOOP
    longest = 1.5  # seconds until the cut

    def __init__(self, seed: int | None, mend=False):
        self.seed = random.randrange(10**6) if seed is None else seed
        print(f"seed {self.seed}", flush=True)
        self.random, self.mend = random.Random(self.seed), mend
        self.machine = Machine(self.name + "-mended" * mend)
        self.make_disk()

    def make_disk(self):
        device = sound_device()
        for number in range(1, UPDATES + 1):
            device.install_update(f"2024a.1.{number}")
        device.install_update(ANOTHER_SCHEMA, "45l")
        device.announce("2024a.1.1")
        self.machine.build(device, "-N", "2048", "-J", "size=4", megabytes=24)
        self.start = self.found = self.machine.look()

    def cut_power(self, first: int) -> tuple[Console, int]:
        """Boots, lets the loop run for a while, and kills the emulator, which logs what
        the device asks of its disk and changes only a copy of it. What the device said,
        and how many blocks were lost."""
        machine, log = self.machine, self.machine.directory / "log"
        scratch = shutil.copyfile(machine.var, machine.directory / "scratch.img")
        log.write_bytes(b"")
        mounted, syncs = self.random.choice(OTHERS)
        emulator = machine.start(
            f"{syncs}n={first}{self.loop}",
            options="var=" + mounted + " mend" * self.mend,
            more=("-smp", "2"),  # processors: others sync in the middle of a pass
            disk="driver=blklogwrites,node-name=var,"
                 f"file.driver=file,file.filename={scratch},"
                 f"log.driver=file,log.filename={log}")
        try:
            machine.wait_for(emulator, "loop begins")
            time.sleep(self.random.uniform(0, self.longest))
        finally:
            emulator.kill()
            emulator.wait()
        lost = power_log.cut_power(machine.var, log.read_bytes(),
                                   self.random.choice((0, 0.5, 1)), self.random)
        console = Console(machine.console)
        before, self.found = self.found, self.look_after_cut()
        check_recovery(console, before, self.mend)
        return console, lost

    def look_after_cut(self) -> Entries:
        """The disk as a boot would find it."""
        found = shutil.copyfile(self.machine.var, self.machine.directory / "found.img")
        image.replay_journal(found)
        image.check(found)
        return self.machine.look(found)

    @contextlib.contextmanager
    def on_trial(self):
        """Has a failure tell what was said last, and the seed. The state that the last
        cut left is booted as well, and shut down."""
        try:
            yield
            console = self.machine.boot(options="mend" * self.mend)
            check_recovery(console, self.found, self.mend)
            image.check(self.machine.var)
        except RuntimeError as reason:
            print(Console(self.machine.console).text[-6000:])
            raise RuntimeError(f"with seed {self.seed}: {reason}") from reason

    def cut(self) -> tuple[bool, int]:
        """One cut, and what it left. Whether it was inside the pass, and how many
        blocks were lost."""
        device = as_device(self.found)
        first = max(number_of(device, link) or 0 for link in (ZONEINFO, TZ_LATEST))
        if first > UPDATES - 60:
            self.make_disk()
            first = 1
        console, lost = self.cut_power(first)
        insist(properties.data_changes(
            *({path: here for path, here in looked.items() if path not in OF_THE_LOOP}
              for looked in (self.start, self.found))))
        insist([f"{path} is not a link" for path in LINKS
                if path in self.found and self.found[path].kind != "link"])
        return within_pass(console), lost

    def stays_mixed_without_mend(self) -> bool:
        """What the next boot would make of the links that the last cut left."""
        machine = self.machine
        copy = shutil.copyfile(machine.var, machine.directory / "unmended.img")
        check_recovery(machine.boot(disk=plain("var", copy)), self.found)
        device = as_device(self.found)
        model.boot(device)
        return "MIXED" in described(device)


def run_cuts(count: int, victim: Victim, table, totals):
    """Prints a line for each cut; counts how often each state was found."""
    started = time.monotonic()
    for number in range(1, count + 1):
        inside, lost = victim.cut()
        device = as_device(victim.found)
        state, record = described(device), kind_of_record(device)
        totals["mixed"] += "MIXED" in state
        if victim.mend and "MIXED" in state:
            totals["stay mixed"] += victim.stays_mixed_without_mend()
        model.boot(mended(device) if victim.mend else device)
        table[state, described(device), inside] += 1
        totals.update(["cuts", "record " + record] + ["inside"] * inside +
                      ["with losses"] * (lost > 0))
        print(f"cut {number}/{count}, {time.monotonic() - started:.0f} s: "
              f"{'inside the pass' if inside else 'between passes'}, "
              f"{lost} blocks lost; {state}; record {record}", flush=True)


def print_table(table, totals):
    print(f"\n{totals['cuts']} power cuts, {totals['inside']} of them inside the "
          f"pass; {totals['with losses']} lost blocks that had been written; "
          f"{totals['mixed']} left links of two sets.")
    if totals["stay mixed"]:
        print(f"Without the mend {totals['stay mixed']} of these stay so; with it, see "
              "below.")
    print("The record afterwards: " + ", ".join(
        f"{totals['record ' + kind]} times {kind}"
        for kind in ("whole", "none", "empty", "of NUL bytes")))
    print(f"\n{'links found after the cut':52}{'inside':>8}{'between':>8}"
          "  after the next boot")
    for state, healed in sorted({key[:2] for key in table}):
        print(f"{state:52}{table[state, healed, True]:8}{table[state, healed, False]:8}"
              f"  {healed}")


def run(count: int, seed: int | None = None, mend=False):
    """Raises RuntimeError when a device is not as it has to be after a power cut."""
    table, totals = collections.Counter(), collections.Counter()
    victim = Victim(seed, mend)
    try:
        with victim.on_trial():
            run_cuts(count, victim, table, totals)
    finally:
        print_table(table, totals)
