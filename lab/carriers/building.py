# SPDX-License-Identifier: BSD-2-Clause
"""Building and running tests, and what that takes: packages, one build at a time, and a
line before a silent wait."""

import contextlib
import fcntl
import os
import re
import shutil
import subprocess
import sys
from collections.abc import Iterator
from pathlib import Path

from lab.words.command import say, stop
from lab.words.places import BUILD, PROJECT, shown

# CMake fails on a path with one of these, or Ninja takes every file below it for out of
# date, as with the last four.
ODD = re.compile(r"""[\x00-\x1f"#*;<>?\\|]|\$\{|['&^`]""")
# What the machine of a preset cannot do, and the tests that therefore skip themselves.
MAY_SKIP = {
    **dict.fromkeys(["dev", "clang"], (None, "")),
    "asan": (r"WholeListOfCalls\.", "a sanitizer makes calls of its own"),
    **dict.fromkeys(["arm64-dev", "armhf-dev"], (
        r"(Calls|DataProtection|WholeListOfCalls)\.",
        "qemu-user traces no system calls")),
}


def need(*purposes: str):
    """Ends the program if nothing can be built here; then installs the packages for
    these purposes, or ends it."""
    for place in (PROJECT, BUILD):
        if odd := ODD.search(str(place)):
            stop(1, f"a path with {odd[0]!r} cannot be built in: {str(place)!r}")
    with contextlib.suppress(OSError):
        BUILD.mkdir(parents=True, exist_ok=True)
    if not os.access(BUILD, os.W_OK):
        stop(1, f"{BUILD} cannot be written; MARLIN_BUILD can name a folder elsewhere")
    if status := subprocess.run([PROJECT / "scripts/packages", *purposes]).returncode:
        sys.exit(status)


@contextlib.contextmanager
def locked(folder: Path) -> Iterator[None]:
    """Has a build folder to itself; says so when it has to wait."""
    folder.mkdir(parents=True, exist_ok=True)
    with open(folder / "lock", "w") as lock:
        try:
            fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)
        except BlockingIOError:
            say(f"Waiting: {shown(folder)} is in use")
            fcntl.flock(lock, fcntl.LOCK_EX)
        yield


def room(place: Path) -> Path:
    """An empty directory."""
    shutil.rmtree(place, ignore_errors=True)
    place.mkdir(parents=True)
    return place


def quietly(log: Path, *command, check=True, **options) -> int:
    """Runs a command with its output in a file, the end of which is shown when it
    fails; then the program ends, unless it is not to check."""
    with open(log, "wb") as output:
        status = subprocess.run(command, stdout=output, stderr=output, cwd=PROJECT,
                                **options).returncode
    if status and check:
        show_end(log)
        stop(1, f"failed: {' '.join(map(str, command))}")
    return status


def show_end(log: Path):
    lines = log.read_text(errors="replace").splitlines()
    say("\n".join(line[:400] for line in lines[-100:]))


def configure(preset: str, *options: str, folder: Path | None = None) -> Path:
    """Has CMake prepare the preset's build folder, or another; returns it."""
    folder = folder or BUILD / preset
    folder.mkdir(parents=True, exist_ok=True)
    quietly(folder / "build.log", "cmake", "--preset", preset, "-B", folder, *options)
    return folder


def build(preset: str, *options: str, folder: Path | None = None,
          targets: tuple[str, ...] = ()) -> Path:
    """Builds with a preset and more options of CMake's. The output is shown on a
    terminal, where it moves, and when it fails."""
    folder = configure(preset, *options, folder=folder)
    command = ["cmake", "--build", folder, *(["--target", *targets] if targets else [])]
    plan = subprocess.run([*command, "--", "-n"], capture_output=True, text=True)
    if steps := re.findall(r"^\[\d+/(\d+)\]", plan.stdout, re.MULTILINE)[-1:]:
        seconds = 10 + 2 * int(steps[0]) // (os.cpu_count() or 1)
        say(f"Building {shown(folder)} ({steps[0]} steps, about {seconds} s)")
    if sys.stdout.isatty():
        if subprocess.run(command).returncode:
            stop(1, f"the project does not build in {shown(folder)}")
    else:
        quietly(folder / "build.log", *command)
    return folder


def copy_the_project(place: Path):
    """What is the same keeps its time, and so its objects."""
    subprocess.run(["rsync", "-rlp", "--checksum", "--delete", "--mkpath",
                    "--exclude=/build", "--exclude=/.git",
                    f"{PROJECT}/", f"{place}/"], check=True)


def package(preset: str, place: Path) -> Path:
    """The Debian package of a release preset, made in a directory that is there."""
    with locked(BUILD / preset):
        folder = build(preset)
        for old in place.glob("*.deb"):
            old.unlink()
        quietly(place / "cpack.log", "cpack", "--config", folder / "CPackConfig.cmake",
                "-B", place)
    [file] = place.glob("*.deb")
    return file


def pytest(*arguments: str) -> list[str]:
    """The command that runs tests of lab/."""
    return ["/usr/bin/python3", "-B", "-m", "pytest", "-c", "lab/pytest.ini",
            f"--rootdir={PROJECT}", *arguments]


def unprivileged() -> list[str]:
    """What to put before a command that asks marlin-status on a private device: root
    has no capability there, and may then not have the namespaces that any other user
    may have."""
    other = "bwrap --unshare-user --uid 1000 --gid 1000 --dev-bind / /"
    return other.split() if os.geteuid() == 0 else []


def build_program():
    """Brings the release program up to date, unless MARLIN names another."""
    if "MARLIN" not in os.environ:
        with locked(BUILD / "release"):
            build("release")


def trials(name: str, *arguments: str) -> list[str]:
    """The command that runs tests in workers, each on a private device of its own."""
    workers = min(os.cpu_count() or 1, 8)
    asks = re.search(r"lab/proofs/(status|life|component)\.py", " ".join(arguments))
    return [*(unprivileged() if asks else []), *pytest(
        "-q", "--tx", f"{workers}*popen//python=lab/carriers/worker", "--dist", "load",
        "--maxfail", "10", f"--junit-xml={BUILD}/prove/{name}.xml", *arguments)]


def run_tests(folder: Path, regex: str, may_skip: str | None, reason: str) -> int:
    """Shows what ctest prints, but counts no skipped test as passed."""
    skipped = []
    command = ["ctest", "-R", regex, "--no-tests=error", "--output-on-failure",
               "--parallel", str(2 * (os.cpu_count() or 1))]
    with subprocess.Popen(command, cwd=folder, stdout=subprocess.PIPE, text=True,
                          errors="replace") as ctest:
        for line in ctest.stdout:
            skipped += re.findall(r"^ *\d+/\d+ Test +#\d+: (\S+) \.+\*+Skipped", line)
            if skipped and (end := re.match(r"\d+% (.* (\d+) .* (\d+))$", line)):
                text, failed, tests = end[1], int(end[2]), int(end[3])
                line = (f"{100 * (tests - failed - len(skipped)) // tests}% {text}, "
                        f"{len(skipped)} of {tests} skipped\n")
            print(line, end="", flush=True)
    if ctest.returncode:
        return 1
    if [name for name in skipped if not (may_skip and re.match(may_skip, name))]:
        return 77
    if skipped:
        print(f"Skipped rightly: {reason}.")
    return 0
