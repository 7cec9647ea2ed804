// SPDX-License-Identifier: BSD-2-Clause
//
// Names of ICU data files, of any length that a file system allows, against
// std::regex.
#include "dataset/icu_file_name.h"

#include <regex>

#include "tests/fuzz/property.h"

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const std::regex grammar(R"(icutz([0-9]+[lbe])\.dat)");
  if (size > 255) return 0;
  const std::string_view name = text_of(data, size);
  const std::string_view schema = icu_schema_in(name);

  std::cmatch groups;
  const bool matches =
      std::regex_match(name.data(), name.data() + size, groups, grammar);
  expect(schema.empty() != matches, "the grammar is the expression's");
  if (!matches) return 0;
  expect(schema.data() == groups[1].first &&
             schema.size() == static_cast<std::size_t>(groups[1].length()),
         "the schema is the group, a part of the name");
  return 0;
}
