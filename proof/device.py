# SPDX-License-Identifier: BSD-2-Clause
"""The real device of a proof: built from a model's device, booted with the real
program, looked at, and compared with what the model expects of it.

Also what every proof shares: its command line, the way into private devices,
several of them side by side, and the last line with its figure.
"""

import argparse
import collections
import functools
import json
import os
import re
import shutil
import signal
import stat
import subprocess
import sys

PROJECT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
INSIDE = "MARLIN_PRIVATE_DEVICE"
PLACES = ("/usr/share", "/var/db")
BOOT_SECONDS = 30  # a boot that takes longer hangs
RESULT = "RESULT "  # begins the line with the figures of one private device
MOST_FAILURES = 10  # in each of the private devices
ERROR_TEXTS = {os.strerror(error) for error in range(134)}


def encoded(text):
  return text.encode("latin-1")


def decoded(raw):
  return raw.decode("latin-1")


# --- The command line, and the way in ----------------------------------------


def command_line(description):
  """A parser with what all proofs understand; --help shows `description`."""
  parser = OneLineParser(
      description=description,
      formatter_class=argparse.RawDescriptionHelpFormatter)
  parser.add_argument(
      "marlin", nargs="?",
      default=os.environ.get("MARLIN", f"{PROJECT}/build/release/marlin"),
      help="the program (default: $MARLIN, or build/release/marlin)")
  parser.add_argument("--quick", action="store_true",
                      help="a shorter run, of the same kind")
  parser.add_argument("--jobs", type=int, default=2, metavar="N",
                      help="private devices side by side (default: 2)")
  parser.add_argument("--part", help=argparse.SUPPRESS)
  return parser


class OneLineParser(argparse.ArgumentParser):

  def error(self, message):
    print(f"{self.prog}: {message}; see --help", file=sys.stderr)
    sys.exit(2)


class TooManyFailures(Exception):
  """Enough to see what is wrong."""


def report(done, what, found):
  """Prints a failure and counts it."""
  print("\n  ".join([f"FAILED {what}"] + found), flush=True)
  done["failures"] += 1
  if done["failures"] == MOST_FAILURES:
    raise TooManyFailures


def run_proof(parser, work, summary, needs=()):
  """Runs a proof: `work(options, part, parts, done)` in each of several private
  devices, which counts in the dictionary `done` what it does, failures by
  `report`, and then prints `summary(options, the sums)` as the last line. It
  exits with 77 where what it needs cannot be had."""
  options = parser.parse_args()
  if options.jobs < 1:
    parser.error("--jobs must be at least 1")
  for tool in needs:
    if not shutil.which(tool, path="/usr/bin:/bin"):
      print(f"{parser.prog}: {tool} is not installed (Debian package {tool})",
            file=sys.stderr)
      sys.exit(77)
  # Inside, the working directory is another.
  options.marlin = os.path.abspath(
      os.environ["MARLIN"] if options.part else options.marlin)
  if not os.access(options.marlin, os.X_OK) or os.path.isdir(options.marlin):
    parser.error(f"there is no program {options.marlin}: build it first")
  if options.part:
    insist_on_private_device()
    os.umask(0o022)
    os.chdir("/")
    part, parts = map(int, options.part.split("/"))
    done = collections.defaultdict(int)
    try:
      work(options, part, parts, done)
    except TooManyFailures:
      print("  too many failures", flush=True)
    print(RESULT + json.dumps(done), flush=True)
    return
  sums = run_parts(parser, options)
  print(f"{parser.prog}: {summary(options, sums)}")
  sys.exit(1 if sums["failures"] else 0)


def run_parts(parser, options):
  script = os.path.abspath(sys.argv[0])
  command = [f"{PROJECT}/scripts/private-device", "--readable",
             os.path.dirname(options.marlin), "--", script]
  environment = dict(os.environ, MARLIN=options.marlin)
  processes = [
      subprocess.Popen(
          command + sys.argv[1:] + ["--part", f"{part}/{options.jobs}"],
          env=environment, stdout=subprocess.PIPE, text=True, errors="replace")
      for part in range(options.jobs)]
  sums = collections.defaultdict(int)
  for process in processes:
    finished = False
    for line in process.stdout:
      if line.startswith(RESULT):
        finished = True
        add_up(sums, json.loads(line[len(RESULT):]))
      else:
        print(line, end="", flush=True)
    status = process.wait()
    if not finished:
      if status != 77:  # no private device can be had, and that has been said
        print(f"{parser.prog}: a part of the proof ended early",
              file=sys.stderr)
      sys.exit(status or 1)
  return sums


def add_up(sums, more):
  """Numbers add up, those in dictionaries, too; of a "most ..." the greatest
  counts."""
  for key, value in more.items():
    if key not in sums:
      sums[key] = value
    elif key.startswith("most"):
      sums[key] = max(sums[key], value)
    elif isinstance(value, dict):
      add_up(sums[key], value)
    else:
      sums[key] += value


@functools.cache
def insist_on_private_device():
  """Whatever builds, boots or looks at a device calls this first: looking, too,
  changes permissions where it has to."""
  reason = why_not_private()
  if reason:
    raise SystemExit(f"refusing to touch this machine: {reason}")


def why_not_private():
  """Why this process may not touch the device's places; empty if it may."""
  if INSIDE not in os.environ:
    return "this is not a private device"
  kinds = {}
  with open("/proc/self/mountinfo", encoding="latin-1") as mounts:
    for line in mounts:
      before, after = line.split(" - ", 1)
      kinds[before.split()[4]] = after.split()[0]
  for place in ("/",) + PLACES:
    if kinds.get(place) != "tmpfs":
      return f"{place} is not a throw-away file system in memory"
  if len({os.stat(place).st_dev for place in ("/",) + PLACES}) != 3:
    return "/var/db and /usr/share are not file systems of their own"
  with open("/proc/self/status", encoding="latin-1") as status:
    if "CapEff:\t0000000000000000" not in status.read():
      return "this process has capabilities, so permissions mean nothing"
  return ""


# --- Building ----------------------------------------------------------------


def wipe():
  """Leaves an empty device."""
  insist_on_private_device()
  for place in PLACES:
    os.chmod(place, 0o755)
    empty(place)


def empty(directory):
  with os.scandir(directory) as entries:
    for entry in list(entries):
      if entry.is_dir(follow_symlinks=False):
        os.chmod(entry.path, 0o700)
        empty(entry.path)
        os.rmdir(entry.path)
      else:
        os.unlink(entry.path)


def build(device):
  """Makes the real device what the model's device is, and has the latter learn
  in which order its directories are listed."""
  wipe()
  for path in PLACES:
    build_below(path, device.find(path), exists=True)


def build_below(path, node, exists=False):
  raw = encoded(path)
  if node.kind == "dir":
    if not exists:
      os.mkdir(raw)
    for name, child in node.entries.items():
      build_below(path + "/" + name, child)
    node.entries = {decoded(name): node.entries[decoded(name)]
                    for name in os.listdir(raw)}
    os.chmod(raw, node.mode)
  elif node.kind == "file":
    descriptor = os.open(raw, os.O_WRONLY | os.O_CREAT | os.O_EXCL, 0o600)
    content = encoded(node.text)
    while content:
      content = content[os.write(descriptor, content):]
    os.fchmod(descriptor, node.mode)
    os.close(descriptor)
  elif node.kind == "link":
    os.symlink(encoded(node.text), raw)
  else:
    os.mkfifo(raw)
    os.chmod(raw, node.mode)


# --- Booting -----------------------------------------------------------------


class Booted:
  """How a process ended, as the model says it, and its standard error."""

  def __init__(self, status, log):
    self.log = log
    if os.WIFEXITED(status):
      self.ending = f"exit {os.WEXITSTATUS(status)}"
    else:
      number = os.WTERMSIG(status)
      self.ending = {signal.SIGABRT: "abort", signal.SIGKILL: "killed"}.get(
          number, f"signal {number}")


def boot(command):
  """Runs a command with nothing but a log at standard error."""
  log = os.memfd_create("log")
  null = os.open("/dev/null", os.O_RDWR)
  status = spawn(command, {0: null, 1: null, 2: log})
  os.close(null)
  os.lseek(log, 0, os.SEEK_SET)
  with open(log, encoding="latin-1", newline="") as printed:
    return Booted(status, printed.read())


def spawn(command, descriptors):
  """Runs a command with these descriptors, None for a closed one, to its end,
  which is killed if it does not come."""
  insist_on_private_device()
  child = os.posix_spawn(
      command[0], command, {"PATH": "/usr/bin:/bin"},
      file_actions=[
          (os.POSIX_SPAWN_CLOSE, number) if ours is None
          else (os.POSIX_SPAWN_DUP2, ours, number)
          for number, ours in descriptors.items()],
      setsigdef=[signal.SIGPIPE, signal.SIGXFSZ])
  signal.signal(signal.SIGALRM, lambda *_: os.kill(child, signal.SIGKILL))
  signal.alarm(BOOT_SECONDS)
  status = os.waitpid(child, 0)[1]
  signal.alarm(0)
  return status


# --- Looking -----------------------------------------------------------------


class Seen:
  """What stands at one path, down to its identity."""

  def __init__(self, path, status):
    self.kind = {stat.S_IFDIR: "dir", stat.S_IFREG: "file",
                 stat.S_IFLNK: "link", stat.S_IFIFO: "fifo"}.get(
                     stat.S_IFMT(status.st_mode), "something else")
    self.mode = stat.S_IMODE(status.st_mode)
    self.text = ""
    self.names = []
    # Looking where the owner may not takes a change of the mode and back, and
    # that leaves a trace in the time of change.
    self.locked = (self.kind == "dir" and not self.mode & 0o500 == 0o500 or
                   self.kind == "file" and not self.mode & 0o400)
    self.identity = (status.st_ino, status.st_mtime_ns,
                     None if self.locked else status.st_ctime_ns)
    if self.kind == "link":
      self.text = decoded(os.readlink(path))
    elif self.locked:
      os.chmod(path, 0o700)
      self._look_inside(path)
      os.chmod(path, self.mode)
    else:
      self._look_inside(path)

  def _look_inside(self, path):
    if self.kind == "file":
      descriptor = os.open(path, os.O_RDONLY)
      size = os.fstat(descriptor).st_size
      self.text = decoded(b"".join(iter(lambda: os.read(descriptor, size + 1),
                                        b"")))
      os.close(descriptor)
    elif self.kind == "dir":
      self.names = [decoded(name) for name in os.listdir(path)]


def look():
  """Everything on the real device: path -> Seen."""
  insist_on_private_device()
  seen = {}

  def below(path):
    raw = encoded(path)
    status = os.lstat(raw)
    mode = stat.S_IMODE(status.st_mode)
    here = seen[path] = Seen(raw, status)
    if not here.names:
      return
    if here.locked:
      os.chmod(raw, 0o700)
    for name in here.names:
      below(path + "/" + name)
    if here.locked:
      os.chmod(raw, mode)

  for place in PLACES:
    below(place)
  return seen


def resolved(seen, path):
  """Where a path leads in what has been seen, or None."""
  for _ in range(40):
    parts = path.split("/")
    for length in range(2, len(parts) + 1):
      here = "/".join(parts[:length])
      if here in seen and seen[here].kind == "link":
        path = os.path.normpath(
            os.path.join(os.path.dirname(here), seen[here].text,
                         *parts[length:]))
        break
    else:
      return path if path in seen else None
  return None


# --- Comparing ---------------------------------------------------------------


def differences(device, seen):
  """Where the real device is not what the model's is; empty if nowhere. The
  model learns again in which order directories are listed."""
  found = []
  expected = dict(device.everything())
  for path in sorted(expected.keys() | seen.keys()):
    if path not in seen:
      found.append(f"{path} is missing: expected {described(expected[path])}")
    elif path not in expected:
      found.append(f"{path} is there: {described(seen[path])}")
    else:
      node, here = expected[path], seen[path]
      if described(node) != described(here):
        found.append(f"{path} is {described(here)}, expected {described(node)}")
      elif node.kind == "dir" and set(here.names) == set(node.entries):
        node.entries = {name: node.entries[name] for name in here.names}
  return found


def described(entry):
  text = entry.text if len(entry.text) < 300 else (
      f"{entry.text[:100]!r}... of {len(entry.text)} bytes, "
      f"hash {hash(entry.text)}")
  return {"dir": f"a directory, mode {entry.mode:04o}",
          "file": f"a file, mode {entry.mode:04o}, {text!r}",
          "link": f"a link to {text!r}",
          "fifo": f"a FIFO, mode {entry.mode:04o}"}.get(entry.kind, entry.kind)


def log_differences(outcome, booted):
  """Where the printed lines or the ending are not what the model says."""
  found = []
  if booted.ending != outcome.ending:
    found.append(f"ended with {booted.ending}, expected {outcome.ending}")
  rest = booted.log
  for text, error in outcome.lines:
    start = f"marlin: {text}: "
    if not rest.startswith(start):
      found.append(f"expected the line {start!r}, got {first_line(rest)!r}")
      return found
    ending, _, rest = rest[len(start):].partition("\n")
    if error is not None and ending != os.strerror(error):
      found.append(f"{start!r} ends in {ending!r}, "
                   f"expected {os.strerror(error)!r}")
    if ending not in ERROR_TEXTS:
      found.append(f"{start!r} ends in {ending!r}, which is no error's text")
  # The runtime's own words on an exception that nobody caught may follow.
  if rest and (outcome.ending != "abort" or rest.startswith("marlin: ")):
    found.append(f"expected no further line, got {first_line(rest)!r}")
  return found


def first_line(text):
  return text.partition("\n")[0]


def untouched(device_before, device, outcome, before, after):
  """Entries of the real device that were changed, or made anew, though no call
  of the model's boot has to do with them; `device_before` is path -> node."""
  now = dict(device.everything())
  return [
      f"{path} was changed or made anew"
      for path, node in device_before.items()
      if now.get(path) is node and node not in outcome.changed
      and path in before and path in after
      and before[path].identity != after[path].identity]


# --- Reproducing -------------------------------------------------------------


def quoted(text):
  if text and not re.search(r"[^A-Za-z0-9_@%+=:,./-]", text):
    return text
  return "$'" + "".join(
      char if char.isascii() and char.isprintable() and char not in "'\\"
      else f"\\{ord(char):03o}" for char in text) + "'"


def as_format(text):
  """A text, NUL bytes and all, as the format of printf."""
  return "'" + "".join(
      char if char.isascii() and char.isprintable() and char not in "'\\%"
      else f"\\{ord(char):03o}" for char in text) + "'"


def as_shell(device, boots, after, outcome):
  """A device, booted so often, as a test for a shell: what it builds, boots and
  then expects of the last boot: the lines, the way of ending, the device below
  "/var/db", and the record."""
  lines, modes = [], []

  def below(path, node):
    if node.kind == "dir":
      if path not in PLACES:
        lines.append(f"mkdir -p {quoted(path)}")
      for name, child in node.entries.items():
        below(path + "/" + name, child)
      modes.append((path, node.mode, 0o755))
    elif node.kind == "link":
      lines.append(f"ln -s -- {quoted(node.text)} {quoted(path)}")
    elif node.kind == "fifo":
      lines.append(f"mkfifo {quoted(path)}")
      modes.append((path, node.mode, 0o644))
    else:
      lines.append(f"printf {as_format(node.text)} >{quoted(path)}")
      modes.append((path, node.mode, 0o644))

  for place in PLACES:
    below(place, device.find(place))
  lines += [f"chmod {mode:o} {quoted(path)}"
            for path, mode, usual in modes if mode != usual]
  lines += ['"$1" 2>/dev/null'] * (boots - 1)
  return "\n".join(
      ['marlin=$(realpath "${MARLIN:-build/release/marlin}")',
       'LC_ALL=C scripts/private-device --readable "${marlin%/*}" '
       """bash -s "$marlin" <<'END'""", "umask 022"] +
      lines + expectations(after, outcome) + ["END"])


def expectations(device, outcome):
  """Commands for one more boot, and for what is not as expected after it."""
  status = 0 if outcome.ending == "exit 0" else 128 + signal.SIGABRT
  log = "".join(
      quoted(f"marlin: {text}: ") +
      ("*" if error is None else quoted(os.strerror(error))) + r"$'\n'"
      for text, error in outcome.lines)
  if outcome.ending == "abort":
    log += "*"  # the runtime's own words may follow
  below_var = [(path, node) for path, node in device.everything()
               if path.startswith("/var/db")]
  listing = [
      quoted(f"{path} {'p' if node.kind == 'fifo' else node.kind[0]} " +
             (node.text if node.kind == "link" else ""))
      for path, node in below_var]
  files = [(path, node) for path, node in below_var if node.kind == "file" and
           re.fullmatch("/var/db/[^/]+/[^/]+", path)]
  return [
      "failed=0",
      '"$1" 2>/tmp/log',
      f"status=$?; ((status == {status})) ||",
      f"  {{ echo \"status $status, expected {status}\"; failed=1; }}",
      f"[[ $(cat /tmp/log; echo .) == {log}. ]] ||",
      "  { echo 'unexpected log:'; cat /tmp/log; failed=1; }",
      "chmod -R u+rwx /var/db",
      r"find /var/db -printf '%p %y %l\n' | sort >/tmp/found",
      " \\\n  ".join([r"printf '%s\n'"] + listing) + " |",
      "  sort | diff - /tmp/found || failed=1"] + [
          f"printf {as_format(node.text)} | cmp - {quoted(path)} || failed=1"
          for path, node in files] + ["exit $failed"]
