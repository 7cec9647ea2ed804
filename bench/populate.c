// SPDX-License-Identifier: BSD-2-Clause
//
// populate DIRECTORY NUMBER: makes that many empty files, named other.0 and so
// on, in a directory. For a million of them a shell loop is too slow.
#define _GNU_SOURCE
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

int main(int argc, char** argv) {
  if (argc != 3 || chdir(argv[1]) != 0) {
    fputs("populate: needs a directory and a number\n", stderr);
    return 2;
  }
  const long number = strtol(argv[2], NULL, 10);
  for (long i = 0; i < number; i++) {
    char name[32];
    snprintf(name, sizeof name, "other.%ld", i);
    const int file = open(name, O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
    if (file < 0) {
      perror("populate");
      return 1;
    }
    close(file);
  }
  return 0;
}
