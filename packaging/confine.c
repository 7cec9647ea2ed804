// SPDX-License-Identifier: BSD-2-Clause
//
// Stands in marlin's place in a test and starts "marlin.real" beside it, under
// the restrictions of the boot unit: its read-only and hidden paths, no
// capability, its limit of memory, and its system calls, those that systemd
// adds left out. lab/test_package.py takes all of them from the unit and
// compiles them in. One difference, on purpose: a call that the unit refuses
// kills here, so that no refusal goes unnoticed.
#define _GNU_SOURCE
#include <err.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <linux/mount.h>
#include <linux/securebits.h>
#include <sched.h>
#include <seccomp.h>
#include <stdio.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

static const char* const writable[] = {WRITABLE_PATHS};
static const char* const read_only[] = {READ_ONLY_PATHS};
static const char* const hidden[] = {HIDDEN_PATHS};
static const char* const allowed_calls[] = {ALLOWED_CALLS};

#define LENGTH(list) (sizeof(list) / sizeof *(list))

static void must(int result, const char* what) {
  if (result < 0) err(125, "confine: %s", what);
}

static void write_file(const char* path, const char* text) {
  const int file = open(path, O_WRONLY | O_CLOEXEC);
  must(file, path);
  must((int)write(file, text, strlen(text)), path);
  close(file);
}

static void map_itself(const char* file, unsigned id) {
  char map[32];
  snprintf(map, sizeof map, "%u %u 1\n", id, id);
  write_file(file, map);
}

// The only way to mounts of its own for a process without capabilities; only
// root cannot go it, because nobody may hand on its number.
static void enter_namespaces(void) {
  const uid_t user = getuid();
  const gid_t group = getgid();
  must(unshare(CLONE_NEWUSER | CLONE_NEWNS), "unshare");
  write_file("/proc/self/setgroups", "deny");
  map_itself("/proc/self/uid_map", user);
  map_itself("/proc/self/gid_map", group);
}

// A path that is missing is no error, as after the "-" in the unit.
static void make_mount(const char* path) {
  if (mount(path, path, NULL, MS_BIND | MS_REC, NULL) != 0 && errno != ENOENT)
    must(-1, path);
}

static void set_read_only(const char* path, int on, unsigned flags) {
  struct mount_attr wanted = {0};
  *(on ? &wanted.attr_set : &wanted.attr_clr) = MOUNT_ATTR_RDONLY;
  if (syscall(SYS_mount_setattr, AT_FDCWD, path, flags, &wanted,
              sizeof wanted) != 0 &&
      errno != ENOENT)
    must(-1, path);
}

static void protect_paths(void) {
  for (size_t i = 0; i < LENGTH(writable); ++i) make_mount(writable[i]);
  for (size_t i = 0; i < LENGTH(read_only); ++i) make_mount(read_only[i]);
  set_read_only("/", 1, AT_RECURSIVE);
  for (size_t i = 0; i < LENGTH(writable); ++i)
    set_read_only(writable[i], 0, 0);
  for (size_t i = 0; i < LENGTH(read_only); ++i)
    set_read_only(read_only[i], 1, 0);
}

// Last of all mounts: the log and what is needed until exec are open by then.
static void hide_paths(void) {
  for (size_t i = 0; i < LENGTH(hidden); ++i)
    if (mount("hidden", hidden[i], "tmpfs", MS_RDONLY, "mode=000") != 0 &&
        errno != ENOENT)
      must(-1, hidden[i]);
}

static void limit_memory(void) {
  const struct rlimit none = {0, 0};
  struct rlimit all;
  must(getrlimit(RLIMIT_AS, &all), "memory");
  // A test may have set a smaller one.
  if (all.rlim_max > MEMORY) all.rlim_cur = all.rlim_max = MEMORY;
  must(setrlimit(RLIMIT_AS, &all), "memory");
  must(setrlimit(RLIMIT_CORE, &none), "core");
}

static void drop_capabilities(void) {
  for (int capability = 0; prctl(PR_CAPBSET_DROP, capability) == 0;)
    ++capability;
  // From here on root's user number gives nothing at the next exec.
  must(prctl(PR_SET_SECUREBITS, SECBIT_NOROOT | SECBIT_NOROOT_LOCKED),
       "securebits");
  must(prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0), "no_new_privs");
}

static void allow_only_listed_calls(void) {
  scmp_filter_ctx filter = seccomp_init(SCMP_ACT_KILL_PROCESS);
  for (size_t i = 0; i < LENGTH(allowed_calls); ++i) {
    const int number = seccomp_syscall_resolve_name(allowed_calls[i]);
    // The list names the calls of all architectures.
    if (number < 0) continue;
    must(seccomp_rule_add(filter, SCMP_ACT_ALLOW, number, 0), allowed_calls[i]);
  }
  must(seccomp_load(filter), "seccomp");
  seccomp_release(filter);
}

// MemoryDenyWriteExecute.
static void refuse_writable_code(void) {
  const scmp_datum_t both = PROT_WRITE | PROT_EXEC;
  scmp_filter_ctx filter = seccomp_init(SCMP_ACT_ALLOW);
  must(seccomp_rule_add(filter, SCMP_ACT_KILL_PROCESS, SCMP_SYS(mmap), 1,
                        SCMP_A2(SCMP_CMP_MASKED_EQ, both, both)),
       "mmap");
  must(seccomp_rule_add(filter, SCMP_ACT_KILL_PROCESS, SCMP_SYS(mprotect), 1,
                        SCMP_A2(SCMP_CMP_MASKED_EQ, PROT_EXEC, PROT_EXEC)),
       "mprotect");
  must(seccomp_load(filter), "seccomp");
  seccomp_release(filter);
}

// A tracer that makes a call fail gives it a number that is on no list.
static int is_traced(void) {
  char line[128];
  int tracer = 0;
  FILE* const status = fopen("/proc/self/status", "re");
  if (status == NULL) err(125, "confine: /proc/self/status");
  while (fgets(line, sizeof line, status) != NULL)
    if (sscanf(line, "TracerPid: %d", &tracer) == 1) break;
  fclose(status);
  return tracer != 0;
}

int main(int argc, char** argv) {
  (void)argc;
  char real[PATH_MAX];
  const ssize_t length = readlink("/proc/self/exe", real, sizeof real - 8);
  must((int)length, "/proc/self/exe");
  strcpy(real + length, ".real");

  const int traced = is_traced();
  enter_namespaces();
  protect_paths();
  hide_paths();
  drop_capabilities();
  limit_memory();
  if (!traced) {
    refuse_writable_code();
    allow_only_listed_calls();
  }
  execv(real, argv);
  err(125, "confine: %s", real);
}
