// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/words.h"

#include <array>

#include "support/paths.h"

std::string kind_of(const entry& here) {
  static constexpr std::array names = {"none",      "link",    "file",
                                       "directory", "special", "unknown"};
  return names.at(static_cast<std::size_t>(here.what));
}

std::string data_in_use(const link_facts& links) {
  if (!links.current_path) return "none";
  return links.current_path->empty() ? "system" : "update";
}

bool fits(link_pair pair) {
  return pair == link_pair::system || pair == link_pair::update;
}

pair_words words_for(link_pair pair) {
  static constexpr pair_words words[] = {
      {"system", "zoneinfo and icutz name the same data"},
      {"update", "zoneinfo and icutz name the same data"},
      {"update_without_icu",
       "zoneinfo names an update, but there is no link icutz"},
      {"update_with_other_icu",
       "icutz does not name the ICU data of zoneinfo's update"},
      {"system_with_icu",
       "zoneinfo names the system partition, but there is a link icutz"},
      {"not_the_tree", "zoneinfo leads into an update, but not to its tree"},
      {"no_dataset", "zoneinfo names no data set"}};
  return words[static_cast<std::size_t>(pair)];
}

std::string zone_of(const link_facts& links) {
  const std::string tree = std::string(paths::zoneinfo_link) + "/";
  if (!links.localtime.text.starts_with(tree)) return {};
  return links.localtime.text.substr(tree.size());
}
