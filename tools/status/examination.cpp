// SPDX-License-Identifier: BSD-2-Clause
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <stdexcept>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/status/failure.h"
#include "tools/status/limits.h"
#include "tools/status/report.h"
#include "tools/status/throwaway.h"

namespace {

std::vector<std::string> unknown(const report& told, bool is_running_system) {
  std::vector<std::string> texts;
  const auto has_several = [](const std::optional<dataset_facts>& set) {
    return set && set->has_several_schemas;
  };
  if (!is_running_system &&
      (has_several(told.device.current) || has_several(told.device.update)))
    texts.emplace_back(
        "which ICU data file comes first on the device's own file system");
  if (!(told.after == told.device.links))
    texts.emplace_back("whether there is space for the links");
  if (!is_running_system)
    texts.emplace_back("what the device mounts over this tree");
  return texts;
}

// A word that is cut costs one refusal, and an update's decides nothing.
void insist_on_enough_memory(const report& told) {
  const auto lacks_memory = [](const std::optional<dataset_facts>& set) {
    return set && set->ends == dataset_facts::state::no_memory;
  };
  unsigned expected = 0;
  for (const auto* set : {&told.device.current, &told.device.update})
    if (*set && !(*set)->path.empty() && (*set)->word_is_cut) ++expected;
  if (told.device.system.word_is_cut || told.boot.refusals > expected ||
      lacks_memory(told.device.current) || lacks_memory(told.device.update) ||
      std::any_of(told.boot.lines.begin(), told.boot.lines.end(),
                  [](const line& said) { return said.error == ENOMEM; }))
    throw cannot_tell("the next boot takes more than " +
                      std::to_string(most_memory >> 20) + " MB of memory");
}

// In a user namespace this user is the device's root only as far as the device
// is this user's. What is sound for somebody with the rights of everybody is
// sound.
void insist_on_rights(const report& told, const place& here) {
  const std::string& foreign = told.device.foreign_part;
  if (!foreign.empty() &&
      (told.why.is != verdict::sound || told.device.has_closed_part ||
       !here.owner_may_change_links))
    throw cannot_tell(escaped(foreign) +
                      " belongs to another user or group, or has an access "
                      "list; run this as root");
}

// Tried, because it does not follow from the links.
bool is_mended_by_a_removal(const report& told) {
  return told.after == told.device.links && !told.after.pair.fits &&
         ::unlink(paths::zoneinfo_link) == 0 && rehearse_boot().ends_normally &&
         read_links().pair.fits;
}

}  // namespace

report examine(const std::string& root) {
  limit_time();
  place here = enter_throwaway_device(root);
  become_the_boot();
  limit_memory();
  count_refusals();
  report told;
  told.device = read_device(here.seen);
  if (!here.has_all_users) {
    told.device.foreign_part = here.foreign_part;
    told.device.has_known_owner = !here.has_foreign_links;
    note_rights(told.device, here.seen);
  }
  insist_on_enough_memory(told);
  told.boot = rehearse_boot();
  told.after = read_links();
  insist_on_enough_memory(told);
  told.why = explain(told.device, told.boot, told.after);
  insist_on_rights(told, here);
  told.cannot_know = unknown(told, here.is_running_system);
  told.is_mended_by_a_removal = is_mended_by_a_removal(told);
  return told;
}
