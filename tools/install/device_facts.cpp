// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/device_facts.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <stdexcept>
#include <string_view>

#include "dataset/icu.h"
#include "dataset/zoneinfo.h"
#include "support/paths.h"
#include "support/version_grammar.h"
#include "tools/escaped.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"

namespace {

std::string text_of(const char* link) {
  return link_text(AT_FDCWD, link, link);
}

std::string first_step_below(std::string_view root, std::string_view path) {
  if (!path.starts_with(root)) return {};
  path.remove_prefix(root.size());
  return std::string(path.substr(0, path.find('/')));
}

std::string set_in(const char* link) {
  return first_step_below(paths::download_root, text_of(link));
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

// A call that fails looks to the boot's own classes like no text at all, which
// would let any update pass.
template <typename Reader>
std::string read_twice(const std::string& what, Reader reader) {
  try {
    const std::string text = reader();
    if (text == reader()) return text;
  } catch (int) {
  }
  refuse(what + " cannot be read");
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

bool is_file(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

bool is_installed(const std::string& set) {
  const std::string path = paths::download_root + set;
  return !set.empty() && status_of(AT_FDCWD, path, path).st_mode != 0;
}

std::string announced_set() { return set_in(paths::latest_update_link); }

std::string set_in_use() { return set_in(paths::zoneinfo_link); }

bool is_in_use(const std::string& set) {
  const std::string path = paths::download_root + set;
  return text_of(paths::zoneinfo_link) == path + "/zoneinfo" &&
         text_of(paths::icu_link) == path + "/icutz";
}

std::string system_version() {
  return read_twice("the system's version",
                    [] { return mln_zoneinfo().version(); }) +
         ".1.0";
}

std::string system_schema() {
  return read_twice("the system's ICU schema", [] { return mln_icu().schema; });
}

bool fits_system(const std::string& set) {
  const std::string schema = system_schema();
  return is_installed(set) && !schema.empty() &&
         schema == read_twice("the ICU schema of " + escaped(set), [&set] {
           return mln_icu(paths::download_root + set).schema;
         });
}

bool a_boot_could_take(const std::string& set) {
  const auto version = version_in(set);
  const std::string in_use = set_in_use();
  const auto than = version_in(in_use.empty() ? system_version() : in_use);
  return version && (!than || *version > *than) && fits_system(set);
}

std::string zone_of_the_user() {
  const std::string text = text_of(paths::localtime_link);
  for (const std::string tree :
       {paths::zoneinfo_link, paths::former_zoneinfo}) {
    if (!text.starts_with(tree + "/")) continue;
    const std::string zone = text.substr(tree.size() + 1);
    // Only a look at the way could tell where ".." leads.
    if (zone.find("..") != zone.npos) break;
    if (is_file(paths::localtime_link) ||
        is_file(paths::zoneinfo_link + ("/" + zone)))
      return zone;
  }
  return {};
}

std::set<std::string> needed_sets() {
  const std::string root = resolved(paths::download_root) + "/";
  std::set<std::string> needed;
  for (const char* link :
       {paths::zoneinfo_link, paths::icu_link, paths::latest_update_link,
        paths::legacy_icu_link, paths::localtime_link}) {
    needed.insert(set_in(link));
    needed.insert(first_step_below(root, resolved(link)));
  }
  needed.erase("");
  return needed;
}
