// SPDX-License-Identifier: BSD-2-Clause
//
// The compiled zoneinfo tree of a data set.
#pragma once

#include <string>

#include "dataset/dataset_component.h"

class mln_zoneinfo final : public mln_dataset_component {
 public:
  // The system partition's tree, "/usr/share/zoneinfo.default".
  mln_zoneinfo();
  // The tree "zoneinfo" below the data set's directory; an empty path means
  // the system partition. Prints nothing, even if there is no such tree.
  explicit mln_zoneinfo(const std::string& path);

  // Always true: a zoneinfo tree fits every system.
  bool compatible_schema(const mln_dataset_component& other) const override;

  // Creates "/var/db/timezone/zoneinfo" anew, as a link to `zoneinfo_path`. If
  // the old one cannot be removed, prints "Unlink of zoneinfo softlink failed"
  // and goes on.
  void activate() const override;

  // The release of the data, such as 2024a: the first word of the tree's
  // "+VERSION" file when the component was built; empty if it had none.
  std::string version() const;

  // Reads that word; called by the constructors. Where there is none,
  // `version_string` stays as it is.
  void read_version();

  std::string zoneinfo_path;
  std::string version_string;
};
