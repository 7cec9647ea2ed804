# SPDX-License-Identifier: BSD-2-Clause
"""Every chosen device boots with a log that is gone: closed, full, limited in its size,
read-only, without a reader; or with one that fails in the middle: it takes only a part
of a line, or not the first, second or third line, or none from the second on. The pass
runs to its end and leaves the same device as with a log, no line ever lands in a file
of the device, and the lines that were not hit are in the log.

And with a log that is there every line reaches it whole, in one write. That goes for
lines of up to BUFSIZ bytes, 8192 with the GNU C library; a longer one takes several.
"""

import fcntl
import functools
import itertools
import os
from errno import EAGAIN, EFBIG, EINTR, EIO, ENOSPC, errorcode

import pytest

from lab.carriers import boot, namespace
from lab.oracles import model
from lab.oracles.trial import fail, left, real, undisturbed
from lab.words import lines
from lab.words.chosen_devices import CHOSEN
from lab.words.device import decoded


def pipe_without_reader():
    reader, writer = os.pipe()
    os.close(reader)
    return writer


def pipe_that_takes_no_more():
    """Its reader sleeps, and nobody waits for it."""
    _, writer = os.pipe()
    fcntl.fcntl(writer, fcntl.F_SETFL, os.O_NONBLOCK)
    try:
        while True:
            os.write(writer, b"x" * 4096)
    except BlockingIOError:
        return writer


LIMITED = "file that may not grow"  # nor may the record, in such a boot
LOST_LOGS = {
    LIMITED: lambda: {2: os.memfd_create("log")},
    "file without space": lambda: {2: os.open("/dev/full", os.O_WRONLY)},
    "pipe without reader": lambda: {2: pipe_without_reader()},
    "file to read": lambda: {2: os.open("/dev/null", os.O_RDONLY)},
    "pipe that takes no more": lambda: {2: pipe_that_takes_no_more()},
    **{"closed " + " and ".join(map(str, closed)):
       functools.partial(dict.fromkeys, closed)
       for number in (1, 2, 3) for closed in itertools.combinations(range(3), number)}}

TAKEN = 5  # bytes, of a line of which only a part is taken


def disturbances(name):
    """(what, strace's options, the calls that are hit, the lines that are left) for a
    log that fails in the middle."""
    traced = undisturbed(name).calls
    printed = [lines.NAME + text for text, _ in model.boot(CHOSEN[name]()).lines]
    # On an exception that nobody caught the runtime prints, too.
    prints = [call for call in traced if call.name == "print"][:len(printed)]
    for at, call in enumerate(prints[:3]):
        others = printed[:at] + printed[at + 1:]
        for error in (EIO, EAGAIN, ENOSPC, EINTR):
            yield (f"line {at + 1} fails with {errorcode[error]}",
                   boot.failing(call.call, error, call.number), [call], others)
        # strace has the program believe that they were taken, and takes none.
        yield (f"line {at + 1} is taken in part",
               boot.inject(call.call, f"retval={TAKEN}", call.number), [call],
               printed[:at] + [printed[at][TAKEN:]] + printed[at + 1:])
    for call in prints[1:2]:
        # To strace a record that is written later is one more line.
        later = [other for other in traced
                 if other.call == call.call and other.number >= call.number]
        yield ("the log fails from line 2 on",
               boot.failing(call.call, EIO, f"{call.number}+"), later, printed[:1])


def with_names(_):
    return [pytest.param(name, what, *rest, id=f"{name}: {what}")
            for name in CHOSEN for what, *rest in disturbances(name)]


def boot_without_record(device, is_lost):
    """The model's boot, in which the record is made, and lost if so."""
    return model.boot(device, lambda number, call, path: (
        EFBIG if call == "write" and is_lost else None))


@pytest.mark.parametrize("log", LOST_LOGS)
@pytest.mark.parametrize("name", CHOSEN)
def test_a_lost_log(name, log):
    device, before = real(name)
    outcome = boot_without_record(device, log == LIMITED)
    null = os.open("/dev/null", os.O_RDWR)
    at_start = {0: null, 1: null, 2: null} | LOST_LOGS[log]()
    limit = ["/usr/bin/prlimit", "--fsize=0"] if log == LIMITED else []
    ending = boot.ending_of(boot.spawn([*limit, boot.PROGRAM], at_start))
    for descriptor in {null, *at_start.values()} - {None}:
        os.close(descriptor)
    found = left(device, ending, outcome)
    found += [f"a line landed in {path}" for path, here in namespace.look().items()
              if "marlin" in here.text or "terminate" in here.text]
    fail(log, found, before)


@pytest.mark.parametrize("name", CHOSEN)
def test_lines_in_one_write_each(name, count):
    """Every write to a pipe of packets is read as one."""
    device, before = real(name)
    outcome = model.boot(device)
    reader, writer = os.pipe2(os.O_DIRECT)
    fcntl.fcntl(writer, fcntl.F_SETPIPE_SZ, 1 << 20)
    boot.spawn([boot.PROGRAM], {2: writer})
    os.close(writer)
    writes = [decoded(packet) for packet in iter(lambda: os.read(reader, 1 << 16), b"")]
    os.close(reader)
    printed = [line for line in writes if line.startswith(lines.NAME)]
    count("lines in one write each", len(printed))
    # What follows is the runtime's, on an exception that nobody caught.
    if (len(printed) != len(outcome.lines) or printed != writes[:len(printed)] or
            any(line.find("\n") != len(line) - 1 for line in printed)):
        fail("write by write", [repr(writes)], before)


@pytest.mark.cases("name, what, options, hit, kept", with_names)
def test_a_log_that_fails_in_the_middle(name, what, options, hit, kept):
    """The error texts of the lines that are left may have become those of the log's own
    failure."""
    device, before = real(name)
    outcome = boot_without_record(device, any(call.name == "write" for call in hit))
    booted = boot.traced(*options)
    found = left(device, booted.ending, outcome)
    injected = [call.number for call in boot.calls() if call.injected]
    if injected != [call.number for call in hit]:
        found.append(f"hit were the writes {injected}")
    printed = [line.rpartition(": ")[0] for line in booted.log.splitlines()]
    if (printed[:len(kept)] != kept or
            len(printed) > len(kept) and outcome.ending != "abort"):
        found.append(f"printed {booted.log!r}, expected {kept}")
    fail(what, found, before)
