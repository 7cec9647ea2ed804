// SPDX-License-Identifier: BSD-2-Clause
#include "support/version.h"

#include <err.h>

#include <charconv>
#include <string>
#include <string_view>
#include <tuple>

#include "support/version_grammar.h"

namespace {

std::int32_t to_number(std::string_view digits) {
  // Up to nine digits always fit. For more, std::stoi decides, with its
  // exception and the errno that it leaves.
  if (digits.size() > 9) return std::stoi(std::string(digits));
  std::int32_t number{};
  std::from_chars(digits.data(), digits.data() + digits.size(), number);
  return number;
}

std::int32_t to_optional_number(std::string_view digits) {
  return digits.empty() ? -1 : to_number(digits);
}

auto fields(const mln_version& version) {
  return std::tie(version.year, version.letters, version.major, version.minor);
}

}  // namespace

mln_version::mln_version(const std::string& text) { parse(text); }

void mln_version::parse(const std::string& text) {
  const auto groups = match_version_text(text);
  if (!groups) {
    // Deliberate: one malformed text prints two lines. The first says that the
    // text did not match at all: no groups were counted. The second is the one
    // to search a log for. Pinned by
    // VersionParse.PrintsTwoLinesForAMalformedText.
    ::warn("Cannot parse version string %s, results.size() = %d", text.c_str(),
           0);
    ::warn("Cannot parse version string %s", text.c_str());
    *this = {};
    return;
  }
  year = to_number(groups->year);
  letters = groups->letters;
  major = to_optional_number(groups->major);
  minor = to_optional_number(groups->minor);
}

bool operator>(const mln_version& left, const mln_version& right) {
  return fields(left) > fields(right);
}

bool operator==(const mln_version& left, const mln_version& right) {
  return fields(left) == fields(right);
}
