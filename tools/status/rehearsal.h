// SPDX-License-Identifier: BSD-2-Clause
//
// One boot, run by the boot program's own code in this process.
#pragma once

#include <string>
#include <vector>

#include "tools/status/line.h"

struct rehearsal {
  std::vector<line> lines{};
  bool ends_normally = false;
  std::string thrown{};   // otherwise: what was thrown, in words
  unsigned refusals = 0;  // how often memory was refused to it
};

// Runs run_startup_pass() on the device that this process sees as "/".
rehearsal rehearse_boot();
