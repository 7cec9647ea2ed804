// SPDX-License-Identifier: BSD-2-Clause
#include "support/version_grammar.h"

#include <algorithm>

namespace {

constexpr auto is_digit = [](char byte) { return byte >= '0' && byte <= '9'; };
constexpr auto is_letter = [](char byte) { return byte >= 'a' && byte <= 'z'; };

// Splits the longest run of bytes of one kind, possibly empty, off the front.
template <typename Kind>
std::string_view take_run(std::string_view& text, Kind belongs) {
  const auto end = std::find_if_not(text.begin(), text.end(), belongs);
  const std::string_view run =
      text.substr(0, static_cast<std::size_t>(end - text.begin()));
  text.remove_prefix(run.size());
  return run;
}

// Splits "\.([0-9]+)" off the front and returns its digits; without digits
// after the dot the text stays as it is.
std::string_view take_dotted_number(std::string_view& text) {
  if (!text.starts_with('.')) return {};
  std::string_view rest = text.substr(1);
  const std::string_view number = take_run(rest, is_digit);
  if (!number.empty()) text = rest;
  return number;
}

}  // namespace

// ([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?
//
// Each run ends at a byte of another kind, and a single dotted number is always
// the first of the two. Therefore the longest run is always the right one, and
// nothing needs backtracking.
std::optional<mln_version_groups> match_version_text(std::string_view text) {
  const std::string_view year = take_run(text, is_digit);
  const std::string_view letters = take_run(text, is_letter);
  const std::string_view major = take_dotted_number(text);
  const std::string_view minor = take_dotted_number(text);
  if (year.empty() || letters.empty() || !text.empty()) return std::nullopt;
  return mln_version_groups{year, letters, major, minor};
}
