# SPDX-License-Identifier: BSD-2-Clause
"""Several installers at once, and updates that change while they are installed."""

import contextlib
import itertools
import os
import random
import re
import subprocess
import tempfile
import threading
import time
from pathlib import Path

import pytest

from lab.carriers import namespace
from lab.oracles.installer import (DONE, FAILED, NEW, PROGRAM, SOURCE, announced, below,
                                   first, hidden, manifest, names, next_boot,
                                   put_update, run)
from lab.oracles.trial import fail
from lab.words.device import Device
from lab.words.paths import update_path
from lab.words.places import PROJECT

INCOMING = "/var/db/incoming/"


def several(count: int) -> Device:
    device = first()
    for number in range(count):
        put_update(device, f"{INCOMING}2024b.1.{number}", "2024b")
    return device


@pytest.mark.parametrize("turn", range(30))
def test_several_at_once(turn, count):
    """One works, the others say so in a line; each of them prunes now and then."""
    chance = random.Random(turn)
    namespace.build(several(6))
    before = namespace.look()
    running = [subprocess.Popen(
        [PROGRAM, "--prune" if chance.random() < 0.2 else
         f"{INCOMING}2024b.1.{number}"],
        stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True)
        for number in chance.sample(range(6), 6)]
    ended = [(each.communicate()[1], each.returncode, each.args[1]) for each in running]
    after = namespace.look()
    found = [f"{log!r}, status {status}" for log, status, _ in ended
             if status not in (0, 3, 4) or log.count("\n") != (status != 0)]
    done = [word.removeprefix(INCOMING) for _, status, word in ended
            if status == 0 and word != "--prune"]
    if announced(after) != (update_path(max(done)) if done else None):
        found.append(f"done are {done}, announced is {announced(after)}")
    if set(names(after)) - set(done) or hidden(after):
        found.append(f"done are {done}, but there are {names(after)}")
    fail("several at once", found, before)
    count("of them busy", sum(status == 3 for _, status, _ in ended))
    next_boot(after)


@contextlib.contextmanager
def changing(seed: int):
    """Meanwhile a zone of the update is replaced by one thing after the other, without
    a pause."""
    place = f"{SOURCE}/zoneinfo/Europe/Paris"
    stopped, chance = threading.Event(), random.Random(seed)

    def file(content: bytes):
        return lambda path: Path(path).write_bytes(content)

    things = itertools.cycle([
        file(Path(place).read_bytes()), file(b"TZif of a sort"),
        lambda path: os.symlink("/etc/passwd", path), os.mkfifo])

    def change():
        while not stopped.is_set():
            next(things)(place + ".next")
            os.rename(place + ".next", place)
            if chance.random() < 0.1:
                time.sleep(0.01)

    thread = threading.Thread(target=change)
    thread.start()
    try:
        yield
    finally:
        stopped.set()
        thread.join()


@pytest.mark.parametrize("seed", range(20))
def test_an_update_that_changes_meanwhile(seed, count):
    """What is installed is what the manifest says, or nothing is."""
    namespace.build(first())
    before = namespace.look()
    with changing(seed):
        for _ in range(20):
            told = run(["--force", SOURCE])
            if told.ending == DONE:
                break
            if told.ending != FAILED or told.log.count("\n") != 1:
                fail("an update that changes", [f"{told}"], before)
            count("refused")
    after = namespace.look()
    found = hidden(after)
    if announced(after):
        count("installed")
        if below(after, update_path(NEW)) != below(before, SOURCE):
            found.append("what is installed is not what the manifest says")
    elif NEW in names(after):
        found.append("a set is there that is not announced")
    fail("an update that changes", found, before)


def damage(chance: random.Random) -> bool:
    """Does one thing to an update; whether it is the manifest that was damaged."""
    files = sorted(path for path in Path(SOURCE).rglob("*") if path.is_file())
    path, other = chance.sample(files, 2)
    content = bytearray(path.read_bytes())
    at = chance.randrange(len(content))
    kind = chance.randrange(8)
    if kind < 4:
        content[at] ^= 1 << chance.randrange(8)
        path.write_bytes(content)
    elif kind == 4:
        path.write_bytes(content[:at])
    elif kind == 5:
        path.unlink()
    elif kind == 6:
        path.with_name(f"{path.name}x").write_bytes(content)
    else:
        other.write_bytes(content)
    return "SHA256SUMS" in (path.name, other.name)


@pytest.mark.parametrize("turn", range(20))
def test_damage(turn, count):
    """sha256sum(1) and the installer agree, but for a manifest that is not as
    sha256sum(1) prints it: that is refused."""
    for seed in range(turn * 50, turn * 50 + 50):
        namespace.build(first())
        before = namespace.look()
        of_manifest = damage(random.Random(seed))
        listed = re.findall(r"(?m)^.{66}(.*)$", Path(
            f"{SOURCE}/SHA256SUMS").read_text("latin-1")) if os.path.exists(
                f"{SOURCE}/SHA256SUMS") else []
        there = {str(path.relative_to(SOURCE)) for path in Path(SOURCE).rglob("*")
                 if path.is_file() and not path.name.startswith("SHA256SUMS.")}
        sound = there == {*listed, "SHA256SUMS"} and not subprocess.run(
            ["sha256sum", "-c", "--strict", "--status", "SHA256SUMS"], cwd=SOURCE,
            stderr=subprocess.DEVNULL).returncode
        told = run([SOURCE])
        taken = told.ending == DONE
        if taken > sound or taken < sound and not of_manifest:
            fail(f"damage {seed}", [f"sound: {sound}; {told}"], before)
        count("damages refused" if not taken else "damages that leave it as it was")


SIGN = {"signify": "signify-openbsd -G -n -p {key}.pub -s {key}.sec\n"
                   "signify-openbsd -S -s {key}.sec -m {sums}",
        "minisign": "minisign -G -W -p {key}.pub -s {key}.sec\n"
                    "minisign -S -s {key}.sec -m {sums}"}


@pytest.mark.parametrize("tool", SIGN)
def test_a_signature(tool, count):
    """By the examples: a signed update is installed, also if it is exchanged while the
    signature is checked; one that was changed afterwards is not, with a manifest that
    fits, nor one without a signature."""
    here = Path(tempfile.mkdtemp())
    example = Path(PROJECT, f"packaging/examples/verify-{tool}").read_text()
    verify, exchange = here / "verify", here / "exchange"
    verify.write_text(example.replace("/etc/marlin-update.pub", f"{here}/key.pub"))
    assert str(here) in verify.read_text()
    exchange.write_text(f"#!/bin/sh\necho more >>{SOURCE}/zoneinfo/MET\n"
                        f'echo more >{SOURCE}/SHA256SUMS\nexec {verify} "$1"\n')
    for program in (verify, exchange):
        program.chmod(0o755)

    def sealed(sign=False):
        Path(SOURCE, "SHA256SUMS").write_text(manifest({
            str(path.relative_to(SOURCE)): path.read_text()
            for path in Path(SOURCE).glob("*/**/*") if path.is_file()}))
        if sign:
            script = SIGN[tool].format(key=here / "key", sums=f"{SOURCE}/SHA256SUMS")
            subprocess.run(["/bin/sh", "-euc", script], check=True, capture_output=True)

    def ends(program, ending):
        told = run(["--verify", str(program), SOURCE])
        assert told.ending == ending, f"{told}"
        count(f"that end with {ending}")

    namespace.build(first())
    ends(verify, FAILED)
    sealed(sign=True)
    Path(SOURCE, "zoneinfo/MET").write_text("TZif, another")
    sealed()
    ends(verify, FAILED)
    assert announced(namespace.look()) is None
    (here / "key.pub").unlink()
    (here / "key.sec").unlink()
    sealed(sign=True)
    before = namespace.look()
    ends(exchange, DONE)
    after = namespace.look()
    assert below(after, update_path(NEW)) == below(before, SOURCE)
    assert below(after, SOURCE) != below(before, SOURCE)
    next_boot(after)
