#!/usr/bin/env -S python3 -B
# SPDX-License-Identifier: BSD-2-Clause
"""What a power cut leaves of a log of writes, on a disk of six blocks."""

import pathlib
import random
import struct
import tempfile
import unittest

from power_log import (BLOCK, DISCARD, FLUSH, FUA, MAGIC, SECTOR, BadLog,
                       cut_power, requests)

HEAD = struct.pack("<QQQI", MAGIC, 1, 0, SECTOR).ljust(SECTOR, b"\0")


def write(block, letters, flags=0):
  data = b"".join(letter.encode() * BLOCK for letter in letters)
  entry = struct.pack("<QQQQ", block * BLOCK // SECTOR, len(data) // SECTOR,
                      flags, 0)
  return entry.ljust(SECTOR, b"\0") + data


def flush():
  return struct.pack("<QQQQ", 0, 0, FLUSH, 0).ljust(SECTOR, b"\0")


class PowerCut(unittest.TestCase):

  def left(self, *log, chance=0.0, seed=1):
    """The blocks of the disk after the cut, a letter each."""
    with tempfile.TemporaryDirectory() as directory:
      disk = pathlib.Path(directory) / "disk"
      disk.write_bytes(b"-" * 6 * BLOCK)
      cut_power(disk, HEAD + b"".join(log), chance, random.Random(seed))
      after = disk.read_bytes()
    blocks = [after[at:at + BLOCK] for at in range(0, len(after), BLOCK)]
    self.assertTrue(all(len(set(block)) == 1 for block in blocks), "torn")
    return "".join(chr(block[0]) for block in blocks)

  def test_keeps_what_was_flushed(self):
    self.assertEqual(self.left(write(0, "ab"), flush(), write(2, "c")), "ab----")

  def test_takes_a_flush_only_for_what_came_before_it(self):
    self.assertEqual(self.left(write(0, "a"), flush(), write(0, "b")), "a-----")

  def test_keeps_what_was_written_through(self):
    self.assertEqual(self.left(write(0, "a"), write(1, "b", FUA)), "-b----")

  def test_keeps_the_rest_when_chance_wills(self):
    self.assertEqual(self.left(write(0, "abc"), chance=1.0), "abc---")

  def test_loses_any_of_the_rest(self):
    log = [write(0, "ab"), write(2, "cd")]
    seen = {self.left(*log, chance=0.5, seed=seed) for seed in range(200)}
    self.assertEqual(len(seen), 16)

  def test_ignores_a_discard_and_a_request_that_was_not_logged_whole(self):
    discard = write(0, "x", DISCARD)[:SECTOR]
    self.assertEqual(self.left(discard, write(1, "b"), write(2, "cd")[:-1],
                               chance=1.0), "-b----")

  def test_leaves_the_disk_alone_without_a_log(self):
    self.assertEqual(list(requests(b"")), [])

  def test_rejects_what_is_no_log(self):
    with self.assertRaises(BadLog):
      list(requests(bytes(SECTOR)))


if __name__ == "__main__":
  unittest.main()
