// SPDX-License-Identifier: BSD-2-Clause
//
// What is told of a device, for people and for programs.
#pragma once

#include <string>
#include <vector>

#include "tools/status/explanation.h"
#include "tools/status/facts.h"
#include "tools/status/rehearsal.h"

struct report {
  device_facts device{};
  rehearsal boot{};
  link_facts after{};
  explanation why{};
  std::vector<std::string> cannot_know{};
  bool is_mended_by_a_removal = false;  // of "zoneinfo", before another boot
};

// Runs the device's next boot where it leaves no trace, for good: this process
// then sees nothing else. Throws cannot_tell, or what explain() throws.
report examine(const std::string& root);

// How rows are shown: `width` 0 means without wrapping, as into a pipe.
struct look {
  unsigned width = 0;
  bool has_colour = false;
};

// Rows for a person. All texts of the device are escaped.
std::string in_rows(const report& told, const look& wanted);

// One JSON object and a newline. Texts of the device are escaped as escaped()
// does, so that any bytes give valid JSON; see marlin-status(8) for the names.
std::string in_json(const report& told);

// The reasons for a status other than 0, each a line with its subject.
std::string in_reasons(const report& told);
