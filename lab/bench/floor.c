// SPDX-License-Identifier: BSD-2-Clause
//
// The least that a pass can cost: the system calls that the scene asks for, in
// the order of a pass, and nothing between them. No decision is taken; every
// path and every outcome is known when this is compiled. One macro chooses the
// scene: FLOOR_QUIET, FLOOR_UPDATE, FLOOR_ACTIVATION, FLOOR_RESET or
// FLOOR_LOCALTIME.
#define _GNU_SOURCE
#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#define DB "/var/db/timezone/"
#define SYSTEM_TREE "/usr/share/zoneinfo.default"
#define UPDATE DB "tz/2024a.1.0"
#define OLD_UPDATE DB "tz/2022a.1.0"

static char buffer[4096];
static struct stat status;

// What is read is not looked at, and no call is checked.
#define IGNORE(call)                   \
  do {                                 \
    if (call) __asm__ volatile("" ::); \
  } while (0)

static inline void read_file(const char* path) {
  stat(path, &status);
  const int file = open(path, O_RDONLY | O_CLOEXEC);
  IGNORE(read(file, buffer, sizeof buffer));
  close(file);
}

static inline void read_system(void) {
  read_file(SYSTEM_TREE "/+VERSION");
  read_file("/usr/share/icu/icutzformat.txt");
}

// The calls of a walk by fts(3) to the only file of a directory.
static inline void walk(const char* path, const char* file) {
  stat(path, &status);
  const int start = open(".", O_RDONLY);
  IGNORE(fchdir(start));
  const int directory =
      open(path, O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_DIRECTORY);
  fstat(directory, &status);
  fstat(directory, &status);
  IGNORE(fchdir(directory));
  IGNORE(syscall(SYS_getdents64, directory, buffer, sizeof buffer));
  lstat(file, &status);
  IGNORE(syscall(SYS_getdents64, directory, buffer, sizeof buffer));
  close(directory);
  IGNORE(fchdir(start));
  close(start);
}

static inline void read_update(const char* version, const char* icu,
                               const char* data_file) {
  read_file(version);
  walk(icu, data_file);
}

#define READ_UPDATE(path) \
  read_update(path "/zoneinfo/+VERSION", path "/icutz", "icutz44l.dat")

static inline void read_link(const char* path) {
  IGNORE(readlink(path, buffer, 1024));
}

static inline void replace_link(const char* target, const char* path) {
  unlink(path);
  IGNORE(symlink(target, path));
}

#define SAY(line) IGNORE(write(STDERR_FILENO, line, sizeof line - 1))

int main(void) {
  signal(SIGPIPE, SIG_IGN);
  signal(SIGXFSZ, SIG_IGN);
  access("/var/db/icutz", F_OK);
  access("/var/db/icutz", F_OK);
  unlink("/var/db/icu");
  read_system();
  read_link(DB "tz_latest");
  read_link(DB "zoneinfo");

#if defined FLOOR_UPDATE
  READ_UPDATE(UPDATE);
#elif defined FLOOR_RESET
  READ_UPDATE(OLD_UPDATE);
  SAY("marlin: Symlink points at data incompatible with installed system: "
      "No such file or directory\n");
  read_system();
  replace_link(SYSTEM_TREE, DB "zoneinfo");
  unlink(DB "icutz");
  unlink("/var/db/icutz");
#else
  read_system();
#endif

#if defined FLOOR_ACTIVATION
  READ_UPDATE(UPDATE);
  replace_link(UPDATE "/zoneinfo", DB "zoneinfo");
  unlink(DB "icutz");
  unlink("/var/db/icutz");
  IGNORE(symlink(UPDATE "/icutz", DB "icutz"));
  stat(DB "TZVersionDiffRecord", &status);
  const int record = open(DB "TZVersionDiffRecord",
                          O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
  IGNORE(write(record, "2023c.1.0_2024a.1.0", 19));
  close(record);
#endif

  read_link(DB "localtime");
#if defined FLOOR_LOCALTIME
  SAY("marlin: localtime link invalid; resetting to America/Los_Angeles: "
      "No such file or directory\n");
  replace_link(DB "zoneinfo/America/Los_Angeles", DB "localtime");
#endif
  return 0;
}
