# SPDX-License-Identifier: BSD-2-Clause
"""The system calls of a boot, seen and disturbed with strace.

A model's call has one name, whatever the machine's calls are called: on arm64,
for one, there is only unlinkat for unlink and rmdir.
"""

import collections
import errno
import re

import device as real

LOG = "/tmp/strace"

# Machine's calls -> the model's name; what depends on the arguments is in
# `Call`.
NAMES = {
    "access": "access", "faccessat": "access", "faccessat2": "access",
    "readlink": "readlink", "readlinkat": "readlink",
    "symlink": "symlink", "symlinkat": "symlink",
    "unlink": "unlink", "unlinkat": "unlink", "rmdir": "rmdir",
    "open": "open", "openat": "open",
    "pread64": "pread", "write": "write", "close": "close",
    "fchdir": "fchdir", "getdents64": "getdents",
    "stat": "stat", "lstat": "lstat", "fstat": "fstat", "newfstatat": "stat",
    "fstatat64": "stat", "statx": "stat",
    # Not to be seen in a boot, but to be noticed if it were.
    "creat": "create", "mkdir": "mkdir", "mkdirat": "mkdir",
    "rename": "rename", "renameat": "rename", "renameat2": "rename",
    "link": "link", "linkat": "link", "chmod": "chmod", "fchmod": "chmod",
    "fchmodat": "chmod", "truncate": "truncate", "ftruncate": "truncate",
    "read": "read", "readv": "read", "preadv": "read", "writev": "write",
    "pwrite64": "write", "chdir": "chdir", "lseek": "lseek", "fcntl": "fcntl",
    "ioctl": "ioctl", "fsync": "fsync", "fdatasync": "fsync", "sync": "fsync",
    "utimensat": "utimens", "mknod": "mknod", "mknodat": "mknod",
    "chown": "chown", "lchown": "chown", "fchown": "chown",
    "fchownat": "chown", "statfs": "statfs", "fstatfs": "statfs",
}
TRACED = ",".join("?" + name for name in NAMES)

# `call` is the machine's name and `number` counts its calls by that name, as
# strace does; `name` and `path` are the model's; `injected`: whether strace
# made it fail.
Call = collections.namedtuple("Call", "call number name path injected")


def run(marlin, *options):
  """Boots under strace; every line of the log has one whole call."""
  return real.boot(["/usr/bin/strace", "-o", LOG, "-s", "0",
                    *options, marlin])


def failing(call, error, when):
  """The options that make a machine's call fail: `when` is its number, or "3+"
  for the third and all that follow. Not every machine has every call."""
  return ["-e", f"inject=?{call}:error={errno.errorcode[error]}:when={when}"]


def calls():
  """The calls in the log, those before and after the pass included."""
  counts = collections.Counter()
  with open(LOG, encoding="latin-1") as log:
    for line in log:
      match = re.match(r"([a-z0-9_]+)\((.*)", line)
      if match:
        call, arguments = match.groups()
        counts[call] += 1
        yield Call(call, counts[call], *name_and_path(call, arguments),
                   line.endswith("(INJECTED)\n"))


def name_and_path(call, arguments):
  name = NAMES.get(call, call)
  # Paths stand in full; of other texts nothing does.
  paths = [unescaped(text) for text in
           re.findall(r'"((?:[^"\\]|\\.)*)"(?!\.\.\.)', arguments)]
  path = paths[-1] if paths else None
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
  if name in ("access", "readlink", "open", "create", "stat", "lstat",
              "symlink", "unlink", "rmdir"):
    return name, path
  return name, None


def unescaped(text):
  plain = {"n": "\n", "t": "\t", "v": "\v", "f": "\f", "r": "\r"}
  return re.sub(
      r"\\([0-7]{1,3}|.)",
      lambda match: (chr(int(match[1], 8)) if match[1][0] in "01234567"
                     else plain.get(match[1], match[1])), text)


def calls_of_the_pass():
  """The calls from the first that concerns the device, without the lines that
  are printed."""
  return pass_of(list(calls()))


def pass_of(traced):
  return [call for call in traced[beginning(traced):]
          if call.name != "print" and call.call in NAMES]


def beginning(traced):
  """Where in a trace the pass begins."""
  return next((index for index, call in enumerate(traced)
               if call.path and call.path.startswith("/var/db/")), len(traced))
