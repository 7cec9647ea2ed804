# SPDX-License-Identifier: BSD-2-Clause
"""An emulated arm64 device: its disks, its boots, and a look at it afterwards.

The device has a system partition, which is read only and holds the program, and
a disk for "/var". Both are ext4 images that are built and looked at without any
privilege, by the tools of e2fsprogs; only the device's own kernel mounts them.
Its console is a file, in which every line begins with the kernel's time.
"""

import fcntl
import hashlib
import os
import pathlib
import re
import shutil
import subprocess
import sys
import time

PROJECT = pathlib.Path(__file__).resolve().parent.parent
GUEST = PROJECT / "emulator" / "guest"
WORK = PROJECT / "build" / "emulator"
PARTS = WORK / "parts"
PROGRAM = PROJECT / "build" / "arm64-release" / "marlin"

SKIPPED = 77
TIMEZONE = "db/timezone"  # on the disk for "/var"
DOWNLOADS = TIMEZONE + "/tz"

MODULES = ("drivers/virtio/virtio_ring", "drivers/virtio/virtio",
           "drivers/virtio/virtio_mmio", "drivers/block/virtio_blk")
APPLETS = """cat cp date dd df echo env false grep head insmod ln ls md5sum mkdir
  mount mv poweroff printf ps readlink rm seq setsid sh sleep sort stat switch_root
  sync tail test touch tr true umount uname uptime usleep vi wc cttyhack""".split()


class Unavailable(Exception):
  """What a device needs is not on this machine."""


def tool(name):
  path = shutil.which(name, path=os.environ.get("PATH", "") + ":/usr/sbin:/sbin")
  if path is None:
    raise Unavailable(f"there is no {name}")
  return path


def run(*command, **options):
  """Runs a tool; its output is shown only when it fails."""
  done = subprocess.run([str(word) for word in command], stdout=subprocess.PIPE,
                        stderr=subprocess.STDOUT, check=False, **options)
  if done.returncode != 0:
    sys.stdout.write(done.stdout.decode(errors="replace"))
    raise RuntimeError(f"{command[0]} failed with status {done.returncode}")
  return done.stdout


def build_program():
  if subprocess.run([PROJECT / "scripts" / "packages", "build", "arm64"],
                    check=False).returncode != 0:
    raise Unavailable("no program for arm64 can be built")
  print(f"Building {PROGRAM.relative_to(PROJECT)}", file=sys.stderr, flush=True)
  WORK.mkdir(parents=True, exist_ok=True)
  with open(WORK / "build.lock", "w", encoding="ascii") as lock:
    fcntl.flock(lock, fcntl.LOCK_EX)
    if not (PROGRAM.parent / "build.ninja").is_file():
      run("cmake", "--preset", "arm64-release", cwd=PROJECT)
    run("cmake", "--build", "--preset", "arm64-release", cwd=PROJECT)


def prepare():
  """Builds the program and fetches the parts; raises Unavailable when a device
  cannot be had."""
  build_program()
  fetched = subprocess.run([PROJECT / "emulator" / "parts", PARTS], check=False)
  if fetched.returncode != 0:
    raise Unavailable("the parts of a device cannot be had")
  for name in ("qemu-system-aarch64", "mke2fs", "e2fsck", "debugfs", "zic"):
    tool(name)


# --- The memory that it starts from -----------------------------------------


def cpio(entries):
  """An archive as the kernel unpacks it. Entries: name, mode, content."""
  archive = bytearray()
  for inode, (name, mode, content) in enumerate(
      [*entries, ("TRAILER!!!", 0, b"")], 1):
    encoded = name.encode() + b"\0"
    fields = (inode, mode, 0, 0, 1, 0, len(content), 0, 0, 0, 0, len(encoded), 0)
    archive += b"070701" + b"".join(b"%08X" % field for field in fields)
    archive += encoded
    archive += bytes(-len(archive) % 4)
    archive += content
    archive += bytes(-len(archive) % 4)
  return bytes(archive)


def first_memory():
  directories = ("bin", "dev", "device", "modules", "proc", "sys")
  entries = [(name, 0o40755, b"") for name in directories]
  entries.append(("bin/busybox", 0o100755, (PARTS / "busybox").read_bytes()))
  entries += [("bin/" + name, 0o120777, b"busybox") for name in APPLETS]
  entries.append(("init", 0o100755, (GUEST / "init").read_bytes()))
  for module in MODULES:
    [path] = (PARTS / "modules").glob(f"*/kernel/{module}.ko")
    entries.append((f"modules/{path.name}", 0o100644, path.read_bytes()))
  return cpio(entries)


# --- Its data ---------------------------------------------------------------


def write(path, content="", mode=0o644):
  path.parent.mkdir(parents=True, exist_ok=True)
  path.write_bytes(content if isinstance(content, bytes) else content.encode())
  path.chmod(mode)


def short_name(release):
  """What a clock shows that reads data of this release: 2024a -> U24A."""
  return release[2:4] + release[4:].upper()


def write_zones(tree, release, letter):
  """A tree whose zones tell, as their abbreviation, where they come from."""
  tree.mkdir(parents=True)
  rules = tree / "rules"
  name = letter + short_name(release)
  write(rules, f"Zone America/Los_Angeles -8:00 - {name}L\n"
               f"Zone Europe/Paris 1:00 - {name}P\n")
  run(tool("zic"), "-d", tree, rules)
  rules.unlink()
  write(tree / "+VERSION", release + "\n")


class Staging:
  """A directory that becomes a disk."""

  def __init__(self, path):
    self.path = path
    shutil.rmtree(path, ignore_errors=True)
    path.mkdir(parents=True)

  def link(self, name, target):
    path = self.path / name
    path.parent.mkdir(parents=True, exist_ok=True)
    path.unlink(missing_ok=True)
    path.symlink_to(target)

  def become(self, image, megabytes, label, *options):
    image.unlink(missing_ok=True)
    run(tool("mke2fs"), "-q", "-t", "ext4", "-b", "4096", "-m", "0", "-L", label,
        "-E", "root_owner=0:0,lazy_itable_init=0,lazy_journal_init=0",
        *options, "-d", self.path, image, f"{megabytes}M")
    shutil.rmtree(self.path)


def build_system(image, release="2023c", schema="44l"):
  """A system partition: the program, a shell, the system's own data."""
  staging = Staging(image.with_suffix(".staging"))
  root = staging.path
  for name in ("bin", "dev", "proc", "run", "sys", "tmp", "var"):
    (root / name).mkdir()
  write(root / "bin/busybox", (PARTS / "busybox").read_bytes(), 0o755)
  for name in APPLETS:
    staging.link("bin/" + name, "busybox")
  write(root / "sbin/marlin", PROGRAM.read_bytes(), 0o755)
  write(root / "sbin/boot", (GUEST / "boot").read_bytes(), 0o755)
  write_zones(root / "usr/share/zoneinfo.default", release, "S")
  write(root / "usr/share/icu/icutzformat.txt", schema + "\n")
  staging.become(image, 12, "system", "-O", "^has_journal")


def update_path(version):
  return "/var/db/timezone/tz/" + version


def add_update(staging, version, schema="44l"):
  directory = staging.path / DOWNLOADS / version
  write_zones(directory / "zoneinfo", version.split(".")[0], "U")
  write(directory / f"icutz/icutz{schema}.dat", "ICU " + version)


def add_system_links(staging):
  staging.link(TIMEZONE + "/zoneinfo", "/usr/share/zoneinfo.default")
  staging.link(TIMEZONE + "/localtime",
               "/var/db/timezone/zoneinfo/Europe/Paris")


# --- A look at a disk -------------------------------------------------------


def debugfs(image, request, *options):
  return run(tool("debugfs"), *options, "-R", request, image).decode()


def check(image):
  """What fsck.ext4 has to say of a disk; nothing when it is sound."""
  done = subprocess.run([tool("fsck.ext4"), "-fn", image], check=False,
                        stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
  return "" if done.returncode == 0 else done.stdout.decode()


def replay_journal(image):
  done = subprocess.run([tool("e2fsck"), "-p", "-E", "journal_only", image],
                        check=False, stdout=subprocess.PIPE,
                        stderr=subprocess.STDOUT)
  if done.returncode not in (0, 1):
    raise RuntimeError("no replay: " + done.stdout.decode())


def tree(image, path="/db"):
  """All below a directory of a disk: links as "-> target", files as bytes."""
  copy = image.with_suffix(".copy")
  shutil.rmtree(copy, ignore_errors=True)
  copy.mkdir()
  debugfs(image, f"rdump {path} {copy}")
  found = {}
  for directory, directories, files in os.walk(copy):
    for name in directories + files:
      entry = pathlib.Path(directory) / name
      key = str(entry.relative_to(copy))
      if entry.is_symlink():
        found[key] = "-> " + os.readlink(entry)
      elif entry.is_dir():
        found[key] = "a directory"
      else:
        found[key] = entry.read_bytes()
  shutil.rmtree(copy)
  return found


def identity(image, path):
  """Inode and times of change of what stands at a path; empty for nothing."""
  return re.findall(r"(?:Inode:|mtime:|ctime:) +\S+",
                    debugfs(image, f"stat {path}"))


def digest(image):
  return hashlib.sha256(image.read_bytes()).hexdigest()


# --- A boot -----------------------------------------------------------------

LINE = re.compile(r"^\[ *(\d+\.\d+)\] ?(.*?)\r?$")


class Console:
  """What a boot printed: lines with the kernel's time in seconds."""

  def __init__(self, path):
    self.text = path.read_bytes().decode(errors="replace")
    matches = (LINE.match(line) for line in self.text.split("\n"))
    self.lines = [(float(m[1]), m[2]) for m in matches if m]

  def said(self, prefix="device: "):
    """The lines of the device itself, without its name."""
    return [text[len(prefix):] for _, text in self.lines
            if text.startswith(prefix)]

  def time_of(self, text):
    for at, line in self.lines:
      if line == "device: " + text:
        return at
    raise RuntimeError(f"the console never said: {text}")

  def has(self, text):
    return any(line == "device: " + text for _, line in self.lines)

  def pass_lines(self):
    """What the pass of the boot printed, or the runtime on its behalf; the
    kernel may have printed in between."""
    printed, within = [], False
    for _, text in self.lines:
      if text.startswith("device: pass ended with status"):
        return printed
      if within and text.startswith(("marlin: ", "terminate called", "  what")):
        printed.append(text)
      within = within or text == "device: pass begins"
    raise RuntimeError("the pass never ended:\n" + self.text[-2000:])

  def status(self):
    for text in self.said():
      if text.startswith("pass ended with status "):
        return int(text.rsplit(" ", 1)[1])
    raise RuntimeError("the pass never ended:\n" + self.text[-2000:])


class Device:
  """One device, in a directory of its own."""

  def __init__(self, name):
    self.directory = WORK / name
    shutil.rmtree(self.directory, ignore_errors=True)
    self.directory.mkdir(parents=True)
    self.system = self.directory / "system.img"
    self.var = self.directory / "var.img"
    self.memory = self.directory / "memory"
    self.console = self.directory / "console"
    self.first_memory = first_memory()

  def command(self, scene, options, disk, serial):
    extra = cpio([("scene", 0o100644, scene.encode())]) if scene else b""
    self.memory.write_bytes(self.first_memory + extra)
    disk = disk or f"driver=raw,node-name=var,file.driver=file,file.filename={self.var}"
    parameters = f"console=ttyAMA0 loglevel=5 printk.devkmsg=on panic=-1 {options}"
    return [tool("qemu-system-aarch64"), "-M", "virt", "-cpu", "cortex-a57",
            "-m", "256", "-nodefaults", "-no-reboot", "-display", "none",
            "-serial", serial, "-kernel", str(PARTS / "kernel"),
            "-initrd", str(self.memory), "-append", parameters,
            "-blockdev", f"driver=raw,node-name=system,read-only=on,"
                         f"file.driver=file,file.filename={self.system}",
            "-device", "virtio-blk-device,drive=var",
            "-device", "virtio-blk-device,drive=system",
            "-blockdev", disk]

  def start(self, scene="", options="", disk=None, more=()):
    self.console.unlink(missing_ok=True)
    command = self.command(scene, options, disk, f"file:{self.console}")
    return subprocess.Popen([*command, *more], stdin=subprocess.DEVNULL)

  def boot(self, scene="", options="", disk=None, more=(), seconds=120):
    """One boot from power on to power off. `scene` is what the device does
    when it is up, in its shell's language; `more` are words for the emulator."""
    emulator = self.start(scene, options, disk, more)
    try:
      emulator.wait(seconds)
    except subprocess.TimeoutExpired:
      emulator.kill()
      emulator.wait()
      print(self.console.read_text(errors="replace")[-4000:])
      raise RuntimeError(f"the device was not done after {seconds} s") from None
    console = Console(self.console)
    if emulator.returncode != 0 or not console.has("shut down"):
      raise RuntimeError("the device did not shut down:\n" + console.text[-4000:])
    return console

  def wait_for(self, emulator, text, seconds=120):
    """Until the console says so."""
    end = time.monotonic() + seconds
    while time.monotonic() < end and emulator.poll() is None:
      if self.console.exists() and Console(self.console).has(text):
        return
      time.sleep(0.05)
    raise RuntimeError(f"the console never said: {text}\n" +
                       self.console.read_text(errors="replace")[-4000:])
