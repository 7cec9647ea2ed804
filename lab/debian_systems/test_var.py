# SPDX-License-Identifier: BSD-2-Clause
"""Systems with "/var" on a disk of its own: beside a read-only root, and late."""

import pytest

from lab.debian_systems.machine import System, UNIT, message
from lab.debian_systems.scene import NEW, device, fail, insist, linked, names, updated
from lab.words import lines
from lab.words.paths import DEFAULT_ZONE, SYSTEM_ZONEINFO, ZONEINFO

VAR = "/dev/nvme0n3 /var ext4 {} 0 0\n"
LATE = """[Unit]
DefaultDependencies=no
[Service]
Type=oneshot
RemainAfterExit=yes
ExecStart=/bin/sleep 5
"""


def with_update(fstab: str, more="") -> str:
    return f"""
        {updated()}
        echo '{fstab}' >etc/fstab
        {more}"""


def test_a_read_only_root_without_tmp():
    """An update is activated there; then "/var" is read-only as well."""
    system, update = System("read-only", with_update(
        VAR.format("defaults"), "rmdir tmp"), apart="var"), names().update
    seen = system.boot("mount | grep ' / '; ls -d /tmp", options="ro")
    insist(seen, (), device(active=True, announced=True), reader="14:00 CEST",
           record=f"{names().system}.1.0_{update}")
    assert "/dev/nvme0n1 on / type ext4 (ro" in seen.text("then")

    system.replace("/etc/fstab", VAR.format("ro"))
    seen = system.boot("mount", options="ro")
    insist(seen, [lines.NOT_NEWER % (update, update)],
           device(active=True, announced=True), reader="14:00 CEST")


@pytest.mark.rest
def test_a_read_only_var_with_bad_links():
    """marlin can do nothing; the system boots and says so."""
    made = device()
    made.link(ZONEINFO, "/x")
    system = System("read-only-var", f"""
        {linked(made)}
        echo '{VAR.format("ro")}' >etc/fstab""", apart="var")
    reset = (lines.REMOVE % ZONEINFO, lines.ZONEINFO_NOT_UNLINKED,
             lines.CREATE_SYMLINK % (ZONEINFO, SYSTEM_ZONEINFO))
    insist(system.boot(), [
        lines.BAD_LINK % "/x", lines.INVALID_LINKS, *reset, lines.NO_DATA, *reset,
        " terminate called after throwing an instance of 'int'"], made,
        reader="12:00 UTC", ended=("signal", "failed", "6"), failed=[UNIT])


@pytest.mark.rest
def test_a_new_var_that_is_late():
    """The two directories are made on it, and not where it is to be mounted."""
    fstab = VAR.format("nofail,x-systemd.requires=late.service,"
                       "x-systemd.before=systemd-tmpfiles-setup.service")
    system = System("new-var", f"""
        echo '{fstab}' >etc/fstab
        cat >etc/systemd/system/late.service <<'END'\n{LATE}END
        rm -rf var/db""", apart="var")
    insist(system.boot(), NEW, device(zone=DEFAULT_ZONE), reader="05:00 PDT")


def test_var_is_late_and_then_missing():
    """With "nofail" nothing else waits for it; marlin does."""
    system, update = System("late", with_update(
        VAR.format("nofail,x-systemd.requires=late.service"),
        f"cat >etc/systemd/system/late.service <<'END'\n{LATE}END\n"), apart="var",
        ), names().update
    seen = system.boot()
    insist(seen, (), device(active=True, announced=True), reader="14:00 CEST",
           record=f"{names().system}.1.0_{update}")
    assert seen.at("local-fs.target", "ActiveEnter") < seen.at(
        "var.mount", "ActiveEnter") < seen.at(UNIT, "ExecMainStart")

    system.third.unlink()
    system.replace("/etc/fstab", VAR.format("nofail,x-systemd.device-timeout=3s"))
    seen = system.boot()
    told = [message(entry) for entry in seen.journal]
    fail(seen, [f"the journal does not tell why: {told}"] * (
        not any("Dependency failed for" in text and (
            UNIT in text or "Time-Zone Data Links" in text) for text in told)) + [
            f"after {UNIT}: {unit} failed" for unit in seen.failed()])
    assert seen.units[UNIT]["ActiveState"] == "inactive" and seen.links == {}
