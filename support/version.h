// SPDX-License-Identifier: BSD-2-Clause
//
// The version of a data set, as a value that can be compared.
#pragma once

#include <cstdint>
#include <string>

// The fields of a version text such as 2024a.1.0. One that was never parsed, or
// whose text was malformed, is unset, and older than every parsed one.
struct mln_version {
  // `major` and `minor` are function-like macros on some systems, so no "(" may
  // follow them.
  std::int32_t year{-1};
  std::string letters{};
  std::int32_t major{-1};  // -1: the text has none
  std::int32_t minor{-1};  // -1: the text has none

  mln_version() = default;
  explicit mln_version(const std::string& text);

  // Fills all four fields from `text`. A malformed text throws nothing, leaves
  // the unset value, and prints
  // "Cannot parse version string TEXT, results.size() = 0" and
  // "Cannot parse version string TEXT". A number that does not fit throws
  // std::out_of_range and prints nothing; the fields before it keep their new
  // values.
  void parse(const std::string& text);
};

// Whether `left` is strictly newer: by year, then letters (as bytes: z is older
// than za, b newer than az), then major, then minor.
bool operator>(const mln_version& left, const mln_version& right);
bool operator==(const mln_version& left, const mln_version& right);
// There is no other comparison; the language would make this one of ==.
bool operator!=(const mln_version&, const mln_version&) = delete;
