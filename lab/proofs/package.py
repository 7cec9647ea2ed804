# SPDX-License-Identifier: BSD-2-Clause
"""The Debian package of each release preset, and the boot unit in it, as far as that
can be judged without a boot.

The packages stay in build/packaging. Each is built once more elsewhere, from what git
knows of this tree, uncommitted changes too.
"""

import gzip
import os
import re
import shutil
import subprocess
import tarfile
import warnings
from datetime import datetime
from io import BytesIO
from pathlib import Path
from typing import NamedTuple

import pytest

from lab.carriers import building
from lab.words.places import BUILD, PROJECT

WORK = BUILD / "packaging"
ARCHITECTURES = {"release": "amd64", "arm64-release": "arm64",
                 "armhf-release": "armhf"}  # by preset

# The modes, the directories and what is in them.
CONTENT = {place + name: mode for mode, place, *names in map(str.split, """
    755 /usr/bin/ marlin-status
    644 /usr/lib/systemd/system/ marlin.service
    777 /usr/lib/systemd/system/sysinit.target.wants/ marlin.service->../marlin.service
    644 /usr/lib/tmpfiles.d/ marlin.conf
    444 /usr/lib/marlin/proc/sys/kernel/ domainname hostname
    777 /usr/lib/marlin/run/host/ os-release->.os-release-stage/os-release
    444 /usr/lib/marlin/run/systemd/journal/ dev-log socket stdout
    444 /usr/lib/marlin/usr/libexec/ marlin marlin-mend
    755 /usr/libexec/ marlin marlin-mend
    755 /usr/sbin/ marlin-install
    644 /usr/share/bash-completion/completions/ marlin-install marlin-mend marlin-status
    644 /usr/share/doc/marlin/ README.md SECURITY.md changelog.gz copyright
    644 /usr/share/doc/marlin/docs/ architecture.md decisions.md demo.svg integration.md
    644 /usr/share/doc/marlin/docs/ proofs.md readers.md
    644 /usr/share/doc/marlin/examples/ apparmor inittab
    755 /usr/share/doc/marlin/examples/ init-script openrc verify-minisign
    755 /usr/share/doc/marlin/examples/ verify-signify
    644 /usr/share/doc/marlin/examples/marlin.service.d/ mend.conf
    644 /usr/share/lintian/overrides/ marlin
    644 /usr/share/man/man5/ marlin-layout.5.gz
    644 /usr/share/man/man8/ marlin.8.gz marlin-install.8.gz marlin-mend.8.gz
    644 /usr/share/man/man8/ marlin-status.8.gz
    644 /usr/share/marlin/ marlin-status.schema.json
""".strip().splitlines()) for name in names}


def run(*command, **options) -> str:
    """A command's output; the test fails with it if the command does."""
    done = subprocess.run([str(word) for word in command], text=True,
                          stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT, **options)
    if done.returncode:
        pytest.fail(f"{done.stdout}\nstatus {done.returncode}: {done.args}", False)
    return done.stdout


def fresh(place: Path) -> Path:
    subprocess.run(["chmod", "-Rf", "u+w", place])  # a package has what is read-only
    return building.room(place)


def found(pattern: str, text: str) -> str:
    """What the pattern's group matches."""
    return re.search(pattern, text, re.M)[1]


# --- Building ------------------------------------------------------------------------


class Package(NamedTuple):
    preset: str
    file: Path
    tree: Path  # in which it was built once more
    again: Path
    work: Path
    content: Path  # unpacked


def pytest_generate_tests(metafunc):
    presets = metafunc.config.getoption("preset") or list(ARCHITECTURES)
    if "package" in metafunc.fixturenames:
        metafunc.parametrize("package", presets, indirect=True, scope="module")


@pytest.fixture(scope="module")
def package(request) -> Package:
    preset, work = request.param, WORK / request.param
    with building.locked(work):
        os.environ.pop("SOURCE_DATE_EPOCH", None)
        file = building.package(preset, work)
        # In another place, at another time, by somebody with other habits; and not by
        # a cache, which would give the same objects out twice.
        tree = work / "another/place"
        again = built(tree, preset, umask=0o077, TZ="Pacific/Apia", LC_ALL="C.UTF-8",
                      CCACHE_DISABLE="1")
        run("dpkg-deb", "-x", file, fresh(work / "content"))
        shutil.copy(file, WORK)
        yield Package(preset, file, tree, again, work, work / "content")


def built(tree: Path, preset: str, umask=-1, **environment) -> Path:
    """The package, built in a copy of this tree."""
    run("bash", "-euo", "pipefail", "-c", """
        (cd "$2" && git ls-files -z | tar -c --null -T -) | tar -x --no-same-permissions
        cmake --preset "$1" -DMARLIN_WERROR=ON
        cmake --build "build/$1"
        cpack --config "build/$1/CPackConfig.cmake" -B "build/$1"
        """, "-", preset, PROJECT, cwd=fresh(tree), umask=umask,
        env=os.environ | environment)
    file, = (tree / "build" / preset).glob("*.deb")
    return file


# --- The package ---------------------------------------------------------------------


def test_two_builds_in_two_directories_give_the_same_bytes(package, count):
    for kind in "marlin_*.deb", "marlin-dbgsym_*.ddeb":
        [one], [other] = (file.parent.glob(kind)
                          for file in (package.file, package.again))
        run("cmp", one, other)
    count(f"bytes of {package.file.name}", package.file.stat().st_size)


def test_lintian_finds_no_error(package):
    """It speaks up when root runs it. What it says short of an error is shown too, so
    that it does not go unread."""
    for line in run(
            *"bwrap --unshare-user --uid 1000 --gid 1000 --dev-bind / / lintian -q "
            "--fail-on error --tag-display-limit 0".split(), package.file,
            *package.file.parent.glob("*.ddeb")).splitlines():
        warnings.warn(line)


def test_it_holds_what_it_should(package):
    """And all of it is root's, for others to read, of the day of the release."""
    day = found(r"^## \S+ - ([\d-]+)(?:, unreleased)?$",
                (PROJECT / "CHANGELOG.md").read_text())
    time = datetime.fromisoformat(f"{day}T00:00:00+00:00").timestamp()
    packed = subprocess.run(["dpkg-deb", "--fsys-tarfile", package.file], check=True,
                            stdout=subprocess.PIPE).stdout
    entries = list(tarfile.open(fileobj=BytesIO(packed)))
    assert {entry.name[1:] + (entry.issym() and f"->{entry.linkname}" or ""):
            f"{entry.mode:o}" for entry in entries if not entry.isdir()} == CONTENT
    # Not even the owner writes in the root that the unit shows marlin.
    assert {entry.mode for entry in entries if entry.isdir()
            and "/lib/marlin/" not in entry.name} == {0o755}
    assert {entry.mode for entry in entries if entry.isdir()
            and "/lib/marlin/" in entry.name} == {0o555}
    assert {(entry.uname, entry.gname, entry.uid, entry.gid, entry.mtime)
            for entry in entries} == {("root", "root", 0, 0, time)}


def test_its_control_fields(package):
    """The libraries in it can be traced, and there is no Homepage that is not true."""
    fields = dict(line.split(": ", 1) for line in run(
        "dpkg-deb", "-f", package.file).splitlines() if not line.startswith(" "))
    assert fields["Architecture"] == ARCHITECTURES[package.preset]
    assert fields["Multi-Arch"] == "foreign" and "Homepage" not in fields
    assert re.search(r"\bgcc-\d+ \(= .*\bglibc \(= .*, ", fields["Static-Built-Using"])


def test_its_links_lead_somewhere(package):
    documents = package.content / "usr/share/doc/marlin"
    links = [(page, link) for page in documents.rglob("*.md")
             for link in re.findall(r"\]\((?!https?:|#)([^)#]+)", page.read_text())]
    assert len(links) > 40
    assert [(page.name, link) for page, link in links
            if not (page.parent / link).exists()] == []


def test_symbols_of_its_programs_are_beside_it(package):
    [symbols] = package.file.parent.glob("*.ddeb")
    listed = run("dpkg-deb", "-c", symbols)
    for path in CONTENT:
        if re.match("/usr/(s?bin|libexec)/", path):
            known = found("Build ID: (.*)", run("readelf", "-n",
                                                f"{package.content}{path}"))
            assert f"/{known[:2]}/{known[2:]}.debug" in listed, path


def test_it_has_one_version_everywhere(package):
    share, changelog = package.content / "usr/share", package.work / "changelog"
    changelog.write_bytes(gzip.decompress(
        (share / "doc/marlin/changelog.gz").read_bytes()))
    pages = sorted(share.glob("man/*/*.gz"))
    assert len(pages) == 5
    versions = [
        found(r"^## (\S+) - ", (PROJECT / "CHANGELOG.md").read_text()),
        found(r"^project\([^)]*VERSION ([\d.]+)",
              (PROJECT / "CMakeLists.txt").read_text()),
        run("dpkg-deb", "-f", package.file, "Version").strip(),
        run("dpkg-parsechangelog", "-l", changelog, "-S", "Version").strip(),
        *(found(r"^\.Os marlin (.*)$", gzip.decompress(page.read_bytes()).decode())
          for page in pages)]
    assert len(set(versions)) == 1, versions


@pytest.mark.parametrize("name", ["libexec/marlin", "libexec/marlin-mend",
                                  "sbin/marlin-install", "bin/marlin-status"])
def test_its_programs_are_static_and_hardened(package, name):
    """Nothing that can be written to is executed, or the other way around; what has
    been relocated cannot be written to any more."""
    program = package.content / "usr" / name
    headers = run("readelf", "-lW", program)
    assert "INTERP" not in headers and "GNU_RELRO" in headers
    assert re.search(r"GNU_STACK .* RW +0x", headers) and " RWE " not in headers
    # Constants are in a segment of their own, not in the executable one.
    flags = re.findall(r"^ +LOAD .* (R  |R E|RW ) +0x", headers, re.M)
    sections = re.findall(r"^ +\d\d +(.*)$", headers, re.M)[:len(flags)]
    assert not [names for names, flag in zip(sections, flags)
                if flag == "R E" and ".rodata" in names.split()]
    # packaging/cmake/release.cmake says that no branch protection is in force.
    assert not re.search(r"\b(IBT|SHSTK|BTI|PAC)\b", run("readelf", "-nW", program))


def test_cmake_installs_it_below_any_prefix(package):
    stage = fresh(package.work / "stage")
    build = package.tree / "build" / package.preset
    run("cmake", build, "-DCMAKE_INSTALL_PREFIX=/opt/marlin")
    run("cmake", "--install", build, env={**os.environ, "DESTDIR": str(stage)})
    prefix = stage / "opt/marlin"
    assert os.access(prefix / "libexec/marlin", os.X_OK)
    unit = (prefix / "lib/systemd/system/marlin.service").read_text()
    assert "\nRootDirectory=/opt/marlin/lib/marlin\n" in unit
    assert "=/opt/marlin/libexec/marlin:/usr/libexec/marlin\n" in unit
    assert (prefix / "lib/marlin/usr/libexec/marlin").is_file()
    assert (prefix / "share/doc/marlin/LICENSE").is_file()


# --- What starts it ------------------------------------------------------------------


@pytest.fixture(scope="module")
def units(package) -> str:
    """The option for a root with the package in it and the units that it leans on."""
    root = fresh(package.work / "units")
    shutil.copytree(package.content / "usr", root / "usr", symlinks=True)
    for name in ("sysinit", "shutdown", "local-fs", "basic"):
        shutil.copy(f"/lib/systemd/system/{name}.target",
                    root / "usr/lib/systemd/system")
    return f"--root={root}"


def test_systemd_accepts_the_unit_and_the_mend(package, units):
    """The drop-in, where an integrator puts it. It may fail: systemd does not look
    for its program."""
    example = package.content / "usr/share/doc/marlin/examples/marlin.service.d"
    program = found(r"^ExecStartPre=-/(.*)$", (example / "mend.conf").read_text())
    assert os.access(package.content / program, os.X_OK)
    verify = "systemd-analyze", "verify", "--man=no", units, "marlin.service"
    assert run(*verify) == ""
    place = Path(units.removeprefix("--root=")) / "etc/systemd/system/marlin.service.d"
    shutil.copytree(example, place)
    assert run(*verify) == ""
    shutil.rmtree(place)


def test_systemd_rates_its_exposure(units, count):
    rating = run("systemd-analyze", "security", "--offline=true", units, "--no-pager",
                 "marlin.service")
    level = float(found(r"exposure level for marlin\.service: ([\d.]+) ", rating))
    assert level <= 3.7, rating
    count("tenths of exposure, as systemd rates the boot unit", round(10 * level))
