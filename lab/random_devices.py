# SPDX-License-Identifier: BSD-2-Clause
"""Devices composed at random out of every choice for every link, file, directory and
permission: a seed gives one, and Hypothesis can draw and shrink one."""

from __future__ import annotations

import random

from lab.device import Device, Node
from lab.paths import (DEFAULT_LOCALTIME, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU,
                       RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO,
                       update_path)

# --- The choices -------------------------------------------------------------

VERSIONS = ["2024a.1.0", "2024b.1.0", "2023c.1.0", "2023b.1.0", "2022z.1.0"]
# Each newer than the one before.
NEIGHBOURS = [
    "2023z.9.9", "2024a", "2024a.0", "2024a.0.0", "2024a.1", "2024a.1.0", "2024a.1.1",
    "2024a.2.0", "2024a.10", "2024az", "2024b", "2024z", "2024za", "2025a"
]
ODD_VERSIONS = [
    "2024a", "2024a.1", "2024a.1.1", "2024aa.1.0", "2024a.01.0", "02024a.1.0",
    "2024a.10.0", "2024A.1.0", "2024a.1.0.0", "2024a.", "2024", "a2024", " 2024a",
    "2024a ", "2024a.1.0.bak", "x", "%s%n%d", "2024a.1.0\n", "2147483647z",
    "2147483648a", "2024a.99999999999", "2024a.1.2147483648", "2024\xe4.1.0",
    "2024\xc3\xa4", "." * 3, "-1a", "+2024a", "0a", "1a.0.0", "9" * 250 + "a",
    "x" * 255, "2024" + "a" * 251
]
RELEASES = ["2023c"]
ODD_RELEASES = [
    "2022a", "2024a", "2024b", "2024z", "2023c.1.0", "", "2023C", "version", "2023c,x",
    "2023c\0", "2147483648a", "9" * 30 + "a", "%s%s%n", "0" * 5000 + "2023c",
    "9" * 5000 + "a", "2023" + "c" * 5000
]
SCHEMAS = ["44l"]
ODD_SCHEMAS = ["45l", "44b", "44e", "044l", "0l", "9999999999999999999999l"]
ODD_FORMATS = ["", "44L", "l", "44", "icutz44l.dat", "44l\0", "44l,", "4" * 5000 + "l"]
SPACES = ["\n"]
ODD_SPACES = [
    "", " ", "\n\n\n", "\t", "\v", "\f", "\r\n", " x", "\0", "\x85", "\xa0", " " * 5000
]
MODES = [0o755]
ODD_MODES = [0o700, 0o555, 0o311, 0o444, 0o644, 0o000, 0o077, 0o2755]
FILE_MODES = [0o644]
ODD_FILE_MODES = [0o600, 0o444, 0o200, 0o000, 0o004, 0o640]
DATA_NAMES = [
    "readme", "icutz44L.dat", "icutzl.dat", "icutz44x.dat", "xicutz44l.dat",
    "icutz44l.dat.bak", "icutz44ldat", "icutz44l.dat\n", "ICUTZ44l.dat",
    "icutz44ll.dat", "icutz-44l.dat", "icutz44l_dat", "icutz 44l.dat", "icutz",
    "icutz44l.DAT", "icutz4\xe44l.dat", ".icutz44l.dat", "zone.tab"
]


class Chooser:
    """Takes a usual choice, or with some probability an odd one."""

    def __init__(self, source: random.Random):
        self.random = source
        self.oddness = self.random.choice([0, 0.03, 0.1, 0.3, 0.7])

    def odd(self):
        return self.random.random() < self.oddness

    def chance(self, probability):
        return self.random.random() < probability

    def any(self, choices):
        return self.random.choice(choices)

    def of(self, usual, odd):
        return self.any(odd if self.odd() else usual)


def compose(source: random.Random) -> Device:
    """A device; the same for a source in the same state."""
    choose = Chooser(source)
    device = Device()
    compose_system(choose, device)
    versions = compose_downloads(choose, device)
    targets = zoneinfo_targets(versions)
    current = choose.any([None] + versions) if choose.chance(0.9) else "gone.1"
    usual = update_path(current) if current else None
    place_link(choose, device, ZONEINFO,
               usual + "/zoneinfo" if usual else SYSTEM_ZONEINFO, targets)
    place_link(choose, device, ICUTZ, usual + "/icutz" if usual else None,
               icu_targets(versions))
    place_link(choose, device, LOCALTIME, DEFAULT_LOCALTIME, LOCALTIME_TARGETS)
    announced = choose.any([None] + versions * 2)
    place_link(choose, device, TZ_LATEST,
               update_path(announced) if announced else None,
               announcement_targets(versions))
    place_link(choose, device, LEGACY_ICUTZ, None, icu_targets(versions))
    compose_record(choose, device)
    compose_old_icu(choose, device)
    compose_surroundings(choose, device)
    return device


def compose_file(choose, device, path, content):
    if not choose.odd():
        device.file(path, content)
        return
    choose.any([
        lambda: None,
        lambda: device.file(path, content, choose.any(ODD_FILE_MODES)),
        lambda: device.file(path, ""),
        lambda: device.file(path, "x" * choose.any([4095, 4096, 4097, 20000])),
        lambda: device.file(path, " " * choose.any([4095, 4096, 8192]) + content),
        lambda: device.file(path,
                            content.strip().rjust(4096) + "\n" + content),
        lambda: device.directory(path),
        lambda: device.fifo(path),
        lambda: device.socket(path),
        lambda: device.link(path, choose.any(["gone", path, ".", "/var/db"])),
        lambda:
        (device.file(path + ".real", content), device.link(path, path + ".real")),
    ])()


def compose_tree(choose, device, path, release):
    """A zoneinfo tree."""
    if choose.odd():
        kind = choose.any(["missing", "file", "link", "dangling", "mode"])
        if kind == "missing":
            return
        if kind == "file":
            device.file(path, "x")
            return
        if kind == "dangling":
            device.link(path, "gone")
            return
        if kind == "link":
            device.link(path, path.rpartition("/")[2] + ".real")
            path += ".real"
    device.directory(path)
    compose_file(
        choose, device, path + "/+VERSION",
        choose.of([""], [" ", "\n\t", "\0", "\xa0"]) + release +
        choose.of(SPACES, ODD_SPACES))
    device.file(path + "/Europe/Paris", "TZif")
    if not choose.odd():
        device.file(path + "/America/Los_Angeles", "TZif")
    device.directory(path, choose.of(MODES, ODD_MODES))


def compose_system(choose, device):
    compose_tree(choose, device, SYSTEM_ZONEINFO, choose.of(RELEASES, ODD_RELEASES))
    if not choose.odd() or choose.chance(0.5):
        device.directory(SYSTEM_ICU)
        compose_file(
            choose, device, SYSTEM_ICU + "/icutzformat.txt",
            choose.of(SCHEMAS, ODD_SCHEMAS + ODD_FORMATS) +
            choose.of(SPACES, ODD_SPACES))
        device.directory(SYSTEM_ICU, choose.of(MODES, ODD_MODES))
    if choose.odd():
        device.file("/usr/share/zoneinfo/Europe/Paris", "TZif")


def compose_icu(choose, device, path):
    """A directory of ICU data, or what stands in its place."""
    if choose.odd():
        kind = choose.any(["missing", "file", "link", "dangling", "loop", "fifo"])
        if kind == "missing":
            return
        if kind == "link":
            device.link(path, choose.any([path + ".real", "icutz.real"]))
            path += ".real"
        else:
            device.put(
                path, {
                    "file": Node("file", 0o644, "x"),
                    "fifo": Node("fifo", 0o644),
                    "dangling": Node("link", text="gone"),
                    "loop": Node("link", text=path)
                }[kind])
            return
    device.directory(path)
    names = [f"icutz{choose.of(SCHEMAS, ODD_SCHEMAS)}.dat"]
    if choose.chance(0.2):
        names += choose.random.sample(DATA_NAMES, 3)
    while choose.odd() and len(names) < 6:
        names.append(
            choose.any(DATA_NAMES +
                       [f"icutz{schema}.dat" for schema in SCHEMAS + ODD_SCHEMAS]))
    names = sorted(set(names))
    choose.random.shuffle(names)
    for name in names:
        kind = choose.of(["file"], ["mode", "directory", "link", "fifo", "none"])
        entry = f"{path}/{name}"
        if kind == "file":
            device.file(entry, "ICU")
        elif kind == "mode":
            device.file(entry, "ICU", choose.any(ODD_FILE_MODES))
        elif kind == "directory":
            device.file(entry + "/icutz44l.dat", "ICU")
        elif kind == "link":
            device.link(entry, choose.any(["icutz44l.dat", "gone", ".", "/"]))
        elif kind == "fifo":
            device.fifo(entry)
    device.directory(path, choose.of(MODES, ODD_MODES))


def compose_downloads(choose, device):
    """Updates; gives their versions."""
    root = "/var/db/timezone/tz"
    if choose.odd():
        kind = choose.any(["missing", "file", "link"])
        if kind == "missing":
            device.directory("/var/db/timezone")
            return []
        if kind == "file":
            device.file(root, "x")
            return []
        device.link(root, choose.any(["downloads", "/var/db/timezone/downloads"]))
        root = "/var/db/timezone/downloads"
    device.directory(root)
    if choose.chance(0.15):
        first = choose.random.randrange(len(NEIGHBOURS) - 1)
        wanted = NEIGHBOURS[first:first + 2]
        choose.random.shuffle(wanted)
    else:
        wanted = [
            choose.of(VERSIONS, ODD_VERSIONS)
            for _ in range(choose.any([0, 1, 1, 2, 2, 3]))
        ]
    versions = []
    for version in wanted:
        if version in versions:
            continue
        if versions and choose.odd():
            device.link(f"{root}/{version}", versions[0])
        else:
            path = f"{root}/{version}"
            device.directory(path)
            compose_tree(choose, device, path + "/zoneinfo",
                         choose.of(RELEASES, ODD_RELEASES))
            compose_icu(choose, device, path + "/icutz")
            device.directory(path, choose.of(MODES, ODD_MODES))
        versions.append(version)
    device.directory(root, choose.of(MODES, ODD_MODES))
    return versions


def place_link(choose, device, path, usual, targets):
    if not choose.odd():
        if usual is not None:
            device.link(path, usual)
        return
    kind = choose.any(
        ["target"] * 8 +
        ["missing", "missing", "file", "directory", "full directory", "fifo",
         "socket"])
    if kind == "target":
        device.link(path, choose.any(targets))
    elif kind == "file":
        device.file(path, "x", choose.of(FILE_MODES, ODD_FILE_MODES))
    elif kind == "directory":
        device.directory(path, choose.of(MODES, ODD_MODES))
    elif kind == "full directory":
        device.file(path + "/America/Los_Angeles", "x")
        device.directory(path, choose.of(MODES, ODD_MODES))
    elif kind in ("fifo", "socket"):
        device.put(path, Node(kind, 0o644))


def zoneinfo_targets(versions):
    root = "/var/db/timezone/tz"
    targets = [
        SYSTEM_ZONEINFO, SYSTEM_ZONEINFO + "/", "/usr/share/zoneinfo", "/",
        "/usr/share//zoneinfo.default", root, root + "/", root + "//zoneinfo",
        root + "/x/", root + "/a/b/zoneinfo", root + "/gone.1/zoneinfo",
        root + "/../../../../usr/share/zoneinfo.default",
        "/var/db/timezone/TZ/2024a.1.0/zoneinfo", "zoneinfo", ZONEINFO, LOCALTIME,
        root + "/" + "y" * 990 + "/zoneinfo", root + "/" + "y/" * 600, "x" * 1024,
        root + "/" + "z" * 300 + "/zoneinfo", "a\nb", "%s%n"
    ]
    for version in versions:
        path = f"{root}/{version}"
        targets += [
            path + "/zoneinfo", path + "/zoneinfo/", path, path + "/", path + "/other",
            path + "//zoneinfo", path + "/icutz", path + "/./zoneinfo",
            "tz/" + version + "/zoneinfo", f"{root}/./{version}/zoneinfo",
            f"{root}//{version}/zoneinfo"
        ]
    return targets


def icu_targets(versions):
    targets = [
        SYSTEM_ICU, "/nowhere", "timezone/tz", "tz", "icutz", ICUTZ, LEGACY_ICUTZ,
        OLD_ICU, ZONEINFO, LOCALTIME, "/var/db", ".", "x" * 1023,
        "/usr/share/" + "./" * 500, "/" * 1100, "/" * 4095
    ]
    for version in versions:
        targets += [
            f"/var/db/timezone/tz/{version}/icutz", f"tz/{version}/icutz",
            f"timezone/tz/{version}/icutz"
        ]
    return targets


def announcement_targets(versions):
    root = "/var/db/timezone/tz/"
    targets = [
        "x", "/", root, root[:-1], root + "x", root + "gone", root + "\n",
        SYSTEM_ZONEINFO, "/var/db/Timezone/tz/2024a.1.0", ZONEINFO, "%s", TZ_LATEST,
        root + "9999z.1.0", root + "y" * 1100, root + "../../../../usr/share"
    ]
    for version in versions:
        path = root + version
        targets += [
            path, path + "/", path + "/zoneinfo", "tz/" + version,
            root + "./" + version, root + "/" + version, path + "/../x",
            path.upper(), " " + path
        ]
    return targets


LOCALTIME_TARGETS = [
    ZONEINFO, ZONEINFO + "/", ZONEINFO + "/Europe/Paris", ZONEINFO + "/Nowhere",
    ZONEINFO + "x", ZONEINFO[:-1], "/usr/share/zoneinfo", "/usr/share/zoneinfo/",
    "/usr/share/zoneinfo/Europe/Paris", "/usr/share/zoneinfo/Europe/Nowhere",
    "/usr/share/zoneinfo/../localtime", "/usr/share/zoneinfo.default/Europe/Paris",
    "/usr/share/zoneinf", "/usr/share/zoneinfo//Europe/Paris", "zoneinfo/Europe/Paris",
    "/usr/share/zoneinfo/" + "./" * 500 + "Europe/Paris",
    "/usr/share/zoneinfo/" + "z" * 300, "../zoneinfo/Europe/Paris", LOCALTIME,
    "/USR/share/zoneinfo/Europe/Paris", "/var/db/timezone/ZONEINFO", "\n", "%n",
    "/usr/share/zoneinfo/Europe/Paris/", "/usr/share/zoneinfo/+VERSION"
]


def compose_record(choose, device):
    if not choose.odd():
        if choose.chance(0.3):
            device.file(RECORD, "2022a.1.0_2023b.1.0")
        return
    choose.any([
        lambda: device.file(RECORD, "x" * 100, choose.any(ODD_FILE_MODES)),
        lambda: device.directory(RECORD),
        lambda: device.file(RECORD + "/inside", "x"),
        lambda: device.fifo(RECORD),
        lambda: device.socket(RECORD),
        lambda: device.link(RECORD, "record.real"),
        lambda: device.link(RECORD, "gone/record.real"),
        lambda: device.link(RECORD, "/var/db/"),
        lambda: device.link(RECORD, RECORD),
    ])()


def compose_old_icu(choose, device):
    if choose.odd():
        choose.any([
            lambda: device.file(OLD_ICU, "x", choose.any(ODD_FILE_MODES)),
            lambda: device.directory(OLD_ICU, choose.any(ODD_MODES)),
            lambda: device.file(OLD_ICU + "/inside", "x"),
            lambda: device.link(OLD_ICU, choose.any(["gone", "timezone", "."])),
            lambda: device.fifo(OLD_ICU),
        ])()


def compose_surroundings(choose, device):
    """Permissions of the directories above, and other people's files."""
    if choose.odd():
        device.file("/var/db/timezone/other", "x")
        device.link("/var/db/other", "timezone")
    if choose.odd() and choose.chance(0.5):
        device.directory("/var/db/timezone", choose.any(ODD_MODES))
    if choose.odd() and choose.chance(0.3):
        device.directory("/var/db", choose.any(ODD_MODES))
    if choose.odd() and choose.chance(0.3):
        whole = device.find("/var/db/timezone")
        device.drop("/var/db/timezone")
        choose.any([
            lambda: None,
            lambda: device.file("/var/db/timezone", "x"),
            lambda: device.link("/var/db/timezone", "gone"),
            lambda: (device.put("/var/db/moved", whole),
                     device.link("/var/db/timezone", "moved")),
        ])()
