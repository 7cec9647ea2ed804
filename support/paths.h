// SPDX-License-Identifier: BSD-2-Clause
//
// Every path on the device that the program knows, and who owns it. All are
// absolute and fixed; nothing can change them.
#pragma once

#include <cstddef>

namespace paths {

// Both directories are made by the device's image or its boot, never by marlin.
inline constexpr char timezone_directory[] = "/var/db/timezone/";
// Each downloaded data set is a directory directly below; its name is its
// version text. Written by the installer of updates.
inline constexpr char download_root[] = "/var/db/timezone/tz/";

// The links that readers of time-zone data follow. marlin owns them; the last
// one is also written by others, because it is the user's choice of a zone.
inline constexpr char zoneinfo_link[] = "/var/db/timezone/zoneinfo";
inline constexpr char icu_link[] = "/var/db/timezone/icutz";  // updates only
inline constexpr char localtime_link[] = "/var/db/timezone/localtime";

// What stands at the top of an update: each component's data.
inline constexpr const char* update_entries[] = {"icutz", "zoneinfo"};

// Names the newest download. Written by the installer of updates; only read
// here.
inline constexpr char latest_update_link[] = "/var/db/timezone/tz_latest";

// Written at each activation of an update, and never removed.
inline constexpr char version_record[] = "/var/db/timezone/TZVersionDiffRecord";

// Left behind by older systems, and removed. The second is not a misspelling of
// the first.
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

// With a byte more or less in one of these, the wrong links would be accepted.
static_assert(length(download_root) == 20);
static_assert(length(zoneinfo_link) == 25);
static_assert(length(former_zoneinfo) == 19);
static_assert(length(system_zoneinfo) == 27);

}  // namespace paths
