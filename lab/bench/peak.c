// SPDX-License-Identifier: BSD-2-Clause
//
// peak COMMAND [ARG...]: runs a command and prints the largest resident set, in
// kB, that one of its processes had. Read at the end of each process, from the
// kernel's exact counters: those of getrusage(2) are estimates, too coarse for
// programs of this size. The command's own output goes nowhere.
#define _GNU_SOURCE
#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ptrace.h>
#include <sys/wait.h>
#include <unistd.h>

static void fail(const char* what) {
  fprintf(stderr, "peak: %s: %s\n", what, strerror(errno));
  exit(1);
}

static long largest_resident_set(pid_t process) {
  char path[64];
  char line[256];
  long kilobytes = 0;
  snprintf(path, sizeof path, "/proc/%ld/status", (long)process);
  FILE* const status = fopen(path, "re");
  if (status == NULL) fail(path);
  while (fgets(line, sizeof line, status) != NULL)
    if (sscanf(line, "VmHWM: %ld", &kilobytes) == 1) break;
  fclose(status);
  return kilobytes;
}

static void become(char** command) {
  const int nowhere = open("/dev/null", O_RDWR | O_CLOEXEC);
  if (nowhere < 0) fail("/dev/null");
  dup2(nowhere, STDOUT_FILENO);
  const int complaints = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 3);
  dup2(nowhere, STDERR_FILENO);
  if (ptrace(PTRACE_TRACEME, 0, NULL, NULL) == 0) execv(command[0], command);
  dprintf(complaints, "peak: %s: %s\n", command[0], strerror(errno));
  _exit(127);
}

int main(int argc, char** argv) {
  if (argc < 2) {
    fputs("peak: no command given\n", stderr);
    return 2;
  }
  const pid_t first = fork();
  if (first < 0) fail("fork");
  if (first == 0) become(argv + 1);

  int state;
  if (waitpid(first, &state, 0) != first) fail("waitpid");
  if (!WIFSTOPPED(state)) return 1;
  const long options = PTRACE_O_TRACEEXIT | PTRACE_O_TRACEFORK |
                       PTRACE_O_TRACEVFORK | PTRACE_O_TRACECLONE |
                       PTRACE_O_TRACEEXEC | PTRACE_O_EXITKILL;
  if (ptrace(PTRACE_SETOPTIONS, first, NULL, options) != 0) fail("ptrace");
  ptrace(PTRACE_CONT, first, NULL, NULL);

  long peak = 0;
  int result = 1;
  pid_t process;
  while ((process = waitpid(-1, &state, __WALL)) > 0) {
    if (!WIFSTOPPED(state)) {
      if (process == first && WIFEXITED(state)) result = WEXITSTATUS(state);
      continue;
    }
    const int event = state >> 16;
    if (event == PTRACE_EVENT_EXIT) {
      const long kilobytes = largest_resident_set(process);
      if (kilobytes > peak) peak = kilobytes;
    }
    // A new process begins with a stop that is ours, not the command's.
    const int signal = WSTOPSIG(state);
    const int ours = event != 0 || signal == SIGTRAP || signal == SIGSTOP;
    ptrace(PTRACE_CONT, process, NULL, ours ? 0L : (long)signal);
  }
  printf("%ld\n", peak);
  return result;
}
