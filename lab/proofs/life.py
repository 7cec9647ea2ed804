# SPDX-License-Identifier: BSD-2-Clause
"""A device that lives on: boots, installations, the user's hand and other hands, one
after the other, and what must hold after each of these events and at the end.

An event is a line of text, "install 2024b damaged" or "boot kill symlink 2", and a life
is a list of them: it can be printed, shrunk, kept and lived again, with
scripts/prove --story 'EVENT; EVENT'. Every event can happen at any time, therefore
Hypothesis draws plain lists and no state machine is needed to say what may follow.

Each boot is a trial, against the model and the properties, after marlin-status was
asked to foretell it.
"""

import contextlib
import errno
import functools
import os
import re
import struct
import subprocess
from itertools import pairwise, product

import pytest
from hypothesis import given, seed, settings
from hypothesis import strategies as st

from lab.carriers import boot, namespace
from lab.carriers.boot import Booted
from lab.oracles import model, properties, status
from lab.oracles.conditions import Fails, Killed, MemoryRefused, refusals
from lab.oracles.installer import (BUSY, DONE, FAILED, NOT_NEWER, PROGRAM, announced,
                                   below, hidden, put_update)
from lab.oracles.sets import (fits, is_due, is_welcome, link, mixed, names_of, needed,
                              set_of, whole)
from lab.oracles.trial import entry_differences, left, real, trial
from lab.proofs.kills import killed
from lab.words.changes import change
from lab.words.device import Device, decoded
from lab.words.paths import (DOWNLOADS, FORMER_ZONEINFO, ICUTZ, LEGACY_ICUTZ, LOCALTIME,
                             OLD_ICU, RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TZ_LATEST,
                             ZONEINFO, update_path)
from lab.words.seen import Call, Entries, Seen, as_device

MEND = os.path.join(os.path.dirname(PROGRAM), "marlin-mend")
INCOMING = "/var/db/incoming/"
RELEASES = "2022b", "2023c", "2024a", "2024b", "2025a"
NEWEST = "2031a"  # is installed at the end of each life
EXISTING = "Europe/Paris", "America/Los_Angeles"
PLACES = {"zoneinfo": ZONEINFO, "icutz": ICUTZ, "localtime": LOCALTIME,
          "tz_latest": TZ_LATEST, "record": RECORD, "legacy": LEGACY_ICUTZ,
          "tz": DOWNLOADS.rstrip("/")}

# --- What can happen -----------------------------------------------------------------


def all_of(form: str, *choices) -> list[str]:
    """Every text of a form, in which {} stands for one of the choices each."""
    return [form.format(*words) for words in product(*choices)]


CALLS = "symlink", "unlink", "rename", "mkdir", "open", "fsync", "write"
TROUBLES = (all_of("{} {} {}", ["kill", "fail"], CALLS, "12346")
            + all_of("full {}", "12346"))
JOBS = "--withdraw", "--prune", "--settle", "--audit"
EVENTS = {  # by kind, each drawn as often as the others
    "wait": ["wait"],
    "boot": ["boot"],
    "mend": ["mend"],
    "mended boot": ["boot mend"],
    "killed boot": all_of("boot kill {} {}", CALLS[:2], "123456"),
    "failing boot": all_of("boot fail {} {}", [*CALLS[:2], "access"], "12345"),
    "boot, disk full": all_of("boot full {}", "123"),
    "boot, log lost": ["boot deaf"],
    "boot, memory lost": ["boot starved"],
    "install": all_of("install {}", RELEASES),
    "odd install": all_of("install {} {}", RELEASES, [
        "damaged", "incomplete", "misnamed", "lacking", "schema", "forced", "refused",
        "verified", "locked", "twice"]),
    "troubled install": all_of("install {} {}", RELEASES, TROUBLES),
    **{job[2:]: [f"tool {job}"] for job in JOBS},
    "troubled tool": all_of("tool {} {}", JOBS, TROUBLES),
    "zone": all_of("zone {}", [*EXISTING, "Mars/Base"]),
    "system": all_of("system {} {}", RELEASES, ["44l", "45l"]),
    "older system": ["legacy icutz", "legacy icu", "legacy localtime"],
    "loss": all_of("lose {}", [*PLACES, *RELEASES]),
    # Not the record: a boot writes it wherever a link leads.
    "bend": all_of("bend {} {}", [name for name in PLACES if name != "record"],
                   [*RELEASES, "nowhere"]),
    "file": all_of("file {}", [*PLACES, *RELEASES]),
    "directory": all_of("directory {}", ["tz_latest", "localtime", "zoneinfo",
                                         "icutz"]),
    "mode": all_of("mode {} {}", ["tz", *RELEASES], ["000", "500", "755"]),
    "damage": all_of("damage {}", RELEASES),
}
KINDS = {text: kind for kind, texts in EVENTS.items() for text in texts}

# --- What it looks like --------------------------------------------------------------


def update_name(release: str) -> str:
    return f"{release}.1.0"


def zone_files(place: str, release: str, whose: str) -> dict[str, str]:
    """Each with one type of local time, whose name behind a head of 50 bytes tells what
    it is."""
    names = {zone: f"{whose}-{release}-{zone[:2]}" for zone in EXISTING}
    return {f"{place}/{zone}": decoded(
        b"TZif" + bytes(16) + struct.pack(">6I", 0, 0, 0, 0, 1, len(name) + 1)
        + bytes(6) + name.encode() + b"\0") for zone, name in names.items()}


def hopeless(entries: Entries, directories=("tz_latest", "zoneinfo", "icutz")):
    """What an installation or a boot cannot mend: somebody has to. The installer tells
    what stops it, and marlin-status the rest."""
    tz = entries.get(PLACES["tz"])
    if not tz or (tz.kind, tz.mode) != ("dir", 0o755):
        yield "no directory of downloads"
    for name in directories:
        if (here := entries.get(PLACES[name])) and here.kind == "dir":
            yield f"{name} is a directory"
    device = as_device(entries)
    for name, path in PLACES.items():
        try:
            device.walk(path, follow=True)
        except PermissionError:
            yield f"{name} leads through what cannot be entered"
        except OSError:
            pass


@functools.cache
def starved() -> MemoryRefused:
    """Of a boot: its first request for memory, which takes an update in use."""
    real("update stays")
    return refusals(boot.PROGRAM)[0]


class Life:
    """One device. What our programs do are methods, named as the events, that give what
    must not be; the other events are somebody's hand."""

    def __init__(self, count=lambda title: None):
        self.count, self.story = count, []
        starved()
        namespace.build(change(Device(), "directory TZ; link ZONEINFO SYSTEM;"
                               f"choose_zone Europe/Paris; directory {INCOMING}"))
        install_system("2023c", "44l")

    def live(self, events: list[str]):
        for text in [*events, "end"]:
            if text != "wait":
                self.happen(text)

    def happen(self, text: str):
        self.story.append(text)
        self.calls = []  # of a tool
        before = namespace.look()
        verb, *words = text.split()
        try:
            program = getattr(self, verb, None)
            found = program(before, *words) if program else by_hand(verb, *words)
        except (Exception, pytest.fail.Exception) as failed:
            found = [repr(failed)]
        if found:
            pytest.fail("\n  ".join([text, *found]) + "\nAlone: scripts/prove --story "
                        f"'{'; '.join(self.story)}'", pytrace=False)

    # --- Boots ---

    def boot(self, before: Entries, trouble="", *words: str) -> list[str]:
        if trouble == "mend":
            return self.mend(before) + self.undisturbed(namespace.look(), mended=True)
        if trouble == "deaf":
            device = as_device(before)
            told = boot.run("/bin/sh", "-c", 'exec "$0" 2>&-', boot.PROGRAM)
            found = left(device, told.ending, model.boot(device))
        elif trouble == "starved":
            told = boot.traced(*starved().options())
            found = properties.shortcomings(properties.Judged(Seen(
                before, namespace.look(), *told)), properties.of_the_choice)
        elif trouble:
            found = self.disturbed(before, trouble, *words)
        else:
            return self.undisturbed(before)
        return found + properties.data_changes(before, namespace.look())

    def disturbed(self, before: Entries, trouble, *words: str) -> list[str]:
        """At the call of one kind that is told by its turn; or from then on."""
        kind, turn = ("symlink", *words)[-2:]
        device, made = as_device(before), model.boot(as_device(before)).calls
        numbers = [number for number, (name, _) in enumerate(made, start=1)
                   if name == kind][int(turn) - 1:]
        if not numbers:
            return self.undisturbed(before)
        number, names = numbers[0], boot.family(kind)
        if trouble == "kill":
            killed(device, Killed(names, turn, number), before)
        else:
            call = Call(names, int(turn), *made[number - 1], injected=True, error=None)
            trial(device, Fails(number, call, errno.ENOSPC, for_good=True)
                  if trouble == "full" else Fails(number, call, errno.EIO), again=True)
        return []

    def mend(self, before: Entries) -> list[str]:
        """The mend removes "zoneinfo" where the links are of two sets, only that."""
        told, device, removes = boot.run(MEND), as_device(before), mixed(before)
        if removes:
            device.drop(ZONEINFO)
        found = entry_differences(device, namespace.look())
        if told.ending != DONE or told.log.count("\n") != removes:
            found.append(f"the mend: {told}, where it removes a link: {removes}")
        return found

    def undisturbed(self, before: Entries, mended=False) -> list[str]:
        answer = status.ask("--json")
        assert answer.status != 77, answer.errors
        said = answer.said
        _, seen = trial(as_device(before), again=True)
        found = ([f"its status: {answer}"] * (answer.status != said["status"])
                 + status.link_differences(said["now"], before)
                 + status.boot_differences(said["next_boot"], seen)
                 + status.status_differences(said, seen)
                 + status.reason_differences(said))
        [step] = [each for each in said["next_boot"]["steps"]
                  if each["step"] == "record"]
        written = step["does"] == "written"
        if written != (RECORD in seen.changed()) or (
                written and not step["text"].endswith(seen.after[RECORD].text)):
            found.append(f"of the record it said: {step['text']}")
        found += properties.shortcomings(properties.Judged(seen))
        found += properties.data_changes(before, seen.after)
        if seen.ending == DONE:
            if mixed(seen.after) and (mended or not mixed(before)):
                found.append("the links are of two sets")
            found += self.clock(seen.after)
        return found

    def clock(self, entries: Entries) -> list[str]:
        """date(1) tells the time of the set in use, where that has the user's zone."""
        tree = link(entries, ZONEINFO)
        name = link(entries, LOCALTIME).removeprefix(ZONEINFO)
        here = entries.get(tree + name)
        wanted = here.text[50:-1] if here else ""
        if not (wanted and os.access(LOCALTIME, os.R_OK)):
            return []
        self.count("clocks read")
        told = subprocess.run(["/usr/bin/date", "+%Z"], capture_output=True, text=True,
                              env={"TZ": f":{LOCALTIME}"}).stdout.strip()
        return [f"date tells {told}, not {wanted}"] if told != wanted else []

    # --- The installer ---

    def tool(self, before: Entries, *words: str) -> list[str]:
        options, trouble = words[:1], words[1:]
        told, after = self.run_tool(options, trouble), namespace.look()
        found = self.of_the_tool(before, after, told, words, trouble)
        in_use = (announced(before) in before
                  and link(before, ZONEINFO) == f"{announced(before)}/zoneinfo"
                  and link(before, ICUTZ) == f"{announced(before)}/icutz")
        settles = options == ("--settle",) and in_use
        goes = options == ("--withdraw",) or settles
        if announced(after) not in [announced(before), *[None] * goes]:
            found.append(f"announced is {announced(after)}")
        if told.ending == DONE and goes and announced(after):
            found.append("it is still announced")
        succeeds = options != ("--audit",) or all(
            whole(before, name) for name in needed(before) | set(names_of(before)))
        if succeeds != (told.ending == DONE) and not (
                succeeds and (trouble or [*hopeless(before)])):
            found.append(f"it has to succeed: {succeeds}; {told}")
        prunes = options == ("--prune",) or settles
        for name in names_of(before):
            stays = not prunes or name in needed(before) or is_due(before, name)
            if stays and name not in names_of(after):
                found.append(f"{name} was deleted")
            elif not stays and name in names_of(after) and told.ending == DONE and (
                    not link(before, update_path(name))):
                found.append(f"{name} was not pruned")
        return found

    def run_tool(self, words, trouble: tuple[str, ...], *holder: str) -> Booted:
        match trouble:
            case "full", turn:
                options = [word for call in ("write", "mkdir", "symlink") for word in
                           boot.failing(boot.family(call), errno.ENOSPC, f"{turn}+")]
            case "fail", call, turn:
                options = boot.failing(boot.family(call), errno.EIO, turn)
            case "kill", call, turn:
                options = boot.killing(boot.family(call), turn)
            case _:
                options = []
        told = boot.traced(*options, command=[*holder, PROGRAM, *words])
        self.calls = [] if "kill" in trouble else list(boot.calls())
        return told

    def unsynced(self) -> list[str]:
        """What a tool did before the disk had what it builds upon: a rename after a
        write, or another rename; or it ended after a change."""
        letters = {"write": "w", "rename": "r", "unlink": "u", "fsync": "s"}
        done = "".join(letters.get(call.name, "") for call in self.calls
                       if not call.error)
        installs = "w" in done
        # What is removed before and after an installation may come back.
        built = done[done.find("w"):done.rfind("s") + 1] if installs else ""
        too_early = re.search("w[^s]*r|r[^s]*r", built) or re.search(
            "sr$" if installs else "[ru]$", done)
        return [f"it did not wait for the disk: {done}"] * bool(too_early)

    def of_the_tool(self, before, after, told, words, trouble) -> list[str]:
        """What no run of the installer may do."""
        found = [f"{path} was changed" for path in (ZONEINFO, ICUTZ, LOCALTIME, RECORD,
                                                    LEGACY_ICUTZ, OLD_ICU)
                 if (before.get(path) and before[path].identity) !=
                 (after.get(path) and after[path].identity)]
        for name in needed(before) & set(names_of(before)):
            if below(after, DOWNLOADS + name) != below(before, DOWNLOADS + name):
                found.append(f"{name}, which is needed, is not as it was")
        if told.ending == "killed":
            return found
        if told.ending == DONE:
            found += self.unsynced()
        if told.ending not in (DONE, FAILED, BUSY, NOT_NEWER):
            found.append(f"it ends with {told.ending}")
        # What makes a write fail loses the line; an audit tells it in its table.
        quiet = {"write", "full", "--audit"} & {*trouble, *words}
        lines = [0, 1] if quiet else [int(told.ending != DONE)]
        if told.log.count("\n") not in lines:
            found.append(f"{told.ending}: {told.log!r}")
        cleans_up = told.ending == DONE and not trouble and "--audit" not in words
        if cleans_up and hidden(after) and after[PLACES["tz"]].mode == 0o755:
            found.append(f"left behind: {hidden(after)}")
        return found

    def install(self, before: Entries, release: str, kind="", *more: str) -> list[str]:
        name = update_name(release)
        path = update_path(name)
        trouble = (kind, *more) if more else ()
        source = self.source(release, kind)
        words = {"forced": ["--force"], "verified": ["--verify", "/bin/true"],
                 "refused": ["--verify", "/bin/false"]}.get(kind, []) + [source]
        update = below(namespace.look(), source)
        told = self.twice(words) if kind == "twice" else self.run_tool(
            words, trouble, *["/usr/bin/flock", DOWNLOADS] * (
                kind == "locked" and os.access(DOWNLOADS, os.R_OK)))
        remove(source)
        after, sight = namespace.look(), properties.Sight(before)
        found = [line for line in self.of_the_tool(before, after, told, words, trouble)
                 if not line.startswith(f"{name}, which is needed")
                 or below(after, path) != update]
        done = told.ending == DONE
        is_whole = below(after, path) == update and after[path].mode == 0o755
        # What is in use, and was lost or damaged, is only put back.
        wanted = announced(before) if set_of(before, ZONEINFO) == name else path
        stays = name in needed(before) and whole(before, name)
        schema = {"": "44l", "verified": "44l", "schema": "45l"}.get(kind)
        wrong = {
            f"{name} is not announced, or not whole":
                done and not (is_whole and announced(after) == wanted),
            f"{name}, which is needed, was replaced": done and stays,
            f"an update that is {kind} was installed": done and kind in (
                "damaged", "incomplete", "misnamed", "refused", "locked"),
            "an update that is not newer was installed":
                done and kind != "forced" and not is_welcome(before, name),
            f"the schema of {name} is not the system's":
                done and not fits(properties.Sight(after), name),
            f"{name} lacks the zone that the device is set to":
                done and kind == "lacking" and sight.leads_somewhere(LOCALTIME)
                and link(before, LOCALTIME).endswith("/Europe/Paris"),
            f"announced is {announced(after)}":
                not done and announced(after) != announced(before)
                and not (trouble and announced(after) == path and is_whole),
            f"it cannot be installed: {told.log}":
                not done and schema == sight.data_set("").schema and not stays
                # Perhaps it is whole: that takes --force.
                and not (name in needed(before) and path in before
                         and before[path].mode == 0)
                and not [*hopeless(before, ["tz_latest"])]
                and is_welcome(before, name),
        }
        found += [what for what, is_so in wrong.items() if is_so]
        for other in set(names_of(before)) - set(names_of(after)):
            found.append(f"{other} was deleted")
        self.count(f"installations that end with {told.ending}")
        return found

    def source(self, release: str, kind: str) -> str:
        """An unpacked update, as something else has left it."""
        name = update_name(release)
        source = INCOMING + (name.upper() if kind == "misnamed" else name)
        device = Device()
        put_update(device, source, release, more=zone_files("zoneinfo", release, "U"),
                   schema="45l" if kind == "schema" else "44l")
        europe = f"{source}/zoneinfo/Europe"
        sums = device.find(f"{source}/SHA256SUMS")
        if kind == "damaged":
            device.file(f"{europe}/Paris", "XXXX")
        elif kind in ("incomplete", "lacking"):
            device.drop(europe)
        if kind == "lacking":
            sums.text = re.sub(".*/Europe/.*\n", "", sums.text)
        namespace.build_below(source, device.find(source))
        return source

    def twice(self, words) -> Booted:
        """Both at once; the answer is that of the one that did it, if any did."""
        running = [subprocess.Popen([PROGRAM, *words], stdout=subprocess.DEVNULL,
                                    stderr=subprocess.PIPE, text=True)
                   for _ in range(2)]
        one, other = sorted(Booted(f"exit {each.wait()}", each.communicate()[1])
                            for each in running)  # by status, of which 0 is the first
        assert other.ending in (FAILED, BUSY, NOT_NEWER) and "\n" in other.log, other
        return one

    # --- The end ---

    def end(self, before: Entries) -> list[str]:
        """Whatever happened: one sound installation and one boot put the newest update
        in use, and the next changes nothing. Where that cannot be, it is told."""
        reasons = [*hopeless(before)]
        for why in reasons:
            self.count(f"lives that end hopelessly: {why}")
        found = self.install(before, NEWEST, "schema" * (
            properties.Sight(before).data_set("").schema == "45l"))
        after = namespace.look()
        path = update_path(update_name(NEWEST))
        if announced(after) != path:
            return found
        is_told = status.ask("--json").status == 2
        found += self.undisturbed(after)
        booted = namespace.look()
        in_use = link(booted, ZONEINFO) == f"{path}/zoneinfo"
        if in_use == bool(reasons) or reasons and not is_told:
            found.append(f"in use: {in_use}, reasons: {reasons}, told: {is_told}")
        if reasons:
            return found
        found += self.undisturbed(booted)
        if namespace.look() != booted:
            found.append("one more boot changes something")
        return found


# --- Hands ---------------------------------------------------------------------------


def by_hand(verb: str, *words: str):
    """As far as it can be done; what is in the way stays."""
    path = place(words[0])
    with contextlib.suppress(OSError):
        match verb, *words:
            case "zone", name:
                relink(LOCALTIME, f"{ZONEINFO}/{name}")
            case "system", release, schema:
                install_system(release, schema)
            case "legacy", "icutz":
                relink(LEGACY_ICUTZ, place("2024a") + "/icutz")
            case "legacy", "icu":
                os.makedirs(OLD_ICU)
            case "legacy", "localtime":
                relink(LOCALTIME, f"{FORMER_ZONEINFO}/Europe/Paris")
            case "lose", _:
                remove(path)
            case "bend", _, to:
                relink(path, place(to) if to in RELEASES else to)
            case "file" | "directory", _:
                remove(path)
                (os.mkdir if verb == "directory" else os.mknod)(path, 0o755)
            case "mode", _, mode:
                os.chmod(path, int(mode, 8))
            case "damage", _:
                os.truncate(f"{path}/zoneinfo/Europe/Paris", 30)
            case _:
                raise ValueError("no such event")


def install_system(release: str, schema: str):
    """The system partition of another release."""
    device = Device()
    device.file(f"{SYSTEM_ZONEINFO}/+VERSION", f"{release}\n")
    for path, text in zone_files(SYSTEM_ZONEINFO, release, "S").items():
        device.file(path, text)
    device.file(f"{SYSTEM_ICU}/icutzformat.txt", f"{schema}\n")
    namespace.empty("/usr/share")
    namespace.build_below("/usr/share", device.find("/usr/share"), exists=True)


def place(what: str) -> str:
    return PLACES.get(what) or update_path(update_name(what))


def relink(path: str, target: str):
    remove(path)
    os.symlink(target, path)


def remove(path: str):
    with contextlib.suppress(OSError):
        if os.path.isdir(path) and not os.path.islink(path):
            os.chmod(path, 0o700)
            namespace.empty(path)
            os.rmdir(path)
        else:
            os.unlink(path)


# --- The lives -----------------------------------------------------------------------


STORIES = {  # those that were faults, and what an updater does at any time
    "a lost set comes back": "install 2024b; boot; lose 2024b; install 2024b; boot",
    "a withdrawn set can be announced again":
        "install 2024a; boot; install 2024b; tool --withdraw; tool --withdraw; "
        "tool --prune; bend tz_latest 2024b; boot",
    "what is older than that in use goes":
        "install 2024a; boot; install 2024b; boot; tool --settle; "
        "install 2024a; install 2025a; tool --settle; boot; tool --withdraw; "
        "tool --prune",
    "settling keeps what is newer":
        "install 2024a; boot; install 2024b; bend tz_latest 2024a; tool --settle; "
        "damage 2024b; tool --audit",
    "an older set helps where the newer is lost":
        "install 2024b; boot; lose 2024b; install 2024a; boot; boot",
    "the mend knows the former place":
        "install 2024a; boot; lose icutz; legacy icutz; boot mend; "
        "lose icutz; legacy icutz; lose 2024a; boot mend",
    "a record after a reset":
        "install 2024a; boot; install 2025a; system 2024b 44l; boot",
    "what is refused":
        "install 2024b locked; install 2024b; install 2024a; install 2025a refused; "
        "install 2025a damaged; boot",
    "an update lacks the zone":
        "install 2024b lacking; zone Mars/Base; install 2024b; boot",
    "what is in use is only put back":
        "install 2024b; boot; tool --withdraw; damage 2024b; install 2024b; boot",
    "each link keeps its set": "install 2022b forced; " + "; ".join(
        f"bend {name} 2022b; tool --prune; lose {name}"
        for name in ("tz_latest", "zoneinfo", "icutz", "legacy", "localtime")),
    "only a damaged set is replaced":
        "install 2024b; damage 2024b; install 2024b; boot; install 2024b forced",
    "only a link is moved from the former place":
        "install 2024b; boot; lose icutz; file legacy; boot mend; "
        "file icutz; boot mend",
    "what is in use is named as a boot names it":
        "install 2024b; boot; bend icutz 2024b; tool --settle; lose icutz; "
        "boot mend; bend zoneinfo 2024b; tool --settle",
    "what was left behind goes": "install 2024a kill rename 1; install 2024b",
    "what cannot be read makes nothing newer":
        "install 2022b fail open 4; install 2024b; install 2024a fail open 6; "
        "install 2024a fail open 8",
}


def lives(option):
    """Stories, or the seeds and the numbers of random lives."""
    if option("story"):
        return [(option("story"), 1)]
    return [(story, 1) for story in STORIES.values()] + (
        [(0, 30), (1, 30)] if option("quick") else [(each, 100) for each in range(29)])


@pytest.mark.cases("start, number", lives)
def test_a_life(start, number, count):
    if isinstance(start, str):
        return Life(count).live([text.strip() for text in start.split(";")])

    @seed(start)
    @settings(max_examples=number, database=None)
    @given(st.lists(st.one_of([st.sampled_from(texts) for texts in EVENTS.values()]),
                    min_size=40, max_size=40))
    def live(events):
        kinds = [KINDS[text] for text in events]
        count("events", len(kinds) - kinds.count("wait"))
        for one, other in pairwise([*kinds, "the end"]):
            count(f"{one}, then {other}")
        Life(count).live(events)

    live()
