# SPDX-License-Identifier: BSD-2-Clause
"""Systems with "/var" on a disk of its own: beside a read-only root, and late."""

from lab import lines
from lab.systems.machine import UNIT, System, message
from lab.systems.scene import (device, fail, insist, install_update_here, linked,
                               names)

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
        {install_update_here()} {linked(device(announced=True))}
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


def test_var_is_late_and_then_missing():
    """With "nofail" nothing else waits for it; marlin does."""
    system, update = System("late", with_update(
        VAR.format("nofail,x-systemd.requires=late.service"),
        f"cat >etc/systemd/system/late.service <<'END'\n{LATE}END\n"), apart="var",
        ), names().update
    seen = system.boot()
    insist(seen, (), device(active=True, announced=True), reader="14:00 CEST",
           record=f"{names().system}.1.0_{update}")
    assert seen.at("marlin.service", "ExecMainStart") > 5_000_000

    system.third.unlink()
    system.replace("/etc/fstab", VAR.format("nofail,x-systemd.device-timeout=3s"))
    seen = system.boot()
    told = [message(entry) for entry in seen.journal]
    fail(seen, [f"the journal does not tell why: {told}"] * (
        not any(f"Dependency failed for {UNIT}" in text for text in told)) + [
            f"after {UNIT}: {unit} failed" for unit in seen.failed()])
    assert seen.units[UNIT]["ActiveState"] == "inactive" and seen.links == {}
