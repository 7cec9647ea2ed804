// SPDX-License-Identifier: BSD-2-Clause
#include "support/version_grammar.h"

#include <gtest/gtest.h>

#include <regex>
#include <string>

namespace {

// Any byte comes in addition or in place of another; any part is missing.
TEST(VersionGrammar, AgreesWithTheRegularExpressionOnEveryNearMiss) {
  const std::regex grammar(R"(([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?)");
  const std::string whole = "2016a.1.0";
  constexpr int none = 256;
  EXPECT_FALSE(match_version_text(whole + ".0"));
  for (std::size_t place = 0; place <= whole.size(); ++place) {
    for (int byte = 0; byte <= none; ++byte) {
      const std::size_t most = byte == none ? whole.size() - place : 1;
      for (std::size_t missing = 0; missing <= most; ++missing) {
        std::string text = whole;
        text.replace(place, missing, byte != none, static_cast<char>(byte));
        EXPECT_EQ(match_version_text(text).has_value(),
                  std::regex_match(text, grammar))
            << testing::PrintToString(text);
      }
    }
  }
}

TEST(VersionGrammar, TakesTextsOfAnyLength) {
  const std::string digits(16u << 20, '1');
  const std::string letters(16u << 20, 'q');
  EXPECT_TRUE(match_version_text(digits + letters + "." + digits));
  EXPECT_FALSE(match_version_text(digits + letters + "." + digits + "."));
}

}  // namespace
