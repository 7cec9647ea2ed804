// SPDX-License-Identifier: BSD-2-Clause
//
// Version texts: the grammar against std::regex, the numbers against what the
// digits say, the lines that are printed, and the laws of the ordering. An
// input is one text as a whole, and up to three texts with "|" between them.
#include <array>
#include <cstdint>
#include <regex>
#include <stdexcept>

#include "support/version.h"
#include "support/version_grammar.h"
#include "tests/fuzz/property.h"

namespace {

constexpr std::size_t longest_for_regex = 200;

constexpr std::int64_t too_great = -2;

// What a number group stands for; -1 for an empty one.
std::int64_t number_of(std::string_view digits) {
  if (digits.empty()) return -1;
  std::int64_t number = 0;
  for (const char digit : digits) {
    number = number * 10 + (digit - '0');
    if (number > 2147483647) return too_great;
  }
  return number;
}

void check_grammar(const std::string& text) {
  static const std::regex grammar(
      R"(([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?)");
  const auto groups = match_version_text(text);
  std::smatch expected;
  const bool matches = std::regex_match(text, expected, grammar);
  expect(groups.has_value() == matches, "the grammar is the expression's");
  if (!matches) return;
  expect(groups->year == expected[1].str(), "group 1 is the year");
  expect(groups->letters == expected[2].str(), "group 2 is the letters");
  expect(groups->major == expected[3].str(), "group 3 is the major number");
  expect(groups->minor == expected[4].str(), "group 4 is the minor number");
}

// Fills the fields, up to a number that is too great; whether there is none.
bool fill(mln_version& version, const mln_version_groups& groups) {
  const auto fill_number = [](std::int32_t& field, std::string_view digits) {
    const std::int64_t number = number_of(digits);
    if (number != too_great) field = static_cast<std::int32_t>(number);
    return number != too_great;
  };
  if (!fill_number(version.year, groups.year)) return false;
  version.letters = groups.letters;
  return fill_number(version.major, groups.major) &&
         fill_number(version.minor, groups.minor);
}

// The version of a text; unset for one with a number that does not fit.
mln_version parsed(const std::string& text) {
  mln_version version("7seven.8.9");
  mln_version expected = version;
  bool fits = true;
  const std::string printed = printed_by([&] {
    try {
      version.parse(text);
    } catch (const std::out_of_range&) {
      fits = false;
    }
  });
  std::string lines;
  bool expected_fits = true;
  if (const auto groups = match_version_text(text)) {
    expected_fits = fill(expected, *groups);
  } else {
    const std::string message = "Cannot parse version string " + text;
    lines = warning(message.c_str() + std::string(", results.size() = 0")) +
            warning(message);
    expected = {};
  }
  expect(printed == lines, "only a malformed text prints its two lines");
  expect(fits == expected_fits, "numbers of more than 32 bits do not fit");
  expect(version == expected, "the fields are what the groups say");
  return fits ? version : mln_version();
}

// The rule, said field by field.
bool newer(const mln_version& left, const mln_version& right) {
  if (left.year != right.year) return left.year > right.year;
  if (left.letters != right.letters) return left.letters > right.letters;
  if (left.major != right.major) return left.major > right.major;
  return left.minor > right.minor;
}

void check_order(const std::array<mln_version, 3>& versions) {
  for (const auto& a : versions) {
    expect(!(mln_version() > a), "nothing is older than unset");
    for (const auto& b : versions) {
      expect((a > b) == newer(a, b), "the order goes by the fields");
      expect((a > b) + (b > a) + (a == b) == 1, "one of three holds");
    }
  }
}

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string text(text_of(data, size));
  if (size <= longest_for_regex) check_grammar(text);
  parsed(text);

  std::array<mln_version, 3> versions;
  std::size_t start = 0;
  for (auto& version : versions) {
    const std::size_t end = std::min(text.find('|', start), size);
    version = parsed(text.substr(start, end - start));
    start = std::min(end + 1, size);
  }
  check_order(versions);
  return 0;
}
