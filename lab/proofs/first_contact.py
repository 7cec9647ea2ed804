# SPDX-License-Identifier: BSD-2-Clause
"""What a newcomer meets: doors that explain themselves, a machine that lacks something,
a checkout in an odd place. No test installs anything."""

import os
import re
import shutil
import subprocess
from pathlib import Path

import pytest

from lab.carriers import building
from lab.words.places import PROJECT

DOORS = sorted(door for door in (PROJECT / "scripts").iterdir()
               if os.access(door, os.X_OK) and door.is_file())
REFUSAL = "bwrap: No permissions to create a new namespace"


def run(*words, **environment) -> subprocess.CompletedProcess:
    return subprocess.run(
        words, env={**os.environ, **environment}, stdin=subprocess.DEVNULL,
        capture_output=True, text=True, cwd="/")


def told(done: subprocess.CompletedProcess, status: int) -> str:
    """The one line with which a command has ended."""
    assert (done.returncode, done.stdout) == (status, ""), done.stdout + done.stderr
    assert done.stderr.count("\n") == 1, done.stderr
    return done.stderr


@pytest.fixture
def fakes(tmp_path):
    """fakes(name=script...) tells a PATH on which these programs come first; with
    `alone` it has them, and those of this machine that are named there, only."""
    def path(alone="", **scripts):
        scripts |= {tool: f'exec /usr/bin/{tool} "$@"' for tool in alone.split()}
        for name, script in scripts.items():
            program = tmp_path / "fakes" / name.replace("_", "-")
            program.parent.mkdir(exist_ok=True)
            program.write_text(f"#!/bin/sh\n{script}\n")
            program.chmod(0o755)
        return f"{tmp_path}/fakes" + ("" if alone else f":{os.environ['PATH']}")
    return path


def copied(place: Path) -> Path:
    """A checkout with all that git has of it."""
    return shutil.copytree(PROJECT, place, symlinks=True,
                           ignore=shutil.ignore_patterns("build", ".git"))


@pytest.mark.parametrize("door", [*DOORS, PROJECT / ".ci/run"],
                         ids=lambda door: door.name)
def test_doors_explain_themselves(door, tmp_path):
    done = run(door, "--help", MARLIN_BUILD=str(tmp_path))
    assert (done.returncode, done.stderr) == (0, "")
    assert re.match(f"usage: scripts/{door.name}|usage: scripts/ci", done.stdout)
    line = told(run(door, "--no-such-thing", MARLIN_BUILD=str(tmp_path)), 2)
    assert line.endswith("; see --help\n")
    assert not list(tmp_path.iterdir())


# --- A machine that lacks something -----------------------------------------------


@pytest.mark.parametrize("door, says", [
    ("private-device --probe", ""), ("private-device true", ""), ("demo", ""),
    ("test", r"\ntest: ([1-9]\d\d+) of \1 tests skipped.*")])
def test_a_device_that_cannot_be_had_is_explained(door, says, fakes, tmp_path):
    """And nothing is built."""
    name, *words = door.split()
    done = run(PROJECT / "scripts" / name, *words, MARLIN_BUILD=f"{tmp_path}/made",
               PATH=fakes(bwrap=f"echo '{REFUSAL}' >&2; exit 1"))
    assert (done.returncode, done.stdout) == (77, "")
    assert re.fullmatch(f"private-device: {REFUSAL}; root allows it by.*{says}\n",
                        done.stderr)
    assert not list(tmp_path.glob("made/*"))


def test_a_missing_bubblewrap_is_named(fakes, tmp_path):
    assert "Debian package bubblewrap" in told(
        run(PROJECT / "scripts/private-device", "true",
            PATH=fakes("realpath dirname")), 77)


@pytest.mark.parametrize("preset, skipped, status", [
    ("dev", [], 0), ("dev", ["Calls.A"], 77), ("asan", ["WholeListOfCalls.A"], 0),
    ("arm64-dev", ["Calls.A"], 0), ("arm64-dev", ["Calls.A", "LinkRepair.B"], 77)])
def test_skipped_tests_do_not_count_as_passed(preset, skipped, status, fakes, tmp_path,
                                              monkeypatch, capsys):
    (tmp_path / "told").write_text("".join(
        f"1/9 Test #1: {name} ...***Skipped   0.01 sec\n" for name in skipped) +
        "\n100% tests passed, 0 tests failed out of 9\n")
    monkeypatch.setenv("PATH", fakes(ctest=f"cat '{tmp_path}/told'"))
    assert building.run_tests(tmp_path, ".", *building.MAY_SKIP[preset]) == status
    printed = capsys.readouterr().out
    assert ("100%" in printed) == (not skipped)
    assert (f"out of 9, {len(skipped)} of 9 skipped" in printed) == bool(skipped)


@pytest.mark.parametrize("root", ["su", "sudo"])
def test_whoever_is_not_root_is_told_a_command_that_works(root, fakes, tmp_path):
    log = tmp_path / "log"
    path = fakes(
        "awk dirname sed realpath", id="echo 1000", apt_get=f'echo "$@" >>"{log}"',
        dpkg_query="echo installed/g++ not-installed/ninja-build",
        **{root: 'shift; exec /bin/sh -c "$@"' if root == "su" else 'exec /bin/"$@"'})
    line = told(run(PROJECT / "scripts/packages", "build", PATH=path), 1)
    assert run("/bin/sh", "-c", line.partition(": to install what is missing: ")[2],
               PATH=path).returncode == 0
    assert log.read_text().splitlines() == [
        "update", "install -y --no-install-recommends cmake ninja-build "
        "nlohmann-json3-dev"]


# --- A checkout in an odd place ---------------------------------------------------


def test_a_private_device_is_made_from_any_place(tmp_path):
    place = copied(tmp_path / "it's a \"$HOME\";\\ place")
    link = tmp_path / "link"
    link.symlink_to(place / "scripts/private-device")
    written = tmp_path / "to be; written"
    written.mkdir()
    script = ('test "$PWD" = "$1" && test -r lab/carriers/private_device.py && '
              'touch "$2/here" && ! touch "$1/here" && ! touch /etc/here && '
              'test -z "$(ls /var/db /usr/share 2>&1 | grep -v :)" && '
              'test "$(grep -c : /proc/net/dev)" = 1 && '
              'grep -q "CapEff:.00*$" /proc/self/status && kill -PIPE $$')
    done = run(link, "--writable", written, "--", "sh", "-c", script, "sh",
               place, written)
    # The signal is one that Python ignores, and with it what Python starts.
    assert done.returncode == 128 + 13, done.stderr
    assert (written / "here").exists()


def test_a_folder_that_somebody_else_made_is_refused(tmp_path):
    parts = tmp_path / "emulator/packages"
    parts.mkdir(parents=True)
    line = told(run(PROJECT / "scripts/device", "--boot-cost",
                    MARLIN_BUILD=str(tmp_path)), 77)
    assert f"{parts} is there, and not made by this; remove it" in line
    assert parts.exists()


@pytest.mark.parametrize("words", [
    [], ["--"], ["--readable"], ["--writable", "/no/such/folder", "true"],
    ["--readable", "/etc/passwd", "true"], ["--probe", "true"]])
def test_bad_use_of_a_private_device(words):
    assert "see --help" in told(run(PROJECT / "scripts/private-device", *words), 2)


@pytest.mark.parametrize("place, says", [
    ("build", "absolute"),
    *((f"/tmp/a{odd}b", repr(odd)) for odd in [*"\n\"#*;<>?\\|'&^`", "${"])])
def test_a_place_in_which_nothing_can_be_built_is_refused(place, says):
    assert says in told(run(PROJECT / "scripts/test", MARLIN_BUILD=place), 1)
    assert not Path("/", place).exists()


def test_a_checkout_that_cannot_be_written(tmp_path):
    """Built elsewhere, in a place with an odd name, twice at once, through a link."""
    checkout = copied(tmp_path / "a $HOME, read-only: 100% [plâce]")
    link = tmp_path / "link"
    link.symlink_to(checkout / "scripts/test")
    read_only = ("bwrap", "--dev-bind", "/", "/", "--ro-bind", checkout, checkout)
    assert "MARLIN_BUILD" in told(run(*read_only, link, MARLIN_BUILD=""), 1)

    build = tmp_path / "another $place"
    both = [subprocess.Popen([*read_only, link, "dev", "-R", "FirstWord"], text=True,
                             env={**os.environ, "MARLIN_BUILD": str(build)},
                             stdout=subprocess.PIPE, stderr=subprocess.PIPE)
            for _ in range(2)]
    printed, errors = zip(*(each.communicate() for each in both))
    assert not any(each.returncode for each in both), printed + errors
    assert all("100% tests passed, 0 tests failed out of " in out for out in printed)
    for line in r"Building .* \(\d+ steps, about \d+ s\)$", "Waiting: ":
        assert len(re.findall(f"(?m)^{line}", "".join(errors))) == 1
    assert not (checkout / "build").exists()
    shutil.rmtree(build)
