// SPDX-License-Identifier: BSD-2-Clause
#include "driver/dataset_links.h"

#include <err.h>

#include "driver/link_rejected.h"
#include "support/fsutil.h"
#include "support/paths.h"

std::string latest_update_path() {
  return fsutil::read_symlink(paths::latest_update_link);
}

std::string current_dataset_path() {
  return dataset_path_from_link(fsutil::read_symlink(paths::zoneinfo_link));
}

std::string dataset_path_from_link(const std::string& target) {
  constexpr auto root_length = paths::length(paths::download_root);
  if (target.starts_with(paths::download_root)) {
    // Deliberate: the name after the last "/" is not compared with anything,
    // because only the data set counts here. The depth is not checked, because
    // a path further down gives no version, and a data set without one is older
    // than any that has one. Pinned by
    // DatasetPathFromLink.AcceptsAnyNameAfterTheLastSlash and
    // DatasetPathFromLink.AcceptsATargetSeveralLevelsDown.
    const auto last_slash = target.rfind('/');
    if (last_slash > root_length) return target.substr(0, last_slash);
  } else if (target == paths::system_zoneinfo) {
    return {};
  }
  ::warn("Bad zoneinfo link %s", target.c_str());
  throw link_rejected;
}
