// SPDX-License-Identifier: BSD-2-Clause
//
// What a rehearsed boot did, and why: its lines and its effect, explained by
// the facts. Nothing is decided here that the boot has not shown.
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
  // For a verdict other than sound: of the steps, and what is found beside
  // them.
  std::vector<step> reasons{};
};

// `after` is what read_links() gives when the boot is over. Throws
// std::bad_alloc only, and std::logic_error if a boot did what is in no table.
explanation explain(const device_facts& device, const rehearsal& boot,
                    const link_facts& after);
