// SPDX-License-Identifier: BSD-2-Clause
//
// The lines of a boot. Their texts are written out here once more, on purpose:
// a wrong text must not make its own test right.
#pragma once

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

namespace device {

using log_lines = std::vector<std::string>;

// All of these, in this order.
template <typename... Several>
log_lines lines(const Several&... several) {
  log_lines all;
  (all.insert(all.end(), several.begin(), several.end()), ...);
  return all;
}

// The line of a call that fails, or one that ends in an earlier call's error.
inline log_lines failure(const std::string& text, int error) {
  return {"marlin: " + text + ": " + std::strerror(error)};
}

// One without a value in it: a call gives it its error.
struct fixed_line {
  const char* text;
  log_lines operator()(int error = ENOENT) const {
    return failure(text, error);
  }
};

// --- Calls that failed -------------------------------------------------------

inline log_lines cannot_read(const std::string& link, int error) {
  return failure("read_symlink: " + link, error);
}
inline log_lines cannot_remove(const std::string& path, int error) {
  return failure("remove: could not remove " + path, error);
}
inline log_lines cannot_link(const std::string& path, const std::string& target,
                             int error) {
  return failure("create_symlink: from " + path + " to " + target, error);
}

// --- Data sets. No call fails right before most of these lines: where no error
// is given they end in that of the last "/var/db/icu" that was not there.

inline log_lines unparsed(const std::string& version, int error = ENOENT) {
  const std::string text = "Cannot parse version string " + version;
  return lines(failure(text + ", results.size() = 0", error),
               failure(text, error));
}
// A walk to its end leaves no error.
inline log_lines no_schema_in(const std::string& dataset, int error = 0) {
  return failure("No ICU schema found for " + dataset, error);
}
inline log_lines bad_path(const std::string& dataset) {
  return failure("mln_dataset::create_components: bad path " + dataset, ENOENT);
}
inline log_lines bad_zoneinfo_link(const std::string& target,
                                   int error = ENOENT) {
  return failure("Bad zoneinfo link " + target, error);
}
inline constexpr fixed_line invalid_links{
    "Invalid current symlinks; resetting to system partition"};
inline constexpr fixed_line incompatible{
    "Symlink points at data incompatible with installed system"};
inline log_lines refused(const std::string& update, const std::string& current,
                         int error = ENOENT) {
  return failure("New update not compatible or older version: " + update +
                     " vs. " + current,
                 error);
}
inline constexpr fixed_line unable_to_locate{
    "Unable to locate data; resetting to system partition"};

// --- The legacy link ---------------------------------------------------------

inline constexpr fixed_line not_migrated{
    "Could not migrate /var/db/icutz to /var/db/timezone/icutz"};
inline constexpr fixed_line not_removed{"Could not remove /var/db/icutz"};

// --- Links that are in the way, or made anew ---------------------------------

inline constexpr fixed_line zoneinfo_not_unlinked{
    "Unlink of zoneinfo softlink failed"};
inline log_lines zoneinfo_stays(int error) {
  return lines(cannot_remove("/var/db/timezone/zoneinfo", error),
               zoneinfo_not_unlinked(error));
}
inline constexpr fixed_line icu_not_unlinked{"unlink of ICU softlink failed"};
// The link in its present place, or in the legacy one.
inline log_lines icu_link_stays(const std::string& path, int error) {
  return lines(cannot_remove(path, error), icu_not_unlinked(error));
}
inline log_lines correcting_localtime(const std::string& target, int error) {
  return failure("Correcting localtime link to " + target, error);
}
inline constexpr fixed_line resetting_localtime{
    "localtime link invalid; resetting to America/Los_Angeles"};

}  // namespace device
