// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/device_facts.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <stdexcept>
#include <string_view>

#include "dataset/icu.h"
#include "dataset/icu_file_name.h"
#include "dataset/zoneinfo.h"
#include "support/paths.h"
#include "support/version_grammar.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"
#include "tools/install/path_text.h"

namespace {

std::string text_of(const char* link) {
  return link_text(AT_FDCWD, link, link);
}

std::string first_step_below(std::string_view root, std::string_view path) {
  if (!path.starts_with(root)) return {};
  path.remove_prefix(root.size());
  return std::string(path.substr(0, path.find('/')));
}

std::string existing(const std::string& set) {
  const std::string path = paths::download_root + set;
  return status_of(AT_FDCWD, path, path).st_mode != 0 ? set : std::string();
}

// The path without any link in it; empty if there is nothing at its end.
std::string resolved(const char* path) {
  const std::unique_ptr<char, decltype(&std::free)> found(
      ::realpath(path, nullptr), &std::free);
  if (found) return found.get();
  // Otherwise a set might be deleted that something needs.
  if (errno != ENOENT && errno != ENOTDIR && errno != ELOOP)
    fail("follow the link", path);
  return {};
}

}  // namespace

std::optional<mln_version> version_in(const std::string& text) {
  if (!match_version_text(text)) return std::nullopt;
  try {
    return mln_version(text);
  } catch (const std::out_of_range&) {
    return std::nullopt;
  }
}

std::string set_in(const std::string& link_text) {
  return first_step_below(paths::download_root, link_text);
}

std::string announced_set() {
  return existing(set_in(text_of(paths::latest_update_link)));
}

std::string set_in_use() {
  return existing(set_in(text_of(paths::zoneinfo_link)));
}

std::string system_version() { return mln_zoneinfo().version() + ".1.0"; }

std::string system_schema() { return mln_icu().schema; }

bool fits_system(const std::string& set) {
  const std::string path = paths::download_root + set + "/icutz";
  const std::unique_ptr<DIR, close_listing> entries(::opendir(path.c_str()));
  const std::string schema = system_schema();
  while (entries) {
    const dirent* const entry = ::readdir(entries.get());
    if (entry == nullptr) break;
    if (!schema.empty() && icu_schema_in(entry->d_name) == schema) return true;
  }
  return false;
}

std::string zone_of_the_user() {
  const std::string text = text_of(paths::localtime_link);
  for (const std::string_view tree :
       {paths::zoneinfo_link, paths::former_zoneinfo}) {
    if (text.size() > tree.size() && text.starts_with(tree) &&
        text[tree.size()] == '/')
      return joined("", text.substr(tree.size()));
  }
  return {};
}

std::set<std::string> needed_sets() {
  const std::string root = resolved(paths::download_root) + "/";
  std::set<std::string> needed;
  for (const char* link :
       {paths::zoneinfo_link, paths::icu_link, paths::latest_update_link,
        paths::legacy_icu_link, paths::localtime_link}) {
    needed.insert(set_in(text_of(link)));
    needed.insert(first_step_below(root, resolved(link)));
  }
  needed.erase("");
  return needed;
}
