# SPDX-License-Identifier: BSD-2-Clause
"""usage: scripts/private-device [--readable DIR | --writable DIR]... COMMAND [ARG...]
       scripts/private-device --probe

Runs a command on a private device: a mount namespace in which "/var/db" and
"/usr/share" are empty file systems in memory, gone when the command ends. The
machine's own tools, this project and its build folder can be read there, as can
every --readable directory; only a --writable one can be changed. All capabilities
are dropped, so that a permission failure is a real one even for root. There is no
network. With --probe nothing is run: the exit status tells.

Exit status: the command's; 77 when there can be no private device, 2 for bad use.
"""

# Every test starts this, so it imports no more than it must.
import os
import signal
import sys

PROJECT = os.path.realpath(f"{__file__}/../../..")
REMEDY = ("root allows it by: sysctl -e -w kernel.unprivileged_userns_clone=1 "
          "user.max_user_namespaces=10000 "
          "kernel.apparmor_restrict_unprivileged_userns=0; "
          "a container has to be started with --privileged")
OPTIONS = """--unshare-ipc --unshare-pid --unshare-net --unshare-uts --cap-drop ALL
    --die-with-parent --tmpfs / --ro-bind /usr /usr --ro-bind /etc /etc --dev /dev
    --proc /proc --tmpfs /tmp --dir /run --tmpfs /var/db --tmpfs /usr/share
    --setenv HOME /tmp --setenv MARLIN_PRIVATE_DEVICE 1""".split()


def stop(status: int, text: str):
    print("private-device:", text, file=sys.stderr)
    sys.exit(status)


def device(*more: str) -> list[str]:
    """What to put before a command that is to run on a private device; `more` are
    options of bubblewrap's."""
    options = []
    for place in "/bin /sbin /lib /lib32 /lib64".split():
        if os.path.islink(place):
            options += ["--symlink", os.readlink(place), place]
        elif os.path.isdir(place):
            options += ["--ro-bind", place, place]
    for place in (PROJECT, os.environ.get("MARLIN_BUILD", "")):
        if os.path.isdir(place):
            place = os.path.realpath(place)
            options += ["--ro-bind", place, place]
    return ["bwrap", *OPTIONS, *options, *more, "--chdir", PROJECT, "--"]


def why_not(bwrap: list[str]) -> str:
    """Why this leads to no private device, in bubblewrap's own words; empty if it
    does."""
    told = os.memfd_create("told")
    try:
        probe = os.posix_spawnp(bwrap[0], [*bwrap, "true"], os.environ, file_actions=[
            (os.POSIX_SPAWN_DUP2, told, 2)])
    except OSError:
        return "bwrap is not installed (Debian package bubblewrap)"
    status = os.waitpid(probe, 0)[1]
    os.lseek(told, 0, os.SEEK_SET)
    with open(told, errors="replace") as text:
        words = " ".join(text.read().split()) or f"bwrap: wait status {status}"
    return f"{words}; {REMEDY}" if status else ""


def main(words: list[str]):
    binds = []
    while words and words[0].startswith("-"):
        option = words.pop(0)
        if option == "--help":
            print(__doc__, end="")
            sys.exit()
        elif option in ("--readable", "--writable"):
            if not words or not os.path.isdir(words[0]):
                stop(2, f"{option} needs an existing directory; see --help")
            place = os.path.realpath(words.pop(0))
            binds += ["--ro-bind" if option == "--readable" else "--bind", place, place]
        elif option == "--probe" and not words:
            words = None
        elif option == "--":
            break
        else:
            stop(2, f"{option} is not understood; see --help")
    if words == []:
        stop(2, "no command given; see --help")

    # Python ignores them, and the command would inherit that.
    signal.signal(signal.SIGPIPE, signal.SIG_DFL)
    signal.signal(signal.SIGXFSZ, signal.SIG_DFL)
    bwrap = device(*binds)
    if reason := why_not(bwrap):
        stop(77, reason)
    if words is not None:
        os.execvp("bwrap", [*bwrap, *words])


if __name__ == "__main__":
    main(sys.argv[1:])
