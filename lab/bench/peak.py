# SPDX-License-Identifier: BSD-2-Clause
"""The largest resident set of a command. It is read at the end of each process, from
the kernel's exact counters: those of getrusage(2) are estimates, too coarse for
programs of this size, and a child of Python begins with Python's."""

import contextlib
import ctypes
import os
import re
import signal
import subprocess
from pathlib import Path

# From <sys/ptrace.h> and <sys/wait.h>.
TRACEME, CONT, SETOPTIONS = 0, 7, 0x4200
FORK, VFORK, CLONE, EXEC, EXIT, EXITKILL = 1, 2, 3, 4, 6, 20
OPTIONS = sum(1 << event for event in (FORK, VFORK, CLONE, EXEC, EXIT, EXITKILL))
WALL = 0x40000000


def ptrace(*request: int):
    if ctypes.CDLL(None, use_errno=True).ptrace(*map(ctypes.c_long, request)) < 0:
        raise OSError(ctypes.get_errno(), "ptrace failed")


def peak(*command: str | Path, **options) -> tuple[int, int]:
    """Runs a command, whose output goes nowhere: the most kB that one of its processes
    had, and the exit status."""
    child = subprocess.Popen(
        command, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
        stderr=subprocess.DEVNULL, preexec_fn=lambda: ptrace(TRACEME, 0, 0, 0),
        **options)
    os.waitpid(child.pid, 0)
    ptrace(SETOPTIONS, child.pid, 0, OPTIONS)
    ptrace(CONT, child.pid, 0, 0)
    most = 0
    with contextlib.suppress(ChildProcessError):  # until there is none any more
        while True:
            process, state = os.waitpid(-1, WALL)
            if not os.WIFSTOPPED(state):
                if process == child.pid:
                    child.returncode = os.waitstatus_to_exitcode(state)
                continue
            event, stop = state >> 16, os.WSTOPSIG(state)
            if event == EXIT:
                status = Path(f"/proc/{process}/status").read_text()
                most = max(most, int(re.search(r"VmHWM:\s*(\d+)", status)[1]))
            # A new process begins with a stop that is ours, not the command's.
            ours = event or stop in (signal.SIGTRAP, signal.SIGSTOP)
            ptrace(CONT, process, 0, 0 if ours else stop)
    return most, child.returncode
