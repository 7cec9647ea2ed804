// SPDX-License-Identifier: BSD-2-Clause
//
// One boot, run by the boot program's own code in this process.
#pragma once

#include <string>
#include <vector>

// A warning, taken whole where the program hands it to warn(3): no text inside
// one can look like another.
struct line {
  std::string format;  // as the program gives it, such as "read_symlink: %s"
  std::string text;    // as it is printed, without the newline
  int error = 0;       // the errno whose text the line ends with
};

// Where the warnings of this process go, instead of to standard error: a
// function that is called with each, or nullptr for nowhere. This program has
// its own warn(3) for it, which leaves errno alone.
using line_sink = void (*)(const line&);
void take_lines(line_sink sink);

struct rehearsal {
  std::vector<line> lines{};
  bool ends_normally = false;
  std::string thrown{};   // otherwise: what was thrown, in words
  unsigned refusals = 0;  // how often memory was refused to it
};

// Runs run_startup_pass() on the device that this process sees as "/".
rehearsal rehearse_boot();
