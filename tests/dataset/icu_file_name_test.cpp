// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu_file_name.h"

#include <gtest/gtest.h>

#include <regex>
#include <string>

namespace {

// Any byte comes in addition or in place of another; any part is missing.
TEST(IcuFileName, AgreesWithTheRegularExpressionOnEveryNearMiss) {
  const std::regex grammar(R"(icutz([0-9]+[lbe])\.dat)");
  const std::string valid = "icutz44l.dat";
  constexpr int none = 256;
  for (std::size_t place = 0; place <= valid.size(); ++place) {
    for (int byte = 0; byte <= none; ++byte) {
      const std::size_t most = byte == none ? valid.size() - place : 1;
      for (std::size_t missing = 0; missing <= most; ++missing) {
        std::string name = valid;
        name.replace(place, missing, byte != none, static_cast<char>(byte));
        std::smatch groups;
        std::regex_match(name, groups, grammar);
        EXPECT_EQ(icu_schema_in(name), groups[1].str())
            << testing::PrintToString(name);
      }
    }
  }
}

}  // namespace
