# SPDX-License-Identifier: BSD-2-Clause
"""The programs that are asked for the time, and what is set for them."""

from __future__ import annotations

import re
from collections.abc import Callable
from pathlib import Path
from typing import NamedTuple

from lab.carriers import real_data, releases
from lab.readers import GLIBC, MUSL, UNPACKED
from lab.words.paths import FORMER_ZONEINFO, ICUTZ, SYSTEM_ICU, ZONEINFO

ZONE = "Europe/Lisbon"

# Links that an image may have, by the name that docs/readers.md gives them.
LINKS = {
    "names": (FORMER_ZONEINFO, ZONEINFO),
    "zone": ("/etc/localtime", f"{FORMER_ZONEINFO}/{ZONE}"),
    "ICU's update": ("/usr/share/zoneinfo-icu/44/le", ICUTZ),
    "ICU's system": (f"{SYSTEM_ICU}/icudt{releases.names().icu}", "."),
}


class Reader(NamedTuple):
    """A program that answers each line with a clock, at once. After it a line may have
    the zone and the release of the data that the program believes in."""
    command: list[str]
    question: Callable[[int], str] = str
    runs_on: bool = True  # one process answers all
    environment: dict[str, str] = {}
    links: list[str] = []


def reader_of(name: str, setting: str) -> Reader:
    """By the first two cells of a row of docs/readers.md."""
    told = re.findall(r"`(\w+)=([^`]+)`|link \*([^*]+)\*", setting)
    environment = {name: value for name, value, _ in told if name}
    links = [link for _, _, link in told if link]
    assert setting == ", ".join([
        *(f"`{name}={value}`" for name, value in environment.items()),
        *(f"link *{name}*" for name in links)] or ["nothing"])
    return READERS[name]._replace(environment=environment, links=links)


def debian(path: str) -> str:
    return str(UNPACKED / path)


# One zone by name, each time anew; a program that keeps it says so in its own row.
PYTHON = f"""
import datetime, sys, zoneinfo
zone = zoneinfo.ZoneInfo("{ZONE}")
for line in sys.stdin:
    moment = datetime.datetime.fromtimestamp(int(line), zone)
    print(moment.strftime("%H:%M"), flush=True)
"""
NODE = """
require("readline").createInterface({input: process.stdin}).on("line", (line) => {
  const when = new Date(Number(line) * 1000), options = OPTIONS;
  const zone = Intl.DateTimeFormat("en-GB", options).resolvedOptions().timeZone;
  const clock = when.toLocaleTimeString("en-GB", options).slice(0, 5);
  console.log(clock, zone, process.versions.tz);
});
"""
CALENDAR = ("while read -r moment; do systemd-analyze calendar --base-time=@0 "
            "\"$(date -u -d \"@$moment\" '+%F %T UTC')\" | sed -n "
            "'s/.*elapse: .* \\(..:..\\):00 .*/\\1/p' | head -n 1; done")


def node(options: str) -> list[str]:
    return [debian("usr/bin/node"), "-e", NODE.replace("OPTIONS", options)]


[POSTGRES] = UNPACKED.glob("usr/lib/postgresql/*/bin")
PSQL = ["stdbuf", "-oL", f"{POSTGRES}/psql", "-qAtX", "-v", "ON_ERROR_STOP=1",
        "-h", "/tmp/postgres", "-U", "reader", "postgres"]

READERS = {
    "glibc, `date`": Reader(["stdbuf", "-oL", "date", "-f", "-", "+%H:%M"],
                            lambda moment: f"@{moment}"),
    "glibc, a program": Reader([GLIBC]),
    "musl, a program": Reader([MUSL]),
    "ICU4C, a zone by name": Reader([str(real_data.ICU_CLOCK), ZONE]),
    "ICU4C, the host's zone": Reader([str(real_data.ICU_CLOCK)]),
    "Python, zoneinfo": Reader(["/usr/bin/python3", "-c", PYTHON]),
    "`systemd-analyze calendar`": Reader(["sh", "-c", CALENDAR], runs_on=False),
    "Node, a zone by name": Reader(node(f'{{timeZone: "{ZONE}"}}')),
    "Node, local time": Reader(node("{}")),
    "PostgreSQL, a zone by name": Reader(PSQL, lambda moment: (
        f"select to_char(to_timestamp({moment}) at time zone '{ZONE}', 'HH24:MI');")),
    "Go, a zone by name": Reader([
        debian("usr/bin/mlr"), "--inidx", "--ifs", "space", "put", "-q",
        f'print strftime_local($1, "%H:%M", "{ZONE}")'], runs_on=False),
}


def server(folder: Path) -> list[str]:
    """PostgreSQL's server, for psql."""
    return [f"{POSTGRES}/postgres", "-D", str(folder), "-k",
            "/tmp/postgres", "-c", "listen_addresses=", "-c", "fsync=off"]
