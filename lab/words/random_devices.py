# SPDX-License-Identifier: BSD-2-Clause
"""Devices composed at random out of every choice for every link, file, directory and
permission: a seed gives one, and Hypothesis can draw and shrink one."""

import os
import random

from lab.words.device import Device
from lab.words.paths import (DEFAULT_LOCALTIME, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU,
                             RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TIMEZONE, TZ_LATEST,
                             ZONEINFO, update_path)

# --- The choices -------------------------------------------------------------

VERSIONS = ["2024a.1.0", "2024b.1.0", "2023c.1.0", "2023b.1.0", "2022z.1.0"]
# Each newer than the one before.
NEIGHBOURS = ["2023z.9.9", "2024a", "2024a.0", "2024a.0.0", "2024a.1", "2024a.1.0",
              "2024a.1.1", "2024a.2.0", "2024a.10", "2024az", "2024b", "2024z",
              "2024za", "2025a"]
ODD_VERSIONS = ["2024a", "2024a.1", "2024a.1.1", "2024aa.1.0", "2024a.01.0",
                "02024a.1.0", "2024a.10.0", "2024A.1.0", "2024a.1.0.0", "2024a.",
                "2024", "a2024", " 2024a", "2024a ", "2024a.1.0.bak", "x", "%s%n%d",
                "2024a.1.0\n", "2147483647z", "2147483648a", "2024a.99999999999",
                "2024a.1.2147483648", "2024\xe4.1.0", "2024\xc3\xa4", "...", "-1a",
                "+2024a", "0a", "1a.0.0", "9" * 250 + "a", "x" * 255,
                "2024" + "a" * 251]
ODD_RELEASES = ["2022a", "2024a", "2024b", "2024z", "2023c.1.0", "", "2023C", "version",
                "2023c,x", "2023c\0", "2147483648a", "9" * 30 + "a", "%s%s%n",
                "0" * 5000 + "2023c", "9" * 5000 + "a", "2023" + "c" * 5000]
ODD_SCHEMAS = ["45l", "44b", "44e", "044l", "0l", "9999999999999999999999l"]
ODD_FORMATS = ["", "44L", "l", "44", "icutz44l.dat", "44l\0", "44l,", "4" * 5000 + "l"]
ODD_SPACES = ["", " ", "\n\n\n", "\t", "\v", "\f", "\r\n", " x", "\0", "\x85", "\xa0",
              " " * 5000]
ODD_MODES = [0o700, 0o555, 0o311, 0o444, 0o644, 0o000, 0o077, 0o2755]
ODD_FILE_MODES = [0o600, 0o444, 0o200, 0o000, 0o004, 0o640]
DATA_NAMES = ["readme", "icutz44L.dat", "icutzl.dat", "icutz44x.dat", "xicutz44l.dat",
              "icutz44l.dat.bak", "icutz44ldat", "icutz44l.dat\n", "ICUTZ44l.dat",
              "icutz44ll.dat", "icutz-44l.dat", "icutz44l_dat", "icutz 44l.dat",
              "icutz", "icutz44l.DAT", "icutz4\xe44l.dat", ".icutz44l.dat", "zone.tab"]

# Targets of links. One with a "*" is a target for each version.
ROOT = f"{TIMEZONE}/tz"
ZONEINFO_TARGETS = [
    SYSTEM_ZONEINFO, f"{SYSTEM_ZONEINFO}/", "/usr/share/zoneinfo", "/",
    "/usr/share//zoneinfo.default", ROOT, f"{ROOT}/", f"{ROOT}//zoneinfo", f"{ROOT}/x/",
    f"{ROOT}/a/b/zoneinfo", f"{ROOT}/gone.1/zoneinfo",
    f"{ROOT}/../../../../usr/share/zoneinfo.default",
    f"{TIMEZONE}/TZ/2024a.1.0/zoneinfo", "zoneinfo", ZONEINFO, LOCALTIME,
    f"{ROOT}/{'y' * 990}/zoneinfo", f"{ROOT}/{'y/' * 600}", "x" * 1024,
    f"{ROOT}/{'z' * 300}/zoneinfo", "a\nb", "%s%n", f"{ROOT}/*/zoneinfo",
    f"{ROOT}/*/zoneinfo/", f"{ROOT}/*", f"{ROOT}/*/", f"{ROOT}/*/other",
    f"{ROOT}/*//zoneinfo", f"{ROOT}/*/icutz", f"{ROOT}/*/./zoneinfo", "tz/*/zoneinfo",
    f"{ROOT}/./*/zoneinfo", f"{ROOT}//*/zoneinfo"]
ICU_TARGETS = [SYSTEM_ICU, "/nowhere", "timezone/tz", "tz", "icutz", ICUTZ,
               LEGACY_ICUTZ, OLD_ICU, ZONEINFO, LOCALTIME, "/var/db", ".", "x" * 1023,
               "/usr/share/" + "./" * 500, "/" * 1100, "/" * 4095, f"{ROOT}/*/icutz",
               "tz/*/icutz", "timezone/tz/*/icutz"]
ANNOUNCEMENTS = ["x", "/", f"{ROOT}/", ROOT, f"{ROOT}/x", f"{ROOT}/gone", f"{ROOT}/\n",
                 SYSTEM_ZONEINFO, "/var/db/Timezone/tz/2024a.1.0", ZONEINFO, "%s",
                 TZ_LATEST, f"{ROOT}/9999z.1.0", f"{ROOT}/{'y' * 1100}",
                 f"{ROOT}/../../../../usr/share", f"{ROOT}/*", f"{ROOT}/*/",
                 f"{ROOT}/*/zoneinfo", "tz/*", f"{ROOT}/./*", f"{ROOT}//*",
                 f"{ROOT}/*/../x", f"{ROOT}/*".upper(), f" {ROOT}/*"]
LOCALTIME_TARGETS = [
    ZONEINFO, f"{ZONEINFO}/", f"{ZONEINFO}/Europe/Paris", f"{ZONEINFO}/Nowhere",
    f"{ZONEINFO}x", ZONEINFO[:-1], "/usr/share/zoneinfo", "/usr/share/zoneinfo/",
    "/usr/share/zoneinfo/Europe/Paris", "/usr/share/zoneinfo/Europe/Nowhere",
    "/usr/share/zoneinfo/../localtime", f"{SYSTEM_ZONEINFO}/Europe/Paris",
    "/usr/share/zoneinf", "/usr/share/zoneinfo//Europe/Paris", "zoneinfo/Europe/Paris",
    "/usr/share/zoneinfo/" + "./" * 500 + "Europe/Paris",
    "/usr/share/zoneinfo/" + "z" * 300, "../zoneinfo/Europe/Paris", LOCALTIME,
    "/USR/share/zoneinfo/Europe/Paris", "/var/db/timezone/ZONEINFO", "\n", "%n",
    "/usr/share/zoneinfo/Europe/Paris/", "/usr/share/zoneinfo/+VERSION"]

# --- One device --------------------------------------------------------------


def compose(source: random.Random) -> Device:
    """A device; the same for a source in the same state."""
    return Composer(source).device


class Composer:
    """Takes what is usual, or with some probability an odd choice."""

    def __init__(self, source: random.Random):
        self.random, self.any = source, source.choice
        self.oddness = self.any([0, 0.03, 0.1, 0.3, 0.7])
        self.device = Device()
        self.versions = []
        self.system()
        self.downloads()
        self.links()
        self.surroundings()

    def chance(self, probability):
        return self.random.random() < probability

    def odd(self, share=1.0):
        return self.chance(self.oddness) and self.chance(share)

    def of(self, usual, odd):
        return self.any(odd) if self.odd() else usual

    def mode(self, path):
        """Gives a directory its permissions."""
        self.device.directory(path, self.of(0o755, ODD_MODES))

    # --- Data ---

    def file(self, path, content):
        device = self.device
        if not self.odd():
            return device.file(path, content)
        return self.any([
            lambda: device.file(path, content, self.any(ODD_FILE_MODES)),
            lambda: device.file(path, ""),
            lambda: device.file(path, "x" * self.any([4095, 4096, 4097, 20000])),
            lambda: device.file(path, " " * self.any([4095, 4096, 8192]) + content),
            lambda: device.file(path, content.strip().rjust(4096) + "\n" + content),
            lambda: (device.file(f"{path}.real", content),
                     device.link(path, f"{path}.real")),
            *[lambda: self.stand_in(path, ["gone", path, ".", "/var/db"])] * 4])()

    def directory(self, path):
        """Makes the directory for what a path leads to: there or, behind something
        else that stands there, beside it. Returns where."""
        if self.odd():
            real = f"{path}.real"
            self.stand_in(path, ["gone", path, real, os.path.basename(real)])
            path = real
        self.device.directory(path)
        return path

    def tree(self, path):
        """A zoneinfo tree."""
        path = self.directory(path)
        self.file(f"{path}/+VERSION", "".join([
            self.of("", [" ", "\n\t", "\0", "\xa0"]), self.of("2023c", ODD_RELEASES),
            self.of("\n", ODD_SPACES)]))
        self.device.file(f"{path}/Europe/Paris", "TZif")
        if not self.odd():
            self.device.file(f"{path}/America/Los_Angeles", "TZif")
        self.mode(path)

    def icu(self, path):
        """An update's directory of ICU data."""
        path = self.directory(path)
        names = {f"icutz{self.of('44l', ODD_SCHEMAS)}.dat"}
        if self.chance(0.2):
            names.update(self.random.sample(DATA_NAMES, 3))
        while self.odd() and len(names) < 6:
            names.add(self.any([*DATA_NAMES, *(f"icutz{schema}.dat"
                                               for schema in ["44l", *ODD_SCHEMAS])]))
        names = sorted(names)
        self.random.shuffle(names)
        for name in names:
            self.icu_file(f"{path}/{name}")
        self.mode(path)

    def icu_file(self, path):
        device = self.device
        self.of(lambda: device.file(path, "ICU"), [
            lambda: device.file(path, "ICU", self.any(ODD_FILE_MODES)),
            lambda: device.file(f"{path}/icutz44l.dat", "ICU"),
            *[lambda: self.stand_in(path, ["icutz44l.dat", "gone", ".", "/"])] * 2])()

    def system(self):
        self.tree(SYSTEM_ZONEINFO)
        if not self.odd(0.5):
            self.device.directory(SYSTEM_ICU)
            self.file(f"{SYSTEM_ICU}/icutzformat.txt",
                      self.of("44l", ODD_SCHEMAS + ODD_FORMATS) +
                      self.of("\n", ODD_SPACES))
            self.mode(SYSTEM_ICU)
        if self.odd():
            self.device.file("/usr/share/zoneinfo/Europe/Paris", "TZif")

    def downloads(self):
        root = self.directory(ROOT)
        if self.chance(0.15):
            first = self.random.randrange(len(NEIGHBOURS) - 1)
            wanted = self.random.sample(NEIGHBOURS[first:first + 2], 2)
        else:
            wanted = [self.of(self.any(VERSIONS), ODD_VERSIONS)
                      for _ in range(self.any([0, 1, 1, 2, 2, 3]))]
        for version in dict.fromkeys(wanted):
            path = f"{root}/{version}"
            if self.versions and self.odd():
                self.device.link(path, self.versions[0])
            else:
                self.device.directory(path)
                self.tree(f"{path}/zoneinfo")
                self.icu(f"{path}/icutz")
                self.mode(path)
            self.versions.append(version)
        self.mode(root)

    # --- Links and what else the program changes ---

    def links(self):
        current = (self.any([None, *self.versions]) if self.chance(0.9) else "gone.1")
        usual = update_path(current) if current else ""
        self.place(ZONEINFO, f"{usual}/zoneinfo" if usual else SYSTEM_ZONEINFO,
                   ZONEINFO_TARGETS)
        self.place(ICUTZ, usual and f"{usual}/icutz", ICU_TARGETS)
        self.place(LOCALTIME, DEFAULT_LOCALTIME, LOCALTIME_TARGETS)
        announced = self.any([None, *self.versions, *self.versions])
        self.place(TZ_LATEST, announced and update_path(announced), ANNOUNCEMENTS)
        self.place(LEGACY_ICUTZ, "", ICU_TARGETS)
        if self.chance(0.3):
            self.device.file(RECORD, "2022a.1.0_2023b.1.0")
        self.place(RECORD, "", ["record.real", "gone/record.real", "/var/db/", RECORD])
        self.place(OLD_ICU, "", ["gone", "timezone", "."])

    def place(self, path, usual, targets):
        """A link to a usual target, if any, or anything else in its place."""
        if self.odd():
            self.device.drop(path)
            self.stand_in(path, targets)
        elif usual:
            self.device.link(path, usual)

    def stand_in(self, path, targets):
        device = self.device
        self.any([
            *[lambda: device.link(path, self.target(targets))] * 8,
            *[lambda: None] * 2,
            lambda: device.file(path, "x" * 100, self.of(0o644, ODD_FILE_MODES)),
            lambda: self.mode(path),
            lambda: (device.file(f"{path}/America/Los_Angeles", "x"), self.mode(path)),
            lambda: device.fifo(path),
            lambda: device.socket(path)])()

    def target(self, targets):
        """One of these texts as it is, or of the forms with a version in it."""
        return self.any([target.replace("*", version) for target in targets for version
                         in (self.versions if "*" in target else [""])])

    def surroundings(self):
        """Permissions of the directories above, and other people's files."""
        device = self.device
        if self.odd():
            device.file(f"{TIMEZONE}/other", "x")
            device.link("/var/db/other", "timezone")
        if self.odd(0.5):
            device.directory(TIMEZONE, self.any(ODD_MODES))
        if self.odd(0.3):
            device.directory("/var/db", self.any(ODD_MODES))
        if self.odd(0.3):
            whole = device.find(TIMEZONE)
            device.drop(TIMEZONE)
            self.any([
                lambda: None,
                lambda: device.file(TIMEZONE, "x"),
                lambda: device.link(TIMEZONE, "gone"),
                lambda: (device.put("/var/db/moved", whole),
                         device.link(TIMEZONE, "moved"))])()
