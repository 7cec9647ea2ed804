// SPDX-License-Identifier: BSD-2-Clause
#include <csignal>
#include <cstdio>

#include "driver/startup.h"

namespace {

// A log that is gone must not stop the boot: without this, a warning into a
// pipe that nobody reads any more would kill the program.
void survive_a_lost_log() { std::signal(SIGPIPE, SIG_IGN); }

// warn(3) writes a line in three pieces to an unbuffered stream; a log that
// takes every write for a record, as the kernel's does, would tear it apart. A
// line longer than the buffer still comes in pieces.
void write_whole_lines() {
  static char line[BUFSIZ];
  std::setvbuf(stderr, line, _IOLBF, sizeof line);
}

}  // namespace

// One boot, in order:
//  1. The two time-zone directories are freed from data protection.
//  2. The legacy link "/var/db/icutz" moves to "/var/db/timezone/icutz".
//  3. "/var/db/icu" goes.
//  4. The system partition's data set is read, and what "tz_latest" announces.
//  5. "zoneinfo" is resolved, and reset to the system partition if it makes no
//     sense; the data set that it names is read.
//  6. It is reset as well if that set is older than the system's, or of another
//     ICU schema.
//  7. An announced update that is strictly newer, and of the system's schema,
//     is linked into place and recorded.
//  8. What fails in 4 to 7 and is not mended there, but for the record, ends
//     with links to the system partition.
//  9. "localtime" is repaired.
int main() {
  survive_a_lost_log();
  write_whole_lines();
  run_startup_pass();
  return 0;
}
