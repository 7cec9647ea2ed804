#!/usr/bin/env -S python3 -B
# SPDX-License-Identifier: BSD-2-Clause
"""Shows an emulated device: an update is announced, then activated.

With --shell, a prompt on the device instead.
"""

import argparse
import subprocess
import sys

import device as emulated
from scenes import announce, with_updates

LINKS = ("zoneinfo", "icutz", "localtime", "tz_latest")


def new_device(name):
  shown = emulated.Device(name)
  emulated.build_system(shown.system)
  staging = emulated.Staging(shown.directory / "staging")
  with_updates(("2024a", "44l"), ("2024b", "45l"))(staging)
  staging.become(shown.var, 32, "var")
  return shown


def print_console(console):
  for at, text in console.lines:
    if text.startswith(("device: ", "marlin: ", "terminate called")):
      print(f"  {at:8.3f} s  {text}")


def show():
  shown = new_device("show")
  for title, how in (("System 2023c, never updated; then 2024a is announced",
                      {"scene": announce("2024a")}),
                     ("The next boot activates it", {}),
                     ("And the one after that finds it announced again", {})):
    print(f"\n--- {title}", flush=True)
    print_console(shown.boot(**how))
  print("\n--- On the disk")
  found = emulated.tree(shown.var, "/" + emulated.TIMEZONE)
  for name in LINKS:
    print(f"  timezone/{name} {found.get('timezone/' + name, 'none')}")
  record = found.get("timezone/TZVersionDiffRecord", b"none").decode()
  print(f"  timezone/TZVersionDiffRecord: {record}")


def shell():
  shown = new_device("shell")
  scene = ("echo 'The updates 2024a.1.0 and 2024b.1.0 are in "
           "/var/db/timezone/tz. \"poweroff -f\" ends it.'\n"
           "setsid cttyhack sh\n")
  command = shown.command(scene, "", None, "mon:stdio")
  return subprocess.run(command, check=False).returncode


def main():
  parser = argparse.ArgumentParser(description=__doc__.split("\n", maxsplit=1)[0])
  parser.add_argument("--shell", action="store_true", help="a prompt on the device")
  options = parser.parse_args()
  try:
    emulated.prepare()
  except emulated.Unavailable as reason:
    print(f"SKIPPED: {reason}", file=sys.stderr)
    return emulated.SKIPPED
  if options.shell:
    return shell()
  show()
  return 0


if __name__ == "__main__":
  sys.exit(main())
