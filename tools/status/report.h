// SPDX-License-Identifier: BSD-2-Clause
//
// What is told of a device, for people and for programs.
#pragma once

#include <string>
#include <vector>

#include "tools/status/facts.h"
#include "tools/status/rehearsal.h"

enum class verdict {
  sound = 0,    // the boot changes nothing
  changes = 1,  // it changes something on purpose
  wrong = 2,    // something is wrong, now or after the boot
};

struct step {
  std::string name;    // such as "update"
  std::string does;    // such as "refused"
  std::string reason;  // such as "older"; the page lists all
  std::string text;    // the same for a person, device texts escaped

  std::string sentence() const;  // the text, after the name in words
};

struct explanation {
  std::vector<step> steps{};  // in the order of the boot
  verdict is = verdict::sound;
  std::vector<step> reasons{};  // if not sound: steps, and what is found beside
};

struct report {
  device_facts device{};
  rehearsal boot{};
  link_facts after{};
  dataset_facts system_after{};
  explanation why{};
  std::vector<std::string> cannot_know{};
  bool is_mended_by_a_removal = false;  // of "zoneinfo", before another boot
};

// Runs the device's next boot where it leaves no trace, for good: this process
// then sees nothing else. Throws cannot_tell, or what explain() throws.
report examine(const std::string& root);

// What the rehearsed boot did, and why: its lines and its effect, explained by
// the facts. Nothing is decided here that the boot has not shown. Throws
// std::bad_alloc, and std::logic_error if the boot did what is in no table.
explanation explain(const report& told);

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
