// SPDX-License-Identifier: BSD-2-Clause
//
// Every place on the device that the program knows, and whose it is. All are
// absolute and fixed; nothing can move them.
#pragma once

#include <cstddef>

namespace paths {

// Both directories are made by whoever sets up the device, never by marlin.
inline constexpr char timezone_directory[] = "/var/db/timezone/";
// Each downloaded data set is a directory directly below; its name is its
// version text. Written by whoever installs updates.
inline constexpr char download_root[] = "/var/db/timezone/tz/";

// The links that readers of time-zone data follow. marlin owns them; the user's
// choice of a zone is written to the last one by others, too.
inline constexpr char zoneinfo_link[] = "/var/db/timezone/zoneinfo";
inline constexpr char icu_link[] = "/var/db/timezone/icutz";  // updates only
inline constexpr char localtime_link[] = "/var/db/timezone/localtime";

// Names the newest download. Written by whoever installs updates; read here.
inline constexpr char latest_update_link[] = "/var/db/timezone/tz_latest";

// Written here whenever an update is activated; it outlives later boots.
inline constexpr char version_record[] = "/var/db/timezone/TZVersionDiffRecord";

// Left behind by older systems, and removed. The second is no slip for the
// first.
inline constexpr char legacy_icu_link[] = "/var/db/icutz";
inline constexpr char obsolete_icu[] = "/var/db/icu";

// The system partition's own data; read only.
inline constexpr char system_zoneinfo[] = "/usr/share/zoneinfo.default";
inline constexpr char system_icu[] = "/usr/share/icu";
// Where "localtime" pointed on older systems.
inline constexpr char former_zoneinfo[] = "/usr/share/zoneinfo";

// The length of a path as the prefix rules count it, without the NUL.
template <std::size_t size>
constexpr std::size_t length(const char (&)[size]) {
  return size - 1;
}

// A byte too many or too few in one of these would accept the wrong links.
static_assert(length(download_root) == 20);
static_assert(length(zoneinfo_link) == 25);
static_assert(length(former_zoneinfo) == 19);
static_assert(length(system_zoneinfo) == 27);

}  // namespace paths
