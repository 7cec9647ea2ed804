// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu_file_name.h"

#include <gtest/gtest.h>

#include <regex>
#include <string>

#include "tests/support/generated_text.h"

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
  for (const char* name : {"",
                           "icutz",
                           ".dat",
                           "icutz.dat",
                           "icutzl.dat",
                           "icutz44.dat",
                           "icutz44L.dat",
                           "icutz44x.dat",
                           "icutz44ll.dat",
                           "icutz44lb.dat",
                           "icutz4l4.dat",
                           "icutz44l.dat.bak",
                           "icutz44l.DAT",
                           "icutz44ldat",
                           "icutz44lxdat",
                           "icutz44l.da",
                           "icutz44l.datt",
                           "xicutz44l.dat",
                           "Icutz44l.dat",
                           "ICUTZ44l.dat",
                           "icut44l.dat",
                           "icutz 44l.dat",
                           "icutz-44l.dat",
                           "icutz44l.dat ",
                           "icutz44l.dat\n",
                           "icudt44l.dat",
                           "icutz44a.dat",
                           "icutz44c.dat",
                           "icutz44d.dat",
                           "icutz44f.dat",
                           "icutz44k.dat",
                           "icutz44m.dat",
                           "icutz/4l.dat",
                           "icutz:4l.dat",
                           "icutzat",
                           "icutz4"})
    EXPECT_EQ(icu_schema_in(name), "") << name;
}

TEST(IcuFileName, WithANulByteCarriesNothing) {
  for (std::size_t place = 0; place <= 12; ++place) {
    std::string name = "icutz44l.dat";
    name.insert(place, 1, '\0');
    EXPECT_EQ(icu_schema_in(name), "") << place;
  }
}

TEST(IcuFileName, AgreesWithTheRegularExpressionOnAMillionNames) {
  const std::regex grammar(R"(icutz([0-9]+[lbe])\.dat)");
  text_generator generator(
      2,
      {{"icutz"}, {"0", "4", "44", "0123456789"}, {"l", "b", "e"}, {".dat"}});
  int matches = 0;
  for (int i = 0; i < 1'000'000; ++i) {
    const std::string name = generator.next();
    std::smatch groups;
    const bool found = std::regex_match(name, groups, grammar);
    matches += found;
    ASSERT_EQ(icu_schema_in(name), found ? groups[1].str() : "")
        << testing::PrintToString(name);
  }
  EXPECT_GT(matches, 200'000);
}

}  // namespace
