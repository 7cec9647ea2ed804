# SPDX-License-Identifier: BSD-2-Clause
"""The Debian package of each release preset, and the boot unit in it.

Built from what git knows of this tree, uncommitted changes too, in build/packaging,
where the packages stay. The unit is tested on the machine's own architecture.
"""

from __future__ import annotations

import fcntl
import gzip
import os
import re
import shlex
import shutil
import stat
import subprocess
import tarfile
import warnings
from datetime import datetime
from io import BytesIO
from pathlib import Path
from typing import NamedTuple

import pytest

PROJECT = Path(__file__).resolve().parent.parent
WORK = PROJECT / "build/packaging"
ARCHITECTURES = {"release": "amd64", "arm64-release": "arm64"}  # by preset

CONTENT = """
    /usr/lib/systemd/system/marlin.service
    /usr/lib/systemd/system/sysinit.target.wants/marlin.service
    /usr/lib/tmpfiles.d/marlin.conf
    /usr/libexec/marlin
    /usr/share/doc/marlin/README.md
    /usr/share/doc/marlin/changelog.gz
    /usr/share/doc/marlin/copyright
    /usr/share/doc/marlin/docs/architecture.md
    /usr/share/doc/marlin/docs/decisions.md
    /usr/share/doc/marlin/docs/demo.svg
    /usr/share/doc/marlin/docs/integration.md
    /usr/share/doc/marlin/examples/init-script
    /usr/share/doc/marlin/examples/inittab
    /usr/share/lintian/overrides/marlin
    /usr/share/man/man5/marlin-layout.5.gz
    /usr/share/man/man8/marlin.8.gz
""".split()
LINKS = {"/usr/lib/systemd/system/sysinit.target.wants/marlin.service":
         "../marlin.service"}
PROGRAMS = ["/usr/libexec/marlin", "/usr/share/doc/marlin/examples/init-script"]

# Every line of the unit's section is applied by packaging/confine.c, or takes away
# what a process without capabilities, without these calls and without places to write
# to does not have anyway, or does not restrict. A new one fails until somebody has
# thought about it.
KNOWN = set("""
    Type RemainAfterExit ExecStart TimeoutStartSec SyslogLevel User UMask
    CapabilityBoundingSet NoNewPrivileges ProtectSystem ReadWritePaths ReadOnlyPaths
    MemoryDenyWriteExecute SystemCallArchitectures SystemCallErrorNumber
    SystemCallFilter KeyringMode ProtectHome PrivateDevices PrivateMounts ProtectProc
    ProcSubset ProtectClock ProtectControlGroups ProtectHostname ProtectKernelLogs
    ProtectKernelModules ProtectKernelTunables PrivateNetwork IPAddressDeny
    RestrictAddressFamilies PrivateIPC LockPersonality RestrictNamespaces
    RestrictRealtime RestrictSUIDSGID
""".split())


def run(*command, **options) -> str:
    """A command's output; the test fails with it if the command does."""
    command = [str(word) for word in command]
    done = subprocess.run(command, text=True, stdin=subprocess.DEVNULL,
                          stdout=subprocess.PIPE, stderr=subprocess.STDOUT, **options)
    if done.returncode:
        pytest.fail(f"{done.stdout}\nstatus {done.returncode}: {shlex.join(command)}",
                    pytrace=False)
    return done.stdout


def in_user_namespace(number: int, *command, **options) -> str:
    """Runs a command as this user number. As 0 it may own files, and changes nothing of
    the machine; as another it has the rights of whoever runs the test."""
    return run("bwrap", "--unshare-user", "--uid", number, "--gid", number,
               "--dev-bind", "/", "/", *command, **options)


def fresh(place: Path) -> Path:
    shutil.rmtree(place, ignore_errors=True)
    place.mkdir(parents=True)
    return place


def files_below(root: Path) -> list[str]:
    return sorted(f"/{path.relative_to(root)}" for path in root.rglob("*")
                  if path.is_symlink() or not path.is_dir())


def release() -> tuple[str, str]:
    """The newest in CHANGELOG.md: its version and its day."""
    return re.search(r"^## (\S+) - (\S+)$", (PROJECT / "CHANGELOG.md").read_text(),
                     re.M).groups()


# --- Building ------------------------------------------------------------------------


class Package(NamedTuple):
    preset: str
    tree: Path  # in which it was built
    file: Path
    again: Path  # built once more elsewhere
    content: Path  # unpacked

    def field(self, name: str) -> str:
        return run("dpkg-deb", "-f", self.file, name).strip()


def pytest_generate_tests(metafunc):
    presets = metafunc.config.getoption("preset") or list(ARCHITECTURES)
    if "unit" in metafunc.fixturenames:
        presets = [preset for preset in presets if preset == "release"]
    if "package" in metafunc.fixturenames:
        metafunc.parametrize("package", presets, indirect=True, scope="module")


@pytest.fixture(scope="module")
def package(request) -> Package:
    preset = request.param
    place = WORK / preset
    place.mkdir(parents=True, exist_ok=True)
    with open(place / "lock", "w", encoding="ascii") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        file = built(place / "one", preset)
        # In another place, at another time, by somebody with other habits; and not by
        # a cache, which would give the same objects out twice.
        again = built(place / "another/place", preset, umask=0o077, TZ="Pacific/Apia",
                      LC_ALL="C.UTF-8", CCACHE_DISABLE="1")
        run("dpkg-deb", "-x", file, fresh(place / "content"))
        shutil.copy(file, WORK)
        yield Package(preset, place / "one", file, again, place / "content")


def built(tree: Path, preset: str, umask=-1, **environment) -> Path:
    """The package, built in a copy of this tree."""
    fresh(tree)
    environment = {**os.environ, **environment}
    environment.pop("SOURCE_DATE_EPOCH", None)
    run("bash", "-o", "pipefail", "-c",
        'git ls-files -z | tar -c --null -T - | tar -x --no-same-permissions -C "$1"',
        "-", tree, cwd=PROJECT, umask=umask)
    for command in (["cmake", "--preset", preset],
                    ["cmake", "--build", "--preset", preset],
                    ["cpack", "--config", f"build/{preset}/CPackConfig.cmake",
                     "-B", f"build/{preset}"]):
        run(*command, cwd=tree, env=environment, umask=umask)
    file, = (tree / "build" / preset).glob("*.deb")
    return file


# --- The package ---------------------------------------------------------------------


def test_two_builds_in_two_directories_give_the_same_bytes(package, count):
    run("cmp", package.file, package.again)
    count(f"bytes of {package.file.name}", package.file.stat().st_size)


def test_lintian_finds_no_error(package):
    """It speaks up when root runs it. What it says short of an error is shown too, so
    that it does not go unread."""
    output = in_user_namespace(1000, "lintian", "-q", "--fail-on", "error",
                               "--tag-display-limit", "0", package.file)
    for line in output.splitlines():
        warnings.warn(line)


def test_it_holds_what_it_should(package):
    """And all of it is root's, for others to read, of the day of the release."""
    day = datetime.fromisoformat(f"{release()[1]}T00:00:00+00:00").timestamp()
    packed = subprocess.run(["dpkg-deb", "--fsys-tarfile", package.file], check=True,
                            stdout=subprocess.PIPE).stdout
    with tarfile.open(fileobj=BytesIO(packed)) as archive:
        entries = {entry.name.removeprefix("."): entry for entry in archive}
    files = {path: (oct(entry.mode), entry.linkname)
             for path, entry in entries.items() if not entry.isdir()}
    assert files == {path: ("0o777", LINKS[path]) if path in LINKS else
                     ("0o755" if path in PROGRAMS else "0o644", "") for path in CONTENT}
    assert {entry.mode for entry in entries.values() if entry.isdir()} == {0o755}
    assert {(entry.uname, entry.gname, entry.uid, entry.gid, entry.mtime)
            for entry in entries.values()} == {("root", "root", 0, 0, day)}


def test_it_is_for_its_architecture(package):
    assert package.field("Architecture") == ARCHITECTURES[package.preset]


def test_it_has_one_version_everywhere(package):
    documents = package.content / "usr/share/doc/marlin"
    changelog = package.content.parent / "changelog"
    changelog.write_bytes(gzip.decompress((documents / "changelog.gz").read_bytes()))
    versions = {
        "CMakeLists.txt": re.search(r"^project\([^)]*VERSION ([\d.]+)",
                                    (PROJECT / "CMakeLists.txt").read_text(), re.M)[1],
        "package": package.field("Version"),
        "its changelog": run("dpkg-parsechangelog", "-l", changelog, "-S",
                             "Version").strip()}
    for page in package.content.glob("usr/share/man/man*/*.gz"):
        versions[page.name] = re.search(r"^\.Os marlin (.*)$",
                                        gzip.decompress(page.read_bytes()).decode(),
                                        re.M)[1]
    assert len(versions) == 5
    assert versions == dict.fromkeys(versions, release()[0])


def test_its_program_is_static_and_hardened(package):
    """Nothing that can be written to is executed, or the other way around; what has
    been relocated cannot be written to any more."""
    headers = run("readelf", "-lW", package.content / "usr/libexec/marlin")
    assert "INTERP" not in headers and "GNU_RELRO" in headers
    assert re.search(r"GNU_STACK .* RW +0x", headers)
    assert re.search(r"LOAD .* R E +0x", headers) and not re.search(" RWE ", headers)


def test_it_is_installed_and_removed_without_a_trace(package):
    root = fresh(package.content.parent / "root")
    for directory in ("lib/dpkg/info", "lib/dpkg/updates", "db/timezone/tz"):
        (root / "var" / directory).mkdir(parents=True)
    for file in ("status", "available"):
        (root / "var/lib/dpkg" / file).touch()
    (root / "var/db/timezone/TZVersionDiffRecord").write_text("kept\n")

    def dpkg(*arguments):
        return in_user_namespace(0, "dpkg", f"--root={root}",
                                 "--force-script-chrootless", "--force-architecture",
                                 "--log=/dev/null", *arguments)

    def left():
        return {path: path.read_text() if path.is_file() else path.lstat().st_mode
                for path in root.rglob("*") if "var/lib/dpkg" not in str(path)}

    before = left()
    dpkg("--install", package.file)
    assert "Status: install ok installed" in dpkg("--status", "marlin")
    assert [path for path in files_below(root)
            if not path.startswith("/var/")] == sorted(CONTENT)
    assert not [path for path in (root / "usr").rglob("*")
                if not path.is_symlink() and path.stat().st_mode & 0o022]
    dpkg("--purge", "marlin")
    assert left() == before


def test_cmake_installs_it_below_any_prefix(package):
    stage = fresh(package.content.parent / "stage")
    build = package.tree / "build" / package.preset
    run("cmake", build, "-DCMAKE_INSTALL_PREFIX=/opt/marlin")
    run("cmake", "--install", build, env={**os.environ, "DESTDIR": str(stage)})
    prefix = stage / "opt/marlin"
    assert os.access(prefix / "libexec/marlin", os.X_OK)
    assert "\nExecStart=/opt/marlin/libexec/marlin\n" in (
        prefix / "lib/systemd/system/marlin.service").read_text()
    assert (prefix / "share/doc/marlin/LICENSE").is_file()


# --- What starts it ------------------------------------------------------------------


def boot(tests: str, program: Path):
    """Runs lab/package_boots.py on a private device, with this for the program."""
    in_user_namespace(
        1000, "scripts/private-device", "/usr/bin/env", f"MARLIN={program}",
        "/usr/bin/python3", "-B", "-m", "pytest", "-c", "lab/pytest.ini",
        f"--rootdir={PROJECT}", "-q", "-p", "no:cacheprovider",
        f"lab/package_boots.py::{tests}", cwd=PROJECT)


@pytest.fixture(scope="module")
def unit(package) -> Unit:
    return Unit((package.content / "usr/lib/systemd/system/marlin.service").read_text())


class Unit(str):
    """The text of the boot unit."""

    def values(self, key: str) -> list[str]:
        """The words of all its lines with this key."""
        return " ".join(re.findall(rf"^{key}=(.*)$", self, re.M)).split()


def test_tmpfiles_make_the_two_directories(package, unit):
    root = fresh(package.content.parent / "tmpfiles")
    (root / "etc").mkdir()
    (root / "etc/passwd").write_text("root:x:0:0::/:\n")
    (root / "etc/group").write_text("root:x:0:\n")
    shutil.copytree(package.content / "usr", root / "usr", symlinks=True)
    in_user_namespace(0, "systemd-tmpfiles", f"--root={root}", "--create",
                      "marlin.conf")
    for directory in ("var/db/timezone", "var/db/timezone/tz"):
        assert stat.filemode((root / directory).stat().st_mode) == "drwxr-xr-x"


@pytest.mark.parametrize("example, arguments", [("init-script", "start"),
                                                ("inittab", "")])
def test_an_example_for_another_init_system_boots(package, unit, example, arguments):
    """With the program where it was unpacked. The mounts are there, and the paths of
    busybox may differ."""
    text = (package.content / "usr/share/doc/marlin/examples" / example).read_text()
    assert "/usr/libexec/marlin" in text
    text = text.replace("/usr/libexec/marlin", f"{package.content}/usr/libexec/marlin")
    if example == "inittab":
        text = "\n".join(line for line in re.findall("^::sysinit:(.*)$", text, re.M)
                         if "mount" not in line)
    place = fresh(package.content.parent / example)
    (place / example).write_text(text)
    (place / "marlin").write_text(f"#!/bin/sh\nexec sh {place}/{example} {arguments}\n")
    (place / "marlin").chmod(0o755)
    boot("test_a_new_device_boots", place / "marlin")


@pytest.fixture(scope="module")
def units(package, unit) -> Path:
    """A root with the package in it and the units that it leans on."""
    root = fresh(package.content.parent / "units")
    shutil.copytree(package.content / "usr", root / "usr", symlinks=True)
    for name in ("sysinit", "shutdown", "local-fs", "basic"):
        shutil.copy(f"/lib/systemd/system/{name}.target",
                    root / "usr/lib/systemd/system")
    return root


def test_systemd_accepts_the_unit(units):
    assert run("systemd-analyze", "verify", "--man=no", f"--root={units}",
               "marlin.service") == ""


def test_systemd_rates_its_exposure_at_most_1(units, count):
    rating = run("systemd-analyze", "security", "--offline=true", f"--root={units}",
                 "--no-pager", "marlin.service")
    tenths = int(re.search(r"exposure level for marlin\.service: (\d+)\.(\d) ",
                           rating).expand(r"\1\2"))
    assert tenths <= 10, rating
    count("tenths of exposure, as systemd rates the boot unit", tenths)


def test_every_restriction_of_the_unit_is_known(unit):
    section = unit.partition("\n[Service]\n")[2]
    assert set(re.findall(r"^([A-Za-z]+)=", section, re.M)) - KNOWN == set()
    assert unit.values("ProtectSystem") == ["strict"]
    assert "\nCapabilityBoundingSet=\n" in unit
    assert unit.values("MemoryDenyWriteExecute") == ["yes"]


# --- Boots under the unit's restrictions ---------------------------------------------


@pytest.fixture(scope="module")
def confine(package, unit) -> Path:
    """A program that starts the one beside it under the unit's restrictions."""
    # What systemd adds to every list.
    calls = re.findall(r"^ +([a-z][a-z0-9_]*)$",
                       run("systemd-analyze", "syscall-filter", "@default"), re.M)
    assert "execve" in calls
    lists = {"ALLOWED_CALLS": calls + unit.values("SystemCallFilter"),
             "WRITABLE_PATHS": unit.values("ReadWritePaths"),
             "READ_ONLY_PATHS": unit.values("ReadOnlyPaths")}
    compiled = package.content.parent / "confine"
    run("gcc", "-O1", "-Wall", "-Wextra", "-Werror", "-o", compiled,
        PROJECT / "packaging/confine.c", "-lseccomp",
        *("-D{}={}".format(name, ",".join(f'"{word.removeprefix("-")}"'
                                          for word in words))
          for name, words in lists.items()))
    return compiled


@pytest.fixture(scope="module")
def confined(package, confine) -> Path:
    """The program out of the package, confined."""
    place = fresh(package.content.parent / "confined")
    shutil.copy(package.content / "usr/libexec/marlin", place / "marlin.real")
    return Path(shutil.copy(confine, place / "marlin"))


def test_the_confinement_confines(package, confine):
    place = fresh(package.content.parent / "probing")
    run("gcc", "-static", "-O1", "-Wall", "-Wextra", "-Werror",
        "-o", place / "marlin.real", PROJECT / "packaging/probe.c")
    boot("test_the_probe_is_refused", shutil.copy(confine, place / "marlin"))


def test_devices_boot_confined(confined):
    boot("test_a_chosen_device_boots", confined)


def test_the_boot_tests_pass_confined(package, confined):
    """Where they look for the program, it is the confined one."""
    build = package.tree / "build/dev"
    run("cmake", "--preset", "dev", "-S", package.tree, "-B", build)
    run("cmake", "--build", build, "--target", "boot_test")
    for file in confined.parent.iterdir():
        (build / file.name).unlink(missing_ok=True)
        shutil.copy(file, build)
    output = in_user_namespace(1000, build / "tests/boot_test", "--gtest_brief=1")
    assert re.search(r"\[  PASSED  \] [1-9]\d* tests?\.", output), output
    assert "SKIPPED" not in output, output
