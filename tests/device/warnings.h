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
inline log_lines no_lines() { return {}; }

// The line of a call that fails, or one that ends in an earlier call's error.
inline log_lines failure(const std::string& text, int error) {
  return {"marlin: " + text + ": " + std::strerror(error)};
}

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
inline log_lines invalid_links(int error = ENOENT) {
  return failure("Invalid current symlinks; resetting to system partition",
                 error);
}
inline log_lines incompatible(int error = ENOENT) {
  return failure("Symlink points at data incompatible with installed system",
                 error);
}
inline log_lines refused(const std::string& update, const std::string& current,
                         int error = ENOENT) {
  return failure("New update not compatible or older version: " + update +
                     " vs. " + current,
                 error);
}
inline log_lines unable_to_locate(int error = ENOENT) {
  return failure("Unable to locate data; resetting to system partition", error);
}

// --- The legacy link ---------------------------------------------------------

inline log_lines not_migrated(int error) {
  return failure("Could not migrate /var/db/icutz to /var/db/timezone/icutz",
                 error);
}
inline log_lines not_removed(int error) {
  return failure("Could not remove /var/db/icutz", error);
}

// --- Links that are in the way, or made anew ---------------------------------

inline log_lines zoneinfo_not_unlinked(int error) {
  return failure("Unlink of zoneinfo softlink failed", error);
}
inline log_lines zoneinfo_stays(int error) {
  return lines(cannot_remove("/var/db/timezone/zoneinfo", error),
               zoneinfo_not_unlinked(error));
}
inline log_lines icu_not_unlinked(int error) {
  return failure("unlink of ICU softlink failed", error);
}
// The link in its present place, or in the legacy one.
inline log_lines icu_link_stays(const std::string& path, int error) {
  return lines(cannot_remove(path, error), icu_not_unlinked(error));
}
inline log_lines correcting_localtime(const std::string& target, int error) {
  return failure("Correcting localtime link to " + target, error);
}
inline log_lines resetting_localtime(int error = ENOENT) {
  return failure("localtime link invalid; resetting to America/Los_Angeles",
                 error);
}

}  // namespace device
