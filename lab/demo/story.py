# SPDX-License-Identifier: BSD-2-Clause
"""The story of the demonstration: eight boots of one device. A scene is a title, what
led to it, and one boot. What all boots have to change on the device, and what they have
to leave, stands in `facts`.

Told on a private device, where `scripts/demo` starts it; with --facts nothing is
printed but what was found, to be the same as the file.
"""

from __future__ import annotations

import calendar
import contextlib
import difflib
import os
import shutil
import signal
import subprocess
import sys
from pathlib import Path

from lab.carriers import boot, namespace, real_data, releases
from lab.demo import screen
from lab.words import lines
from lab.words.device import Device
from lab.words.paths import (DOWNLOADS, FORMER_ZONEINFO, ICUTZ, LOCALTIME,
                             RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TIMEZONE, TZ_LATEST,
                             ZONEINFO, update_path)
from lab.words.seen import Entries, Seen, as_device

ROWS = {"zoneinfo": ZONEINFO, "icutz": ICUTZ, "localtime": LOCALTIME,
        "tz_latest": TZ_LATEST, "record": RECORD}
NOON = str(calendar.timegm((releases.YEAR, 2, 1, 12, 0, 0)))
COMPANIONS = Path(boot.PROGRAM).parent / "tools"
FACTS = Path(__file__).with_name("facts").read_text(encoding="ascii").splitlines()


def tell(story: Story):
    device, names = story.device, story.names
    screen.rule("marlin, eight boots of one device")
    screen.say(f"""At every boot marlin decides which time-zone data a device uses:
        what its system partition holds, or an update downloaded since. Whoever
        reads time-zone data follows the links that marlin keeps in {TIMEZONE}:""")
    print(f"""
  zoneinfo    the tree of zone files in use
  icutz       the ICU data in use; only for an update
  localtime   the user's zone, a file in that tree
  tz_latest   the newest download; marlin only reads it

  {screen.paint(screen.DIM, "Shown beside them:")}
  record      the versions before and after the last update
  clock       what "date" shows at noon UTC on a day in winter
  ICU clock   the same of a program with Debian's ICU""")
    screen.say("""Before each boot marlin-status tells what it will do.""")
    screen.say("""The device is private and gone when this ends. Its data is this
        machine's, except for the names of the releases and one invention in the later
        ones: Lisbon leaves Western European Time, WET, for Central or Eastern, CET or
        EET, in the zone files and in the ICU data. One download is made for another
        ICU format.""")
    print(f"""
  {screen.paint(screen.DIM, " " * 12 + "ICU format   Lisbon   what it is")}
  {names.system:<11} {names.icu:<12} WET      system partition, at first
  {names.update:<11} {names.icu:<12} CET      a download
  {names.refused:<11} {names.other_icu:<12} EET      a later download
  {names.upgrade:<11} {names.icu:<12} EET      system partition, upgraded""")

    device.directory(DOWNLOADS)
    story.install_system("system")
    story.scene("A first boot", """A new device: the system partition holds its
        data, but there is no link yet. Nothing says which data is in use, so marlin
        links the system partition's and, in it, the default zone.""")
    screen.say("""The words after the last colon are the system's text for whatever
        call failed last; they need not have to do with the line in which they
        stand.""", screen.DIM)

    story.scene("A quiet boot", """Nothing has happened since. The links name
        data that fits, so marlin touches nothing: the links and their directory are
        the very ones that they were, to the nanosecond.""")
    device.choose_zone("Europe/Lisbon")
    story.install("update")
    story.scene("An update is activated", f"""The user has moved to Lisbon, and
        {names.update} has been downloaded, in which Lisbon has CET. The update is newer
        than {names.system} and its ICU data has the system's format, so marlin-install
        announces it, and marlin links it. Noon UTC was 12:00 in Lisbon; now it is
        13:00.""")

    story.scene("The same update again", f"""tz_latest still announces {names.update},
        which is in use by now. Equal is not newer, so marlin says so, as at every
        boot from now on, and touches nothing.""")

    story.install("refused")
    story.bring("refused", update_path(names.refused))
    device.announce(names.refused)
    story.scene("An update that does not fit is refused", f"""In
        {names.refused} Lisbon has EET. marlin-install does not take it, but somebody
        has announced it by hand. It is newer, but its ICU data has the format
        {names.other_icu} and the system reads {names.icu}, so marlin refuses it and
        stays with {names.update}.""")

    story.install_system("upgrade")
    story.scene("A system upgrade overtakes the update", f"""The system partition
        has been upgraded and now holds {names.upgrade}, newer than the update in
        use. So marlin goes back to the system partition, where Lisbon has EET too.
        The refused update is still announced, and refused again.""")

    device.link(ZONEINFO, "/nowhere")
    device.file(LOCALTIME, "damaged\n")
    device.drop(TZ_LATEST)
    story.scene("Damaged links are repaired", """The links are damaged: zoneinfo
        names nothing known, localtime has become a plain file, and tz_latest is
        lost. So marlin links the system partition's data again, and the default
        zone, as nothing tells any more which one was the user's.""")

    device.link(LOCALTIME, f"{FORMER_ZONEINFO}/Europe/Lisbon")
    story.scene("An older system's link is corrected", """A backup has brought
        back the user's localtime link, but as an older system wrote it, into a tree
        that this one does not have. The zone is known, so marlin points the link at
        the same zone of the tree in use.""")
    story.summary()


class Story:
    """A device, its boots, and what was found after them."""

    def __init__(self):
        self.device = Device()  # as it is to be at the next boot
        self.names = real_data.names()
        self.scenes = 0
        self.facts = []  # as they were found
        self.told = {}  # by marlin-install, since the last boot

    def bring(self, source: str, target: str):
        """Has the device hold what stands somewhere in the data."""
        self.device.put(target, namespace.description_of(real_data.TARGET / source))

    def install_system(self, data_set: str):
        self.bring(f"{data_set}/zoneinfo", SYSTEM_ZONEINFO)
        self.bring(f"{data_set}/icu", SYSTEM_ICU)
        # Where ICU looks for single files of its data.
        self.device.link(f"{SYSTEM_ICU}/icudt{self.names.icu}", ".")

    def install(self, data_set: str):
        """Has marlin-install install a data set on the device as it is."""
        self.make_real()
        version = getattr(self.names, data_set)
        unpacked = Path("/tmp", version)
        shutil.copytree(real_data.TARGET / data_set, unpacked, symlinks=True)
        done = subprocess.run([COMPANIONS / "marlin-install", unpacked],
                              capture_output=True, text=True)
        shutil.rmtree(unpacked)
        self.device.root = as_device(namespace.look()).root
        self.told = {"installer": [(done.stdout or done.stderr).strip()]}
        self.note(f"{version}: marlin-install, exit {done.returncode}")

    def make_real(self):
        # What is there already, from the boot before, is not made anew.
        if self.device.contents() != as_device(namespace.look()).contents():
            namespace.build(self.device)

    def foretold(self) -> tuple[int, list[str]]:
        """What marlin-status says of the next boot: its status and its reasons."""
        done = subprocess.run([COMPANIONS / "marlin-status", "--check"], text=True,
                              stdout=subprocess.PIPE)
        return done.returncode, done.stdout.splitlines()

    def scene(self, title: str, words: str):
        self.scenes += 1
        screen.rule(f"{self.scenes}  {title}")
        screen.say(words)
        self.make_real()
        before = namespace.look()
        expected, reasons = self.foretold()
        print()
        self.told["foretold"] = reasons or ["no change"]
        for name, told in self.told.items():
            screen.field(name, *(part for text in told for part in screen.broken(text)))
        self.told = {}
        was = self.rows(before)
        booted = boot.boot()
        seen = Seen(before, namespace.look(), *booted)
        found = self.rows(seen.after)
        self.device.root = as_device(seen.after).root

        status, log = seen.ending.removeprefix("exit "), seen.log.splitlines()
        touched = seen.changed()
        screen.changes(was, found, {row for row in ROWS if ROWS[row] in touched})
        print()
        screen.printed(log)
        screen.field("exit", f"status {status}"
                     + ("" if touched else "; nothing was touched"))

        self.note(f"{title}: exit {status}, foretold {expected}, "
                  + ("touched" if touched else "nothing touched"))
        for line in log:
            self.note(f"  '{line.removeprefix(lines.NAME).rpartition(': ')[0]}'")
        for name, before in was.items():
            if before != found[name]:
                self.note(f"  {name}: {before} -> {found[name]}")

    def note(self, fact: str):
        """Keeps what was found, in the same words for the data of every machine."""
        for found, told in ((self.names.update, "<update>"),
                            (self.names.refused, "<refused>"),
                            (f"{self.names.system}.1.0", "<system>")):
            fact = fact.replace(found, told)
        self.facts.append(fact)

    def rows(self, entries: Entries) -> dict[str, str]:
        """What is shown of the device as it is now, with these entries."""
        rows = {name: stands(entries, path) for name, path in ROWS.items()}
        if rows["record"] == "(a plain file)":
            rows["record"] = entries[RECORD].text
        clock = output("date", "-d", f"@{NOON}", "+%H:%M %Z", TZ=f":{LOCALTIME}")
        # Without a zone file there is no name of a zone, and the hour is UTC's.
        rows["clock"] = clock[:-1] + ", no zone" if clock.endswith(" ") else clock
        rows["ICU clock"] = "no zone"
        if rows["localtime"].startswith(f"{ZONEINFO}/"):
            zone = rows["localtime"].removeprefix(f"{ZONEINFO}/")
            rows["ICU clock"] = " ".join(output(
                str(real_data.ICU_CLOCK), zone, input=NOON, ICU_DATA=SYSTEM_ICU,
                ICU_TIMEZONE_FILES_DIR=ICUTZ).split()[:2])
        return rows

    def summary(self):
        if self.facts == FACTS:
            screen.say("All boots ended as lab/demo/facts says.", screen.GREEN)
        else:
            screen.say("Not all is as claimed.", screen.RED)
            print("Not as claimed:", *difflib.unified_diff(FACTS, self.facts), sep="\n",
                  file=sys.stderr)
        print()


def output(*command: str, input="", **environment: str) -> str:
    return subprocess.run(command, check=True, env=environment, text=True, input=input,
                          stdout=subprocess.PIPE).stdout.rstrip("\n")


def stands(entries: Entries, path: str) -> str:
    if path not in entries:
        return "none"
    here = entries[path]
    return here.text if here.kind == "link" else f"(a plain {here.kind})"


def main() -> int:
    namespace.insist_on_private_device()
    signal.signal(signal.SIGPIPE, signal.SIG_DFL)
    os.umask(0o022)
    story = Story()
    if sys.argv[1:] == ["--facts"]:
        with open(os.devnull, "w") as nothing, contextlib.redirect_stdout(nothing):
            tell(story)
        print(*story.facts, sep="\n")
    else:
        tell(story)
    return int(story.facts != FACTS)


if __name__ == "__main__":
    sys.exit(main())
