# SPDX-License-Identifier: BSD-2-Clause
"""Measures the part of a device's boot that the pass takes.

The emulator counts instructions and makes the device's clock from them: one
nanosecond each, so that a figure is the same on every machine and under every
load. What the disk takes comes on top, on a real device; the requests that the
pass makes to it are counted instead.
"""

import re
import statistics

from lab.arm64_device.machine import Console, Machine
from lab.carriers.qemu import COUNTED
from lab.words.device import sound_device

NEVER_IDLE = "nohlt"  # without work count on, instead of jumping to the next timer
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
for run in $(seq $RUNS); do
  measure "the pass, warm" marlin
  measure "an empty process, warm" true
  drop; reads >/dev/null
  measure "the pass, cold" marlin
  drop; reads >/dev/null
  measure "an empty process, cold" true
  drop; reads >/dev/null
  cat /dev/vda /dev/vda >/dev/null & reader=$!
  measure "the pass, cold, disk busy" marlin
  kill $reader; wait $reader 2>/dev/null
done
"""


def milliseconds(seconds: float) -> str:
    return f"{seconds * 1000:9.2f} ms"


def print_boot(title: str, console: Console):
    begin, end, ready = (console.find(text)[0] for text in (
        "pass begins", "pass ended with status", "readers are done"))
    print(f"{title:42}{milliseconds(begin)}{milliseconds(end - begin)}"
          f"{milliseconds(ready)}{(end - begin) / ready:9.1%}")


def measured(console: Console) -> dict[str, list[tuple]]:
    """Names, with the time of each run, and the requests and KiB that it read."""
    times, figures = {}, {}
    for at, text in console.lines:
        if match := re.fullmatch(r"device: (.*) (begins|ends)", text):
            times[match.groups()] = at
        elif match := re.fullmatch(
                r"device: (.*) read from (\d+) (\d+) to (\d+) (\d+)", text):
            name, *counts = match.groups()
            requests, size, requests_then, size_then = map(int, counts)
            took = times[name, "ends"] - times[name, "begins"]
            figures.setdefault(name, []).append(
                (took, requests_then - requests, size_then - size))
    return figures


def measure():
    machine, device = Machine("boot-cost"), sound_device()
    device.install_update("2024a.1.0")
    machine.build(device)
    print(f"{'boot, instructions as nanoseconds':42}{'before it':>12}{'the pass':>12}"
          f"{'until ready':>12}{'share':>9}")
    for title, then, script in (
            ("never updated", lambda: device.announce("2024a.1.0"), ""),
            ("an update is activated", None, ""),
            ("the same update announced again", None, f"RUNS={RUNS}\n{MEASURE}")):
        console = machine.boot(then, script, seconds=300, options=NEVER_IDLE,
                               more=COUNTED)
        print_boot(title, console)

    print(f"\n{f'median of {RUNS} runs after that boot':42}{'time':>12}"
          f"{'reads':>12}{'KiB read':>12}")
    for name, runs in measured(console).items():
        time, requests, size = map(statistics.median, zip(*runs))
        busy = "busy" in name
        print(f"{name:42}{milliseconds(time)}{'-' if busy else int(requests):>12}"
              f"{'-' if busy else int(size):>12}")
