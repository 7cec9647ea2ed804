# SPDX-License-Identifier: BSD-2-Clause
"""What a command costs: instructions, system calls, memory. All of them are exact, and
the same under every load of the machine."""

import contextlib
import ctypes
import os
import re
import signal
import subprocess
from collections.abc import Callable
from pathlib import Path

# Each variable more is some 550 instructions more in the C library's start-up.
ENVIRONMENT = {"PATH": "/usr/bin"}
SECONDS = 60  # a command that takes longer hangs
# From <sys/ptrace.h> and <sys/wait.h>.
TRACEME, CONT, SETOPTIONS = 0, 7, 0x4200
FORK, VFORK, CLONE, EXEC, EXIT, EXITKILL = 1, 2, 3, 4, 6, 20
OPTIONS = sum(1 << event for event in (FORK, VFORK, CLONE, EXEC, EXIT, EXITKILL))
WALL = 0x40000000


def run(*command: str):
    """Runs a command, which must not fail."""
    subprocess.run(command, env=ENVIRONMENT, stdout=subprocess.DEVNULL,
                   stderr=subprocess.DEVNULL, check=True)


def instructions(program: str) -> int:
    """In user space."""
    run("valgrind", "--tool=callgrind", "--callgrind-out-file=/dev/null",
        "--log-file=/tmp/valgrind", program)
    return int(re.search(r"Collected *: (\d+)", Path("/tmp/valgrind").read_text())[1])


def costs(program: str, restore: Callable) -> tuple[int, int, int]:
    """Instructions, system calls and peak memory in kB."""
    restore()
    counted = instructions(program)
    restore()
    run("strace", "-qq", "-o", "/tmp/calls", program)
    calls = re.findall(r"^[a-z_0-9]+\(", Path("/tmp/calls").read_text(), re.M)
    restore()
    return counted, len(calls), peak(program)[0]


def ptrace(*request: int):
    if ctypes.CDLL(None, use_errno=True).ptrace(*map(ctypes.c_long, request)) < 0:
        raise OSError(ctypes.get_errno(), "ptrace failed")


def peak(*command: str | Path, log=subprocess.DEVNULL) -> tuple[int, int]:
    """Runs a command: the most kB that one of its processes had, and what wait(2) told.
    The resident set is read at the end of each process, from the kernel's exact
    counters: those of getrusage(2) are estimates, too coarse for programs of this size,
    and a child of Python begins with Python's."""
    child = subprocess.Popen(
        command, env=ENVIRONMENT, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
        stderr=log, preexec_fn=lambda: ptrace(TRACEME, 0, 0, 0))
    signal.signal(signal.SIGALRM, lambda *_: child.kill())
    signal.alarm(SECONDS)
    os.waitpid(child.pid, 0)
    ptrace(SETOPTIONS, child.pid, 0, OPTIONS)
    ptrace(CONT, child.pid, 0, 0)
    most = ended = 0
    with contextlib.suppress(ChildProcessError):  # until there is none any more
        while True:
            process, state = os.waitpid(-1, WALL)
            if not os.WIFSTOPPED(state):
                if process == child.pid:
                    child.returncode = ended = state
                continue
            event, stop = state >> 16, os.WSTOPSIG(state)
            if event == EXIT:
                status = Path(f"/proc/{process}/status").read_text()
                most = max(most, int(re.search(r"VmHWM:\s*(\d+)", status)[1]))
            # A new process begins with a stop that is ours, not the command's.
            ours = event or stop in (signal.SIGTRAP, signal.SIGSTOP)
            ptrace(CONT, process, 0, 0 if ours else stop)
    signal.alarm(0)
    return most, ended
