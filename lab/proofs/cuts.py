# SPDX-License-Identifier: BSD-2-Clause
"""A life on an emulated device, whose power is cut at any moment.

Events of a life come one after the other, on a real disk, while others sync it or
nobody does; then the emulator is killed. What had not been flushed is kept or lost at
random. What the disk then holds is judged after its journal has been replayed: it is
sound; what is announced is what an installer last said, or was about to; every set
that has a name is whole, and none that a link leads into is gone. Then the device
boots again, by turns with the mend and without, as the model does with what was found;
and that is the boot that ends with the next cut.
"""

import collections
import contextlib
import random
import re
import shutil
import time

from lab.arm64_device import power_log
from lab.arm64_device.machine import Console, Machine, plain, shown_links
from lab.carriers import image
from lab.oracles import model
from lab.oracles.installer import HIDDEN, announced, below, put_update
from lab.oracles.sets import mixed, names_of, needed
from lab.oracles.trial import log_differences
from lab.proofs import life
from lab.proofs.life import RELEASES, update_name
from lab.words.device import sound_device
from lab.words.paths import (DOWNLOADS, FORMER_ZONEINFO, ICUTZ, LEGACY_ICUTZ, LOCALTIME,
                             OLD_ICU, RECORD, TIMEZONE, TZ_LATEST,
                             ZONEINFO, update_path)
from lab.words.seen import Entries, as_device

UPDATES = "/usr/share/updates/"  # to copy
# Owns nothing but "/var/db/timezone/tz" and its own announcement; "owner" in the
# device's passwd.
ACCOUNT = 1

# The events of a life that a shell on the device can make happen: how often each
# comes, and how. Boots that have something to do are the rule, because they are short.
IN_SHELL = {
    r"boot": (80, "marlin 2>/dev/kmsg"),
    r"boot mend": (40, "marlin-mend 2>/dev/kmsg; marlin 2>/dev/kmsg"),
    r"bend tz_latest (\d.*)": (16, rf"[ ! -d {DOWNLOADS}\1.1.0 ] || "
                                   rf"replace {DOWNLOADS}\1.1.0 {TZ_LATEST}"),
    r"lose (zoneinfo|icutz)": (10, rf"rm -f {TIMEZONE}/\1"),
    r"install (\S+)": (1, rf"as_owner marlin-install {UPDATES}\1.1.0"),
    r"install (\S+) forced": (1, rf"as_owner marlin-install --force {UPDATES}\1.1.0"),
    r"tool (--withdraw|--prune|--settle)": (3, r"as_owner marlin-install \1"),
    r"zone (\w+/[LP].*)": (2, rf"replace {ZONEINFO}/\1 {LOCALTIME}"),
    r"legacy icutz": (3, f"[ ! -e {ICUTZ} ] || "
                         f'replace "$(readlink {ICUTZ})" {LEGACY_ICUTZ}'),
    r"legacy icu": (3, f"mkdir -p {OLD_ICU}"),
    r"legacy localtime": (3, f"replace {FORMER_ZONEINFO}/Europe/Paris {LOCALTIME}"),
}
EVENTS = {text: (often, found.expand(shell)) for texts in life.EVENTS.values()
          for text in texts for form, (often, shell) in IN_SHELL.items()
          if (found := re.fullmatch(form, text))}
FIRST = [text for text in EVENTS if text.startswith("install")]
LENGTH = 300  # more than a device lives through before the cut
LONGEST = 4  # seconds until the cut

# How the disk is mounted, and what else goes on: nothing that syncs, others who
# sync now and then or all the time; or every change of a directory is on the
# disk before the next, as the mount asks for, so that each state in the middle
# of a boot can be found. The last is the rule, because it finds the most.
OTHERS = (("rw", ""), ("rw", "(while :; do sync; usleep 30000; done) &\n"),
          ("rw", "(while :; do sync; done) &\n"), *(3 * [("dirsync", "")]))

LINKS = ZONEINFO, ICUTZ, LOCALTIME, TZ_LATEST, LEGACY_ICUTZ
LEFT = f"{TIMEZONE}/{HIDDEN}* {DOWNLOADS}{HIDDEN}*"
WORDS = f"""
as_owner() {{ said=$(su owner -c "exec $*" 2>&1); }}
replace() {{
  ln -sfn "$1" "$2.next" && chown -h {ACCOUNT} "$2.next" && mv -T "$2.next" "$2"
}}
happen() {{
  said=
  say "begins: $1"
  eval "$2"
  say "status $?, announced $(readlink {TZ_LATEST}), left" {LEFT}, said $said
}}
say "life begins"
"""
TOLD = re.compile(r"begins: (.*)|status (\d+), announced (\S*), left (.*), said ?(.*)")
# What an installation may end with: done, or the reason why not.
ENDINGS = [r"0 .*", r"1 .*: a set of this version is in use or announced; .*",
           r"4 .*: it is not newer than .*"]


def insist(found: list[str]):
    """Raises if anything is not as it has to be."""
    if found:
        raise RuntimeError("; ".join(found))


def kind_of_record(entries: Entries) -> str:
    """A record is written and never synced: the disk may know of the file but not
    of its bytes yet; the next activation writes it anew."""
    if RECORD not in entries:
        return "none"
    record, version = entries[RECORD].text, r"20\d\d[a-z]\.1\.0"
    if not record.strip("\0"):
        return "of NUL bytes" if record else "empty"
    insist([f"the record holds {record!r}"] * (
        not re.fullmatch(f"{version}_{version}", record)))
    return "whole"


def check_recovery(console: Console, found: Entries, mend: bool) -> Entries:
    """The first pass of a boot that found this is to do what the model does; the device
    after it."""
    device = as_device(found)
    if mend and mixed(found):
        device.drop(ZONEINFO)
    insist(log_differences(model.boot(device), console.booted()))
    zone = device.walk(LOCALTIME, follow=True)[2].text
    insist([f"after the boot not: {text}"
            for text in shown_links(device) + [f"reader sees {zone}"]
            if text not in console.said])
    after = dict(device.everything())
    insist(["links of two sets with the mend"] * (mend and mixed(after)))
    return after


def announced_by(event: str) -> set[str | None]:
    """What an event can make the announcement."""
    if named := re.search(r"20\d\d[a-z]", event):
        return {update_path(update_name(named[0]))}
    return {None} if event.endswith(("--withdraw", "--settle")) else set()


class Victim:
    """A device whose power is cut again and again. `found` is what the next boot
    finds, `allowed` what may be announced then."""

    def __init__(self, seed: int | None):
        self.seed = random.randrange(10**6) if seed is None else seed
        print(f"seed {self.seed}", flush=True)
        self.random, self.machine = random.Random(self.seed), Machine("power-cuts")
        self.build()
        self.start = self.found = self.machine.look()
        self.mend, self.allowed = False, {None}
        self.totals = collections.Counter()

    def build(self):
        device = sound_device()
        device.directory(DOWNLOADS)
        device.directory(TIMEZONE, 0o1775)
        for release in RELEASES:
            put_update(device, UPDATES + update_name(release), release, release,
                       more={"icutz/icutz44l.dat": f"ICU data of {release}\n" * 5000})
        self.machine.build(device, "-N", "2048", "-J", "size=4", megabytes=32)
        image.debugfs(self.machine.var, f"sif /db/timezone gid {ACCOUNT}",
                      f"sif /db/timezone/tz uid {ACCOUNT}", write=True)

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

    def cut(self) -> tuple[str, int]:
        """Boots, lets life go on for a while, and kills the emulator, which logs what
        the device asks of its disk and changes only a copy of it. What was happening,
        and how many blocks were lost."""
        machine, log = self.machine, self.machine.directory / "log"
        scratch = shutil.copyfile(machine.var, machine.directory / "scratch.img")
        log.write_bytes(b"")
        mounted, syncs = self.random.choice(OTHERS)
        events = [self.random.choice(FIRST), *self.random.choices(
            [*EVENTS], [often for often, _ in EVENTS.values()], k=LENGTH)]
        emulator = machine.start(
            WORDS + syncs + "".join(f"happen '{event}' '{EVENTS[event][1]}'\n"
                                    for event in events)
            + "while :; do sleep 1; done\n",
            options="var=" + mounted + " mend" * self.mend,
            more=("-smp", "2"),  # processors: others sync in the middle of a pass
            disk="driver=blklogwrites,node-name=var,"
                 f"file.driver=file,file.filename={scratch},"
                 f"log.driver=file,log.filename={log}")
        try:
            machine.wait_for(emulator, "life begins")
            time.sleep(self.random.uniform(0, LONGEST))
        finally:
            emulator.kill()
            emulator.wait()
        lost = power_log.cut_power(machine.var, log.read_bytes(),
                                   self.random.choice((0, 0.5, 1)), self.random)
        console = Console(machine.console)
        check_recovery(console, self.found, self.mend)
        self.found = self.look_after_cut()
        happening = self.follow(console)
        self.judge()
        return happening, lost

    def look_after_cut(self) -> Entries:
        """The disk as a boot would find it."""
        found = shutil.copyfile(self.machine.var, self.machine.directory / "found.img")
        image.replay_journal(found)
        image.check(found)
        return self.machine.look(found)

    def follow(self, console: Console) -> str:
        """Learns from what the device said which announcements there can be, and what
        was happening."""
        happening = "nothing"
        for told in filter(None, map(TOLD.fullmatch, console.said)):
            if told[1]:
                happening = told[1]
                self.allowed |= announced_by(happening)
                continue
            event, happening = happening, "nothing"
            self.totals["came to its end: " + event.split()[0]] += 1
            is_tools = event.startswith(("install", "tool"))
            endings = ENDINGS if event.startswith("install") else ENDINGS[:1]
            if not any(re.fullmatch(form, f"{told[2]} {told[5]}") for form in endings):
                raise RuntimeError(f"{event}: {told[0]}")
            if is_tools and told[4] != LEFT:
                raise RuntimeError(f"{event}: left behind: {told[4]}")
            # Only the installer syncs what it has done, and what others did before.
            self.allowed = {told[3] or None} | (set() if is_tools else self.allowed)
        return happening

    def judge(self):
        """What a cut left."""
        found = self.found
        if announced(found) not in self.allowed:
            raise RuntimeError(f"announced is {announced(found)}, not one of "
                               f"{self.allowed}")
        self.allowed = {announced(found)}
        sets = names_of(found)
        insist([f"{name} is gone, and a link leads there"
                for name in sorted(needed(found) - set(sets))])
        insist([f"{name} is not as it was in the update" for name in sets
                if below(found, DOWNLOADS + name) != below(found, UPDATES + name)
                or found[DOWNLOADS + name].mode != 0o755])
        insist([f"{path} is not a link" for path in LINKS
                if path in found and found[path].kind != "link"])
        insist([f"{path} is a stray file" for path in found
                if path not in self.start and path not in LINKS
                and not path.startswith((DOWNLOADS, f"{TIMEZONE}/{HIDDEN}", RECORD))
                and path not in (OLD_ICU, TZ_LATEST + ".next", LOCALTIME + ".next",
                                 LEGACY_ICUTZ + ".next")])

    def try_the_mend(self):
        """On a copy of what the last cut left, if its links are of two sets."""
        if mixed(self.found):
            copy = shutil.copyfile(self.machine.var,
                                   self.machine.directory / "copy.img")
            check_recovery(self.machine.boot(options="mend", disk=plain("var", copy)),
                           self.found, mend=True)


def run(count: int, seed: int | None = None):
    """Raises RuntimeError when a device is not as it has to be after a power cut."""
    victim = Victim(seed)
    try:
        with victim.on_trial():
            for _ in range(count):
                happening, lost = victim.cut()
                told = ["power cut", f"during: {happening.split()[0]}",
                        *["then links of two sets"] * mixed(victim.found),
                        f"then the record is {kind_of_record(victim.found)}",
                        *["lost blocks that had been written"] * (lost > 0)]
                victim.totals.update(told)
                victim.try_the_mend()
                victim.mend = not victim.mend
                print(happening, f"{lost} blocks lost", *told, sep="; ", flush=True)
    finally:
        print(*(f"{number:5} times {title}"
                for title, number in sorted(victim.totals.items())), sep="\n")


def test_power_cuts():
    run(18)
