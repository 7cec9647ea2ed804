// SPDX-License-Identifier: BSD-2-Clause
//
// What the lines of a boot are compared with. Their texts are written out here
// once more, on purpose: a wrong text must not make its own test right.
#pragma once

#include <gmock/gmock.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

namespace device {

using line_matcher = ::testing::Matcher<std::string>;
using line_matchers = std::vector<line_matcher>;

// Whatever an earlier call left.
inline constexpr int any_error = -1;

// A line that ends with the text of this error.
inline line_matcher failure(const std::string& text, int error) {
  if (error != any_error)
    return ::testing::StrEq("marlin: " + text + ": " + std::strerror(error));
  return ::testing::ResultOf(
      "the line up to its error text",
      [](const std::string& line) { return line.substr(0, line.rfind(": ")); },
      ::testing::StrEq("marlin: " + text));
}

inline void append(line_matchers& all, const line_matcher& one) {
  all.push_back(one);
}
inline void append(line_matchers& all, const line_matchers& some) {
  all.insert(all.end(), some.begin(), some.end());
}

// These lines and no other, in this order. Each argument is one, or several.
template <typename... Lines>
auto lines(const Lines&... expected) {
  line_matchers all;
  (append(all, expected), ...);
  return ::testing::ElementsAreArray(all);
}
inline auto no_lines() { return ::testing::IsEmpty(); }

// --- Calls that failed -------------------------------------------------------

inline line_matcher cannot_read(const std::string& link, int error) {
  return failure("read_symlink: " + link, error);
}
inline line_matcher cannot_remove(const std::string& path, int error) {
  return failure("remove: could not remove " + path, error);
}
inline line_matcher cannot_link(const std::string& path,
                                const std::string& target, int error) {
  return failure("create_symlink: from " + path + " to " + target, error);
}

// --- Data sets. No call fails right before most of these lines: where no error
// is given they end in that of the last "/var/db/icu" that was not there.

inline line_matchers unparsed(const std::string& version, int error = ENOENT) {
  const std::string text = "Cannot parse version string " + version;
  return {failure(text + ", results.size() = 0", error), failure(text, error)};
}
// A walk to its end leaves no error.
inline line_matcher no_schema_in(const std::string& dataset, int error = 0) {
  return failure("No ICU schema found for " + dataset, error);
}
inline line_matcher bad_path(const std::string& dataset) {
  return failure("mln_dataset::create_components: bad path " + dataset, ENOENT);
}
inline line_matcher bad_zoneinfo_link(const std::string& target,
                                      int error = ENOENT) {
  return failure("Bad zoneinfo link " + target, error);
}
inline line_matcher invalid_links(int error = ENOENT) {
  return failure("Invalid current symlinks; resetting to system partition",
                 error);
}
inline line_matcher incompatible(int error = ENOENT) {
  return failure("Symlink points at data incompatible with installed system",
                 error);
}
inline line_matcher refused(const std::string& update,
                            const std::string& current, int error = ENOENT) {
  return failure("New update not compatible or older version: " + update +
                     " vs. " + current,
                 error);
}
inline line_matcher unable_to_locate(int error = ENOENT) {
  return failure("Unable to locate data; resetting to system partition", error);
}

// --- The legacy link

inline line_matcher not_migrated(int error) {
  return failure("Could not migrate /var/db/icutz to /var/db/timezone/icutz",
                 error);
}
inline line_matcher not_removed(int error) {
  return failure("Could not remove /var/db/icutz", error);
}

// --- Links that are in the way, or made anew ---------------------------------

inline line_matchers zoneinfo_stays(int error) {
  return {cannot_remove("/var/db/timezone/zoneinfo", error),
          failure("Unlink of zoneinfo softlink failed", error)};
}
// The link in its present place, or in the legacy one.
inline line_matchers icu_link_stays(const std::string& path, int error) {
  return {cannot_remove(path, error),
          failure("unlink of ICU softlink failed", error)};
}
inline line_matcher correcting_localtime(const std::string& target, int error) {
  return failure("Correcting localtime link to " + target, error);
}
inline line_matcher resetting_localtime(int error = ENOENT) {
  return failure("localtime link invalid; resetting to America/Los_Angeles",
                 error);
}

}  // namespace device
