# SPDX-License-Identifier: BSD-2-Clause
"""What make-update and make-system have in common: rules and ICU files are read and
checked, compiled and packed, and only a whole result gets its name."""

from __future__ import annotations

import argparse
import bz2
import collections
import contextlib
import datetime
import errno
import fcntl
import gzip
import hashlib
import importlib
import io
import json
import lzma
import os
import re
import resource
import shutil
import signal
import stat
import subprocess
import sys
import tarfile
import tempfile
import time
from collections.abc import Iterator
from pathlib import Path
from typing import NamedTuple

NAME = Path(sys.argv[0]).name
COMPRESSIONS = {b"BZh": bz2, b"\x1f\x8b": gzip, b"\xfd7zXZ": lzma}  # by first bytes
# By name a table that is in it.
RESOURCES = {"metaZones.res": "metazoneInfo", "timezoneTypes.res": "typeMap",
             "windowsZones.res": "mapTimezones", "zoneinfo64.res": "Zones"}
SOURCES = ("africa", "antarctica", "asia", "australasia", "europe", "northamerica",
           "southamerica", "etcetera", "factory", "backward")
# Not compiled, but readers look for them in the tree.
TABLES = ("iso3166.tab", "leap-seconds.list", "leapseconds", "tzdata.zi",
          "zone.tab", "zone1970.tab", "zonenow.tab")
LARGEST = 16 << 20  # bytes of one input file; ten times what the largest has today
INT_MAX = 2147483647
SECONDS = 60  # a tool that takes longer hangs
MOST = 4 * LARGEST  # bytes that a tool prints or packs; a small file can stand for more
# What a tool says when it is not its input that is wrong.
MACHINE = tuple(os.strerror(number) for number in (
    errno.EDQUOT, errno.EFBIG, errno.EIO, errno.EMFILE, errno.ENFILE, errno.ENOMEM,
    errno.ENOSPC, errno.EROFS))
YEARS = 10  # in which times are compared
HERE = "l" if sys.byteorder == "little" else "b"


class Refused(Exception):
    """Nothing is made; the text is all that is printed."""

    def __init__(self, text: str, status=1):
        super().__init__(text)
        self.status = status


# --- The command line -------------------------------------------------------------


class Options(argparse.ArgumentParser):
    def error(self, message):
        self.exit(2, f"{NAME}: {plain(message)}; see --help\n")


def options(about: str) -> Options:
    """The options of both programs; `about` is their documentation."""
    parser = Options(prog=NAME, usage=argparse.SUPPRESS, description=about,
                     formatter_class=argparse.RawDescriptionHelpFormatter,
                     allow_abbrev=False, add_help=False)
    parser.format_help = lambda: about.lstrip()
    parser.add_argument("--help", action="help")
    for option in ("--rules", "--icu", "--out"):
        parser.add_argument(option, type=Path, required=True)
    parser.add_argument("--json", action="store_true")
    return parser


def main(make, parser: Options):
    """Runs `make` with the options; a refusal is one line."""
    # An interrupted program also takes away what it has begun.
    for number in (signal.SIGINT, signal.SIGTERM, signal.SIGHUP):
        signal.signal(number, lambda number, _: sys.exit(128 + number))
    chosen = parser.parse_args()
    os.umask(0o022)
    try:
        facts, text = make(chosen)
    except Refused as refused:
        print(f"{NAME}: {plain(str(refused))}", file=sys.stderr)
        sys.exit(refused.status)
    except OSError as failed:
        where = f"{failed.filename}: " if failed.filename is not None else ""
        print(f"{NAME}: {plain(str(where))}{failed.strerror}; nothing was made",
              file=sys.stderr)
        sys.exit(1)
    try:
        print(json.dumps(facts, indent=2, sort_keys=True) if chosen.json else text)
        sys.stdout.flush()
    except (OSError, AttributeError) as failed:
        # Python would try to write it again at the end.
        sys.stdout = None
        print(f"{NAME}: {facts['directory']} is made, but standard output fails: "
              f"{getattr(failed, 'strerror', 'it is closed')}", file=sys.stderr)
        sys.exit(1)


def plain(text: str) -> str:
    """Texts of other people on one line, and harmless on a terminal."""
    return "".join(char if char.isprintable() else repr(char)[1:-1] for char in text)


# --- Other programs ---------------------------------------------------------------


def need(*tools: str):
    # Some of them are in /usr/sbin, which is not on everybody's path.
    os.environ["PATH"] = os.environ.get("PATH", os.defpath) + ":/usr/sbin:/sbin"
    if missing := [tool for tool in tools if not shutil.which(tool)]:
        raise Refused(f"missing: {' '.join(missing)}; install the Debian packages "
                      "libc-bin and icu-devtools", 77)


def output(*command, folder: Path, remedy: str, **environment: str) -> str:
    """What a tool prints. One that fails is a refusal that quotes its first line,
    except warnings."""
    name = Path(command[0]).name
    with (tempfile.TemporaryFile("w+", errors="replace") as printed,
          tempfile.TemporaryFile("w+", errors="replace") as errors):
        try:
            status = subprocess.run(
                command, cwd=folder, stdin=subprocess.DEVNULL, stdout=printed,
                stderr=errors, preexec_fn=limited, timeout=SECONDS,
                env={"PATH": os.environ["PATH"], "LC_ALL": "C", "TZ": "UTC0"}
                | environment).returncode
        except subprocess.TimeoutExpired:
            raise Refused(f"{name} takes too long; {remedy}") from None
        if -status in (signal.SIGKILL, signal.SIGTERM, signal.SIGXCPU, signal.SIGXFSZ):
            raise Refused(f"{name}: ended by {signal.Signals(-status).name}, as by a "
                          "limit of memory, time or size; nothing was made")
        if status:
            errors.seek(0)
            said = errors.read(10000).strip() or f"it ended with status {status}"
            line = next((line for line in said.splitlines() if "warning: " not in line),
                        said.splitlines()[0]).removeprefix(f"{name}: ")
            if line.endswith(MACHINE) or "unable to write" in line or status == 127:
                remedy = "nothing was made"
            raise Refused(f"{name}: {line}; {remedy}")
        printed.seek(0)
        return printed.read()


def limited():
    """Run in the place of a tool, before it: larger files end it."""
    _, hard = resource.getrlimit(resource.RLIMIT_FSIZE)
    resource.setrlimit(resource.RLIMIT_FSIZE, (
        MOST if hard == resource.RLIM_INFINITY else min(MOST, hard), hard))


# --- Versions ---------------------------------------------------------------------
# Read here a second time, apart from the boot program, so that making data takes no
# C++ build; a test compares the two.


def version(text: str) -> tuple[int, str, int, int]:
    """A version, which compares as the boot program compares them."""
    match = re.fullmatch(r"([0-9]+)([a-z]+)(?:\.([0-9]+)(?:\.([0-9]+))?)?", text)
    if not match or any(len(number.lstrip("0")) > 10 or int(number) > INT_MAX
                        for number in match.group(1, 3, 4) if number):
        raise Refused(f"'{text}' is not a version; write it like 2024a.1.0")
    year, letters, first, second = match.groups()
    return int(year), letters, int(first or -1), int(second or -1)


def release_of(text: str, where: str) -> str:
    if not re.fullmatch("[0-9]+[a-z]+", text) or len(text) > 40:
        raise Refused(f"{where} says '{text[:40]}', which is not a release; "
                      "expected is one like 2024a")
    version(text)
    return text


# --- What is given ----------------------------------------------------------------


def read(path: Path, largest=LARGEST) -> bytes:
    """A regular file of a sensible size; anything else could block or fill memory."""
    try:
        status = os.stat(path)
    except (OSError, ValueError) as failed:
        raise Refused(f"{path}: {getattr(failed, 'strerror', failed)}; "
                      "name another") from None
    if not stat.S_ISREG(status.st_mode):
        raise Refused(f"{path} is not a regular file; name another")
    if status.st_size > largest:
        raise Refused(f"{path} has {status.st_size} bytes, more than {largest}; "
                      "name another")
    return path.read_bytes()


def first_word(path: Path) -> str:
    words = read(path).decode("ascii", "replace").split()
    return words[0] if words else ""


class Rules(NamedTuple):
    release: str
    compiled: list[str]  # files that zic takes
    files: dict[str, bytes]  # these, and tables; by name


def rules_from(path: Path) -> Rules:
    """The rules in a tzdata.zi, in a directory with one or with the sources that it is
    made of, or in an archive of such a directory."""
    wanted = (*SOURCES, *TABLES, "version")
    if path.is_dir():
        files = {name: read(path / name) for name in wanted
                 if (path / name).is_file()}
    elif re.search(r"\.(tar|tgz|tar\.\w+)$", path.name):
        files = unpacked(path, wanted)
    else:
        files = {"tzdata.zi": read(path)}
    if "tzdata.zi" in files:
        line = files["tzdata.zi"].partition(b"\n")[0].decode("ascii", "replace")
        release = line.removeprefix("# version ").strip()
        if release == line.strip():
            raise Refused(f"{path} has no '# version' in its first line; "
                          "name a tzdata.zi of a release")
        compiled = ["tzdata.zi"]
    elif set(SOURCES) <= files.keys() and "version" in files:
        release = files.pop("version").decode("ascii", "replace").strip()
        compiled = list(SOURCES)
    else:
        raise Refused(f"{path} holds neither tzdata.zi nor the sources africa to "
                      "backward with the file version; name a release of the rules")
    return Rules(release_of(release, f"{path}"), compiled, files)


def unpacked(path: Path, wanted: tuple[str, ...]) -> dict[str, bytes]:
    """Files of an archive, by name, whether or not they stand in a directory. Nothing
    else in it is looked at, and nothing is written."""
    files, raw = {}, read(path)
    too_large = Refused(f"{path} is far too large when it is unpacked; "
                        "name an archive of a release")
    try:
        for magic, library in COMPRESSIONS.items():
            if raw.startswith(magic):
                # To its end, where a checksum may stand.
                raw = library.open(io.BytesIO(raw)).read(4 * LARGEST + 1)
                break
        if len(raw) > 4 * LARGEST:
            raise too_large
        # Not by tarfile, which reads what a header promises.
        with tarfile.open(fileobj=io.BytesIO(raw), mode="r:") as archive:
            for member in archive:
                name = member.name.rpartition("/")[2]
                if member.size > LARGEST:
                    raise too_large
                if name not in wanted or not member.isreg():
                    continue
                if name in files:
                    raise Refused(f"{path} holds {name} twice; "
                                  "name an archive of a release")
                files[name] = archive.extractfile(member).read()
    except Refused:
        raise
    except Exception as failed:  # of any library of compression
        reason = str(failed).splitlines()[0] if str(failed) else "it is damaged"
        raise Refused(f"{path} cannot be read as an archive: {reason}; "
                      "fetch it again") from None
    return files


class Icu(NamedTuple):
    release: str
    letter: str  # l, b or e: byte order and character set
    format: int  # of resource files
    schema: str  # as its icutzformat.txt has it; empty if there is none
    files: dict[str, bytes]


def icu_from(folder: Path) -> Icu:
    """ICU's four resource files."""
    files = {name: read(folder / name) for name in RESOURCES}
    kinds = {}
    for name, content in files.items():
        # udata.h: size, magic numbers, byte order, character set, kind, its version.
        if len(content) < 32 or content[2:4] != b"\xda\x27" or (
                content[12:16] != b"ResB"):
            raise Refused(f"{folder / name} is not an ICU resource file; "
                          "fetch it again")
        letter = "e" if content[9] else "b" if content[8] else "l"
        kinds[letter, content[16]] = name
    if len(kinds) > 1:
        raise Refused(f"{' and '.join(sorted(kinds.values()))} in {folder} differ in "
                      "byte order or format; take all four from one place")
    letter, format = next(iter(kinds))
    schema = folder / "icutzformat.txt"
    return Icu(release_in(folder, files, letter), letter, format,
               first_word(schema) if schema.exists() else "", files)


def readable(icu: Icu, work: Path, where=Path()):
    """Writes the files in this machine's byte order."""
    for name, content in icu.files.items():
        (work / name).write_bytes(content)
        if icu.letter != HERE:
            output("icupkg", f"-t{HERE}", name, folder=work,
                   remedy=f"{where / name} is damaged: fetch it again")


def release_in(folder: Path, files: dict[str, bytes], letter: str) -> str:
    """The release that zoneinfo64.res tells; derb has to be able to read all four."""
    with tempfile.TemporaryDirectory(prefix=NAME) as work:
        readable(Icu("", letter, 0, "", files), Path(work), folder)
        for name in files:
            remedy = f"{folder / name} is damaged: fetch it again"
            text = output("derb", "-c", "-s", work, name, folder=Path(work),
                          remedy=remedy)
            if not re.search(f"^    {RESOURCES[name]}[:{{ ]", text, re.MULTILINE):
                raise Refused(f"{folder / name} is another of the four; fetch it again")
        found = re.search(r'^    TZVersion *\{ *"([^"\n]*)" *\}', text, re.MULTILINE)
    if not found:
        raise Refused(f"{folder}/zoneinfo64.res has no TZVersion; fetch it again")
    return release_of(found[1], f"{folder}/zoneinfo64.res")


def same_release(rules: Rules, icu: Icu):
    if rules.release != icu.release:
        raise Refused(f"the rules are {rules.release} and the ICU data is "
                      f"{icu.release}; take both from one release")


def fitting_schema(schema: str, icu: Icu, whose: str):
    """`schema` is that of a system."""
    if not re.fullmatch("[0-9]{1,40}[lbe]", schema):
        raise Refused(f"{whose} is '{schema[:40]}', which is not an ICU schema; "
                      "expected is one like 44l")
    if icu.schema not in ("", schema):
        raise Refused(f"the ICU data has the schema {icu.schema[:40]}, and {whose} is "
                      f"{schema}; take ICU data that was made for {schema}")
    if icu.letter != schema[-1]:
        raise Refused(f"the ICU data has the byte order '{icu.letter}', and {whose} "
                      f"is {schema}; take the files for '{schema[-1]}'")


# --- Making -----------------------------------------------------------------------


@contextlib.contextmanager
def new(place: Path) -> Iterator[Path]:
    """A directory that gets its name when everything in it is there; otherwise nothing
    is left of it."""
    if not place.parent.is_dir():
        raise Refused(f"{place.parent} is not a directory; make it first")
    # Tools are run elsewhere and therefore get absolute paths.
    begun = place.parent.absolute() / f".{NAME}.new"
    lock = os.open(begun.parent, os.O_RDONLY)
    try:
        fcntl.flock(lock, fcntl.LOCK_EX)
        if os.path.lexists(place):
            raise Refused(f"{place} is there already; remove it, or choose another")
        # Nobody is at it any more.
        shutil.rmtree(begun, ignore_errors=True)
        begun.mkdir(0o700)
        try:
            yield begun
            settle(begun)
            begun.rename(place)
        finally:
            shutil.rmtree(begun, ignore_errors=True)
    finally:
        os.close(lock)


def settle(root: Path):
    """Modes with which readers, and the boot program, can use it; owners if possible;
    times only if they are asked for, in the way that other builds have it."""
    moment = os.environ.get("SOURCE_DATE_EPOCH", "")
    if len(moment) > 11:
        raise Refused("SOURCE_DATE_EPOCH is too large; set a number of seconds")
    for folder, _, names in os.walk(root, topdown=False):
        for path in [os.path.join(folder, name) for name in names] + [folder]:
            os.chmod(path, 0o755 if path == folder else 0o644)
            if os.geteuid() == 0:
                os.chown(path, 0, 0)
            if moment.isdecimal():
                os.utime(path, (int(moment), int(moment)))


def refuse_foreign_files(tree: Path):
    """zic gives a link in the rules a target anywhere on this machine, as one more name
    of that file, or a copy. Such a file has more names than there are here, or is not
    a zone."""
    names = collections.Counter()
    found = {}
    for path in tree.rglob("*"):
        status = path.lstat()
        if not stat.S_ISDIR(status.st_mode):
            names[status.st_dev, status.st_ino] += 1
            found[path] = status
    for path, status in sorted(found.items()):
        own = names[status.st_dev, status.st_ino] == status.st_nlink
        if not own or stat.S_ISREG(status.st_mode) and not is_zone(read(path)):
            raise Refused(f"the rules have a link to a file outside, "
                          f"'{path.relative_to(tree)}'; correct them")


def is_zone(content: bytes) -> bool:
    return content.startswith(b"TZif")


def make_tree(rules: Rules, tree: Path):
    """Compiles the rules."""
    tree.mkdir()
    with tempfile.TemporaryDirectory(prefix=NAME) as work:
        for name, content in rules.files.items():
            Path(work, name).write_bytes(content)
        output("zic", "-b", "slim", "-d", tree, *rules.compiled, folder=Path(work),
               remedy="correct the rules")
    refuse_foreign_files(tree)
    for folder, folders, names in os.walk(tree):
        for name in folders + names:
            path = Path(folder, name)
            if not re.fullmatch(r"[A-Za-z0-9._+-]+", name) or (
                    folder == str(tree) and name in (*TABLES, "+VERSION")):
                raise Refused("the rules have a zone with the name "
                              f"'{path.relative_to(tree)}', which cannot be used; "
                              "correct them")
            # zic does not take a link without a target as an error.
            if path.is_symlink():
                raise Refused("the rules have a link without its target, "
                              f"'{path.relative_to(tree)}'; correct them")
    if not any(path.is_file() for path in tree.rglob("*")):
        raise Refused("the rules have no zone; name a release of the rules")
    for name in TABLES:
        if name in rules.files:
            (tree / name).write_bytes(rules.files[name])
    (tree / "+VERSION").write_text(f"{rules.release}\n")


def make_icu(icu: Icu, schema: str, folder: Path):
    """Packs the resource files, and keeps them: stock ICU reads these, not the pack."""
    folder.mkdir()
    for name, content in icu.files.items():
        (folder / name).write_bytes(content)
    with tempfile.TemporaryDirectory(prefix=NAME) as work:
        Path(work, "list.txt").write_text("\n".join(icu.files) + "\n")
        output("icupkg", f"-t{icu.letter}", "-s", folder, "-a", f"{work}/list.txt",
               "new", f"icutz{schema}.dat", folder=folder,
               remedy="take the four files as ICU publishes them")


def write_manifest(root: Path):
    """As sha256sum(1) prints it, and as the installer wants it: every file, sorted."""
    files = sorted(os.fsencode(path.relative_to(root)) for path in root.rglob("*")
                   if path.is_file())
    (root / "SHA256SUMS").write_bytes(b"".join(
        hashlib.sha256((root / os.fsdecode(path)).read_bytes()).hexdigest().encode()
        + b"  " + path + b"\n" for path in files))


# --- Comparing --------------------------------------------------------------------


def zones_in(tree: Path) -> dict[str, bytes]:
    """Every zone by every name that it has, links included."""
    zones = {}
    for folder, folders, names in os.walk(tree):
        inside = Path(folder).relative_to(tree)
        if folder == str(tree):
            # Other clocks and this machine's own zone, as distributions have them.
            folders[:] = [name for name in folders if name not in ("posix", "right")]
            names = [name for name in names if name not in ("localtime", "posixrules")]
        for name in names:
            path = Path(folder, name)
            if path.is_file() and path.stat().st_size <= LARGEST:
                content = path.read_bytes()
                if is_zone(content):
                    zones[str(inside / name)] = content
    return zones


def differing(old: Path, new: Path, since: int) -> dict[str, list[str]]:
    """Names of zones that differ in the years from a moment on."""
    before, after = zones_in(old), zones_in(new)
    # Most are the same to the byte, and many have several names: zdump takes 16 s for
    # all of them.
    pairs = {}
    for name in sorted(before.keys() & after.keys()):
        if before[name] != after[name]:
            pairs.setdefault((before[name], after[name]), []).append(name)
    chosen = [names[0] for names in pairs.values()]
    changed = []
    if chosen:
        until = since + YEARS * 31556952
        was, now = (clocks(tree, chosen, since, until) for tree in (old, new))
        changed = [name for names, *clock in zip(pairs.values(), was, now)
                   if clock[0] != clock[1] for name in names]
    return {"changed": sorted(changed), "added": sorted(after.keys() - before.keys()),
            "removed": sorted(before.keys() - after.keys())}


def clocks(tree: Path, names: list[str], since: int, until: int) -> list[str]:
    """For each zone its offset at the beginning and its changes until the end."""
    text = output("zdump", "-i", "-t", f"{since},{until}", "--", *names, folder=tree,
                  remedy=f"check the zones in {tree}", TZDIR=str(tree.absolute()))
    found = re.split(r'^TZ="[^\n]*\n', text, flags=re.MULTILINE)[1:]
    if len(found) != len(names):
        raise Refused(f"zdump cannot read the zones in {tree}; check that tree")
    # Between two zones there is an empty line.
    return [clock.strip("\n") for clock in found]


def moments(clock: str) -> list[list[int]]:
    """The same, as moments with the offset from then on, in seconds; the first moment
    is 0. Changes of nothing but a name are left out."""
    def seconds(parts: list[str]) -> int:
        return sum(int(part) * 60 ** (2 - at) for at, part in enumerate(parts))

    found = []
    for line in clock.splitlines():
        date, hour, text, *_ = line.split("\t")
        offset = seconds(re.findall("..", text[1:])) * (-1 if text[0] == "-" else 1)
        moment = 0
        if date != "-":
            midnight = datetime.datetime.fromisoformat(f"{date}T00:00:00+00:00")
            moment = int(midnight.timestamp()) + seconds(hour.split(":")) - offset
        if not found or found[-1][1] != offset:
            found.append([moment, offset])
    return found


# By a process of its own, because ICU looks for its data once: the names of the zones
# for which it tells another offset at a change, just before one, or once a fortnight.
ASK_ICU = """
import icu, json, sys
zones, since, until = json.load(open("zones.json"))
for name, moments in zones.items():
    zone = icu.TimeZone.createTimeZone(name)
    right, wanted = zone.getID() == name, moments[0][1]
    steps = moments[1:] + [[until, None]]
    for at in sorted([*range(since, until, 1209600), *(at for at, _ in steps)]):
        if at == steps[0][0]:
            right = right and sum(zone.getOffset(at - 1.0, False)) == wanted * 1000
            wanted = steps.pop(0)[1]
        if at < until:
            right = right and sum(zone.getOffset(float(at), False)) == wanted * 1000
    if not right:
        print(name)
"""


def check_clocks(icu: Icu, tree: Path) -> bool:
    """zdump reads every zone, and ICU tells the same times in the coming years.
    Whether ICU could be asked, which takes python3-icu."""
    since = int(time.time())
    until = since + YEARS * 31556952
    alike = collections.defaultdict(list)
    for name, content in sorted(zones_in(tree).items()):
        alike[content].append(name)
    found = clocks(tree, [names[0] for names in alike.values()], since, until)
    try:
        importlib.import_module("icu")
    except ImportError:
        return False
    zones = {name: moments(clock) for group, clock in zip(alike.values(), found)
             for name in group}
    with tempfile.TemporaryDirectory(prefix=NAME) as work:
        readable(icu, Path(work))
        Path(work, "zones.json").write_text(json.dumps([zones, since, until]))
        wrong = output(sys.executable, "-c", ASK_ICU, folder=Path(work),
                       remedy="check the ICU data", ICU_TIMEZONE_FILES_DIR=work).split()
    if wrong:
        more = f" and {len(wrong) - 9} more" if len(wrong) > 9 else ""
        raise Refused("the ICU data tells other times than the rules, for "
                      f"{', '.join(sorted(wrong)[:9])}{more}; take both from one "
                      "release")
    return True


def not_compared(compared: bool) -> str:
    return "" if compared else (
        "\nthe times that ICU tells were not compared: install python3-icu")
