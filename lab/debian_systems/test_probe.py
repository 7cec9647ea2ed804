# SPDX-License-Identifier: BSD-2-Clause
"""What a program can do in marlin's place, under the unit as it ships, with drop-ins of
somebody else's, and under no restriction; and what a profile adds to that."""

import re

import pytest

from lab.debian_systems.machine import Seen, System, UNIT, message
from lab.debian_systems.scene import ZONE, device, fail, insist, linked, names, updated
from lab.words import lines
from lab.words.paths import LOCALTIME, RECORD, SYSTEM_ZONEINFO, ZONEINFO

APPARMOR = "/usr/share/doc/marlin/examples/apparmor"
# All else is refused: there is nothing else.
DONE = {"write /var/db/entry", "write /var/db/timezone/entry"}
# What a fleet may set for all services, and the empty places that may come with it.
FOREIGN = {
    "ProtectSystem=strict": (), "ReadOnlyPaths=/": (), "ReadWritePaths=/": (),
    "ProtectHostname=yes": (), "ProtectHome=yes": (),
    "ProtectHome=tmpfs": ("/home", "/root", "/run/user"),
    "PrivateTmp=yes": ("/tmp", "/var/tmp"), "PrivateDevices=yes": (),
    "PrivateIPC=yes": ("/dev/mqueue",), "ProtectKernelLogs=yes": (),
    "ProtectKernelTunables=yes": (), "ProtectControlGroups=yes": (),
    "ProtectProc=invisible": (), "MountAPIVFS=yes": ()}
UNITS = {UNIT: ("", ()), **{
    f"foreign-{number}.service": row for number, row in enumerate(FOREIGN.items())}}


def results(seen: Seen, unit: str) -> dict[str, str]:
    """What the probe printed, by what it tried."""
    return dict(map(str.strip, message(entry).split(":", 1))
                for entry in seen.said_by(_SYSTEMD_UNIT=unit)
                if ":" in message(entry))


LIMITS = {"limit memory": str(640 << 20), "limit core": "0"}
REFUSED = "Operation not permitted"
BARE = """[Unit]
DefaultDependencies=no
[Service]
Type=oneshot
ExecStart=/usr/libexec/marlin
"""


def shortcomings(tried: dict[str, str], may: set[str], free: dict[str, str]):
    """What came out wrong. `free` is what came of the same without restrictions, where
    everything can be opened and no call is refused."""
    for what, unrestricted in free.items():
        result = tried.get(what, "not tried")
        if what.startswith("call "):
            right = result == REFUSED != unrestricted
        elif what.startswith(("read ", "write ")):
            right = unrestricted == "done" and result != "not tried" and (
                (result == "done") == (what in may))
        else:
            right = result == LIMITS.get(what, result)
        if not right:
            yield f"{what}: {result}; without restrictions: {unrestricted}"


def probed(root="rw") -> Seen:
    """One boot with the probe in marlin's place, under each of UNITS, without most of
    the unit's root, to read what the kernel tells of the probe, and under nothing."""
    added = "".join(f"made {name} '{line}'\n" for name, (line, _) in UNITS.items()
                    if line)
    return System(f"probe-{root}", f"""
        cp usr/lib/lab/probe/marlin usr/libexec/marlin
        {linked(device())}
        chmod 640 etc/shadow
        echo 'f /run/secret 0600 - - - secret
        c /var/db/node 0600 - - - 1:11' >etc/tmpfiles.d/secret.conf
        {"echo '/dev/nvme0n3 /var ext4 defaults 0 0' >etc/fstab" * (root == "ro")}
        """, apart="var" * (root == "ro")).boot(f"""
        cd /run/systemd/system
        made() {{
          grep -v ^Refuse /usr/lib/systemd/system/{UNIT} >$1
          mkdir $1.d
          printf '[Service]\\n%s\\n' "$2" >$1.d/fleet.conf
        }}
        {added}
        made open.service MountAPIVFS=yes
        sed -i '/^BindPaths=.*:/d' open.service
        printf %s '{BARE}' >bare.service
        systemctl daemon-reload
        mkdir /run/systemd/incoming
        [ -w /tmp ] || mount -t tmpfs tmpfs /tmp
        systemctl start foreign-*.service open.service
        mount -o remount,rw /
        systemctl start bare.service""", options=root)


@pytest.mark.parametrize("root", ["rw", pytest.param("ro", marks=pytest.mark.rest)])
def test_the_probe_is_refused(root):
    seen = probed(root)
    free = results(seen, "bare.service")
    assert list(free)[-1] == "call mmap of writable code"
    capabilities = {what: result.strip() for what, result in results(
        seen, "open.service").items() if what.startswith("Cap")}
    assert set(capabilities.values()) == {"0" * 16} and len(capabilities) == 5
    found = []
    for unit, (line, empty) in UNITS.items():
        asked = {what: result for what, result in free.items()
                 if what not in {f"write {place}/entry" for place in empty}}
        found += [f"{unit} {line}".strip() + f": {text}"
                  for text in shortcomings(results(seen, unit), DONE, asked)]
    fail(seen, found)


PROFILE = f"""
mkdir -p etc/systemd/system/{UNIT}.d
echo '[Unit]\nAfter=apparmor.service' >etc/systemd/system/{UNIT}.d/order.conf
rm etc/systemd/system/apparmor.service
rm -f etc/apparmor.d/[a-z]*.*
cp .{APPARMOR} etc/apparmor.d/usr.libexec.marlin
"""


@pytest.mark.parametrize("enforced", [True, False], ids=["enforced", "not loaded"])
def test_a_record_that_is_a_link(enforced):
    """Only the profile forbids to write to what it names, and nothing else."""
    other, update = "/var/db/other", names().update
    system = System(f"apparmor-{enforced}", f"""
        {updated()}
        echo kept >.{other}
        ln -s {other} .{RECORD}
        ln -sfn /usr/share/zoneinfo/{ZONE} .{LOCALTIME}
        {PROFILE * enforced}""")
    seen = system.boot("dmesg | grep DENIED >/run/lab/seen/denied",
                       "sysctl.kernel.printk_ratelimit=0")
    made = device(active=True, announced=True)
    made.link(RECORD, other)
    insist(seen, [lines.CORRECTING % f"{ZONEINFO}/{ZONE}"], made, reader="14:00 CEST")
    denied = re.findall(' name="([^"]*)"', seen.text("denied"))
    assert denied == [other] * enforced, seen.text("denied")
    assert seen.text(other) == ("kept\n" if enforced else
                                f"{names().system}.1.0_{update}")


# In marlin's place, what never ends by itself.
HANGS = f"""
cp /usr/lib/lab/busybox /usr/libexec/marlin
cd /run/systemd/system
grep -v ^Refuse /usr/lib/systemd/system/{UNIT} >hangs.service
mkdir hangs.service.d
cat >hangs.service.d/lab.conf <<'END'
[Service]
ExecStart=
ExecStart=@/usr/libexec/marlin sh -c 'while :; do :; done'
TimeoutStartSec=5s
END
systemctl daemon-reload
systemctl start hangs
systemctl show --value -p Result,ExecMainStatus,MainPID hangs >/run/lab/seen/hangs
"""


@pytest.mark.rest
def test_signals_under_the_profile():
    """An abort is told as one, and systemd ends a marlin that hangs."""
    seen = System("apparmor-signals", linked(device()) + PROFILE + f"""
        echo 2147483648a >.{SYSTEM_ZONEINFO}/+VERSION""").boot(HANGS)
    insist(seen, [lines.NO_DATA, " terminate called after throwing an instance of "
                  "'std::out_of_range'", "   what():  stoi"], None,
           ended=("signal", "failed", "6"), failed=[UNIT])
    assert sorted(seen.text("hangs").split()) == ["0", "15", "timeout"]
