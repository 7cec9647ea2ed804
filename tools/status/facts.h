// SPDX-License-Identifier: BSD-2-Clause
//
// What stands on a device, read with the boot program's own classes.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "support/version.h"

// What stands at a path. "none" is an answer, `unknown` comes with an errno.
struct entry {
  enum class kind { none, link, file, directory, special, unknown };
  kind what = kind::none;
  std::string text{};  // a link's target; what a record holds
  int error = 0;

  bool operator==(const entry&) const = default;
};

// One data set as the boot program would build it.
struct dataset_facts {
  // How building it ends: a path that is refused, a number in the name that
  // does not fit, a walk that cannot be started, no memory.
  enum class state {
    built,
    bad_path,
    number_too_large,
    walk_failed,
    no_memory
  };
  state ends = state::built;
  std::string path{};  // empty: the system partition's
  std::string version_text{};
  mln_version version{};
  std::string schema{};
  bool fits_system = false;  // every component accepts the system's
  bool word_is_cut = false;  // memory did not suffice for a first word
  std::vector<std::string> unreadable{};  // what should be there, and why not
  bool has_several_schemas = false;

  bool has_version() const { return !(version == mln_version()); }
};

// How "zoneinfo" and "icutz" fit together.
enum class link_pair {
  system,              // the system's tree, no ICU link
  update,              // both of one update
  update_without_icu,  // an update's tree, no ICU link
  update_with_other_icu,
  system_with_icu,  // the system's tree, an ICU link
  not_the_tree,     // "zoneinfo" leads into a data set, but not to its tree
  no_dataset,       // "zoneinfo" names no data set
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
  link_pair pair = link_pair::no_dataset;
  bool zone_is_file = false;   // "localtime" leads to a regular file
  bool is_recordable = false;  // a record, through links, that a boot may write
};

// A directory among the downloads, and the links that need it.
struct download {
  std::string name{};
  std::vector<std::string> needed_by{};
};

struct device_facts {
  link_facts links{};
  bool legacy_resolves = false;  // as the boot asks, following links
  bool icutz_resolves = false;
  dataset_facts system{};
  std::optional<dataset_facts> current{};
  std::optional<dataset_facts> update{};
  std::vector<download> downloads{};  // those that are needed first
  int downloads_error = 0;
  bool has_more_downloads = false;  // than are listed
  std::string foreign_part{};       // the first that is another user's
  bool has_closed_part = false;     // one that not everybody may read
};

// The links as they are, also after a boot. Neither throws anything but
// std::bad_alloc, and neither changes anything. lstat(2), readlink(2), stat(2),
// open(2).
link_facts read_links();

// All of it. The data sets are read as a boot reads them.
device_facts read_device();
