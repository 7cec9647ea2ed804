// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu_file_name.h"

#include <gtest/gtest.h>

#include <regex>
#include <string>

namespace {

TEST(IcuFileName, CarriesDigitsAndOneFormatLetter) {
  for (const std::string schema :
       {"44l", "44b", "44e", "7l", "044l", "0123456789e"})
    EXPECT_EQ(icu_schema_in("icutz" + schema + ".dat"), schema);
}

TEST(IcuFileName, OfANearMissCarriesNothing) {
  for (const std::string schema : {"", "l", "44", "44L", "44ll", "4l4", " 44l"})
    EXPECT_EQ(icu_schema_in("icutz" + schema + ".dat"), "") << schema;
  for (const std::string start : {"", "xicutz", "Icutz", "icut", "icudt"})
    EXPECT_EQ(icu_schema_in(start + "44l.dat"), "") << start;
  for (const std::string end : {"", "dat", "xdat", ".da", ".DAT", ".dat.bak"})
    EXPECT_EQ(icu_schema_in("icutz44l" + end), "") << end;
  for (const char* name : {"", "icutz", ".dat", "icutzat", "icutz4"})
    EXPECT_EQ(icu_schema_in(name), "") << name;
}

TEST(IcuFileName, AgreesWithTheRegularExpressionOnEveryByteAnywhere) {
  const std::regex grammar(R"(icutz([0-9]+[lbe])\.dat)");
  const std::string valid = "icutz44l.dat";
  for (std::size_t place = 0; place <= valid.size(); ++place) {
    for (int byte = 0; byte < 256; ++byte) {
      for (const std::size_t replaced : {0u, 1u}) {
        std::string name = valid;
        name.replace(place, replaced, 1, static_cast<char>(byte));
        std::smatch groups;
        std::regex_match(name, groups, grammar);
        EXPECT_EQ(icu_schema_in(name), groups[1].str())
            << testing::PrintToString(name);
      }
    }
  }
}

}  // namespace
