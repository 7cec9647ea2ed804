# SPDX-License-Identifier: BSD-2-Clause
"""What marlin-status says of a device, and of its next boot, is so: it is asked, and
then the device is really booted. Asking leaves no trace on the device.

This takes a user who may have namespaces and is not root: lab.doors.prove starts it so.
"""

import collections
import contextlib
import functools
import itertools
import os
import random
import re
import shutil
import stat
import struct
import subprocess
import tarfile
import termios
from pathlib import Path
from urllib.parse import quote

import pytest

from lab.carriers import boot, namespace
from lab.oracles.status import (PAGE, STATUS, Answer, ask, boot_differences,
                                link_differences, reason_differences,
                                status_differences, unescaped)
from lab.oracles.trial import fail
from lab.words.changes import change
from lab.words.chosen_devices import CHOSEN
from lab.words.device import Device, sound_device
from lab.words.paths import (OLD_ICU, PLACES, RECORD, SYSTEM_ZONEINFO, TIMEZONE,
                             ZONEINFO, update_path)
from lab.words.places import BUILD
from lab.words.random_devices import compose
from lab.words.seen import Seen

BLOCK = 50


def times(*places: str) -> dict[str, tuple]:
    """Of access, except on the way, which this or an ordinary user's question goes."""
    found, left = {}, list(places)
    while left:
        path = left.pop()
        with contextlib.suppress(PermissionError):
            here = os.lstat(path)
            if is_way := stat.S_ISDIR(here.st_mode):
                left.extend(entry.path for entry in os.scandir(path))
            is_way |= path.endswith(("/var", TIMEZONE, OLD_ICU))
            found[path] = (here.st_ino, here.st_mode, is_way or here.st_atime_ns,
                           here.st_mtime_ns, here.st_ctime_ns)
    return found


def examine(device: Device, tell: str, count):
    """Asks about a device, boots it, and compares."""
    namespace.build(device)
    before, untouched = namespace.look(), times(*PLACES)
    answer = ask("--json")
    found = [f"changed: {now}" for now in
             times(*PLACES).items() - untouched.items()]
    if answer.status == 77:
        fail(tell, [*found, answer.errors], before)
    said = answer.said
    booted = boot.boot()
    seen = Seen(before, namespace.look(), *booted)
    found += link_differences(said["now"], before)
    found += boot_differences(said["next_boot"], seen)
    found += status_differences(said, seen) + reason_differences(said)
    if answer.status != said["status"] or answer.errors:
        found.append(f"exit status {answer.status}, {answer.errors!r}")
    wrote = any(path in seen.after and seen.after[path].kind == "file"
                for path in seen.changed())
    if wrote != (fact(said, "record") == "activation"):
        found.append(f"said of the record: {fact(said, 'record')}, which is not so")
    fail(tell, found, before)
    for reason in answer.reasons():
        count(f"marlin-status said: {reason}")
    count(f"status {answer.status}")


@pytest.mark.parametrize("name", CHOSEN)
def test_a_chosen_device(name, count):
    examine(CHOSEN[name](), name, count)


def blocks(option):
    total = option("states") or (1000 if option("quick") else 20_000)
    return [pytest.param(range(first, first + BLOCK), id=str(first))
            for first in range(0, total, BLOCK)]


@pytest.mark.cases("numbers", blocks)
def test_random_devices(numbers, count):
    for number in numbers:
        examine(compose(random.Random(f"status/{number}")), f"status/{number}", count)
        count("devices asked about")


# --- Trees that lie -----------------------------------------------------------------

TREE = "/tmp/device"
UPDATE = "2024a.1.0"
AS_ROOT = "/usr/bin/unshare --user --map-root-user --mount /bin/sh -euc "
STRACE = "/usr/bin/strace -f -qq -o /tmp/trace "


class Tree(Device):
    """A sound device, with what the cases do to it."""

    def __init__(self):
        self.root = sound_device().root
        self.afterwards = []

    def use(self, version):
        self.install_update(version)
        self.point_links_at(version)

    def announce(self, version, schema="44l"):
        self.install_update(version, schema)
        super().announce(version)

    def move(self, path, to):
        self.put(to, self.find(path))
        self.drop(path)

    def replace(self, path, to):
        """With a link to where it now stands."""
        self.move(path, os.path.join(os.path.dirname(path), to))
        self.link(path, to)

    def sparse(self, path):
        self.afterwards.append(lambda: os.truncate(TREE + path, 1 << 40))

    def null(self, path):
        """A device with the number 0."""
        self.drop(path)
        self.afterwards.append(lambda: os.mknod(TREE + path, stat.S_IFCHR))

    def twin(self, path, of):
        self.afterwards.append(lambda: os.link(TREE + of, TREE + path))

    def mark(self, path, name, value=""):
        self.afterwards.append(lambda: os.setxattr(TREE + path, name,
                                                   value.encode("latin-1")))

    def fill(self, path, count):
        self.afterwards.extend(functools.partial(os.mknod, f"{TREE}{path}/{number}")
                               for number in range(int(count)))


def unpack(story: str):
    """Has a tree below TREE, changed by verbs of Tree."""
    namespace.insist_on_private_device()
    tree = Tree()
    change(tree, story)
    os.makedirs(TREE, exist_ok=True)
    namespace.empty(TREE)
    namespace.build_below(TREE, tree.root, exists=True)
    for finish in tree.afterwards:
        finish()


def fact(said, name: str):
    """What a path of names leads to; that of a step of the boot, to its reason."""
    reasons = {step["step"]: step["reason"] for step in said["next_boot"]["steps"]}
    if name in reasons:
        return reasons[name]
    for part in name.split("."):
        said = said[int(part)] if part.isdigit() else said[part]
    return said


# The status, the changes, and what is said: without a value, null.
TREES = [
    (0, "", "now.pair system", "cannot_know ['what the device mounts over this tree']"),
    (0, "use 2024a.1.0", "now.pair update", "current.version 2024a.1.0", "announced"),
    (2, "use 2024a.1.0; drop ICUTZ", "now.pair update_without_icu"),
    (2, "use 2024a.1.0; link ICUTZ TZ/2023d.1.0/icutz",
     "now.pair update_with_other_icu"),
    (0, "use 2024a.1.0; link ICUTZ tz/2024a.1.0/icutz", "now.pair update"),
    (2, "link ICUTZ U", "now.pair system_with_icu"),
    (2, "directory ICUTZ", "now.icutz.kind directory"),
    (2, "use 2024a.1.0; link ZONEINFO U/x", "now.pair not_the_tree"),
    (1, "drop ZONEINFO", "now.zoneinfo.kind none", "current no_link"),
    (2, "link ZONEINFO none", "now.zoneinfo.target none", "now.pair no_dataset"),
    (2, "link ZONEINFO (a%20directory)", "now.zoneinfo.target (a directory)"),
    (2, "link ZONEINFO x%0amarlin:%20forged:%20No%20error",
     r"next_boot.lines.0 marlin: Bad zoneinfo link x\x0amarlin: forged: No error: "
     "No such file or directory"),
    (2, "announce a%0ab%1b[2J%20%25s%ff\\",
     r"now.tz_latest.target /var/db/timezone/tz/a\x0ab\x1b[2J %s\xff\\"),
    (2, "file ZONEINFO", "now.in_use none"),
    (2, "use 2147483648a", "last_resort current_number_too_large"),
    (2, "file SYSTEM/+VERSION 2147483648a; use 2024a.1.0", "next_boot.ends abnormally",
     "system.version", "last_resort system_number_too_large"),
    (2, "drop SYSTEM/+VERSION", "system.version"),
    (2, "drop SYSTEM_ICU/icutzformat.txt", "system.schema"),
    (2, "drop SYSTEM/+VERSION; directory SYSTEM/+VERSION", "system.version",
     "system.unreadable.0.error Not a file"),
    (2, "announce 2024a.1.0; file U/icutz/icutz44l.dat ICU 0640", "announced.schema",
     "announced.unreadable.0.error Others may not read it"),
    # Readers who are not root could not read it.
    (2, "use 2024a.1.0; directory U 0700", "reasons.0.code closed"),
    (2, "file SYSTEM/Europe/Paris TZif 0600", "reasons.0.code closed"),
    (2, "use 2024a.1.0; move U/zoneinfo /var/db/tree; link U/zoneinfo /var/db/shut/way;"
     "link /var/db/shut/way ../tree; directory /var/db/shut 0700",
     "reasons.0.code closed"),
    (2, "use 2024a.1.0; drop U/icutz/icutz44l.dat; file U/icutz/icutz45l.dat;"
     "file U/icutz/icutz46l.dat", "current.has_several_schemas True",
     "cannot_know.0 which ICU data file comes first on the device's file system"),
    (0, "use 2024a.1.0; link U/icutz/icutz45l.dat U/icutz/icutz44l.dat;"
     "file U/icutz/icutz46l.dat ICU 0640", "current.has_several_schemas False"),
    (2, "use 2024a.1.0; file TIMEZONE/zoneinfo.x; link LOCALTIME TIMEZONE/zoneinfo.x;"
     "directory U/zoneinfo 0700", "reasons.0.code closed"),
    (2, "announce 2024a.1.0; directory U/icutz 0700", "reasons.2.code closed"),
    (1, "use 2024a.1.0; directory U 0700; announce 2024b.1.0", "update newer"),
    # The host's.
    (2, "link U ../../../../../../../../../../etc; link TZ_LATEST U",
     "announced.schema"),
    (2, "link SYSTEM /proc/self/root/usr", "system.version"),
    (2, "link SYSTEM/+VERSION /etc/hostname", "system.version"),
    (2, "link LOCALTIME ZONEINFO/../../../../../../../../etc/passwd",
     "now.zone_is_file False"),
    (2, "announce 2024a.1.0; link RECORD /etc/passwd",
     "next_boot.after.record.target /etc/passwd"),
    (2, "announce 2024a.1.0; file RECORD 2 0444", "record not_opened"),
    (2, "announce 2024a.1.0; file RECORD 2023c.1.0_2024a.1.0 0444",
     "record not_opened"),
    (1, "announce 2024a.1.0; file RECORD 2 0200", "record activation"),
    (2, "announce 2024a.1.0; link RECORD zoneinfo/+VERSION", "record not_opened"),
    (0, "move /var /data; link /var data", "now.pair system"),
    (0, "move /var /data; link /var /data", "now.pair system"),
    (0, "move SYSTEM /tree; link SYSTEM /tree", "system.version 2023c.1.0"),
    (0, "move TIMEZONE /var/db/zones; link TIMEZONE /var/db/zones"),
    (1, "announce 2024a.1.0; move TZ /updates; link TZ /updates"),
    # The boot may write below "/var/db" only.
    (2, "drop ZONEINFO; move TIMEZONE /zones; link TIMEZONE /zones",
     "next_boot.ends abnormally"),
    (2, "announce 2024a.1.0; directory TIMEZONE 0555", "next_boot.ends abnormally"),
    (2, "directory TIMEZONE 0555", "reasons.0.code not_writable"),
    (0, "directory TZ 0000"),
    (0, "directory TZ 0644", "downloads_error Permission denied"),
    # Behind what the boot removes.
    (2, "use 2024a.1.0; announce 2024b.1.0; move TZ/2024b.1.0/icutz /var/db/real;"
     "link OLD_ICU /var/db/real; link TZ/2024b.1.0/icutz OLD_ICU",
     "update changed_by_the_boot"),
    (2, "use 2024a.1.0; move U/icutz /var/db/real; link OLD_ICU /var/db/real;"
     "link U/icutz OLD_ICU", "usable changed_by_the_boot"),
    (2, "move TIMEZONE /var/db/zones; link TIMEZONE icu; link OLD_ICU zones",
     "current changed_by_the_boot"),
    (2, "move SYSTEM_ICU /icu; link SYSTEM_ICU OLD_ICU; link OLD_ICU /icu",
     "reasons.1.code no_schema"),
    (2, "drop ZONEINFO; link TZ .", "next_boot.ends abnormally"),
    (1, "drop ZONEINFO; link TZ ../..", "next_boot.after.pair system"),
    (0, "use 2024a.1.0; replace U real", "downloads.1.name real",
     "downloads.1.needed_by ['zoneinfo', 'icutz']"),
    (0, "file TZ", "downloads []", "downloads_error Not a directory"),
    (2, "file /var/db", "old_icu unreachable", "legacy_icu_link unreachable"),
    (2, "drop /var"),
    (2, "drop /var; file /var"),
    (2, "link LOCALTIME ZONEINFO/Europe/Nowhere", "reasons.0.subject local_zone"),
    (1, "announce 2024a.1.0; sparse U/zoneinfo/+VERSION", "update newer"),
    (0, "use 2024a.1.0; fill TZ 10100", "has_more_downloads True",
     "downloads [{'name': '2024a.1.0', 'needed_by': ['zoneinfo', 'icutz']}]"),
]


@pytest.mark.parametrize("status, story, facts", [
    pytest.param(status, story, facts, id=story) for status, story, *facts in TREES])
def test_a_tree(status, story, facts, count):
    """Of any device: the status, the facts, and not a trace left on it."""
    unpack(story)
    before = times(TREE)
    answer = ask("--root", TREE, "--json")
    assert times(TREE) == before
    assert (answer.status, answer.errors) == (status, ""), answer.output
    for name, _, value in (one.partition(" ") for one in facts):
        assert str(fact(answer.said, name)) == (value or "None"), name
    for reason in answer.reasons():
        count(f"marlin-status said: {reason}")
    rows = ask("--root", TREE)
    assert (rows.status, rows.errors) == (status, "")
    assert re.fullmatch(r"[ -~\n]*", rows.output)
    # Lines of the boot aside, which have it.
    assert ".1.0" not in re.sub(r"marlin: .*|20\d\d[a-z]\.1\.0|a\.1\.0", "", rows[1])
    check = ask("--root", TREE, "--check")
    assert check.status == status
    assert check.output == "".join(
        f"{reason['subject'].replace('_', ' ')}: {reason['text']}\n"
        for reason in answer.said["reasons"])


def traced(options="") -> str:
    ask("--root", TREE, under=STRACE + options)
    return Path("/tmp/trace").read_text()


def failing(call: str, error: str, when="1+") -> str:
    return f"{STRACE} -e trace={call} -e inject={call}:error={error}:when={when}"


def test_nothing_outside_is_opened():
    """Before the root is the tree, only what the program needs for that."""
    unpack("")
    before = traced("-e trace=%file").partition('chroot(".")')[0]
    opened = set(re.findall(r'open\w*\([^"]*"([^"]*)"', before))
    assert opened and opened <= {
        "", TREE + "/.", "/proc", "/proc/self/setgroups", "/proc/self/uid_map",
        "/proc/self/gid_map", "/proc/self/mounts"}, opened


def test_what_it_inherits_does_not_count():
    unpack("announce 2024a.1.0")
    asked = "--root", TREE, "--json"
    assert ask(*asked, under="/usr/bin/env --ignore-signal=CHLD", umask=0o777) == ask(
        *asked)


# Version 2: the owner, a user, the group, the mask, others; tag, rights and number.
ACL = struct.pack("<I", 2) + b"".join(
    struct.pack("<HHI", tag, rights, os.geteuid() if tag == 2 else 0xffffffff)
    for tag, rights in ((1, 7), (2, 0), (4, 5), (16, 5), (32, 5)))
AN_ACL = f"mark /var/db system.posix_acl_access {quote(ACL)}"
LAYER = (r" looks different in an overlay; is it being changed, or has it an access "
         r"list, an overlay attribute, the device number 0, nosymfollow or a second "
         r"path\?")
INTO_FULL = """/bin/sh -c 'exec "$0" "$@" >/dev/full'"""
TOO_LONG = """/usr/bin/prlimit --fsize=0 /bin/sh -c 'exec "$0" "$@" >/tmp/full'"""


# A bound on memory, time or files is not a guess: a boot may have more.
@pytest.mark.parametrize("why, story, under", [
    (".* takes more than .*", "announce 2024a.1.0; fill U/icutz 200000", ""),
    (".*a limit on the size of files cuts the record", "announce 2024a.1.0",
     "/usr/bin/prlimit --fsize=5"),
    (f"{TREE} is not a device: it has neither /var/db nor {SYSTEM_ZONEINFO}",
     "drop /var; drop /usr", ""),
    (f"{TREE}: Permission denied; let everybody search it", "", """/bin/sh -c
        'chmod 0 /tmp/device; "$0" "$@"; e=$?; chmod 755 /tmp/device; exit $e'"""),
    (f"{TIMEZONE} belongs to another .*, or has an access list; .*",
     f"announce 2024a.1.0; mark TIMEZONE system.posix_acl_default {quote(ACL)}", ""),
    # Of a process that has mounts of its own, and whose root reads as "/".
    ("open_tree: Invalid argument;.*", "", AS_ROOT + (
        """'unshare -m sh -c "echo \\$\\$; exec sleep 9" | { read other; e=0; """
        """"$0" --root /proc/$other/root || e=$?; kill -s PIPE $other; exit $e; }'""")),
    *[("standard output: .*", "", under) for under in (INTO_FULL, TOO_LONG)],
    *[(".*; run this as root, and from outside of a container or chroot, with --root",
       "", failing(*call)) for call in (
           ("unshare", "EPERM"), ("mount", "EINVAL"), ("mount", "ENODEV", "3"),
           ("open_tree", "EPERM"), ("chroot", "EPERM"))],
    *[(path + LAYER, story, "") for path, story in (
        *((path, f"null {path}") for path in (ZONEINFO, OLD_ICU, TIMEZONE)),
        ("/var/db/x", "link LEGACY_ICUTZ x; null /var/db/x"),
        ("/var/db/x", "announce 2024a.1.0; link RECORD /var/db/x; null /var/db/x"),
        (f"{OLD_ICU}/x", "directory OLD_ICU; null OLD_ICU/x"),
        (OLD_ICU, "file OLD_ICU; mark /var/db user.overlay.opaque x;"
         "mark OLD_ICU user.overlay.whiteout y"),
        (OLD_ICU, "file OLD_ICU; mark OLD_ICU user.overlay.metacopy"),
        (RECORD, "file RECORD; mark RECORD user.overlay.metacopy"),
        (RECORD, "announce 2024a.1.0; twin RECORD SYSTEM/+VERSION"),
        ("/var/db", AN_ACL))],
])
def test_what_cannot_be_told(why, story, under):
    try:
        unpack(story)
    except OSError as failed:  # not every file system has marks
        pytest.skip(str(failed))
    answer = ask("--root", TREE, under=under)
    assert answer[:2] == (77, "")
    assert re.fullmatch(f"marlin-status: cannot tell: {why}\n", answer.errors)


# Of a process that starts or ends.
NOT_ITS_OWN = set("execve brk mprotect arch_prctl set_tid_address set_robust_list rseq "
                  "getrandom exit_group rt_sigaction mmap munmap +++ ---".split())


@pytest.mark.cases("device, error", lambda option: itertools.product(
    [(0, "use 2024a.1.0"), (1, "announce 2024a.1.0"), (2, "announce 2022a")],
    ["EIO"] if option("quick") else ["EIO", "EAGAIN", "EINVAL", "ENOENT"]))
def test_a_failing_call(device, error, count):
    """No failure makes anything look better, or ends in silence."""
    status, story = device
    unpack(story)
    made = collections.Counter(re.findall(r"^\d+ +(\w+)\(", traced(), re.M))
    for call in made.keys() - NOT_ITS_OWN:
        for number in range(1, made[call] + 1):
            answer = ask("--root", TREE, under=failing(call, error, number))
            assert answer.status in (status, 2, 77), (call, number, answer)
            assert answer.status != 77 or answer.errors or call == "write"
            count("calls of marlin-status that fail")


def test_its_end_follows_its_parents():
    """Whatever changes its rights takes that back."""
    unpack("")
    trace = traced("-e trace=%process,%creds,prctl")
    process = re.search(r"^(\d+) +setresgid\(", trace, re.M)[1]
    rights = "setgroups|setresgid|setresuid|capset"
    made = re.findall(rf"^{process} +(?:{rights}|prctl\(PR_SET_PDEATHSIG)", trace, re.M)
    assert [line.split()[1] for line in made] == [
        "prctl(PR_SET_PDEATHSIG", *rights.split("|"), "prctl(PR_SET_PDEATHSIG"]


def test_advice_is_tried_first():
    """Removing "zoneinfo" mends a lost "icutz", except where the boot may not write,
    as out of "/var/db" and as its owner, or not remove what stands there."""
    lost = "use 2024a.1.0; drop ICUTZ"
    unpack(lost)
    assert f"To mend it remove {ZONEINFO}:" in ask("--root", TREE).output
    os.unlink(TREE + ZONEINFO)
    assert ask("--root", TREE).status == 1
    for other in ("move TIMEZONE /zones; link TIMEZONE /zones", "directory ICUTZ",
                  "directory TIMEZONE 0555"):
        unpack(f"{lost}; {other}")
        assert "To mend it" not in ask("--root", TREE).output


def test_a_tree_that_disappears():
    for _ in range(20):
        unpack("")
        asked = subprocess.Popen([STATUS, "--root", TREE], stdout=subprocess.DEVNULL,
                                 stderr=subprocess.PIPE)
        shutil.rmtree(TREE)
        errors = asked.communicate(timeout=30)[1].decode()
        assert asked.returncode in (0, 1, 2, 77), errors
        assert asked.returncode == 77 or errors == ""


@pytest.mark.parametrize("words, status, line", [
    ("--rot", 64, "--rot is not understood; see --help"),
    ("-r", 64, "-r is not understood; see --help"),
    ("-xh", 64, "-xh is not understood; see --help"),
    ("--root", 64, "--root needs a directory; see --help"),
    ("--json=x", 64, "--json=x is not understood; see --help"),
    ("--root=", 64, "--root needs a directory; see --help"),
    ("--json --check", 64, "one of --json and --check is enough; see --help"),
    ("x\033[2J", 64, r"x\x1b[2J is not expected; see --help"),
    ("-- --json", 64, "--json is not expected; see --help"),
    ("--root /nowhere", 77, "cannot tell: /nowhere: No such file or directory"),
    ("--root /etc/passwd", 77, "cannot tell: /etc/passwd: Not a directory"),
])
def test_bad_use_is_one_line(words, status, line):
    assert ask(*words.split(" ")) == Answer(status, "", f"marlin-status: {line}\n")


def test_it_tells_about_itself():
    assert ask("--help").output.startswith("usage: marlin-status ")
    assert re.fullmatch(r"marlin-status \d+\.\d+\.\d+\n", ask("--version").output)
    for under in INTO_FULL, TOO_LONG:
        answer = ask("--help", under=under)
        assert answer[:2] == (77, "")
        assert answer.errors.startswith("marlin-status: standard output: ")


def test_rows_fit_a_terminal():
    """As wide as the terminal is, with colour only there and only if it is wanted."""
    unpack("link ZONEINFO " + "x" * 300)
    for environment, colours in ({}, True), ({"NO_COLOR": "1"}, False):
        ours, terminal = os.openpty()
        termios.tcsetwinsize(terminal, (24, 60))
        subprocess.run([STATUS, "--root", TREE], stdout=terminal, env=environment)
        os.close(terminal)
        text = b""
        with contextlib.suppress(OSError):
            while piece := os.read(ours, 65536):
                text += piece
        os.close(ours)
        assert (b"\033[" in text) == colours
        plain = re.sub(rb"\033\[\d*m", b"", text)
        assert max(map(len, plain.replace(b"\r", b"").split(b"\n"))) <= 60


def test_an_archive_as_the_page_says():
    here = Path("/tmp/archive")
    here.mkdir()
    unpack("")
    command = re.search(r"^\.Dl (mkdir device && .*)", PAGE, re.M)[1]
    run = functools.partial(subprocess.run, ["/bin/sh", "-c", command], cwd=here,
                            env={"PATH": f"{Path(STATUS).parent}:/usr/bin"})
    with tarfile.open(here / "device.tar", "w") as archive:
        archive.add(TREE, ".")
    assert run().returncode == 0

    shutil.rmtree(here / "device")
    with tarfile.open(here / "device.tar", "a") as archive:
        out = tarfile.TarInfo("out")
        out.type, out.linkname = tarfile.SYMTYPE, "/tmp/outside"
        archive.addfile(out)
        for name in "out/file", "/tmp/outside/file", "../../outside/file":
            archive.addfile(tarfile.TarInfo(name))
    assert run(stderr=subprocess.DEVNULL).returncode == 1
    assert not os.path.exists("/tmp/outside")
    shutil.rmtree(here)


# --- As root of the namespace, with mounts of its own -------------------------------


def another_users(name: str, otherwise: str) -> str:
    return next(path for path in (f"{BUILD}/prove/another-users{name}", otherwise)
                if os.path.exists(path) and os.stat(path).st_uid != os.geteuid())


FOREIGN_FILE = "/file", "/etc/passwd"


@pytest.mark.parametrize("part, foreign, story, is_told", [
    (RECORD, FOREIGN_FILE, "file RECORD", True),
    (RECORD, FOREIGN_FILE, "file RECORD; announce 2024a.1.0", False),
    # Sound only with the rights of everybody, and of any group.
    (RECORD, FOREIGN_FILE, "file RECORD; file SYSTEM/+VERSION 2023c 0600", False),
    (RECORD, FOREIGN_FILE, "file RECORD; file SYSTEM/+VERSION 2023c 0604", False),
    ("/usr/share/icu/icutzformat.txt", ("/closed", "/etc/shadow"),
     "directory SYSTEM_ICU 0711", False),  # whose two parts are closed
    # Whether the boot may write there, this user cannot try.
    ("/var/db", ("", "/etc"), "drop /var/db; directory /var/db", False),
])
def test_a_part_of_another_user(part, foreign, story, is_told):
    unpack(story)
    answer = ask("--root", TREE, "--check", under=AS_ROOT + f"""'
        mount --bind {another_users(*foreign)} {TREE}{part}; exec "$0" "$@"'""")
    assert answer == (Answer(0, "", "") if is_told else Answer(
        77, "", f"marlin-status: cannot tell: {part} belongs to another user or group, "
        "or has an access list; run this as root\n"))


def test_a_record_that_is_mounted():
    unpack("announce 2024a.1.0; file RECORD old")
    answer = ask("--root", TREE, "--json", under=AS_ROOT + f"""'
        echo other >/tmp/record
        mount --bind /tmp/record {TREE}{RECORD}
        "$0" "$@" || [ $? = 1 ]
        echo other | cmp /tmp/record -'""")
    assert (answer.status, answer.errors) == (0, "")
    assert fact(answer.said, "record") == "activation"


@pytest.mark.parametrize("status, mounts", [
    (77, "mount --bind . . && mount -o remount,bind,nosymfollow $PWD"),
    (77, "mount --bind . timezone"),  # what the boot changes has two paths
    (1, "mount --bind . . && mount -o remount,bind,ro $PWD"),  # not the device's own
    (1, "mount -t tmpfs own icu && mount --bind /tmp/aside ."),  # one hides another
    (1, r'mkdir "a\\ b" && mount --bind /tmp/aside/timezone "a\\ b" && rm -r timezone '
     r'&& ln -s "a\\ b" timezone'),
])
def test_odd_mounts(status, mounts):
    unpack("directory OLD_ICU")
    answer = ask("--root", TREE, "--check", under=AS_ROOT + f"""'
        cd {TREE}/var/db && cp -a . /tmp/aside && {mounts} && cd /
        exec "$0" "$@"'""")
    shutil.rmtree("/tmp/aside")
    assert answer.status == status, answer
    assert answer.output == ("old icu: /var/db/icu is removed\n" * (status == 1))
    assert status == 1 or re.search(LAYER, answer.errors)


@pytest.mark.parametrize("place", ["/var/db/timezone", "/var/db/timezone/tz", "/var/db",
                                   "/var", "/usr/share/icu"])
def test_a_file_system_of_its_own(place):
    """What is mounted inside the device is seen, covered and left alone."""
    unpack("announce 2024a.1.0")
    at, aside = TREE + place, "/tmp/aside"
    look = f'find {TREE} -printf "%p %i %T@ %C@ %l\\n"'
    answer = ask("--root", TREE, "--json", under=AS_ROOT + f"""'
        mkdir {aside} && cp -a {at}/. {aside}
        mount -t tmpfs -o mode=755 own {at} && cp -a {aside}/. {at}
        {look} >/tmp/before
        "$0" "$@" || [ $? = 1 ]
        {look} | cmp /tmp/before -
        rm -r {aside}'""")
    assert (answer.status, answer.errors) == (0, "")
    assert fact(answer.said, "update") == "newer"
    assert unescaped(fact(answer.said, "next_boot.after.zoneinfo.target")) == (
        f"{update_path(UPDATE)}/zoneinfo")
    shutil.rmtree(aside, ignore_errors=True)
