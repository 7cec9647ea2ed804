# SPDX-License-Identifier: BSD-2-Clause
"""What programs read after a boot; docs/readers.md is compared with it."""

from __future__ import annotations

import contextlib
import datetime
import os
import re
import select
import signal
import subprocess
import time
from collections.abc import Iterator
from pathlib import Path

import pytest

from lab.carriers import boot, namespace, real_data, releases
from lab.readers import UNPACKED
from lab.readers.programs import (LINKS, POSTGRES, PSQL, READERS, Reader, ZONE,
                                  reader_of, server)
from lab.words.device import Device
from lab.words.paths import (ICUTZ, LOCALTIME, SYSTEM_ICU, SYSTEM_ZONEINFO, TZ_LATEST,
                             ZONEINFO, update_path)
from lab.words.places import PROJECT

DOCUMENT = (PROJECT / "docs/readers.md").read_text()
TABLE = DOCUMENT.partition("<!-- seen -->\n")[2].partition("<!-- end -->")[0]
ROWS = [line.strip("| ").split(" | ") for line in TABLE.splitlines()[2:]]
SECONDS = 10
NAMES = releases.names()
NOON = int(datetime.datetime(releases.YEAR, 7, 1, 12,
                             tzinfo=datetime.timezone.utc).timestamp())
CLOCKS = {"13:00": "system", "14:00": "update", "15:00": "upgrade", "12:00": "UTC"}
PLACES = re.compile(r'"(/etc/localtime|/var/db/timezone/[^"]*|'
                    r'/usr/share/(?:zoneinfo|icu|marlin)[^"]*)"')
ENVIRONMENT = {"PATH": "/usr/bin:/bin:/usr/sbin", "LC_ALL": "C.UTF-8",
               "LD_LIBRARY_PATH": ":".join(
                   str(place) for place in UNPACKED.glob("usr/lib/*-linux-gnu"))}


def device_with(system: str, links: list[str], update: str | None) -> Device:
    """A device with a system partition's data and both updates; one is in use."""
    device = Device()
    for name, place in (("zoneinfo", SYSTEM_ZONEINFO), ("icu", SYSTEM_ICU)):
        device.put(place, namespace.description_of(real_data.TARGET / system / name))
    wanted = dict(LINKS[name] for name in links)
    Path("/etc/localtime").unlink(missing_ok=True)
    os.symlink(wanted.pop("/etc/localtime", LOCALTIME), "/etc/localtime")
    for link, target in wanted.items():
        device.link(link, target)
    for update_set in ("update", "refused"):
        device.put(update_path(getattr(real_data.names(), update_set)),
                   namespace.description_of(real_data.TARGET / update_set))
    device.point_links_at(update)
    device.choose_zone(ZONE)
    # Packages that are only unpacked look for their files here.
    for name in ("nodejs", "postgresql"):
        device.link(f"/usr/share/{name}", str(UNPACKED / "usr/share" / name))
    return device


def announce(release: str):
    Path(TZ_LATEST).unlink(missing_ok=True)
    os.symlink(update_path(f"{release}.1.0"), TZ_LATEST)


def booted(expected: str):
    """Boots; the tree in use is then the expected one."""
    assert boot.boot().ending == "exit 0"
    assert os.readlink(ZONEINFO) == expected


@contextlib.contextmanager
def serving(reader: Reader, cluster: Path, *before: str) -> Iterator[None]:
    """Runs what the program needs beside it: a server."""
    if reader.command != PSQL:
        yield
        return
    os.makedirs("/tmp/postgres", exist_ok=True)
    running = subprocess.Popen([*before, *server(cluster)], env=ENVIRONMENT,
                               stderr=subprocess.DEVNULL)
    try:
        for _ in range(100):
            if not subprocess.call([f"{POSTGRES}/pg_isready", "-q", "-h",
                                    "/tmp/postgres"], env=ENVIRONMENT):
                break
            time.sleep(0.05)
        yield
    finally:
        running.send_signal(signal.SIGINT)  # does not wait for clients
        running.wait(SECONDS)


@contextlib.contextmanager
def started(reader: Reader, *before: str) -> Iterator[subprocess.Popen]:
    running = subprocess.Popen(
        [*before, *reader.command], env=ENVIRONMENT | reader.environment, text=True,
        stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)
    try:
        yield running
    finally:
        with contextlib.suppress(BrokenPipeError):
            running.stdin.close()
        running.wait(SECONDS)
        running.stdout.close()


def answer(reader: Reader, running: subprocess.Popen) -> str:
    """In words: the data from which a program takes its answers, and the zone that it
    takes for the device's if that is another."""
    with contextlib.suppress(BrokenPipeError):
        running.stdin.write(reader.question(NOON) + "\n")
        running.stdin.flush()
        if not reader.runs_on:
            running.stdin.close()
    words = line_of(running).split()
    if not words:
        return "fails"
    by_clock = CLOCKS.get(words[0], "fails")
    if len(words) == 1:
        return by_clock
    zone, release = words[-2:]
    told = {NAMES.system: "system", NAMES.update: "update",
            NAMES.upgrade: "upgrade"}.get(release, "own")
    if zone != ZONE:
        return f"{told}, as {zone}"
    # The library's own data knows nothing of what was invented.
    assert by_clock == told.replace("own", "system")
    return told


def line_of(running: subprocess.Popen) -> str:
    if not select.select([running.stdout], [], [], SECONDS)[0]:
        pytest.fail("the program does not answer")
    return running.stdout.readline()


def asked(reader: Reader) -> str:
    with started(reader) as running:
        return answer(reader, running)


def files_read(reader: Reader, cluster: Path) -> str:
    """Files with time-zone data that a program opened, or its server."""
    log = "/tmp/opened"
    # Under a tracer that is not its parent, the program gets its signals itself.
    traced = ("strace", "-D", "-f", "-qq", "-e", "trace=open,openat", "-o", log)
    own = () if reader.command == PSQL else traced
    with serving(reader, cluster, *traced), started(reader, *own) as running:
        answer(reader, running)
    # The tracer ends a little later.
    for _ in range(50):
        if not any("strace" in line for line in commands()):
            break
        time.sleep(0.02)
    opened = dict.fromkeys(
        found[1] for line in Path(log).read_text(errors="replace").splitlines()
        if re.search(r"= \d+$", line) and "O_DIRECTORY" not in line
        and (found := PLACES.search(line)))
    # Of ICU's four the one with the changes of clocks.
    files = [path for path in opened if not re.search("(Types|Zones).res$", path)]
    return ", ".join(f"`{path}`" for path in files) or "none"


def commands() -> list[str]:
    """What runs on this private device."""
    found = []
    for process in Path("/proc").glob("[0-9]*/comm"):
        with contextlib.suppress(OSError):
            found.append(process.read_text())
    return found


@pytest.fixture(scope="module")
def cluster() -> Path:
    """An empty data base."""
    namespace.build(device_with("system", [], None))
    folder = Path("/tmp/cluster")
    subprocess.run([f"{POSTGRES}/initdb", "-D", folder, "-U", "reader", "-A", "trust",
                    "--no-sync"], env=ENVIRONMENT, check=True,
                   stdout=subprocess.DEVNULL)
    return folder


def scenes(reader: Reader, cluster: Path) -> list[str]:
    """One program through one device's life, in the cells of the table."""
    tree = f"{update_path(f'{NAMES.update}.1.0')}/zoneinfo"
    namespace.build(device_with("system", reader.links, None))
    booted(SYSTEM_ZONEINFO)
    with serving(reader, cluster):
        system = asked(reader)
        with started(reader) as runs_on:
            before = answer(reader, runs_on) if reader.runs_on else ""
            announce(NAMES.update)
            booted(tree)
            after = answer(reader, runs_on) if reader.runs_on else ""
        same_server = asked(reader)
    with serving(reader, cluster):
        update = asked(reader)
    files = files_read(reader, cluster)
    announce(NAMES.refused)
    booted(tree)
    with serving(reader, cluster):
        refused = asked(reader)
    namespace.build(device_with("upgrade", reader.links, f"{NAMES.update}.1.0"))
    booted(SYSTEM_ZONEINFO)
    with serving(reader, cluster):
        upgrade = asked(reader)
    assert before in (system, "")
    if system == update:
        seen = "never"
    elif not reader.runs_on:
        seen = "by a new process, others not asked"
    elif after != update:
        seen = "by a new process" if same_server == update else "by a new server"
    else:
        seen = "at once"
    return [files, system, update, refused, upgrade, seen]


def by_any_name(cells: list[str]) -> list[str]:
    """Where WET is another name of Lisbon, a program may say either."""
    is_lisbon = "WET" in releases.names_of_lisbon()
    return [cell.replace(", as WET", "") if is_lisbon else cell for cell in cells]


def test_the_pack_alone_is_not_read(cluster):
    """Stock ICU wants the four files beside it."""
    reader = reader_of("ICU4C, a zone by name", f"`ICU_TIMEZONE_FILES_DIR={ICUTZ}`")
    namespace.build(device_with("system", [], f"{NAMES.update}.1.0"))
    assert asked(reader) == "update"
    for file in Path(ICUTZ).glob("*.res"):
        file.unlink()
    assert list(Path(ICUTZ).iterdir()) == [Path(ICUTZ, f"icutz{NAMES.icu}.dat")]
    assert asked(reader) == "own"


def words_of(cells: list[str]) -> str:
    return "-".join(re.findall("[a-z]+", " ".join(cells[:2]).lower()))


@pytest.mark.parametrize("cells", ROWS, ids=words_of)
def test_a_reader(cells, cluster):
    seen = [*cells[:2], *scenes(reader_of(*cells[:2]), cluster)]
    print("| " + " | ".join(seen) + " |")
    assert by_any_name(seen) == by_any_name(cells)


def test_every_program_is_in_the_table():
    assert {name for name, *_ in ROWS} == READERS.keys()
