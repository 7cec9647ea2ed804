// SPDX-License-Identifier: BSD-2-Clause
#include <csignal>
#include <cstdio>

#include "driver/startup.h"

namespace {

// A write that fails must not stop the boot. A warning into a pipe that nobody
// reads any more would kill the program, and so would a warning or the record
// where files have reached the limit of their size.
void survive_failing_writes() {
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
}

// warn(3) writes a line in three pieces to an unbuffered stream. A log in which
// every write is a record, such as the kernel's, would split the line. A line
// that is longer than the buffer still comes in pieces.
void write_whole_lines() {
  static char line[BUFSIZ];
  std::setvbuf(stderr, line, _IOLBF, sizeof line);
}

}  // namespace

int main() {
  survive_failing_writes();
  write_whole_lines();
  run_startup_pass();
  return 0;
}
