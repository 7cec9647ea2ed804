// SPDX-License-Identifier: BSD-2-Clause
//
// One boot, run by the boot program's own code in a process of its own.
#pragma once

#include <string>
#include <vector>

#include "tools/status/line.h"

struct rehearsal {
  std::vector<line> lines;
  bool ends_normally = false;
  std::string thrown{};   // otherwise: what was thrown, in words
  unsigned refusals = 0;  // how often memory was refused to it
};

// Runs run_startup_pass() in a child of this process, on the device that this
// process sees as "/". Throws cannot_tell if the child cannot be made or comes
// to a limit. fork(2), pipe(2), waitpid(2).
rehearsal rehearse_boot();
