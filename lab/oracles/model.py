# SPDX-License-Identifier: BSD-2-Clause
"""How one boot has to go, call by call.

The first of two oracles. Written from what the program has to do, not from its code: a
reader checks the model against what is required, and a trial compares it with the
program. Why there is another: docs/proofs.md.

Only where several ways would do are the calls those that the program chose: how much it
reads at a time, that it asks what kind of file it has open, the walk. In goes a device;
out come the device afterwards, the lines that are printed, how the process ends, and
every file-system call, any of which can be made to fail. The sections go from the
bottom up.
"""

import functools
import re
from contextlib import suppress
from errno import (EEXIST, EINVAL, EISDIR, ENAMETOOLONG, ENOENT, ENOTDIR, ENOTEMPTY,
                   ENXIO, ERANGE)
from typing import NamedTuple

from lab.words import lines
from lab.words.device import Node, failure
from lab.words.paths import (DEFAULT_LOCALTIME, DEFAULT_ZONE, DOWNLOADS,
                             FORMER_ZONEINFO, ICUTZ, LEGACY_ICUTZ, LOCALTIME, OLD_ICU,
                             RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TZ_LATEST, ZONEINFO)

# --- 1. The file-system calls --------------------


class Killed(BaseException):
    """The process is gone; no handler sees this."""


def system_call(method):
    """A method that is one call: when it fails, that is the last error."""
    @functools.wraps(method)
    def noting(self, *arguments, **options):
        try:
            return method(self, *arguments, **options)
        except OSError as failed:
            self.last_error = failed.errno
            raise

    return noting


class Kernel:
    """Carries out the calls of one boot and writes them down. `last_error` is what
    the last call that failed has left, and None where the model cannot know.

    `fault(number, name, path)` gives the error number with which a call fails, or
    None; calls are counted from 1. A call that fails so has no effect. The boot
    is killed before call `killed_before`, if that is given.
    """
    def __init__(self, device, fault=None, killed_before=None):
        self.device = device
        self.fault = fault or (lambda number, name, path: None)
        self.killed_before = killed_before
        self.calls = []  # (name, path)
        self.last_error = None  # the start-up of the process leaves anything

    @system_call
    def _call(self, name, path=None):
        if len(self.calls) + 1 == self.killed_before:
            raise Killed()
        self.calls.append((name, path))
        error = self.fault(len(self.calls), name, path)
        if error is not None:
            raise failure(error)

    @system_call
    def _find(self, call, path, follow=True):
        """What a call finds at its path: (directory, name, node)."""
        self._call(call, path)
        directory, name, node = self.device.walk(path, follow)
        if node is None:
            raise failure(ENOENT)
        return directory, name, node

    def _make(self, directory, name, node):
        directory.insist_on(3)
        directory.entries[name] = node

    def access(self, path):
        self._find("access", path)

    @system_call
    def readlink(self, path):
        node = self._find("readlink", path, follow=False)[2]
        if node.kind != "link":
            raise failure(EINVAL)
        return node.text

    @system_call
    def symlink(self, target, path):
        self._call("symlink", path)
        if not target:
            raise failure(ENOENT)
        if len(target) > 4095:
            raise failure(ENAMETOOLONG)
        directory, name, node = self.device.walk(path, follow=False)
        if node is not None:
            raise failure(EEXIST)
        self._make(directory, name, Node("link", text=target))

    @system_call
    def unlink(self, path):
        directory, name, node = self._find("unlink", path, follow=False)
        directory.insist_on(3)
        if node.kind == "dir":
            raise failure(EISDIR)
        del directory.entries[name]

    @system_call
    def rmdir(self, path):
        directory, name, node = self._find("rmdir", path, follow=False)
        directory.insist_on(3)
        if node.kind != "dir":
            raise failure(ENOTDIR)
        if node.entries:
            raise failure(ENOTEMPTY)
        del directory.entries[name]

    @system_call
    def open(self, path):
        node = self._find("open", path)[2]
        node.insist_on(4)
        if node.kind == "socket":
            raise failure(ENXIO)
        return node

    @system_call
    def create(self, path):
        """open(2) to write, with everything that was in the file thrown away."""
        self._call("create", path)
        directory, name, node = self.device.walk(path, follow=True)
        if node is None:
            node = Node("file", 0o644)  # 0666 as this device's umask cuts it
            self._make(directory, name, node)
            return node
        if node.kind == "dir":
            raise failure(EISDIR)
        node.insist_on(2)
        if node.kind == "socket":
            raise failure(ENXIO)
        node.text = ""
        return node

    @system_call
    def read(self, node, size, position):
        self._call("read")
        if node.kind == "dir":
            raise failure(EISDIR)
        return node.text[position:position + size]

    def write(self, node, text):
        self._call("write")
        node.text += text

    def fstat(self):
        self._call("fstat")

    def close(self):
        """A descriptor is closed even if this fails."""
        quietly(self._call, "close")

    def stat(self, path):
        return self._find("stat", path)[2]

    def lstat(self, path):
        return self._find("lstat", path, follow=False)[2]

    def entry_status(self, directory, name):
        """lstat(2) of a name in the working directory."""
        self._call("lstat", name)
        return directory.entries[name]

    @system_call
    def fchdir(self, node=None):
        """To a directory, or back to where the process started."""
        self._call("fchdir")
        if node is not None:
            node.insist_on(1)

    def getdents(self, node):
        self._call("getdents")
        return list(node.entries)


# --- What the sections below share -------------------------------------------


class Thrown(Exception):
    """Anything that the program throws; no handler looks at what it is."""


def quietly(call, *arguments):
    """Whether a call succeeded."""
    try:
        call(*arguments)
    except OSError:
        return False
    return True


def shown(text):
    """A text as an argument of a printed line: up to its first NUL."""
    return text.split("\0", 1)[0]


UNSET_VERSION = (-1, "", -1, -1)
INT_MAX = 2147483647
LONG_MAX = 9223372036854775807
# How much is read at a time; the outcome does not depend on it.
READ_SIZE = 4096


def schema_of_data_file(entry):
    """A regular file that others may read, of the right name."""
    name, node = entry
    match = re.fullmatch(r"icutz([0-9]+[lbe])\.dat", name)
    readable = node.kind == "file" and node.mode & 0o004
    return match.group(1) if match and readable else ""


class Boot:
    """One pass over one kernel.

    `lines` gets (text, error) for every line that is printed, without the name of
    the program. The text of `error` ends the line; None: it may be any.
    """
    def __init__(self, kernel):
        self.kernel = kernel
        self.lines = []

    def warn(self, form: str, *arguments):
        text = form % tuple(shown(a) if isinstance(a, str) else a for a in arguments)
        self.lines.append((text, self.kernel.last_error))

    # --- 2. The primitives --------------------

    def remove(self, path):
        try:
            self.kernel.unlink(path)
        except OSError as failed:
            if failed.errno == ENOENT:
                return
            self.warn(lines.REMOVE, path)
            raise Thrown from failed

    def exists(self, path):
        return quietly(self.kernel.access, path)

    def read_symlink(self, path):
        try:
            return self.kernel.readlink(path)[:1024]
        except OSError as failed:
            if failed.errno == ENOENT:
                return ""
            self.warn(lines.READ_SYMLINK, path)
            raise Thrown from failed

    def create_symlink(self, target, link):
        try:
            self.kernel.symlink(target, link)
        except OSError as failed:
            self.warn(lines.CREATE_SYMLINK, link, target)
            raise Thrown from failed

    def c_library_remove(self, path):
        """remove(3): also an empty directory, which unlink(2) tells by EISDIR. Its
        result is ignored wherever it is used."""
        try:
            self.kernel.unlink(path)
        except OSError as failed:
            if failed.errno == EISDIR:
                quietly(self.kernel.rmdir, path)

    # --- 3. The first word of a file --------------------

    def is_special(self, path):
        """A FIFO or a device, which is never opened. Nothing requires this question:
        what it leaves does not show."""
        last_error = self.kernel.last_error
        try:
            return self.kernel.stat(path).kind in ("fifo", "device")
        except OSError:
            return False
        finally:
            self.kernel.last_error = last_error

    def first_word(self, path):
        """Empty where there is no such file, nothing that can be read, or no word. When
        reading fails midway the word is what came before."""
        if self.is_special(path):
            return ""
        try:
            file = self.kernel.open(path)
        except OSError:
            return ""
        text = ""
        with suppress(OSError):
            while True:
                some = self.kernel.read(file, READ_SIZE, len(text))
                text += some
                word_has_ended = re.compile(r"[^ \t-\r][ \t-\r]").search(
                    text, max(0, len(text) - len(some) - 1))
                if not some or word_has_ended:
                    break
        self.kernel.close()
        return re.match(r"[ \t-\r]*([^ \t-\r]*)", text)[1]

    # --- 4. The walk through a directory of ICU data --------------------

    def icu_schema(self, dataset_path):
        """The schema of an update: that of the first data file, in listing order;
        empty where there is none."""
        schema = self.walk(dataset_path + "/icutz", schema_of_data_file)
        if not schema:
            self.warn(lines.NO_SCHEMA, dataset_path)
        return schema

    def walk(self, root, schema_of):
        """What `schema_of` gives for the first direct entry for which it gives
        something. Entries that cannot be examined do not count.

        These are the calls of fts(3) as the GNU C library makes them for the
        options physical, follow the root, one device. What they come to: a
        directory that cannot be examined, opened or entered has no entries; a
        listing that breaks off has those read so far; an entry that cannot be
        examined does not count; what fails on the way out changes nothing. fts(3)
        wants to be able to come back to the working directory: if that cannot be
        opened it does without changing directories, and if it cannot be entered
        the walk is over.
        """
        kernel = self.kernel
        directory = None
        try:
            directory = kernel.stat(root)
        except OSError:
            quietly(kernel.lstat, root)  # a dangling link, or nothing at all?
        moves = quietly(kernel.open, ".")

        def go_back():
            return not moves or quietly(kernel.fchdir)

        found, to_the_end = "", go_back()
        if to_the_end and directory is not None and directory.kind == "dir":
            entered, entries = self.list_entries(root, directory, moves)
            found = next((schema for schema in map(schema_of, entries) if schema), "")
            if entered and not found:
                to_the_end = go_back()  # from the last entry
        if to_the_end and not found:
            kernel.last_error = 0  # so fts(3) tells the end from a failure
        go_back()
        if moves:
            kernel.close()
        return found

    def list_entries(self, root, directory, moves):
        """(whether the directory was entered, its entries as (name, node))"""
        kernel = self.kernel
        if not quietly(kernel.open, root):
            return False, []
        entries = []
        is_directory = quietly(kernel.fstat)
        entered = is_directory and (not moves or
                                    (quietly(kernel.fstat)
                                     and quietly(kernel.fchdir, directory)))
        if entered:
            last_error = kernel.last_error
            try:
                for name in kernel.getdents(directory):
                    with suppress(OSError):
                        node = (kernel.entry_status(directory, name)
                                if moves else kernel.lstat(root + "/" + name))
                        entries.append((name, node))
                kernel.getdents(directory)  # the end of the list
            except OSError as failed:
                if failed.errno == ENOENT:
                    kernel.last_error = last_error  # deleted: that is an end, too
        kernel.close()
        return entered, entries

    # --- 5. Version texts --------------------

    def parse_version(self, text):
        """(year, letters, major, minor), which compare as versions do."""
        match = re.fullmatch(r"([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?", text)
        if not match:
            self.warn(lines.VERSION_GROUPS, text, 0)
            self.warn(lines.VERSION, text)
            return UNSET_VERSION

        def number(digits):
            if digits is None:
                return -1
            digits = digits.lstrip("0") or "0"
            if len(digits) > 10 or int(digits) > INT_MAX:
                if len(digits) > 19 or int(digits) > LONG_MAX:
                    self.kernel.last_error = ERANGE  # as strtol(3) leaves it
                raise Thrown
            return int(digits)

        year, letters, major, minor = match.groups()
        return number(year), letters, number(major), number(minor)

    # --- 6. Components and data sets --------------------

    def data_set(self, path):
        """Builds the data set of a path, the empty one that of the system."""
        release = self.first_word(zoneinfo_path(path) + "/+VERSION")
        if path == "":
            version_text = release + ".1.0"
        elif len(path) >= 21 and path[:20] == DOWNLOADS:
            version_text = path[20:]
        else:
            self.warn(lines.BAD_PATH, path)
            raise Thrown
        version = self.parse_version(version_text)
        schema = (self.first_word(SYSTEM_ICU + "/icutzformat.txt") if path == ""
                  else self.icu_schema(path))
        return DataSet(path, version_text, version, schema)

    def activate(self, data_set):
        try:
            self.remove(ZONEINFO)
        except Thrown:
            self.warn(lines.ZONEINFO_NOT_UNLINKED)
        self.create_symlink(zoneinfo_path(data_set.path), ZONEINFO)
        try:
            self.remove(ICUTZ)
            self.remove(LEGACY_ICUTZ)
        except Thrown:
            self.warn(lines.ICU_NOT_UNLINKED)
        if data_set.path != "":
            self.create_symlink(data_set.path + "/icutz", ICUTZ)

    def reset_to_system_partition(self):
        self.activate(self.data_set(""))

    # --- 7. The link that is in use --------------------

    def current_dataset_path(self):
        target = self.read_symlink(ZONEINFO)
        if len(target) >= 21 and target[:20] == DOWNLOADS:
            last_slash = target.rindex("/")
            if last_slash > 20:
                return target[:last_slash]
        elif target == SYSTEM_ZONEINFO:
            return ""
        self.warn(lines.BAD_LINK, target)
        raise Thrown

    # --- 8. The legacy link, local time, the record --------------------

    def migrate_legacy_icu_link(self):
        if self.exists(LEGACY_ICUTZ) and not self.exists(ICUTZ):
            try:
                self.create_symlink(self.read_symlink(LEGACY_ICUTZ), ICUTZ)
            except Thrown:
                self.warn(lines.NOT_MIGRATED)
        if self.exists(LEGACY_ICUTZ):
            try:
                self.remove(LEGACY_ICUTZ)
            except Thrown:
                self.warn(lines.LEGACY_NOT_REMOVED)

    def repair_localtime_link(self):
        try:
            target = self.read_symlink(LOCALTIME)
            if target[:25] == ZONEINFO:
                return
            if target[:19] != FORMER_ZONEINFO:
                raise Thrown
            corrected = ZONEINFO + target[19:]
            self.warn(lines.CORRECTING, corrected)
            if not self.exists(corrected):
                raise Thrown
            self.c_library_remove(LOCALTIME)
            self.create_symlink(corrected, LOCALTIME)
        except Thrown:
            self.warn(lines.LOCALTIME_INVALID, DEFAULT_ZONE)
            self.c_library_remove(LOCALTIME)
            self.create_symlink(DEFAULT_LOCALTIME, LOCALTIME)

    def write_record(self, old, new):
        """Quiet, even if all of it fails."""
        if self.is_special(RECORD):
            return
        try:
            file = self.kernel.create(RECORD)
        except OSError:
            return
        quietly(self.kernel.write, file, old.version_text + "_" + new.version_text)
        self.kernel.close()

    # --- 9. The pass --------------------

    def run(self):
        # The protection classes: this platform has none.
        self.migrate_legacy_icu_link()
        self.c_library_remove(OLD_ICU)
        try:
            self.select_data_set()
        except Thrown:
            self.warn(lines.NO_DATA)
            self.reset_to_system_partition()
        self.repair_localtime_link()

    def select_data_set(self):
        system = self.data_set("")
        latest = self.read_symlink(TZ_LATEST)
        try:
            current_path = self.current_dataset_path()
        except Thrown:
            self.warn(lines.INVALID_LINKS)
            self.reset_to_system_partition()
            current_path = ""
        current = self.data_set(current_path)
        if current.schema == system.schema and not system.version > current.version:
            active = current
        else:
            self.warn(lines.INCOMPATIBLE)
            self.reset_to_system_partition()
            active = system
        if latest == "":
            return
        update = self.data_set(latest)
        # Compared with the current set, also when the links have been reset.
        if update.schema == system.schema and update.version > current.version:
            self.activate(update)
            self.write_record(active, update)
        else:
            self.warn(lines.NOT_NEWER, update.version_text, current.version_text)


class DataSet(NamedTuple):
    path: str
    version_text: str
    version: tuple
    schema: str


def zoneinfo_path(path):
    return SYSTEM_ZONEINFO if path == "" else path + "/zoneinfo"


class Outcome:
    """What one boot comes to; the device itself has been changed."""
    def __init__(self, kernel, lines, ending):
        self.calls, self.lines = kernel.calls, lines
        self.ending = ending  # "exit 0", "abort" or "killed"


def boot(device, fault=None, killed_before=None):
    """Boots a device, which changes it; the arguments are those of Kernel."""
    kernel = Kernel(device, fault, killed_before)
    pass_ = Boot(kernel)
    try:
        pass_.run()
        ending = "exit 0"
    except Thrown:
        ending = "abort"  # nobody caught it
    except Killed:
        ending = "killed"
    return Outcome(kernel, pass_.lines, ending)
