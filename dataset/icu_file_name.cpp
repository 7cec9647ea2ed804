// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu_file_name.h"

// icutz([0-9]+[lbe])\.dat
std::string_view icu_schema_in(std::string_view name) {
  constexpr std::string_view prefix = "icutz";
  constexpr std::string_view suffix = ".dat";
  if (!name.starts_with(prefix)) return {};
  name.remove_prefix(prefix.size());
  if (!name.ends_with(suffix)) return {};
  name.remove_suffix(suffix.size());

  if (name.size() < 2) return {};
  const std::string_view digits = name.substr(0, name.size() - 1);
  const char format = name.back();
  const bool matches =
      digits.find_first_not_of("0123456789") == std::string_view::npos &&
      (format == 'l' || format == 'b' || format == 'e');
  return matches ? name : std::string_view();
}
