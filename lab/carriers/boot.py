# SPDX-License-Identifier: BSD-2-Clause
"""The real program, once, on the device of this namespace; and its system calls, seen
and disturbed with strace."""

import collections
import errno
import os
import re
import signal
from collections.abc import Iterator, Sequence
from typing import NamedTuple

from lab.carriers.namespace import insist_on_private_device
from lab.words.places import BUILD
from lab.words.seen import Call

PROGRAM = os.path.abspath(os.environ.get("MARLIN", BUILD / "release" / "marlin"))
SECONDS = 30  # a boot that takes longer hangs


class Booted(NamedTuple):
    ending: str  # as in Seen
    log: str


def ending_of(status: int) -> str:
    code = os.waitstatus_to_exitcode(status)
    return {-signal.SIGABRT: "abort", -signal.SIGKILL: "killed"}.get(
        code, f"exit {code}" if code >= 0 else f"signal {-code}")


def boot() -> Booted:
    return run(PROGRAM)


def run(*command: str) -> Booted:
    """Runs a command with nothing but a log at standard error."""
    log, null = os.memfd_create("log"), os.open("/dev/null", os.O_RDWR)
    status = spawn([*command], {0: null, 1: null, 2: log})
    os.close(null)
    os.lseek(log, 0, os.SEEK_SET)
    with open(log, encoding="latin-1", newline="") as printed:
        return Booted(ending_of(status), printed.read())


def spawn(command: list[str], descriptors: dict[int, int | None]) -> int:
    """Runs a command with these descriptors; None is a closed one. Kills it if it
    takes too long. Returns what wait(2) told."""
    insist_on_private_device()
    child = os.posix_spawn(
        command[0], command, {"PATH": "/usr/bin:/bin"},
        file_actions=[
            (os.POSIX_SPAWN_CLOSE, number) if ours is None
            else (os.POSIX_SPAWN_DUP2, ours, number)
            for number, ours in descriptors.items()],
        setsigdef=[signal.SIGPIPE, signal.SIGXFSZ])
    signal.signal(signal.SIGALRM, lambda *_: os.kill(child, signal.SIGKILL))
    signal.alarm(SECONDS)
    status = os.waitpid(child, 0)[1]
    signal.alarm(0)
    return status


TRACE = "/tmp/strace"

# The model's name -> the machine's names for it: on arm64, for one, there is only
# unlinkat for unlink and rmdir. What depends on arguments is in `name_and_path`.
FAMILIES = {
    "access": "access faccessat faccessat2", "readlink": "readlink readlinkat",
    "symlink": "symlink symlinkat", "unlink": "unlink unlinkat", "rmdir": "rmdir",
    "open": "open openat", "read": "read readv preadv pread64",
    "write": "write writev pwrite64", "close": "close", "fchdir": "fchdir",
    "getdents": "getdents64", "stat": "stat newfstatat fstatat64 statx",
    "lstat": "lstat", "fstat": "fstat",
    # Never seen in a boot, but to be noticed.
    "create": "creat", "mkdir": "mkdir mkdirat", "rename": "rename renameat renameat2",
    "link": "link linkat", "chmod": "chmod fchmod fchmodat",
    "truncate": "truncate ftruncate", "fsync": "fsync fdatasync sync syncfs",
    "mknod": "mknod mknodat", "chown": "chown lchown fchown fchownat",
    "statfs": "statfs fstatfs",
    **{name: name for name in ("chdir lseek fcntl flock ioctl utimensat umask clone3 "
                               "memfd_create wait4").split()},
}
NAMES = {call: name for name, calls in FAMILIES.items() for call in calls.split()}
TRACED = ",".join("?" + call for call in NAMES)
WITH_PATH = set("access readlink open create stat lstat symlink unlink rmdir".split())


def traced(*options: str, command: Sequence[str] = (PROGRAM,)) -> Booted:
    """Boots under strace; every line of its log has one whole call."""
    return run("/usr/bin/strace", "-o", TRACE, "-s", "0", *options, *command)


def family(name: str) -> str:
    """What machines call one of the model's calls, of which each makes one, for the
    options below."""
    return ",?".join(FAMILIES[name].split())


def inject(call: str, what: str, when) -> list[str]:
    """The options that disturb a machine's call: `when` is its number, or "3+" for
    the third and all that follow. Not every machine has every call."""
    return ["-e", f"inject=?{call}:{what}:when={when}"]


def failing(call: str, number: int, when) -> list[str]:
    return inject(call, f"error={errno.errorcode[number]}", when)


def killing(call: str, when: int) -> list[str]:
    """The options that kill before the call takes effect."""
    return ["-e", f"trace=?{call}", *inject(call, "signal=KILL", when)]


def calls() -> Iterator[Call]:
    """The calls of the last boot under strace, those before the pass included."""
    counts = collections.Counter()
    with open(TRACE, encoding="latin-1") as log:
        for line in log:
            if match := re.match(r"([a-z0-9_]+)\((.*)", line):
                call, arguments = match.groups()
                counts[call] += 1
                failed = re.search(r" = -1 (E[A-Z0-9]+) [^\"]*$", line)
                yield Call(call, counts[call], *name_and_path(call, arguments),
                           line.endswith("(INJECTED)\n"), failed and failed[1])


def name_and_path(call, arguments):
    name = NAMES.get(call, call)
    # Paths stand in full; of other texts nothing does.
    texts = re.findall(r'"((?:[^"\\]|\\.)*)"(?!\.\.\.)', arguments)
    path = texts[-1].encode("latin-1").decode("unicode_escape") if texts else None
    if name == "unlink" and "AT_REMOVEDIR" in arguments:
        name = "rmdir"
    elif name == "stat" and "AT_EMPTY_PATH" in arguments:
        name, path = "fstat", None
    elif name == "stat" and "AT_SYMLINK_NOFOLLOW" in arguments:
        name = "lstat"
    elif name == "open" and "O_CREAT" in arguments:
        name = "create"
    elif name == "write" and re.match(r"[12], ", arguments):
        name = "print"
    return name, path if name in WITH_PATH else None


def pass_of(all_calls: list[Call]) -> list[Call]:
    """The calls from the first that concerns the device, without the lines that are
    printed."""
    return [call for call in all_calls[beginning(all_calls):]
            if call.name != "print" and call.call in NAMES]


def beginning(all_calls: list[Call]) -> int:
    """Where in a trace the pass begins."""
    return next((index for index, call in enumerate(all_calls)
                 if call.path and call.path.startswith("/var/db/")), len(all_calls))
