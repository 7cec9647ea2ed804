// SPDX-License-Identifier: BSD-2-Clause
#include "driver/localtime_link.h"

#include <err.h>

#include <cstdio>
#include <string>
#include <string_view>

#include "driver/link_rejected.h"
#include "support/fsutil.h"
#include "support/paths.h"

namespace {

constexpr char default_zone[] = "America/Los_Angeles";
constexpr char default_target[] =
    "/var/db/timezone/zoneinfo/America/Los_Angeles";
static_assert(std::string_view(default_target).ends_with(default_zone));

// std::remove, because anything in the way, even an empty directory, must go
// without a warning. If it stays, the link cannot be created, which is
// reported.
void replace_localtime_link(const std::string& target) {
  std::remove(paths::localtime_link);
  fsutil::create_symlink(target, paths::localtime_link);
}

// Throws for a link that cannot be kept or corrected.
void keep_or_correct_localtime_link() {
  const std::string target = fsutil::read_symlink(paths::localtime_link);
  // Deliberate: these are bare prefix tests, with no "/" required after the
  // prefix and no look at the zone file, so that a data set that lacks the
  // user's zone for a while does not cost the user's choice. Pinned by
  // LocaltimeLinkRepair.LeavesALinkToAMissingZoneAlone and
  // LocaltimeLinkRepair.AcceptsThePrefixWithoutASeparator.
  if (target.starts_with(paths::zoneinfo_link)) return;
  if (!target.starts_with(paths::former_zoneinfo)) throw link_rejected;

  const std::string corrected =
      paths::zoneinfo_link +
      target.substr(paths::length(paths::former_zoneinfo));
  // Deliberate: a correction is announced before it is known to work, so that
  // the log names the zone that a reset then loses. Pinned by
  // LocaltimeLinkRepair.AnnouncesACorrectionThatThenFails.
  ::warn("Correcting localtime link to %s", corrected.c_str());
  if (!fsutil::exists(corrected)) throw link_rejected;
  replace_localtime_link(corrected);
}

}  // namespace

void repair_localtime_link() {
  try {
    keep_or_correct_localtime_link();
  } catch (...) {
    // Any local time is better than none: fall back to the default zone.
    ::warn("localtime link invalid; resetting to %s", default_zone);
    replace_localtime_link(default_target);
  }
}
