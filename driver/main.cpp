// SPDX-License-Identifier: BSD-2-Clause
#include <csignal>
#include <cstdio>

#include "driver/startup.h"

namespace {

// A lost log must not stop the boot: without this, a warning into a pipe that
// nobody reads any more would kill the program.
void survive_a_lost_log() { std::signal(SIGPIPE, SIG_IGN); }

// warn(3) writes a line in three pieces to an unbuffered stream. A log in which
// every write is a record, such as the kernel's, would split the line. A line
// that is longer than the buffer still comes in pieces.
void write_whole_lines() {
  static char line[BUFSIZ];
  std::setvbuf(stderr, line, _IOLBF, sizeof line);
}

}  // namespace

int main() {
  survive_a_lost_log();
  write_whole_lines();
  run_startup_pass();
  return 0;
}
