// SPDX-License-Identifier: BSD-2-Clause
//
// Tries, in marlin's place, what the boot unit forbids, and prints what came of
// it: a test that confines nothing would pass with any program.
// Without restrictions all files can be opened, and no call is refused.
#define _GNU_SOURCE
#include <errno.h>
#include <fcntl.h>
#include <sched.h>
#include <signal.h>
#include <stdio.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

static char new_files[] =
    "/var/db/entry /var/db/timezone/entry /var/db/timezone/tz/entry /entry "
    "/dev/entry /dev/mqueue/entry /dev/shm/entry /etc/entry /home/entry "
    "/root/entry /run/entry /run/lock/entry /run/systemd/entry "
    "/run/systemd/incoming/entry /run/systemd/system/entry.service "
    "/run/user/entry /tmp/entry /usr/entry /usr/libexec/entry "
    "/usr/share/entry /usr/share/icu/entry /usr/share/zoneinfo.default/entry "
    "/var/entry /var/lib/entry /var/log/entry /var/tmp/entry";

static char kernel_files[] =
    "/dev/kmsg /proc/1/oom_score_adj /proc/sys/kernel/core_pattern "
    "/proc/sys/kernel/hostname /proc/sysrq-trigger "
    "/sys/fs/cgroup/cgroup.subtree_control "
    "/sys/fs/cgroup/system.slice/cgroup.procs /sys/power/state";

static char secrets[] =
    "/dev/console /dev/kmsg /dev/mem /dev/nvme0 /dev/nvme0n1 /dev/nvme0n2 "
    "/dev/rtc0 /dev/tty1 /dev/ttyS0 /etc/shadow /proc/1/environ "
    "/proc/1/root/etc/shadow /proc/kcore /proc/kmsg /root/secret /run/secret "
    "/var/db/node";

#define EACH(list)                \
  char* path = strtok(list, " "); \
  path != NULL;                   \
  path = strtok(NULL, " ")

static void tell(const char* what, const char* name, long result) {
  fprintf(stderr, "%s %s: %s\n", what, name,
          result < 0 ? strerror(errno) : "done");
}

static void create(const char* path) {
  const int file = open(path, O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  tell("write", path, file);
  if (file < 0) return;
  close(file);
  unlink(path);
}

// Opening is enough: what is written there could end the test.
static void open_only(const char* what, const char* path, int mode) {
  const int file = open(path, mode | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  tell(what, path, file);
  if (file >= 0) close(file);
}

static void print_capabilities(void) {
  char line[128];
  FILE* const status = fopen("/proc/self/status", "re");
  while (status != NULL && fgets(line, sizeof line, status) != NULL)
    if (strncmp(line, "Cap", 3) == 0) fputs(line, stderr);
}

static void print_limits(void) {
  struct rlimit memory = {0}, core = {0};
  getrlimit(RLIMIT_AS, &memory);
  getrlimit(RLIMIT_CORE, &core);
  fprintf(stderr, "limit memory: %llu\nlimit core: %llu\n",
          (unsigned long long)memory.rlim_max,
          (unsigned long long)core.rlim_max);
}

// With arguments that would fail anyway, but for another reason.
static void make_calls(void) {
  tell("call", "socket", socket(AF_UNIX, SOCK_STREAM, 0));
  tell("call", "link", link("/usr/share/icu/icutzformat.txt", "/var/db/entry"));
  tell("call", "rename", rename("/var/db/none", "/var/db/entry"));
  tell("call", "mkdir", mkdir("/var/db/entry", 0755));
  tell("call", "mknod", mknod("/var/db/entry", S_IFIFO | 0600, 0));
  tell("call", "chmod", chmod("/var/db", 0755));
  tell("call", "chown", chown("/var/db", 0, 0));
  tell("call", "clone", syscall(SYS_clone, CLONE_SIGHAND, 0, 0, 0, 0));
  tell("call", "kill", kill(1, 0));
  tell("call", "ptrace", syscall(SYS_ptrace, PTRACE_PEEKUSER, 1, 0, 0));
  tell("call", "mount", syscall(SYS_mount, 0, 0, 0, 0, 0));
  tell("call", "unshare", syscall(SYS_unshare, 0));
  tell("call", "shmget", syscall(SYS_shmget, 0, 0, 0));
  tell("call", "mq_open", syscall(SYS_mq_open, "entry", O_RDONLY, 0, 0));
  tell("call", "bpf", syscall(SYS_bpf, 0, 0, 0));
  tell("call", "memfd_create", syscall(SYS_memfd_create, "entry", 0));
  tell("call", "io_uring_setup", syscall(SYS_io_uring_setup, 1, 0));
  tell("call", "keyctl", syscall(SYS_keyctl, 0, 0, 0, 0, 0));
  tell("call", "clock_settime", syscall(SYS_clock_settime, 0, 0));
  tell("call", "sethostname", syscall(SYS_sethostname, 0, 4));
  tell("call", "open of a new set-user-ID file",
       open("/var/db/entry", O_WRONLY | O_CREAT | O_CLOEXEC, S_ISUID | 0700));
  unlink("/var/db/entry");
  void* const code = mmap(NULL, 4096, PROT_READ | PROT_WRITE | PROT_EXEC,
                          MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  tell("call", "mmap of writable code", code == MAP_FAILED ? -1 : 0);
}

int main(int argc, char** argv) {
  // Nobody is to start it by hand: where nothing is forbidden it does harm.
  const char* const name = argc > 0 ? strrchr(argv[0], '/') : NULL;
  if (name == NULL || strcmp(name, "/marlin") != 0) return 2;
  for (EACH(new_files)) create(path);
  for (EACH(kernel_files)) open_only("write", path, O_WRONLY);
  for (EACH(secrets)) open_only("read", path, O_RDONLY);
  print_capabilities();
  print_limits();
  fputs("calls: next\n", stderr);
  make_calls();
  return 0;
}
