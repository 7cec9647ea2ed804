# SPDX-License-Identifier: BSD-2-Clause
"""The carrier with a kernel and a disk of its own: ext4 images, which the tools of
e2fsprogs build and read without any privilege. Only the emulated device mounts them.

What this carrier cannot hold, or a boot there does otherwise than on a private device:
- A name cannot have a quote or a line end in it, because debugfs cannot be told.
- What its owner may not read can be put there by root only, because mke2fs reads it.
- ext4 lists directories in an order of its own, which only a device's kernel can tell.
- arm64 has other names for some system calls, and nothing traces them there.
"""

import hashlib
import os
import re
import stat
import subprocess
import tempfile
from pathlib import Path

from lab.carriers.namespace import build_below
from lab.words.device import Node, decoded, encoded
from lab.words.seen import Entries, Entry, KINDS

ENVIRONMENT = {**os.environ, "PATH": os.environ["PATH"] + ":/usr/sbin:/sbin"}


def run(*command, accept=(0,), **options) -> str:
    """Runs a tool. What it prints, errors included, is returned, or raised when it
    ends with another status."""
    done = subprocess.run([str(word) for word in command], stdout=subprocess.PIPE,
                          env=ENVIRONMENT, check=False,
                          **{"stderr": subprocess.STDOUT, **options})
    if done.returncode not in accept:
        raise RuntimeError(f"{command[0]} ended with status {done.returncode}:\n" +
                           done.stdout.decode(errors="replace"))
    return decoded(done.stdout)


def debugfs(image: Path, *requests: str, write=False) -> list[str]:
    """What each request prints; raises where one cannot be met."""
    with tempfile.TemporaryFile() as errors:
        printed = run("debugfs", *["-w"] * write, "-f", "-", image, stderr=errors,
                      input=encoded("\n".join([*requests, ""])))
        errors.seek(0)
        _, *complaints = errors.read().splitlines()  # its name and version come first
    if complaints:
        raise RuntimeError(f"debugfs of {image}: {complaints}")
    return re.split(r"debugfs: .*\n", printed)[1:]


def build(image: Path, root: Node, megabytes: int, *options: str, owner=0):
    """Makes an image that holds this tree, of which everything is the owner's."""
    image.unlink(missing_ok=True)
    with tempfile.TemporaryDirectory() as staging:
        build_below(staging, root, exists=True)
        run("mke2fs", "-q", "-t", "ext4", "-b", "4096", "-m", "0",
            "-E", "root_owner=0:0,lazy_itable_init=0,lazy_journal_init=0",
            *options, "-d", staging, image, f"{megabytes}M")
    _, *paths = (path for path, _ in root.everything(""))
    debugfs(image, *(f'sif "{path}" uid {owner}' for path in paths), write=True)


LISTED = re.compile(r"^/(\d+)/(\d+)/\d+/\d+/(.*)/(\d*)/$", re.MULTILINE)
LONGEST_IN_INODE = 59  # a link's target that is longer has a block


def look(image: Path, place: str, path: str) -> Entries:
    """Everything below a directory of an image, under the path that it has on the
    device; level by level."""
    entries, level = {}, [(path, "dir", f'"{place}"', "ls -p")]
    while level:
        told = debugfs(image, *(f"{verb} {inode}" for _, _, inode, content in level
                                for verb in ("stat", content)))
        below = []
        for (path, kind, _, _), status, text in zip(level, told[::2], told[1::2],
                                                    strict=True):
            here = entries[path] = Entry(
                kind, int(re.search(r"Mode: +(\d+)", status)[1], 8),
                identity=tuple(re.findall(r"(?:Inode|mtime|ctime): +(\S+)", status)))
            if kind == "dir":
                for inode, mode, name, size in LISTED.findall(text):
                    if name not in (".", "..") and inode != "0":  # 0: removed
                        here.names.append(name)
                        below.append((f"{path}/{name}", *kind_and_content(
                            int(mode, 8), f"<{inode}>", size)))
            elif short := re.search(r'^Fast link dest: "(.*)"$', status, re.M | re.S):
                here.text = short[1]
            elif kind in ("file", "link"):
                here.text = text
        level = below
    return entries


def kind_and_content(mode, inode, size):
    """What stands in an inode, and the request that shows its content."""
    kind = KINDS.get(stat.S_IFMT(mode), "something else")
    if kind == "dir":
        return kind, inode, "ls -p"
    in_a_block = kind == "link" and int(size) > LONGEST_IN_INODE
    return kind, inode, "cat" if kind == "file" or in_a_block else "stat"


def check(image: Path):
    """Raises with what fsck.ext4 finds in a file system that is not sound."""
    run("fsck.ext4", "-fn", image)


def replay_journal(image: Path):
    run("e2fsck", "-p", "-E", "journal_only", image, accept=(0, 1))


def digest(image: Path) -> str:
    return hashlib.sha256(image.read_bytes()).hexdigest()
