// SPDX-License-Identifier: BSD-2-Clause
//
// The ICU time-zone data of a data set.
#pragma once

#include <string>

#include "dataset/dataset_component.h"

class mln_icu final : public mln_dataset_component {
 public:
  // The system partition's data, "/usr/share/icu".
  mln_icu();
  // The data in "icutz" below the data set's directory; an empty path means the
  // system partition. For an update without a usable data file prints
  // "No ICU schema found for PATH"; when the directory walk cannot be started
  // prints "tz_icu::initialize: fts_open of PATH/icutz failed, REASON" and
  // throws errno. Calls: fts(3).
  explicit mln_icu(const std::string& path);

  // Whether `other` is an mln_icu of the same schema; two without a schema are
  // compatible. If `other` is of another class, prints
  // "mln_icu::compatible_schema: could not dynamic_cast other component".
  bool compatible_schema(const mln_dataset_component& other) const override;

  // Removes "/var/db/timezone/icutz", then the legacy "/var/db/icutz". If the
  // first cannot be removed, the second is not tried; either failure prints
  // "unlink of ICU softlink failed". After that, for an update only, creates
  // "/var/db/timezone/icutz" as a link to `icu_path`.
  void activate() const override;

  // Finds the schema; called by the constructors. `schema` stays as it is where
  // there is none, and for an update also where it is known already.
  void initialize();

  std::string schema{};  // such as 44l; empty when none was found
  std::string icu_path;  // the directory of the data files
};
