# SPDX-License-Identifier: BSD-2-Clause
"""The programs that are asked for the time, and what is set for them."""

from __future__ import annotations

from collections.abc import Callable
from dataclasses import dataclass, field
from pathlib import Path

from lab.carriers import real_data, releases
from lab.readers import GLIBC, MUSL, UNPACKED
from lab.words.paths import FORMER_ZONEINFO, ICUTZ, LOCALTIME, SYSTEM_ICU, ZONEINFO

ZONE = "Europe/Lisbon"

# Links that an image may have, by the name that docs/readers.md gives them.
LINKS = {
    "names": (FORMER_ZONEINFO, ZONEINFO),
    "zone": ("/etc/localtime", f"{FORMER_ZONEINFO}/{ZONE}"),
    "ICU's update": ("/usr/share/zoneinfo-icu/44/le", ICUTZ),
    "ICU's system": (f"{SYSTEM_ICU}/icudt{releases.names().icu}", "."),
}


@dataclass
class Reader:
    """A program that answers each line with a clock, at once. After it a line may
    have the zone and the release of the data that the program believes in."""
    name: str
    command: list[str]
    environment: dict[str, str] = field(default_factory=dict)
    links: tuple[str, ...] = ()
    question: Callable[[int], str] = str
    runs_on: bool = True  # one process answers all

    def setting(self) -> str:
        """The cell "set for it" of docs/readers.md."""
        told = [f"`{name}={value}`" for name, value in self.environment.items()]
        told += [f"link *{name}*" for name in self.links]
        return ", ".join(told) or "nothing"


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


def by_name(moment: int) -> str:
    return f"select to_char(to_timestamp({moment}) at time zone '{ZONE}', 'HH24:MI');"


def at(moment: int) -> str:
    return f"@{moment}"


DATE = ["stdbuf", "-oL", "date", "-f", "-", "+%H:%M"]
ICU = [str(real_data.ICU_CLOCK)]
NODE_NAMED, NODE_LOCAL = (
    [debian("usr/bin/node"), "-e", NODE.replace("OPTIONS", options)]
    for options in (f'{{timeZone: "{ZONE}"}}', "{}"))
[POSTGRES] = UNPACKED.glob("usr/lib/postgresql/*/bin")
PSQL = ["stdbuf", "-oL", f"{POSTGRES}/psql", "-qAtX", "-v", "ON_ERROR_STOP=1",
        "-h", "/tmp/postgres", "-U", "reader", "postgres"]
GO = [debian("usr/bin/mlr"), "--inidx", "--ifs", "space", "put", "-q",
      f'print strftime_local($1, "%H:%M", "{ZONE}")']
TZ, FILES = {"TZ": f":{LOCALTIME}"}, {"ICU_TIMEZONE_FILES_DIR": ICUTZ}
DATA = {"ICU_DATA": SYSTEM_ICU}

READERS = [
    Reader("glibc, `date`", DATE, question=at),
    Reader("glibc, `date`", DATE, TZ, question=at),
    Reader("glibc, `date`", DATE, {"TZ": ZONE}, question=at),
    Reader("glibc, `date`", DATE, {"TZ": ZONE, "TZDIR": ZONEINFO}, question=at),
    Reader("glibc, `date`", DATE, {"TZ": ZONE}, ("names",), question=at),
    Reader("glibc, a program", [GLIBC]),
    Reader("glibc, a program", [GLIBC], links=("names", "zone")),
    Reader("musl, a program", [MUSL]),
    Reader("musl, a program", [MUSL], links=("names", "zone")),
    Reader("musl, a program", [MUSL], TZ),
    Reader("musl, a program", [MUSL], {"TZ": ZONE}),
    Reader("musl, a program", [MUSL], {"TZ": ZONE, "TZDIR": ZONEINFO}),
    Reader("musl, a program", [MUSL], {"TZ": ZONE}, ("names",)),
    Reader("ICU4C, a zone by name", [*ICU, ZONE]),
    Reader("ICU4C, a zone by name", [*ICU, ZONE], FILES),
    Reader("ICU4C, a zone by name", [*ICU, ZONE], links=("ICU's update",)),
    Reader("ICU4C, a zone by name", [*ICU, ZONE], DATA,
           ("ICU's update", "ICU's system")),
    Reader("ICU4C, the host's zone", ICU, FILES),
    Reader("ICU4C, the host's zone", ICU, FILES, ("names",)),
    Reader("ICU4C, the host's zone", ICU, FILES | TZ),
    Reader("ICU4C, the host's zone", ICU, FILES | {"TZ": ZONE}),
    Reader("ICU4C, the host's zone", ICU, FILES, ("names", "zone")),
    Reader("Python, zoneinfo", ["/usr/bin/python3", "-c", PYTHON]),
    Reader("Python, zoneinfo", ["/usr/bin/python3", "-c", PYTHON],
           {"PYTHONTZPATH": ZONEINFO}),
    Reader("Python, zoneinfo", ["/usr/bin/python3", "-c", PYTHON], links=("names",)),
    Reader("`systemd-analyze calendar`", ["sh", "-c", CALENDAR], runs_on=False),
    Reader("Node, a zone by name", NODE_NAMED),
    Reader("Node, a zone by name", NODE_NAMED, DATA, ("ICU's update", "ICU's system")),
    Reader("Node, local time", NODE_LOCAL, FILES),
    Reader("Node, local time", NODE_LOCAL, FILES, ("names", "zone")),
    Reader("PostgreSQL, a zone by name", PSQL, question=by_name),
    Reader("PostgreSQL, a zone by name", PSQL, links=("names",), question=by_name),
    Reader("Go, a zone by name", GO, runs_on=False),
    Reader("Go, a zone by name", GO, {"ZONEINFO": ZONEINFO}, runs_on=False),
    Reader("Go, a zone by name", GO, links=("names",), runs_on=False),
]


def server(folder: Path) -> list[str]:
    """PostgreSQL's server, for psql."""
    return [f"{POSTGRES}/postgres", "-D", str(folder), "-k",
            "/tmp/postgres", "-c", "listen_addresses=", "-c", "fsync=off"]
