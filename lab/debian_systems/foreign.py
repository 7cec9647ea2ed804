# SPDX-License-Identifier: BSD-2-Clause
"""Runs commands that start arm64 programs, as if this machine could."""

import subprocess
from pathlib import Path

FORMAT = "/usr/lib/binfmt.d/qemu-aarch64.conf"
# A namespace's formats are its own from Linux 6.7 on; before that it has the machine's.
SCRIPT = f"""
echo made
read -r mapped
formats=/proc/sys/fs/binfmt_misc
exec sh -euc 'mount -t binfmt_misc formats $0 && cat {FORMAT} >$0/register || :
exec "$@"' $formats "$@"
"""


def run_with_qemu(*command):
    """As root, in a namespace with all of its users, so that this machine does not
    change. Raises with what is printed if the command fails."""
    with subprocess.Popen(
            ["unshare", "--user", "--mount", "sh", "-euc", SCRIPT, "-", *command],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE,
            stderr=subprocess.STDOUT) as process:
        first = process.stdout.readline()
        if first == b"made\n":
            first = b""
            for users in ("uid_map", "gid_map"):
                Path(f"/proc/{process.pid}/{users}").write_text("0 0 65536\n")
        printed, _ = process.communicate(b"\n")
    if process.returncode:
        raise RuntimeError((first + printed).decode(errors="replace"))
