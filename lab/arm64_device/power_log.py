# SPDX-License-Identifier: BSD-2-Clause
"""What a disk with a volatile cache holds after a power cut.

The emulator logs all that the device asks of the disk, in order (its driver
blklogwrites; the format is that of the kernel's dm-log-writes: a sector that describes
the log, then for each request a sector and its data). What was written before the last
flush is on the disk; of what came after it, every block of 4096 bytes may have got
there or not, in any order.
"""

import random
import struct
from collections.abc import Iterator
from pathlib import Path

SECTOR = 512
BLOCK = 4096
MAGIC = 0x6a736677736872
FLUSH, FUA, DISCARD = 1, 2, 4


def requests(log: bytes) -> Iterator[tuple[int, int, bytes]]:
    """Flags, offset and data of each request that was logged whole."""
    if len(log) < SECTOR:
        return
    magic, version, _, sector = struct.unpack_from("<QQQI", log)
    if magic != MAGIC or version != 1 or sector != SECTOR:
        raise ValueError("this is not a log of writes")
    at = SECTOR
    while at + SECTOR <= len(log):
        first, count, flags, _ = struct.unpack_from("<QQQQ", log, at)
        at += SECTOR
        size = 0 if flags & DISCARD else count * SECTOR
        if at + size > len(log):
            return
        yield flags, first * SECTOR, log[at:at + size]
        at += size


def cut_power(disk: Path, log: bytes, chance: float, source: random.Random) -> int:
    """Brings an image, as it was when the log began, to a state that the cut can have
    left; each block that was not flushed is kept with this chance. Returns how many
    blocks are lost."""
    asked = list(requests(log))
    flushed = max((number for number, (flags, _, _) in enumerate(asked)
                   if flags & FLUSH), default=-1)
    lost = 0
    with open(disk, "r+b") as image:
        for number, (flags, offset, data) in enumerate(asked):
            for start in range(0, len(data), BLOCK):
                if number < flushed or flags & FUA or source.random() < chance:
                    image.seek(offset + start)
                    image.write(data[start:start + BLOCK])
                else:
                    lost += 1
    return lost
