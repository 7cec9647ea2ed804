#!/usr/bin/env -S python3 -B
# SPDX-License-Identifier: BSD-2-Clause
"""Cuts the power of an emulated device at random instants.

The device runs the pass over and over, with changing announcements, while
others sync the disk; then the emulator is killed. What had not been flushed is
kept or lost at random, the disk is checked after its journal has been replayed,
and the device is booted again: that boot's pass is to bring the links to where
the state found on the disk says, and it is where the next cut happens.
"""

import argparse
import collections
import random
import re
import shutil
import sys
import time

import device as emulated
import power_log
from device import DOWNLOADS, TIMEZONE, update_path

SYSTEM = "/usr/share/zoneinfo.default"
FORMER = "/usr/share/zoneinfo/Europe/Paris"
PARIS = "/var/db/timezone/zoneinfo/Europe/Paris"
LOS_ANGELES = "/var/db/timezone/zoneinfo/America/Los_Angeles"
UPDATES = 150  # 2024a.1.1 and so on, each newer than the one before
ANOTHER_SCHEMA = "2030a.1.0"
LINKS = ("zoneinfo", "icutz", "localtime", "tz_latest")

# How the disk is mounted, and what else goes on: nothing that syncs, others who
# sync now and then or all the time; or every change of a directory is on the
# disk before the next, as the mount asks for, so that each state in the middle
# of a pass can be found. The last is the rule, because it finds the most.
OTHERS = (("rw", ""), ("rw", "(while :; do sync; usleep 30000; done) &\n"),
          ("rw", "(while :; do sync; done) &\n"), *(3 * [("dirsync", "")]))

LOOP = """
replace() {{ ln -sfn "$1" "$2.next"; mv -T "$2.next" "$2"; }}
cd /var/db/timezone
n={first}
say "loop begins"
while [ $n -lt {last} ]; do
  n=$((n + 1))
  case $((n % 8)) in
    3) replace {former} localtime ;;
    4) ln -s "$(readlink icutz)" /var/db/icutz ;;
    6) replace /var/db/timezone/tz/{another} tz_latest ;;
  esac
  [ $((n % 8)) = 6 ] || replace /var/db/timezone/tz/2024a.1.$n tz_latest
  say "pass $n begins"
  marlin 2>/dev/kmsg
  say "pass $n ended with status $?"
done
say "loop ended"
while :; do sleep 1; done
"""


class Broken(Exception):
  """A device is not as it has to be after a power cut."""


def expect(what, holds):
  if not holds:
    raise Broken(what)


# --- The state that a cut left ------------------------------------------------


def number_of(target):
  """The number of the update that a link's target is in; None for no update."""
  found = re.fullmatch(r"/var/db/timezone/tz/2024a\.1\.(\d+)(/\w+)?", target or "")
  return int(found[1]) if found else None


def links_of(tree):
  found = {}
  for name in LINKS:
    at = tree.get(f"{TIMEZONE}/{name}")
    expect(f"{name} is no link", at is None or isinstance(at, str))
    found[name] = at and at.removeprefix("-> ")
  return found


def described(links):
  """A state in words, with "update" for whichever number it is."""
  zoneinfo, icutz = number_of(links["zoneinfo"]), number_of(links["icutz"])
  if links["zoneinfo"] is None:
    pair = "zoneinfo missing, icutz " + ("missing" if icutz is None else "there")
  elif zoneinfo is None:
    pair = "the system's" if icutz is None else "MIXED: zoneinfo system, icutz update"
  elif icutz is None:
    pair = "MIXED: zoneinfo update, icutz missing"
  elif zoneinfo == icutz:
    pair = "one update's"
  else:
    older = "older" if icutz < zoneinfo else "newer"
    pair = f"MIXED: zoneinfo update, icutz of an {older} one"
  return pair + ("" if links["localtime"] else ", localtime missing")


def recovered(links):
  """Where the pass has to bring these links."""
  after = dict(links)
  if links["zoneinfo"] is None:
    after["zoneinfo"], after["icutz"] = SYSTEM, None
  announced, current = number_of(links["tz_latest"]), number_of(after["zoneinfo"])
  if announced is not None and (current is None or announced > current):
    after["zoneinfo"] = links["tz_latest"] + "/zoneinfo"
    after["icutz"] = links["tz_latest"] + "/icutz"
  if links["localtime"] is None:
    after["localtime"] = LOS_ANGELES
  elif links["localtime"] == FORMER:
    after["localtime"] = PARIS
  return after


def check_names(tree):
  """Nothing is there that nobody put there."""
  for path in tree:
    directory, _, name = path.rpartition("/")
    if directory == TIMEZONE:
      known = name in (*LINKS, "tz", "TZVersionDiffRecord", "localtime.next",
                       "tz_latest.next")
      expect(f"a stray {path}", known)
    if directory == "db":
      expect(f"a stray {path}", name in ("timezone", "icutz"))


def check_record(tree):
  """A record is written and never synced, so the disk may know of the file
  but not of its bytes yet; the next activation writes it anew."""
  record = tree.get(TIMEZONE + "/TZVersionDiffRecord")
  if record is None:
    return "none"
  if not record.strip(b"\0"):
    return "of NUL bytes" if record else "empty"
  expect(f"the record holds {record!r}", re.fullmatch(
      rb"(2023c\.1\.0|2024a\.1\.\d+)_2024a\.1\.\d+", record))
  return "whole"


def data_sets(tree):
  return {path: content for path, content in tree.items()
          if path.startswith(DOWNLOADS + "/")}


# --- The cuts -----------------------------------------------------------------


class Victim:
  """A device whose power is cut again and again."""

  def __init__(self, seed):
    self.random = random.Random(seed)
    self.device = emulated.Device("power-cuts")
    self.scratch = self.device.directory / "scratch.img"
    self.log = self.device.directory / "log"
    emulated.build_system(self.device.system)
    self.system = emulated.digest(self.device.system)
    self.make_disk()

  def make_disk(self):
    staging = emulated.Staging(self.device.directory / "staging")
    emulated.add_update(staging, "2024a.1.1")
    downloads = staging.path / DOWNLOADS
    for number in range(2, UPDATES + 1):
      shutil.copytree(downloads / "2024a.1.1", downloads / f"2024a.1.{number}")
    emulated.add_update(staging, ANOTHER_SCHEMA, "45l")
    emulated.add_system_links(staging)
    staging.link(TIMEZONE + "/tz_latest", update_path("2024a.1.1"))
    staging.become(self.device.var, 24, "var", "-N", "2048", "-J", "size=4")
    self.data_sets = data_sets(emulated.tree(self.device.var))

  def disk(self):
    shutil.copyfile(self.device.var, self.scratch)
    self.log.unlink(missing_ok=True)
    self.log.touch()
    return ("driver=blklogwrites,node-name=var,"
            f"file.driver=file,file.filename={self.scratch},"
            f"log.driver=file,log.filename={self.log}")

  def run_until_cut(self, first):
    """Boots, lets the loop run for a while, and kills the emulator."""
    mounted, syncs = self.random.choice(OTHERS)
    loop = LOOP.format(first=first, last=UPDATES, former=FORMER,
                       another=ANOTHER_SCHEMA)
    # Two processors, so that the disk is synced in the middle of a pass.
    emulator = self.device.start(scene=syncs + loop, disk=self.disk(),
                                 options="var=" + mounted, more=("-smp", "2"))
    try:
      self.device.wait_for(emulator, "loop begins")
      time.sleep(self.random.uniform(0, 1.5))
    finally:
      emulator.kill()
      emulator.wait()
    return emulated.Console(self.device.console)

  def look_after_cut(self):
    """The disk as a boot would find it, after all checks that need no boot."""
    found = self.device.directory / "found.img"
    shutil.copyfile(self.device.var, found)
    emulated.replay_journal(found)
    complaint = emulated.check(found)
    expect("fsck.ext4: " + complaint, complaint == "")
    tree = emulated.tree(found)
    check_names(tree)
    sets = data_sets(tree)
    changed = [path for path in {**sets, **self.data_sets}
               if sets.get(path) != self.data_sets.get(path)]
    expect(f"data sets were changed: {changed[:5]}", not changed)
    expect("the system partition was changed",
           emulated.digest(self.device.system) == self.system)
    return tree

  def cut(self, first):
    """One cut: the console until then, what was lost, and the disk."""
    console = self.run_until_cut(first)
    chance = self.random.choice((0, 0.5, 1))
    counts = power_log.cut_power(self.device.var, self.log.read_bytes(), chance,
                                 self.random)
    return console, counts, self.look_after_cut()


def check_recovery(console, expected):
  """The first pass of a boot, as the console shows it."""
  expect(f"the pass ended with status {console.status()}", console.status() == 0)
  said = console.said()
  for name in LINKS:
    wanted = f"{name} -> {expected[name] or 'none'}"
    expect(f"after the pass not: {wanted}; {said[:8]}", wanted in said)
  zone = next(text for text in said if text.startswith("reader sees zone "))
  expect(f"a {zone}", zone.split()[-1] in ("S23CP", "S23CL", "U24AP", "U24AL"))


def within_pass(console):
  said = [text for text in console.said() if re.match(r"pass \d+ ", text)]
  for text in said:
    expect(text, text.endswith(("begins", "status 0")))
  return bool(said) and said[-1].endswith("begins")


def run_cuts(count, victim, table, totals):
  """Prints a line for each cut; counts how often each state was found."""
  tree = emulated.tree(victim.device.var)
  started = time.monotonic()
  for number in range(1, count + 1):
    links = links_of(tree)
    first = max(number_of(links["zoneinfo"]) or 0, number_of(links["tz_latest"]) or 0)
    if first > UPDATES - 60:
      victim.make_disk()
      links, first = links_of(emulated.tree(victim.device.var)), 1
    expected = recovered(links)
    try:
      console, counts, tree = victim.cut(first)
      check_recovery(console, expected)
      inside = within_pass(console)
      found = links_of(tree)
      record = check_record(tree)
    except (Broken, RuntimeError):
      print(victim.device.console.read_text(errors="replace")[-6000:])
      raise
    state, healed = described(found), described(recovered(found))
    table[state, healed, inside] += 1
    totals["cuts"] += 1
    totals["inside"] += inside
    totals["record " + record] += 1
    totals["with losses"] += counts["lost"] > 0
    print(f"cut {number}/{count}, {time.monotonic() - started:.0f} s: "
          f"{'inside the pass' if inside else 'between passes'}, "
          f"{counts['lost']} blocks lost; {state}; record {record}", flush=True)
  # The state that the last cut left is booted as well, and shut down.
  check_recovery(victim.device.boot(), recovered(links_of(tree)))
  complaint = emulated.check(victim.device.var)
  expect("fsck.ext4: " + complaint, complaint == "")


def print_table(table, totals):
  print(f"\n{totals['cuts']} power cuts, {totals['inside']} of them inside the "
        f"pass; {totals['with losses']} lost blocks that had been written.")
  print("The record afterwards: " + ", ".join(
      f"{totals['record ' + kind]} times {kind}"
      for kind in ("whole", "none", "empty", "of NUL bytes")))
  print(f"\n{'links found after the cut':52}{'inside':>8}{'between':>8}"
        "  after the next boot")
  for state, healed in sorted({key[:2] for key in table}):
    print(f"{state:52}{table[state, healed, True]:8}{table[state, healed, False]:8}"
          f"  {healed}")


def main():
  parser = argparse.ArgumentParser(description=__doc__.split("\n", maxsplit=1)[0])
  parser.add_argument("count", type=int, help="how many cuts")
  parser.add_argument("--seed", type=int, help="of what is left to chance")
  options = parser.parse_args()
  if options.count < 1:
    parser.error("at least one cut")
  try:
    emulated.prepare()
  except emulated.Unavailable as reason:
    print(f"SKIPPED: {reason}", file=sys.stderr)
    return emulated.SKIPPED
  seed = options.seed if options.seed is not None else random.randrange(10**6)
  print(f"seed {seed}", flush=True)
  table, totals = collections.Counter(), collections.Counter()
  try:
    run_cuts(options.count, Victim(seed), table, totals)
  except (Broken, RuntimeError) as reason:
    print(f"FAILED, with seed {seed}: {reason}")
    return 1
  finally:
    print_table(table, totals)
  return 0


if __name__ == "__main__":
  sys.exit(main())
