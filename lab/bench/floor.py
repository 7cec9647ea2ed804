# SPDX-License-Identifier: BSD-2-Clause
"""The least that a boot can cost: a C program that makes the system calls of the
model's boot of a device, in their order, and nothing between them. It takes no
decision; every path and every outcome is known when it is compiled."""

import json
import subprocess
from pathlib import Path

from lab.oracles import model
from lab.words import lines
from lab.words.device import Device
from lab.words.paths import RECORD

# Always the same, however marlin is built: no hardening that takes an instruction.
COMPILER = "gcc -std=gnu11 -O2 -Wall -static -s -Wl,--gc-sections,-z,relro,-z,now"
# No call is checked, and what is read is not looked at.
PROGRAM = """#define _GNU_SOURCE
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>
static char buffer[4096];
static struct stat status;
int main(void) {{
  int file[9], last = -1;
  signal(SIGPIPE, SIG_IGN);
  signal(SIGXFSZ, SIG_IGN);
{calls}
}}
"""
CALLS = {
    "access": "access({path}, F_OK);", "readlink": "readlink({path}, buffer, 1024);",
    "symlink": "symlink({text}, {path});", "unlink": "unlink({path});",
    "rmdir": "rmdir({path});", "stat": "stat({path}, &status);",
    "lstat": "lstat({path}, &status);", "fstat": "fstat(file[last], &status);",
    "open": "file[++last] = open({path}, O_RDONLY | O_CLOEXEC);",
    "create": "file[++last] = open({path}, "
              "O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);",
    "read": "read(file[last], buffer, sizeof buffer);",
    "write": "write(file[last], {text}, sizeof {text} - 1);",
    "fchdir": "fchdir(file[last]);", "close": "close(file[last--]);",
    "getdents": "syscall(SYS_getdents64, file[last], buffer, sizeof buffer);"}


def compile_floor(device: Device, program: Path):
    """For this device, which boots in the model. What it is in the end is what the
    program makes of it at once."""
    outcome, after = model.boot(device), device.contents()
    calls = [CALLS[name].format(path=json.dumps(path),
                                text=json.dumps(after.get(path or RECORD)))
             for name, path in outcome.calls]
    said = [f"{lines.NAME}{text}: No such file or directory\n"
            for text, _ in outcome.lines]
    calls += [f"write(STDERR_FILENO, {json.dumps(text)}, {len(text)});"
              for text in said]
    subprocess.run([*COMPILER.split(), "-xc", "-", "-o", program], text=True,
                   input=PROGRAM.format(calls="\n".join(calls)), check=True)
