// SPDX-License-Identifier: BSD-2-Clause
//
// One complete time-zone data set: the system partition's own, or a downloaded
// update. Building one only reads the file system.
#pragma once

#include <string>

#include "dataset/components.h"
#include "support/version.h"

class mln_dataset {
 public:
  // The system partition's data set.
  mln_dataset();
  // The data set in the directory `dataset_path`, directly below
  // "/var/db/timezone/tz/" and without a trailing "/"; an empty path means the
  // system partition. Prints "mln_dataset::create_components: bad path PATH"
  // and throws std::invalid_argument, "badpath", for a path that does not begin
  // with that directory or names nothing in it. The rest of the path is the
  // version text; one that does not parse, such as that of a deeper path,
  // prints the parser's lines and leaves `version` unset. Also throws what the
  // parser and the components throw.
  explicit mln_dataset(std::string dataset_path);

  mln_dataset(const mln_dataset&) = delete;
  mln_dataset& operator=(const mln_dataset&) = delete;

  // Builds the components and sets `version_string` and `version`; called by
  // the constructors. Prints and throws what is said there.
  void create_components();

  // Whether every component of this data set accepts its counterpart in
  // `other`; see compatible_components().
  bool compatible_with(const mln_dataset& other) const;

  // Links every component into place, in order. The first exception ends this;
  // what is linked by then stays linked.
  void activate() const;

  // Set by the constructor; nothing changes them afterwards.
  mln_version version{};
  // An update's directory name; for the system partition the release in its
  // zoneinfo tree with ".1.0" appended.
  std::string version_string{};
  std::string path;             // as given; empty: the system partition
  component_list components{};  // mln_zoneinfo, then mln_icu
};

// Whether both were built from the same path; they are equal even if the disk
// changed in between.
bool operator==(const mln_dataset& left, const mln_dataset& right);

// Whether `left` is of a strictly newer version.
bool operator>(const mln_dataset& left, const mln_dataset& right);

// Builds the system partition's data set anew and activates it, so that
// "/var/db/timezone/zoneinfo" names its tree and the ICU links are gone.
// Catches nothing.
void reset_to_system_partition();
