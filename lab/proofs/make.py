# SPDX-License-Identifier: BSD-2-Clause
"""What make-system and make-update make, and what they refuse. That a boot takes it
is tried with the recipe for integrators and with real readers."""

import functools
import gzip
import io
import itertools
import json
import os
import random
import shlex
import shutil
import signal
import subprocess
import tarfile
import tempfile
import time
import zoneinfo
from datetime import datetime, timezone
from pathlib import Path

import pytest

from lab.carriers import releases
from lab.oracles import model
from lab.words.device import Device
from tools import make_data

LISBON = releases.names_of_lisbon()
SINCE = "2025-06-01"
NAMES = releases.names()
VERSION = f"{NAMES.update}.1.0"


@pytest.fixture
def tmp_path():
    """On this private device; pytest's own is elsewhere."""
    with tempfile.TemporaryDirectory() as folder:
        yield Path(folder)


@pytest.fixture
def place(tmp_path):
    """A directory with what make-update is given: rules, ICU data, a system."""
    source = releases.TARGET / NAMES.update
    (tmp_path / "rules").mkdir()
    shutil.copy(source / "tzdata.zi", tmp_path / "rules")
    shutil.copytree(source / "icu", tmp_path / "icu")
    have_system(tmp_path, NAMES.system)
    (tmp_path / "out").mkdir()
    return tmp_path


@functools.cache
def system_of(release: str) -> Path:
    """A system's data, made once by this worker."""
    place = Path(f"/tmp/systems/{release}")
    place.parent.mkdir(exist_ok=True)
    releases.make_system(release, NAMES.icu, place)
    return place


def have_system(place: Path, release: str):
    shutil.rmtree(place / "system", ignore_errors=True)
    shutil.copytree(system_of(release), place / "system")


def make_update(place: Path, **options) -> list[str]:
    """The command for what is there; options replace its own."""
    return releases.tool("make-update", **{
        "rules": place / "rules", "icu": place / "icu", "system": place / "system",
        "out": place / "out", "since": SINCE, **options})


def update(place: Path, *more: str, before=(), environment=None, **options):
    return ran([*before, *make_update(place, **options), *more], environment)


def system(place: Path, *more: str, before=(), environment=None, **options):
    return ran([*before, *releases.tool("make-system", **{
        "rules": place / "rules", "icu": place / "icu", "schema": NAMES.icu,
        "out": place / "out/new", **options}), *more], environment)


def ran(command: list[str], environment=None) -> subprocess.CompletedProcess:
    return subprocess.run(command, capture_output=True, text=True, errors="replace",
                          env={**os.environ, **(environment or {})})


def made(done: subprocess.CompletedProcess) -> dict:
    assert (done.returncode, done.stderr) == (0, "")
    return json.loads(done.stdout)


def refused(done: subprocess.CompletedProcess, words: str, status=1):
    """One clear line, and no more."""
    assert done.returncode == status, done.stderr
    assert done.stdout == ""
    assert done.stderr.count("\n") == 1 and done.stderr.endswith("\n"), done.stderr
    assert done.stderr[:-1].isprintable()
    assert done.stderr.startswith(("make-update: ", "make-system: "))
    assert words in done.stderr


def tree(root: Path) -> dict[str, tuple]:
    """Everything below a directory: kind and mode, and content."""
    return {str(path.relative_to(root)): (
                oct(path.lstat().st_mode), path.read_bytes() if path.is_file() else b"")
            for path in [root, *root.rglob("*")]}


# --- What is made -----------------------------------------------------------------


def test_an_update(place):
    facts = made(update(place, "--json"))
    assert facts == {
        "version": VERSION, "schema": NAMES.icu,
        "system": f"{NAMES.system}.1.0", "years": 10, "since": SINCE,
        "icu_compared": False,
        "directory": f"{place}/out/{NAMES.update}.1.0",
        "changed": LISBON, "added": [], "removed": []}
    assert os.listdir(place / "out") == [VERSION]
    found = tree(place / "out" / VERSION)
    assert set(os.listdir(facts["directory"])) == {"zoneinfo", "icutz", "SHA256SUMS"}
    listed = ran(["/bin/sh", "-euc", f"cd {facts['directory']}\nsha256sum -c SHA256SUMS"
                  "\nfind icutz zoneinfo -type f | LC_ALL=C sort | xargs sha256sum |"
                  " cmp - SHA256SUMS\nfind . -type l"])
    assert listed.returncode == 0 and ": OK\n" in listed.stdout, listed
    assert {line[-4:] for line in listed.stdout.splitlines()} == {": OK"}
    assert found["zoneinfo/+VERSION"][1] == f"{NAMES.update}\n".encode()
    assert set(os.listdir(f"{facts['directory']}/icutz")) == {
        f"icutz{NAMES.icu}.dat", *releases.RESOURCES}
    # As the icu-devtools that made it read it again.
    listed = ran(["/usr/sbin/icupkg", "-l",
                  f"{facts['directory']}/icutz/icutz{NAMES.icu}.dat"])
    assert listed.stdout.split() == list(releases.RESOURCES)
    for name in releases.RESOURCES:
        assert found[f"icutz/{name}"][1] == (place / "icu" / name).read_bytes()
    assert found["zoneinfo/tzdata.zi"][1] == (place / "rules/tzdata.zi").read_bytes()
    assert {mode for mode, _ in found.values()} == {"0o40755", "0o100644"}


def test_a_system(place):
    out = place / "out/new"
    facts = made(system(place, "--json"))
    assert facts == {"version": VERSION, "schema": NAMES.icu,
                     "directory": str(out), "icu_compared": False}
    assert set(os.listdir(out)) == {"zoneinfo.default", "icu"}
    assert (out / "icu/icutzformat.txt").read_text() == f"{NAMES.icu}\n"
    assert (out / "zoneinfo.default/+VERSION").read_text() == f"{NAMES.update}\n"
    made(update(place, "--json"))
    assert tree(out / "zoneinfo.default") == tree(
        place / "out" / f"{NAMES.update}.1.0/zoneinfo")


def test_the_same_bytes(place, monkeypatch):
    """Whatever the umask, the locale, the zone, the order of directories, and the
    folder from which it is started; and the times that are asked for."""
    made(update(place, "--json", environment={"SOURCE_DATE_EPOCH": "86400"}))
    assert {path.stat().st_mtime for path in (place / "out").rglob("*")} == {86400}
    first = tree(place / "out")
    other = place / "other"
    for part in ("icu", "system", "rules"):
        for path in sorted((place / part).rglob("*"), reverse=True):
            if path.is_file():
                copy = other / path.relative_to(place)
                copy.parent.mkdir(parents=True, exist_ok=True)
                shutil.copyfile(path, copy)
                os.utime(copy, (1, 1))
    (other / "out").mkdir()
    monkeypatch.chdir(other)
    was = os.umask(0o777)
    try:
        made(update(Path(), "--json", environment={
            "LC_ALL": "tr_TR.UTF-8", "TZ": "Asia/Tokyo", "PYTHONHASHSEED": "7"}))
    finally:
        os.umask(was)
    assert tree(other / "out") == first


def archived(place: Path, *members: tuple, form="gz") -> Path:
    """Members are names and contents; a third word is another kind than a file."""
    archive = place / f"rules.tar.{form}"
    with tarfile.open(archive, f"w:{form}") as tar:
        for name, content, *kind in members:
            info = tarfile.TarInfo(name)
            info.size, info.linkname = len(content), "/etc/passwd"
            info.type = kind[0] if kind else tarfile.REGTYPE
            tar.addfile(info, io.BytesIO(content))
    return archive


@pytest.mark.parametrize("form", ["file", "archive", "archive that leads out",
                                  "sources", "archive of sources"])
def test_forms_of_rules(place, form):
    """Of an archive only the content of known names is taken, never their place."""
    text = (place / "rules/tzdata.zi").read_bytes()
    members = [("tzdata.zi", text)]
    if "out" in form:
        members = [("../../evil", b""), ("/tmp/evil", b""), ("../tzdata.zi", text)]
    if "sources" in form:
        others = [(name, b"# nothing\n") for name in make_data.SOURCES[1:]]
        members = [("africa", text), ("version", f"{NAMES.update}\n".encode()),
                   ("zone.tab", b"#\n"), ("Makefile", b"all:\n\tfalse\n"), *others]
    rules = archived(place, *members)
    if form == "file":
        rules = place / "rules/tzdata.zi"
    if form == "sources":
        tarfile.open(rules).extractall(rules := place / form)
    facts = made(update(place, "--json", rules=rules))
    assert facts["changed"] == LISBON
    table = Path(facts["directory"], "zoneinfo/zone.tab").exists()
    assert table == form.endswith("sources")
    assert not Path("/tmp/evil").exists() and not (place / "tzdata.zi").exists()


def test_another_byte_order(place):
    other_order(*releases.RESOURCES)(place)
    refused(update(place), "the byte order 'b', and the system's schema is "
                           f"{NAMES.icu}; take the files for 'l'")
    schema = f"{NAMES.icu[:-1]}b"
    (place / "system/icu/icutzformat.txt").write_text(schema)
    facts = made(update(place, "--json"))
    pack = Path(facts["directory"], f"icutz/icutz{schema}.dat").read_bytes()
    assert pack[8] == 1  # big-endian
    assert pack[12:16] == b"CmnD"


@pytest.mark.parametrize("revision", ["0.0", "1", "1.0", "1.9",
                                      "2147483647.2147483647"])
def test_revisions(place, revision):
    """The system's own revision is 1.0."""
    facts = made(update(place, "--json", revision=revision))
    assert facts["version"] == f"{NAMES.update}.{revision}"
    shutil.rmtree(facts["directory"])
    have_system(place, NAMES.update)
    done = update(place, "--json", revision=revision)
    if revision in ("0.0", "1", "1.0"):
        refused(done, "is not newer than the system's")
    else:
        assert made(done)["changed"] == []


RULES_OF_THREE_ZONES = f"""# version {NAMES.update}
R E 1981 ma - Mar lastSu 1u 1 S
R E 1996 ma - Oct lastSu 1u 0 -
Z Asia/Tokyo 9 - JST
Z Europe/Lisbon 1 E CE%sT
Z Europe/Paris 1 E CE%sT
L Europe/Lisbon Portugal
"""


@pytest.mark.parametrize("release", [NAMES.update, NAMES.refused])
def test_times_that_icu_tells(place, release):
    """In the rules Lisbon changes at last, and nobody but ICU knows."""
    pytest.importorskip("icu")
    (place / "rules/tzdata.zi").write_text(
        RULES_OF_THREE_ZONES.replace(
            "Lisbon 1 E CE%sT", f"Lisbon 1 E CE%sT {releases.YEAR + 1}\n0 E WE%sT")
        if release == NAMES.refused else RULES_OF_THREE_ZONES)
    done = ran([*make_update(place)[2:], "--json"])
    if release == NAMES.update:
        assert made(done)["icu_compared"]
    else:
        refused(done, "the ICU data tells other times than the rules, for "
                      "Europe/Lisbon, Portugal; take both from one release")
        assert os.listdir(place / "out") == []


# --- Which zones differ -----------------------------------------------------------


def offsets(root: Path, name: str) -> list:
    with open(root / name, "rb") as file:
        zone = zoneinfo.ZoneInfo.from_file(file)
    return [datetime(2025 + month // 12, month % 12 + 1, day, tzinfo=timezone.utc)
            .astimezone(zone).utcoffset() for month in range(8, 60) for day in (2, 17)]


def test_zones_that_differ(place):
    """Compared with what another reader of zone files sees twice a month."""
    facts = made(update(place, "--json"))
    old, new = place / "system/zoneinfo.default", Path(facts["directory"], "zoneinfo")
    zones = [str(path.relative_to(old)) for path in old.rglob("*")
             if path.is_file() and path.read_bytes()[:4] == b"TZif"]
    assert len(zones) > 500
    assert [zone for zone in sorted(zones)
            if offsets(old, zone) != offsets(new, zone)] == facts["changed"]


def test_zones_come_and_go(place):
    edit("\nL Europe/Lisbon Portugal\n", "\nL Europe/Lisbon Lusitania\n")(place)
    facts = made(update(place, "--json"))
    assert facts["changed"] == [name for name in LISBON if name != "Portugal"]
    assert facts["added"] == ["Lusitania"]
    assert facts["removed"] == ["Portugal"]


def test_a_zone_like_an_option(place):
    append("Z -v 0 - X\n")(place)
    compiled = place / "system/zoneinfo.default"
    shutil.copy(compiled / "Europe/Paris", compiled / "-v")
    assert made(update(place, "--json"))["changed"] == ["-v", *LISBON]


def test_a_past_change(place):
    """Cairo's local mean time differs, and nothing after 1900."""
    edit("\nZ Africa/Cairo 2:5:9 - LMT", "\nZ Africa/Cairo 2:5:8 - LMT")(place)
    facts = made(update(place, "--json"))
    assert facts["changed"] == LISBON
    shutil.rmtree(facts["directory"])
    assert made(update(place, "--json", since="1899-01-01"))["changed"][:2] == [
        "Africa/Cairo", "Egypt"]


def test_a_change_to_come(place):
    edit("\n9 JP J%sT\n", f"\n9 JP J%sT {releases.YEAR + 3}\n10 - +10\n")(place)
    assert made(update(place, "--json"))["changed"] == [
        "Asia/Tokyo", *LISBON[:1], "Japan", *LISBON[1:]]


def test_a_system_compiled_otherwise(place):
    """Its files are fat, and directories of other clocks stand beside them."""
    compiled = place / "system/zoneinfo.default"
    for folder in (compiled, compiled / "right", compiled / "posix"):
        releases.output("/usr/sbin/zic", "-b", "fat", "-d", folder,
                        releases.TARGET / NAMES.system / "tzdata.zi")
    shutil.copy(compiled / "America/New_York", compiled / "posixrules")
    facts = made(update(place, "--json"))
    assert set(LISBON) <= set(facts["changed"]) and not facts["removed"]
    # Some releases of zic call a clock otherwise in fat files, for a season.
    for name in set(facts["changed"]) - set(LISBON):
        assert (offsets(compiled, name)
                == offsets(Path(facts["directory"], "zoneinfo"), name))


def test_versions():
    """Texts are versions, and newer than others, as in the model of a boot."""
    numbers = ["", "0", "1", "9", "10", "010", "2147483647", "2147483648"]
    texts = [year + letters + "".join(f".{number}" for number in more)
             for year in numbers for letters in ("", "a", "az", "b", "A", "a b")
             for count in range(4)
             for more in itertools.islice(itertools.product(numbers, repeat=count), 9)]
    texts += ["2024a.1.0\n", " 2024a", "2024a.", "2024a..1", "٢024a", "2024ä", "-1a"]

    def as_read(read, thrown, text):
        try:
            return read(text)
        except thrown:
            return model.UNSET_VERSION

    reader = model.Boot(model.Kernel(Device()))
    found = [as_read(make_data.version, make_data.Refused, text) for text in texts]
    assert found == [as_read(reader.parse_version, model.Thrown, each)
                     for each in texts]
    assert len(found) - found.count(model.UNSET_VERSION) > 50


# --- What is refused --------------------------------------------------------------
# Each of these changes what is given, or returns other words for the command.


def edit(old: str, new: str):
    def change(place):
        path = place / "rules/tzdata.zi"
        assert path.read_text().count(old) == 1
        path.write_text(path.read_text().replace(old, new))
    return change


def write(part: str, content: bytes):
    return lambda place: (place / part).write_bytes(content)


def append(text: str):
    return lambda place: (place / "rules/tzdata.zi").open("a").write(text)


def with_link_to(make):
    def change(place):
        make(place / "secret")
        append(f"L {place}/secret Evil\n")(place)
    return change


def instead(part: str, make):
    """Something else in place of a file."""
    def change(place):
        (place / part).unlink()
        make(place / part)
    return change


def damaged(part: str, at: int, byte: int):
    def change(place):
        raw = bytearray((place / part).read_bytes())
        raw[at] = byte
        (place / part).write_bytes(raw)
    return change


def other_order(*parts: str):
    return lambda place: [
        releases.output("/usr/sbin/icupkg", "-tb", place / "icu" / part)
        for part in parts]


def other_release(place):
    shutil.copy(releases.TARGET / NAMES.refused / "icu/zoneinfo64.res", place / "icu")


def no_release_in_icu(place):
    text = releases.icu_text(place / "icu", NAMES.update, "Lisbon")
    source = place / "zoneinfo64.txt"
    source.write_text(text.replace("TZVersion", "NoVersion"))
    releases.output("genrb", "-q", "-d", place / "icu", source)


def given(**words):
    return lambda place: words


def archive(*members, form="gz", damage=lambda raw: raw):
    """Rules in an archive; without members there are sound ones in it."""
    def change(place):
        text = (place / "rules/tzdata.zi").read_bytes()
        made = archived(place, *(members or [("tzdata.zi", text)]), form=form)
        made.write_bytes(damage(made.read_bytes()))
        return {"rules": made}
    return change


def fake(**scripts):
    """In the place of tools."""
    def change(place):
        folder = place / "fakes"
        folder.mkdir()
        for name, script in scripts.items():
            (folder / name).write_text(f"#!/bin/sh\n{script}\n")
            (folder / name).chmod(0o755)
        return {"environment": {"PATH": f"{folder}:{os.environ['PATH']}"}}
    return change


def sparse(path: Path):
    with open(path, "wb") as file:
        file.truncate((16 << 20) + 1)


BIG = "icu/zoneinfo64.res"
UNREADABLE = "cannot be read as an archive"
REFUSALS = [
    ("take both from one release", other_release),
    ("the byte order 'b'", other_order(*releases.RESOURCES)),
    ("differ in byte order", other_order("metaZones.res")),
    ("differ in byte order", damaged(BIG, 9, 1)),
    ("has the schema 44l", write("icu/icutzformat.txt", b"44l\n")),
    (f"has the schema {'4' * 40}, and", write("icu/icutzformat.txt", b"4" * 99)),
    ("has no '# version'", edit("# version ", "# vers ")),
    ("is not a release", edit("# version ", "# version x")),
    (f"says '20{'2' * 38}', which is not a release",
     edit("# version 20", "# version 20" + "2" * 99)),
    ("is not a version", edit("# version 20", "# version 999999999920")),
    ("has no '# version'", write("rules/tzdata.zi", b"")),
    ("have no zone", write("rules/tzdata.zi", f"# version {NAMES.update}\n".encode())),
    ("zic: \"tzdata.zi\", line ", append("Q what\n")),
    ("'..'", append("Z ../../evil 0 - X\n")),
    ("begins with '/'", append("Z /tmp/evil 0 - X\n")),
    ("'+VERSION', which cannot be used", append("Z +VERSION 0 - X\n")),
    ("'tzdata.zi', which cannot be", append("Z tzdata.zi 0 - X\n")),
    ("cannot be used", append("Z Good/Zo\x1b[2Jne 0 - X\n")),
    ("a link to a file outside, 'Evil'",
     with_link_to(lambda secret: secret.touch(0o600))),
    ("'Evil'; correct them",
     with_link_to(lambda secret: secret.symlink_to("/etc/passwd"))),
    # As where a file cannot have two names.
    ("a link to a file outside, 'Evil'",
     fake(zic='/usr/sbin/zic "$@" && echo secret >"$4/Evil"')),
    ("Alias", append("L Missing/Zone Alias\n")),
    ("holds neither", instead("rules/tzdata.zi", os.mkfifo)),
    ("more than 16777216", instead("rules/tzdata.zi", sparse)),
    ("No such file", lambda place: shutil.rmtree(place / "rules")),
    ("No such file", lambda place: (place / BIG).unlink()),
    ("is not an ICU", write(BIG, b"zoneinfo64{}\n" * 9)),
    ("is damaged", lambda place: os.truncate(place / BIG, 5000)),
    ("metaZones.res is another of the four", lambda place: shutil.copy(
        place / "icu/timezoneTypes.res", place / "icu/metaZones.res")),
    ("is not a regular file", instead(BIG, os.mkfifo)),
    ("more than 16777216", instead(BIG, sparse)),
    ("Too many", instead(BIG, lambda path: path.symlink_to(path))),
    ("is not a regular file", instead(BIG, lambda path: path.symlink_to("/dev/zero"))),
    ("has no TZVersion", no_release_in_icu),
    ("Permission denied", lambda place: (place / "rules/tzdata.zi").chmod(0)),
    ("holds tzdata.zi twice", archive(("tzdata.zi", b""), ("a/tzdata.zi", b""))),
    ("holds neither", archive(("tzdata.zi", b"", tarfile.SYMTYPE))),
    ("holds neither", archive(("README", b""))),
    # Small, and much too large when they are read.
    ("far too large", archive(("README", bytes(17 << 20)))),
    ("far too large", archive(*[("README", bytes(10 << 20))] * 30)),
    ("far too large", archive(damage=lambda raw: raw + gzip.compress(bytes(70 << 20)))),
    ("far too large", archive(("x", bytes(70 << 20), tarfile.GNUTYPE_LONGNAME))),
    (UNREADABLE, archive(damage=lambda raw: raw[:2000])),
    (UNREADABLE, archive(damage=lambda raw: os.urandom(5000))),
    # The checksum stands behind all that is read.
    (UNREADABLE, archive(damage=lambda raw: raw[:-8] + bytes(4) + raw[-4:])),
    (UNREADABLE,
     archive(form="xz", damage=lambda raw: raw[:2000] + bytes(9) + raw[2009:])),
    (r"a\n\x1b[2Jb", given(rules="a\n\x1b[2Jb")),
    ("SOURCE_DATE_EPOCH is too large",
     given(environment={"SOURCE_DATE_EPOCH": "9" * 20})),
    ("missing: zdump derb; install the Debian packages",
     given(environment={"PATH": "/nowhere"}), 77),
    ("zic: x: No space left on device; nothing was made",
     fake(zic="echo zic: x: No space left on device >&2; exit 1")),
    # The disk is as good as full, in the middle of the tree.
    ("File too large; nothing was made", lambda place: (
        (place / "rules/leapseconds").write_bytes(bytes(3 << 20)) and
        {"before": ["/usr/bin/prlimit", "--fsize=2000000"]})),
    *((f"{tool}: {words}", fake(**{tool: script}))
      for tool in ("zic", "zdump", "derb", "icupkg") for script, words in {
          "echo a\nb >&2; exit 3": "", "kill -SEGV $$": "",
          "exec yes": "ended by SIGXFSZ", "exec yes >&2": "ended by SIGXFSZ"}.items())]
REFUSED_UPDATES = [
    *REFUSALS,
    ("is not newer than the system's", lambda place: have_system(place, NAMES.upgrade)),
    ("is not an ICU schema", write("system/icu/icutzformat.txt", b"4" * 99 + b"l")),
    ("another format of resource files", damaged("system/icu/metaZones.res", 16, 1)),
    ("is not an ICU schema", write("system/icu/icutzformat.txt", b"\x1b[2J l\n")),
    ("is not an ICU schema", write("system/icu/icutzformat.txt", b"")),
    ("is not a release", write("system/zoneinfo.default/+VERSION", b"2024a.1.0\n")),
    ("No such file",
     lambda place: (place / "system/zoneinfo.default/+VERSION").unlink()),
    ("is there already", lambda place: (place / "out" / VERSION).mkdir()),
    ("make it first", lambda place: (place / "out").rmdir()),
    ("make it first", lambda place: ((place / "out").rmdir(), (place / "out").touch())),
    ("Permission denied", lambda place: (place / "out").chmod(0o555)),
    ("is not a version", given(revision="2147483648.0")),
    ("is not a version", given(revision="1" * 5000)),
    *(("; see --help", given(**{option: text}), 2) for option, text in (
        ("revision", "1.0.0"), ("revision", "../x"), ("revision", "-1"),
        ("since", "soon"), ("nonsense", "")))]
REFUSED_SYSTEMS = [
    *REFUSALS, *(("schema", given(schema=text))
                 for text in ("", "72", "l", "72x", "44b", "../72l", "72l\n"))]


@pytest.mark.parametrize("make, row", [
    *((update, row) for row in REFUSED_UPDATES),
    *((system, row) for row in REFUSED_SYSTEMS)],
    ids=lambda value: value.__name__ if callable(value) else value[0])
def test_refusals(place, make, row):
    """In one line, with nothing changed and nothing left."""
    words, change, *status = row
    options = change(place)

    def there():
        return {path: path.lstat().st_mode for path in place.rglob("*")
                if path != place / "out"}

    before, temporary = there(), set(os.listdir("/tmp"))
    done = make(place, **(options if isinstance(options, dict) else {}))
    if (place / "out").is_dir():
        (place / "out").chmod(0o755)
    refused(done, words, *status)
    assert there() == before
    assert set(os.listdir("/tmp")) == temporary


def test_what_is_there_stays(place):
    made(update(place, "--json"))
    before = tree(place)
    refused(update(place), "is there already; remove it, or choose another")
    assert tree(place) == before


@pytest.mark.parametrize("output", ["/dev/full", None])
def test_an_update_that_cannot_be_told(place, output):
    """It is made nevertheless, and the line says so."""
    command = shlex.join(make_update(place))
    done = ran(["/bin/sh", "-c", f"{command} >{output or '&-'}"])
    refused(done, "is made, but standard output fails")
    assert os.listdir(place / "out") == [VERSION]


@pytest.mark.parametrize("seed", range(20))
def test_random_damage(place, seed):
    """Any damage: an update, or one line and nothing."""
    dice = random.Random(seed)
    part = dice.choice([*(f"icu/{name}" for name in releases.RESOURCES),
                        "rules/tzdata.zi", "system/zoneinfo.default/Europe/Lisbon",
                        "system/icu/icutzformat.txt"])
    raw = bytearray((place / part).read_bytes())
    for _ in range(dice.choice([1, 10, 1000])):
        raw[dice.randrange(len(raw))] = dice.randrange(256)
    (place / part).write_bytes(raw)
    done = update(place, "--json")
    if done.returncode == 0:
        assert json.loads(done.stdout)["version"] in os.listdir(place / "out")
    else:
        refused(done, "")
        assert os.listdir(place / "out") == []


# --- What ends early --------------------------------------------------------------


def test_what_a_killed_one_left(place):
    left = place / "out/.make-update.new/zoneinfo"
    left.mkdir(parents=True)
    made(update(place, "--json"))
    assert os.listdir(place / "out") == [VERSION]


def test_an_interrupt_while_it_begins(place):
    """In the place of a library that it loads."""
    (place / "argparse.py").write_text(
        "import os, signal\nos.kill(os.getpid(), signal.SIGINT)\n")
    done = ran(make_update(place)[2:], {"PYTHONPATH": str(place)})
    assert (done.returncode, done.stderr) == (-signal.SIGINT, "")


@pytest.mark.parametrize("number", [signal.SIGTERM, signal.SIGINT, signal.SIGHUP])
def test_an_interrupted_program_leaves_nothing(place, number):
    hung = subprocess.Popen(
        make_update(place), stderr=subprocess.PIPE, env=os.environ | fake(
            zdump=f"touch {place}/begun; exec sleep 60")(place)["environment"])
    for _ in range(400):
        if (place / "begun").exists():
            break
        time.sleep(0.05)
    else:
        pytest.fail("never began")
    assert any((place / "out").iterdir())
    hung.send_signal(number)
    assert hung.communicate(timeout=30) == (None, b"")
    assert hung.returncode == 128 + number
    assert os.listdir(place / "out") == []
