// SPDX-License-Identifier: BSD-2-Clause
// A running program that uses the C library's local time: each line of standard
// input is a moment, counted from 1970, and is answered with the clock.
#include <stdio.h>
#include <stdlib.h>
#include <time.h>

int main(void) {
  char line[64];
  while (fgets(line, sizeof line, stdin) != NULL) {
    const time_t moment = atoll(line);
    char clock[16];
    if (strftime(clock, sizeof clock, "%H:%M", localtime(&moment)) == 0) {
      return 1;
    }
    puts(clock);
    fflush(stdout);
  }
  return 0;
}
