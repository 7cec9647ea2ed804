# SPDX-License-Identifier: BSD-2-Clause
"""Systems that boot without systemd, by the examples for busybox, SysV init and
OpenRC."""

import pytest

from lab.debian_systems.machine import Seen, System
from lab.debian_systems.parts import CHOSEN
from lab.debian_systems.scene import device, links, names, updated
from lab.words import lines
from lab.words.paths import ICUTZ, ZONEINFO

DEVICES = "devtmpfs.mount=1"  # the root has none
EXAMPLES = "usr/share/doc/marlin/examples"
BUSYBOX = f"""
ln -sfn /usr/lib/lab/busybox usr/sbin/init
{{
  echo '::sysinit:/bin/mount -t proc proc /proc'
  cat {EXAMPLES}/inittab
  echo '::wait:/usr/lib/lab/after'
}} >etc/inittab
"""
# As Debian's packages set it up; the order comes from the scripts' headers.
SCRIPTS = f"""
unpack() {{
  tar -c -C {CHOSEN.place}/$1 . | tar -x --keep-directory-symlink
}}
unpack sysvinit
sed 's,:respawn:.*getty .*,:off:,' usr/share/sysvinit/inittab >etc/inittab
echo 'lab:2:wait:/usr/lib/lab/after' >>etc/inittab
rm etc/rc?.d/[SK]* etc/init.d/apparmor etc/init.d/dbus etc/init.d/udev  # for time
"""
SYSV = f"""{SCRIPTS}
cp {EXAMPLES}/init-script etc/init.d/marlin
bwrap --bind . / insserv --default $(find etc/init.d -type f ! -name '.*' -printf '%f ')
"""
OPENRC = f"""{SCRIPTS}
unpack openrc
mkdir -p etc/runlevels/sysinit etc/runlevels/default
ln -s $(grep -lx '# Default-Start: *S' etc/init.d/* | sed s,^,/,) etc/runlevels/sysinit
install {EXAMPLES}/openrc etc/init.d/marlin
ln -s /etc/init.d/marlin etc/runlevels/sysinit
"""
INITS = {"busybox": BUSYBOX, "sysv": SYSV, "openrc": OPENRC}
# How the examples say that it is switched on: the file, what is there, and instead.
MEND = {"busybox": ("inittab", "(timeout", "(/usr/libexec/marlin-mend; timeout"),
        "sysv": ("init.d/marlin", "# run /", "run /"),
        "openrc": ("init.d/marlin", "# /usr", "/usr")}
# On a running system: no restart changes a link. What a script says of its status;
# OpenRC knows of the start at boot, until that is forgotten.
AGAIN = f"""
[ -x /etc/init.d/marlin ] || exit 0
rm {ZONEINFO}
/etc/init.d/marlin restart
[ ! -L {ZONEINFO} ] || echo changed >>/run/lab/seen/again
/etc/init.d/marlin status
echo $? >>/run/lab/seen/again
/etc/init.d/marlin zap
/etc/init.d/marlin status
echo $? >>/run/lab/seen/again
"""
STATUS = {"busybox": "", "sysv": "3\n3\n", "openrc": "0\n3\n"}


@pytest.fixture(params=["busybox", "sysv",
                        pytest.param("openrc", marks=pytest.mark.rest)])
def init(request) -> str:
    return request.param


def printed(seen: Seen) -> list[str]:
    return [line.rstrip("\r") for line in seen.console.split("\n")
            if "marlin" in line and not line.startswith("[")]


def test_an_update_and_a_forged_line(init):
    """They are where /var is mounted by then. What commands a console is not let
    through; the boot after that is quiet."""
    update = names().update
    here = System(init, INITS[init] + f"""
        {updated()}
        ln -sfn "$(printf '/x\\033[31m')" .{ZONEINFO}
        echo '/dev/nvme0n3 /var ext4 defaults 0 0' >etc/fstab""", apart="var")
    seen = here.boot("rm /var/db/timezone/tz_latest", DEVICES)
    said = printed(seen)
    assert [line.rpartition(": ")[0] for line in said] == [
        "marlin: Bad zoneinfo link /x?[31m", f"marlin: {lines.INVALID_LINKS}"], said
    assert links(device(active=True, announced=True)) == {
        path: text for path, text in seen.links.items() if path.count("/") < 5}
    assert seen.text("reader") == "14:00 CEST\n" and update in seen.text(
        "/var/db/timezone/TZVersionDiffRecord")

    seen = here.boot(AGAIN, DEVICES)
    assert printed(seen) == [] and seen.text("reader") == "14:00 CEST\n"
    assert seen.text("again") == STATUS[init]


@pytest.mark.rest
def test_links_of_two_data_sets(init):
    """With the mend; and with one that only fails, which stops no boot."""
    file, off, on = MEND[init]
    made = device(active=True, announced=True)
    made.drop(ICUTZ)
    here = System(f"{init}-mend", INITS[init] + f"""
        {updated(made)}
        sed -i 's,{off},{on},' etc/{file}
        awk 'length > 255 {{ exit 1 }}' etc/{file}
        grep -qF '{on}' etc/{file}
        echo '/dev/nvme0n3 /var ext4 defaults 0 0' >etc/fstab""", apart="var")
    seen = here.boot(f"rm {ICUTZ}; cp /bin/false /usr/libexec/marlin-mend", DEVICES)
    assert printed(seen)[0] == (
        f"marlin-mend: {ZONEINFO} did not fit {ICUTZ}; marlin makes both anew")
    assert seen.links[ICUTZ] == links(device(active=True))[ICUTZ]

    seen = here.boot(options=DEVICES)
    assert any(lines.NOT_NEWER % ((names().update,) * 2) in line
               for line in printed(seen)), printed(seen)
    assert ICUTZ not in seen.links and seen.text("reader") == "14:00 CEST\n"


@pytest.mark.rest
def test_without_var(init):
    """Where "/var" is read-only and empty the boot goes on."""
    here = System(f"{init}-without-var", INITS[init] + """
        echo '/dev/nvme0n3 /var ext4 ro 0 0' >etc/fstab
        rm -rf var; mkdir var""", apart="var")
    seen = here.boot(options=DEVICES)
    said = printed(seen)
    assert any(lines.NO_DATA in line for line in said), said
    assert seen.text("reader") == "12:00 UTC\n"
