#!/usr/bin/env -S python3 -B
# SPDX-License-Identifier: BSD-2-Clause
"""Sequences of real boots of an emulated arm64 device, each on one disk.

Expected are the lines on the console, the links and the record on the disk
afterwards, what readers saw, and that no data set, no announcement and nothing
on the system partition was changed.
"""

import argparse
import errno
import os
import sys
import time

import device as emulated
from device import DOWNLOADS, TIMEZONE, update_path

ABORTED = 128 + 6  # as a shell counts: ended by SIGABRT
SYSTEM = "/usr/share/zoneinfo.default"
PARIS = "/var/db/timezone/zoneinfo/Europe/Paris"
LOS_ANGELES = "/var/db/timezone/zoneinfo/America/Los_Angeles"

INVALID_LINKS = "Invalid current symlinks; resetting to system partition"
INCOMPATIBLE = "Symlink points at data incompatible with installed system"
UNABLE_TO_LOCATE = "Unable to locate data; resetting to system partition"
LOCALTIME_INVALID = "localtime link invalid; resetting to America/Los_Angeles"
TERMINATED = "terminate called after throwing an instance of 'int'"


def not_activated(update, current):
  return ("New update not compatible or older version: "
          f"{update}.1.0 vs. {current}.1.0")


class Broken(Exception):
  """The device is not as expected."""


def matches(expected, line):
  """`expected` is a text whose error text is whatever an earlier call left, a
  pair of a text and an error number, or the runtime's line as it is."""
  if expected == TERMINATED:
    return line == expected
  if isinstance(expected, tuple):
    text, error = expected
    return line == f"marlin: {text}: {os.strerror(error)}"
  return line.rpartition(": ")[0] == "marlin: " + expected


class Scene:
  """One device on which a sequence of boots takes place."""

  def __init__(self, name):
    self.device = emulated.Device("scenes/" + name)
    self.boots = 0

  def install_system(self, release="2023c", schema="44l"):
    emulated.build_system(self.device.system, release, schema)

  def make_disk(self, fill, *options, megabytes=32):
    """`fill` puts into a staging directory what is on the disk at first."""
    staging = emulated.Staging(self.device.directory / "staging")
    (staging.path / DOWNLOADS).mkdir(parents=True)
    fill(staging)
    staging.become(self.device.var, megabytes, "var", *options)

  def boot(self, lines=(), status=0, links=None, reader=None, untouched=False,
           **how):
    """Boots, and compares. `links` are names below the directory of the links,
    with what they are to be after the pass and, if no scene follows it, on the
    disk; None stands for nothing. The reader's zone tells its data set."""
    device = self.device
    before = emulated.tree(device.var)
    identities = self.identities()
    system = emulated.digest(device.system)
    started = time.monotonic()
    console = device.boot(**how)
    self.boots += 1
    print(f"--- boot {self.boots}, {time.monotonic() - started:.1f} s")
    print(console.text.rstrip())

    printed = console.pass_lines()
    if (len(printed) != len(lines) or
        not all(map(matches, lines, printed))):
      raise Broken(f"the pass printed {printed}, not {list(lines)}")
    self.expect("the status", console.status(), status)
    if reader is not None:
      said = [text for text in console.said() if text.startswith("reader sees zone")]
      self.expect("the reader's zone", said, ["reader sees zone " + reader])
    if "var" not in how.get("options", ""):
      self.expect("fsck.ext4", emulated.check(device.var), "")
    self.expect("the system partition", emulated.digest(device.system), system)
    after = emulated.tree(device.var)
    self.expect_same_data_sets(before, after)
    if "scene" not in how:
      latest = TIMEZONE + "/tz_latest"
      self.expect("the announcement", after.get(latest), before.get(latest))
    for name, target in (links or {}).items():
      if f"{name} -> {target or 'none'}" not in console.said():
        raise Broken(f"{name} is not {target} after the pass")
      if "scene" not in how:
        wanted = None if target is None else "-> " + target
        self.expect(name, after.get(f"{TIMEZONE}/{name}"), wanted)
    if untouched:
      self.expect("all of /var", after, before)
      self.expect("inodes and times", self.identities(), identities)
    return after

  def identities(self):
    return [emulated.identity(self.device.var, f"/{TIMEZONE}/{name}")
            for name in ("zoneinfo", "icutz", "localtime", "tz_latest",
                         "TZVersionDiffRecord")]

  @staticmethod
  def expect_same_data_sets(before, after):
    for path in {**before, **after}:
      if path.startswith(DOWNLOADS + "/") and before.get(path) != after.get(path):
        raise Broken(f"a data set was changed: {path}")

  @staticmethod
  def expect(what, found, wanted):
    if found != wanted:
      raise Broken(f"{what}: found {found!r}, not {wanted!r}")

  def expect_record(self, tree, content):
    self.expect("the record", tree.get(TIMEZONE + "/TZVersionDiffRecord"),
                content and content.encode())


def with_updates(*versions, active=None, announced=None):
  """A disk with downloaded updates, on which one may be active or announced."""
  def fill(staging):
    for release, schema in versions:
      emulated.add_update(staging, release + ".1.0", schema)
    emulated.add_system_links(staging)
    if active:
      staging.link(TIMEZONE + "/zoneinfo", update_path(active + ".1.0/zoneinfo"))
      staging.link(TIMEZONE + "/icutz", update_path(active + ".1.0/icutz"))
    if announced:
      staging.link(TIMEZONE + "/tz_latest", update_path(announced + ".1.0"))
  return fill


def announce(release):
  """What an installer of updates does last, on the device."""
  return (f"ln -s {update_path(release + '.1.0')} /var/db/timezone/next\n"
          "mv -T /var/db/timezone/next /var/db/timezone/tz_latest\n")


def at_update(release):
  return {"zoneinfo": update_path(release + ".1.0/zoneinfo"),
          "icutz": update_path(release + ".1.0/icutz"), "localtime": PARIS}


AT_SYSTEM = {"zoneinfo": SYSTEM, "icutz": None, "localtime": PARIS}


# --- The scenes -------------------------------------------------------------


def never_updated(scene):
  scene.install_system()
  scene.make_disk(with_updates())
  for _ in range(2):
    scene.boot(links=AT_SYSTEM, reader="S23CP", untouched=True)


def update(scene):
  """Announced, activated, and the next boot."""
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l")))
  scene.boot(scene=announce("2024a"), links=AT_SYSTEM, reader="S23CP")
  after = scene.boot(links=at_update("2024a"), reader="U24AP")
  scene.expect_record(after, "2023c.1.0_2024a.1.0")
  for _ in range(2):
    scene.boot(lines=[not_activated("2024a", "2024a")], reader="U24AP",
               untouched=True)


def another_schema(scene):
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l"), ("2024b", "45l"),
                               active="2024a", announced="2024a"))
  scene.boot(lines=[not_activated("2024a", "2024a")], scene=announce("2024b"),
             links=at_update("2024a"), reader="U24AP")
  scene.boot(lines=[not_activated("2024b", "2024a")], reader="U24AP",
             untouched=True)


def system_upgraded_past_the_update(scene):
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l"), announced="2024a"))
  scene.boot(links=at_update("2024a"), reader="U24AP")
  scene.install_system("2024b")
  after = scene.boot(lines=[INCOMPATIBLE, not_activated("2024a", "2024a")],
                     links=AT_SYSTEM, reader="S24BP")
  scene.expect_record(after, "2023c.1.0_2024a.1.0")
  scene.boot(lines=[not_activated("2024a", "2024b")], reader="S24BP",
             untouched=True)


def links_wiped(scene):
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l"), active="2024a"))
  wipe = "cd /var/db/timezone && rm zoneinfo icutz localtime; cd /\n"
  scene.boot(links=at_update("2024a"), reader="U24AP", scene=wipe)
  scene.boot(lines=["Bad zoneinfo link ", INVALID_LINKS, LOCALTIME_INVALID],
             links={**AT_SYSTEM, "localtime": LOS_ANGELES}, reader="S23CL",
             scene=announce("2024a") + wipe.replace(" icutz", ""))
  after = scene.boot(
      lines=["Bad zoneinfo link ", INVALID_LINKS, LOCALTIME_INVALID],
      links={**at_update("2024a"), "localtime": LOS_ANGELES}, reader="U24AL")
  scene.expect_record(after, "2023c.1.0_2024a.1.0")


def legacy_icu_link(scene):
  def fill(staging):
    with_updates(("2024a", "44l"), active="2024a")(staging)
    os.rename(staging.path / TIMEZONE / "icutz", staging.path / "db/icutz")
    staging.link("db/icu", "/var/db/gone")
  scene.install_system()
  scene.make_disk(fill)
  after = scene.boot(links=at_update("2024a"), reader="U24AP")
  scene.expect("the legacy link", after.get("db/icutz"), None)
  scene.expect("/var/db/icu", after.get("db/icu"), None)
  scene.boot(reader="U24AP", untouched=True)


def disk_without_a_free_block(scene):
  """Links fit into their inodes; only the record finds no room."""
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l")))
  scene.boot(scene="dd if=/dev/zero of=/var/filler bs=65536 2>/dev/null\n"
                   "dd if=/dev/zero of=/var/filler2 bs=4096 2>/dev/null\n" +
                   announce("2024a"), links=AT_SYSTEM)
  after = scene.boot(links=at_update("2024a"), reader="U24AP",
                     scene="rm /var/filler /var/filler2\n")
  scene.expect("the record", after[TIMEZONE + "/TZVersionDiffRecord"], b"")
  scene.boot(lines=[not_activated("2024a", "2024a")], untouched=True)


def disk_without_a_free_inode(scene):
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l")), "-N", "64")
  scene.boot(scene=announce("2024a") + "mkdir /var/filler\n"
                   "i=0; while touch /var/filler/$i 2>/dev/null; do i=$((i + 1)); done\n",
             links=AT_SYSTEM)
  # The old zoneinfo link's inode serves the new one; for icutz there is none.
  no_room = ("create_symlink: from /var/db/timezone/icutz to "
             "/var/db/timezone/tz/2024a.1.0/icutz", errno.ENOSPC)
  after = scene.boot(lines=[no_room, (UNABLE_TO_LOCATE, errno.ENOSPC)],
                     links=AT_SYSTEM, reader="S23CP",
                     scene="rm -r /var/filler\n")
  scene.expect_record(after, None)
  after = scene.boot(links=at_update("2024a"), reader="U24AP")
  scene.expect_record(after, "2023c.1.0_2024a.1.0")


def reset_fails(remove, create):
  """The lines of a reset to the system partition that cannot be done."""
  return [("remove: could not remove /var/db/timezone/zoneinfo", remove),
          ("Unlink of zoneinfo softlink failed", remove),
          ("create_symlink: from /var/db/timezone/zoneinfo to " + SYSTEM, create)]


def read_only_disk(scene):
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l")))
  scene.boot(options="var=ro", reader="S23CP", untouched=True)
  scene.boot(scene=announce("2024a"))
  activation = [("remove: could not remove /var/db/timezone/zoneinfo", errno.EROFS),
                ("Unlink of zoneinfo softlink failed", errno.EROFS),
                ("create_symlink: from /var/db/timezone/zoneinfo to " +
                 update_path("2024a.1.0/zoneinfo"), errno.EEXIST)]
  scene.boot(options="var=ro", status=ABORTED, reader="S23CP", untouched=True,
             lines=[*activation, (UNABLE_TO_LOCATE, errno.EEXIST),
                    *reset_fails(errno.EROFS, errno.EEXIST), TERMINATED])
  scene.boot(links=at_update("2024a"), reader="U24AP")


def disk_with_a_bad_sector(scene):
  """Where the directory of the links should be there is only an I/O error."""
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l"), active="2024a"))
  var = scene.device.var
  block = emulated.debugfs(var, f"blocks /{TIMEZONE}").split()[-1]
  bad = ("driver=raw,node-name=var,file.driver=blkdebug,"
         f"file.image.driver=file,file.image.filename={var},"
         "file.inject-error.0.event=read_aio,file.inject-error.0.iotype=read,"
         f"file.inject-error.0.errno=5,file.inject-error.0.sector={int(block) * 8}")
  scene.boot(disk=bad, status=ABORTED, options="var=errors=continue",
             lines=[("read_symlink: /var/db/timezone/tz_latest", errno.EIO),
                    (UNABLE_TO_LOCATE, errno.EIO),
                    *reset_fails(errno.EIO, errno.EIO), TERMINATED])
  emulated.run(emulated.tool("e2fsck"), "-fp", var)
  scene.boot(links=at_update("2024a"), reader="U24AP", untouched=True)


def disk_with_a_lost_link(scene):
  """The name of the zoneinfo link leads to an inode that is gone; the disk goes
  read only on the first error, until it is repaired."""
  scene.install_system()
  scene.make_disk(with_updates(("2024a", "44l"), active="2024a"))
  var = scene.device.var
  emulated.run(emulated.tool("debugfs"), "-w", "-R", f"clri /{TIMEZONE}/zoneinfo", var)
  damaged = errno.EUCLEAN  # this kernel finds that before it finds "read only"
  scene.boot(status=ABORTED, options="var=errors=remount-ro",
             lines=[("read_symlink: /var/db/timezone/zoneinfo", damaged),
                    (INVALID_LINKS, damaged), *reset_fails(damaged, damaged),
                    (UNABLE_TO_LOCATE, damaged), *reset_fails(damaged, damaged),
                    TERMINATED])
  emulated.run("sh", "-c", f"{emulated.tool('e2fsck')} -fy {var} || [ $? = 1 ]")
  scene.boot(lines=["Bad zoneinfo link ", INVALID_LINKS], links=AT_SYSTEM,
             reader="S23CP")


def no_directory(scene):
  def fill(staging):
    for directory in (DOWNLOADS, TIMEZONE):
      (staging.path / directory).rmdir()
  scene.install_system()
  scene.make_disk(fill)
  no_link = ("create_symlink: from /var/db/timezone/zoneinfo to " + SYSTEM,
             errno.ENOENT)
  for _ in range(2):
    scene.boot(status=ABORTED, untouched=True,
               lines=["Bad zoneinfo link ", INVALID_LINKS, no_link,
                      (UNABLE_TO_LOCATE, errno.ENOENT), no_link, TERMINATED])


SCENES = {function.__name__: function for function in (
    never_updated, update, another_schema, system_upgraded_past_the_update,
    links_wiped, legacy_icu_link, disk_without_a_free_block,
    disk_without_a_free_inode, read_only_disk, disk_with_a_bad_sector,
    disk_with_a_lost_link, no_directory)}


def main():
  parser = argparse.ArgumentParser(description=__doc__.split("\n", maxsplit=1)[0])
  parser.add_argument("--list", action="store_true", help="print the names")
  parser.add_argument("scene", nargs="*", help="all of them by default")
  options = parser.parse_args()
  if options.list:
    print("\n".join(SCENES))
    return 0
  for name in options.scene:
    if name not in SCENES:
      parser.error(f"there is no scene {name}; see --list")
  try:
    emulated.prepare()
  except emulated.Unavailable as reason:
    print(f"SKIPPED: {reason}", file=sys.stderr)
    return emulated.SKIPPED
  failed = 0
  for name in options.scene or SCENES:
    print(f"=== {name}", flush=True)
    try:
      SCENES[name](Scene(name))
    except (Broken, RuntimeError) as reason:
      print(f"FAILED: {name}: {reason}")
      failed += 1
  return 1 if failed else 0


if __name__ == "__main__":
  sys.exit(main())
