// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/words.h"

#include "support/paths.h"

std::string kind_of(const entry& here) {
  switch (here.what) {
    case entry::kind::none:
      return "none";
    case entry::kind::link:
      return "link";
    case entry::kind::file:
      return "file";
    case entry::kind::directory:
      return "directory";
    case entry::kind::special:
      return "special";
    case entry::kind::unknown:
      break;
  }
  return "unknown";
}

std::string data_in_use(const link_facts& links) {
  if (!links.current_path) return "none";
  return links.current_path->empty() ? "system" : "update";
}

std::string name_of(link_pair pair) {
  switch (pair) {
    case link_pair::system:
      return "system";
    case link_pair::update:
      return "update";
    case link_pair::update_without_icu:
      return "update_without_icu";
    case link_pair::update_with_other_icu:
      return "update_with_other_icu";
    case link_pair::system_with_icu:
      return "system_with_icu";
    case link_pair::not_the_tree:
      return "not_the_tree";
    case link_pair::no_dataset:
      break;
  }
  return "no_dataset";
}

std::string zone_of(const link_facts& links) {
  const std::string tree = std::string(paths::zoneinfo_link) + "/";
  if (!links.localtime.text.starts_with(tree)) return {};
  return links.localtime.text.substr(tree.size());
}
