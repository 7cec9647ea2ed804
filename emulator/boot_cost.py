#!/usr/bin/env -S python3 -B
# SPDX-License-Identifier: BSD-2-Clause
"""Measures the part of a device's boot that the pass takes.

The emulator counts instructions and makes the device's clock from them: one
nanosecond each, so that a figure is the same on every machine and under every
load. What the disk takes comes on top, on a real device; the requests that the
pass makes to it are counted instead.
"""

import argparse
import re
import statistics
import sys

import device as emulated
from scenes import announce, with_updates

COUNTED = ("-icount", "shift=0,sleep=off")
# A processor without work counts on, instead of jumping to the next timer.
NEVER_IDLE = "nohlt"
RUNS = 5

# Each run says what it is, and how much was read from the two disks meanwhile.
MEASURE = """
reads() { # prints requests and KiB of both disks so far
  local requests=0 sectors=0 disk a b
  for disk in vda vdb; do
    read a _ b _ </sys/block/$disk/stat
    requests=$((requests + a)) sectors=$((sectors + b))
  done
  echo $requests $((sectors / 2))
}
measure() { # measure NAME COMMAND
  local before=$(reads)
  say "$1 begins"
  $2 2>/dev/null
  say "$1 ends"
  say "$1 read from $before to $(reads)"
}
drop() { sync; echo 3 >/proc/sys/vm/drop_caches; }
# The shell itself, and what it reports with, are to be there.
reads >/dev/null
for run in 1 2 3 4 5; do
  measure "the pass, warm" marlin
  measure "an empty process, warm" /bin/true
  drop; reads >/dev/null
  measure "the pass, cold" marlin
  drop; reads >/dev/null
  measure "an empty process, cold" /bin/true
  drop; reads >/dev/null
  cat /dev/vda /dev/vda >/dev/null & reader=$!
  measure "the pass, cold, disk busy" marlin
  kill $reader; wait $reader 2>/dev/null
done
"""


def milliseconds(seconds):
  return f"{seconds * 1000:9.2f} ms"


def print_boot(title, console):
  begin, end = console.time_of("pass begins"), next(
      at for at, text in console.lines
      if text.startswith("device: pass ended with status"))
  ready = console.time_of("readers are done")
  print(f"{title:42}{milliseconds(begin)}{milliseconds(end - begin)}"
        f"{milliseconds(ready)}{(end - begin) / ready:9.1%}")


def measured(console):
  """Names, with the times of all runs and what they read, less the harness."""
  begun, figures = {}, {}
  for at, text in console.lines:
    if match := re.fullmatch(r"device: (.*) begins", text):
      begun[match[1]] = at
    elif match := re.fullmatch(r"device: (.*) ends", text):
      figures.setdefault(match[1], []).append([at - begun[match[1]]])
    elif match := re.fullmatch(
        r"device: (.*) read from (\d+) (\d+) to (\d+) (\d+)", text):
      figures[match[1]][-1] += [int(match[4]) - int(match[2]),
                                int(match[5]) - int(match[3])]
  return figures


def measure():
  device = emulated.Device("boot-cost")
  emulated.build_system(device.system)
  staging = emulated.Staging(device.directory / "staging")
  with_updates(("2024a", "44l"))(staging)
  staging.become(device.var, 32, "var")

  print(f"{'boot, instructions as nanoseconds':42}{'before it':>12}{'the pass':>12}"
        f"{'until ready':>12}{'share':>9}")
  for title, scene in (("never updated", announce("2024a")),
                       ("an update is activated", ""),
                       ("the same update announced again", MEASURE)):
    console = device.boot(scene=scene, options=NEVER_IDLE, more=COUNTED,
                          seconds=300)
    print_boot(title, console)

  print(f"\n{f'median of {RUNS} runs after that boot':42}{'time':>12}"
        f"{'reads':>12}{'KiB read':>12}")
  for name, runs in measured(console).items():
    times, requests, size = zip(*runs)
    busy = "busy" in name
    print(f"{name:42}{milliseconds(statistics.median(times))}"
          f"{'-' if busy else int(statistics.median(requests)):>12}"
          f"{'-' if busy else int(statistics.median(size)):>12}")


def main():
  parser = argparse.ArgumentParser(description=__doc__.split("\n", maxsplit=1)[0])
  parser.parse_args()
  try:
    emulated.prepare()
  except emulated.Unavailable as reason:
    print(f"SKIPPED: {reason}", file=sys.stderr)
    return emulated.SKIPPED
  try:
    measure()
  except RuntimeError as reason:
    print(f"FAILED: {reason}")
    return 1
  return 0


if __name__ == "__main__":
  sys.exit(main())
