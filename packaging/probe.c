// SPDX-License-Identifier: BSD-2-Clause
//
// Tries, in marlin's place, what the boot unit forbids, and prints what came of
// it: a test that confines nothing would pass whatever the program does.
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

static void try_to_write(const char* path) {
  const int file = open(path, O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  fprintf(stderr, "write %s: %s\n", path, file < 0 ? strerror(errno) : "done");
  if (file < 0) return;
  close(file);
  unlink(path);
}

static void print_capabilities(void) {
  char line[128];
  FILE* const status = fopen("/proc/self/status", "re");
  while (status != NULL && fgets(line, sizeof line, status) != NULL)
    if (strncmp(line, "Cap", 3) == 0) fputs(line, stderr);
}

int main(void) {
  try_to_write("/var/db/entry");
  try_to_write("/var/db/timezone/entry");
  try_to_write("/var/db/timezone/tz/entry");
  try_to_write("/var/entry");
  try_to_write("/usr/share/entry");
  try_to_write("/tmp/entry");
  try_to_write("/entry");
  print_capabilities();
  fputs("socket: next\n", stderr);
  fprintf(stderr, "socket: %d\n", socket(AF_UNIX, SOCK_STREAM, 0));
  return 0;
}
