// SPDX-License-Identifier: BSD-2-Clause
#include "support/version_grammar.h"

#include <gtest/gtest.h>

#include <regex>
#include <string>

namespace {

// year|letters|major|minor, or "no match".
std::string matched(std::string_view text) {
  const auto groups = match_version_text(text);
  if (!groups) return "no match";
  std::string shown(groups->year);
  for (const auto group : {groups->letters, groups->major, groups->minor})
    shown.append("|").append(group);
  return shown;
}

TEST(VersionGrammar, AcceptsAYearLettersAndUpToTwoNumbers) {
  EXPECT_EQ(matched("2016a"), "2016|a||");
  EXPECT_EQ(matched("2016ab.7"), "2016|ab|7|");
  EXPECT_EQ(matched("2016a.1.0"), "2016|a|1|0");
  EXPECT_EQ(matched("0z.00.007"), "0|z|00|007");
  EXPECT_EQ(matched("99999999999999999999az.1"), "99999999999999999999|az|1|");
}

TEST(VersionGrammar, RejectsNearMisses) {
  for (const char* text :
       {"", "2016", "a", "a2016", "2016a.", "2016a.1.", "2016a.1.0.",
        "2016a.1.0.0", "2016a..1", "2016A", "2016a ", ".1.0", "2016\xc3\xa4"})
    EXPECT_EQ(matched(text), "no match") << text;
}

TEST(VersionGrammar, AgreesWithTheRegularExpressionOnEveryByteAnywhere) {
  const std::regex grammar(R"(([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?)");
  const std::string valid = "2016a.1.0";
  for (std::size_t place = 0; place <= valid.size(); ++place) {
    for (int byte = 0; byte < 256; ++byte) {
      for (const std::size_t replaced : {0u, 1u}) {
        std::string text = valid;
        text.replace(place, replaced, 1, static_cast<char>(byte));
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
