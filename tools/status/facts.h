// SPDX-License-Identifier: BSD-2-Clause
//
// What stands on a device, read with the boot program's own classes.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "support/version.h"
#include "tools/status/sight.h"

// What stands at a path. "none" is an answer, `unknown` comes with an errno.
struct entry {
  enum class kind { none, link, file, directory, special, unknown };
  kind what = kind::none;
  std::string text{};  // a link's target; what a record holds
  int error = 0;

  bool operator==(const entry&) const = default;
};
inline constexpr std::size_t longest_text = 4096;  // no more of one is read
entry entry_at(const char* path);
std::string target_of(const char* link);  // empty: it is none

// The names in a directory, as it lists them, no more than anybody reads.
// Returns an errno, or 0.
inline constexpr std::size_t most_names = 10000;
int list_directory(const std::string& path, std::vector<std::string>& names);

// One data set as the boot program would build it.
struct dataset_facts {
  // How building it ends: a path that is refused, a number in the name that
  // does not fit, a walk that cannot be started.
  enum class state { built, bad_path, number_too_large, walk_failed };
  state ends = state::built;
  std::string path{};  // empty: the system partition's
  std::string version_text{};
  mln_version version{};
  std::string schema{};
  bool fits_system = false;  // every component accepts the system's
  // What should be there, and why it does not count.
  std::vector<std::pair<std::string, std::string>> unreadable{};
  bool has_several_schemas = false;

  bool has_version() const { return !(version == mln_version()); }
};

// How "zoneinfo" and "icutz" fit together, as a name and as a sentence.
struct link_pair {
  std::string_view name = "no_dataset";
  std::string_view sentence = "zoneinfo names no data set";
  bool fits = false;

  bool operator==(const link_pair&) const = default;
};

struct link_facts {
  entry zoneinfo{};
  entry icutz{};
  entry localtime{};
  entry tz_latest{};
  entry record{};
  entry legacy_icutz{};
  entry old_icu{};
  std::optional<std::string> current_path{};  // if "zoneinfo" is accepted
  link_pair pair{};
  bool zone_is_file = false;  // "localtime" leads to a regular file

  bool operator==(const link_facts&) const = default;
};

struct device_facts {
  link_facts links{};
  bool legacy_resolves = false;  // as the boot asks, following links
  bool icutz_resolves = false;
  dataset_facts system{};
  std::optional<dataset_facts> current{};
  std::optional<dataset_facts> update{};
  // Among the downloads, with the links that need each; needed ones first.
  std::vector<std::pair<std::string, std::vector<std::string>>> downloads{};
  int downloads_error = 0;
  bool has_more_downloads = false;  // perhaps; more entries than are listed
  // How often memory was refused for the first word in an update, which is then
  // cut and decides nothing.
  unsigned refusals = 0;
};

// Asked as the boot asks; one that it has just made may be closed to it.
bool opens_record();

// The links, and the system partition's data set, as they are, also after a
// boot. Nothing here changes anything, or throws anything but std::bad_alloc.
link_facts read_links();
dataset_facts read_system();

// What readers need and only root may read; empty: nothing.
std::string closed_part(sight& seen);

// All of it. The data sets are read as a boot reads them; without memory for
// the system's throws std::bad_alloc.
device_facts read_device(sight& seen);

// The words in which they are told, the same for people and for programs.
std::string kind_of(const entry& here);
std::string schema_of(const dataset_facts& set);

// The zone that "localtime" names, below the active tree; empty: none.
std::string zone_of(const link_facts& links);
