// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu_file_name.h"

#include <gtest/gtest.h>

#include <regex>
#include <string>

namespace {

TEST(IcuFileName, CarriesDigitsAndOneFormatLetter) {
  EXPECT_EQ(icu_schema_in("icutz44l.dat"), "44l");
  EXPECT_EQ(icu_schema_in("icutz44b.dat"), "44b");
  EXPECT_EQ(icu_schema_in("icutz44e.dat"), "44e");
  EXPECT_EQ(icu_schema_in("icutz7l.dat"), "7l");
  EXPECT_EQ(icu_schema_in("icutz044l.dat"), "044l");
  EXPECT_EQ(icu_schema_in("icutz0123456789e.dat"), "0123456789e");
}

TEST(IcuFileName, OfANearMissCarriesNothing) {
  for (const std::string schema :
       {"", "l", "44", "44L", "44x", "44ll", "44lb", "4l4", " 44l", "-44l",
        "44a", "44c", "44d", "44f", "44k", "44m", "/4l", ":4l"})
    EXPECT_EQ(icu_schema_in("icutz" + schema + ".dat"), "") << schema;
  for (const std::string start :
       {"", "xicutz", "Icutz", "ICUTZ", "icut", "icudt"})
    EXPECT_EQ(icu_schema_in(start + "44l.dat"), "") << start;
  for (const std::string end : {"", "dat", "xdat", ".da", ".datt", ".DAT",
                                ".dat.bak", ".dat ", ".dat\n"})
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
