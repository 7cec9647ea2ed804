# SPDX-License-Identifier: BSD-2-Clause
"""What a power cut leaves of a log of writes, on a disk of six blocks."""

import random
import struct

import pytest

from lab.arm64_device.power_log import (BLOCK, DISCARD, FLUSH, FUA, MAGIC, SECTOR,
                                        cut_power, requests)

HEAD = struct.pack("<QQQI", MAGIC, 1, 0, SECTOR).ljust(SECTOR, b"\0")


def write(block, letters, flags=0):
    data = b"".join(letter.encode() * BLOCK for letter in letters)
    entry = struct.pack("<QQQQ", block * BLOCK // SECTOR, len(data) // SECTOR, flags, 0)
    return entry.ljust(SECTOR, b"\0") + data


FLUSHED = struct.pack("<QQQQ", 0, 0, FLUSH, 0).ljust(SECTOR, b"\0")
NOT_WHOLE = write(2, "cd")[:-1]
DISCARDED = write(0, "x", DISCARD)[:SECTOR]


def left(disk, *log, chance=0.0, seed=1):
    """The blocks of the disk after the cut, a letter each."""
    disk.write_bytes(b"-" * 6 * BLOCK)
    cut_power(disk, HEAD + b"".join(log), chance, random.Random(seed))
    after = disk.read_bytes()
    blocks = [after[at:at + BLOCK] for at in range(0, len(after), BLOCK)]
    assert all(len(set(block)) == 1 for block in blocks), "torn"
    return "".join(chr(block[0]) for block in blocks)


@pytest.mark.parametrize("what, log, chance, expected", [
    ("flushed is kept", [write(0, "ab"), FLUSHED, write(2, "c")], 0.0, "ab----"),
    ("a flush is for what came before", [write(0, "a"), FLUSHED, write(0, "b")], 0.0,
     "a-----"),
    ("written through is kept", [write(0, "a"), write(1, "b", FUA)], 0.0, "-b----"),
    ("the rest is kept if chance wills", [write(0, "abc")], 1.0, "abc---"),
    ("a discard and half a request do not count", [DISCARDED, write(1, "b"), NOT_WHOLE],
     1.0, "-b----"),
])
def test_a_power_cut(tmp_path, what, log, chance, expected):
    assert left(tmp_path / "disk", *log, chance=chance) == expected, what


def test_any_of_the_rest_is_lost(tmp_path):
    log = [write(0, "ab"), write(2, "cd")]
    seen = {left(tmp_path / "disk", *log, chance=0.5, seed=seed) for seed in range(200)}
    assert len(seen) == 16


def test_no_log_has_no_requests():
    assert not list(requests(b""))
    with pytest.raises(ValueError, match="not a log of writes"):
        list(requests(bytes(SECTOR)))
