// SPDX-License-Identifier: BSD-2-Clause
#include "support/version.h"

#include <cerrno>
#include <stdexcept>

#include "tests/device/device.h"

using namespace device;

namespace {

std::string shown(const mln_version& version) {
  return std::to_string(version.year) + "|" + version.letters + "|" +
         std::to_string(version.major) + "|" + std::to_string(version.minor);
}

const std::string unset = "-1||-1|-1";

TEST(VersionParse, FillsFourFields) {
  for (const auto& [text, fields] :
       {std::pair("2016a", "2016|a|-1|-1"),
        std::pair("2016a.1.0", "2016|a|1|0"),
        std::pair("2016ab.7", "2016|ab|7|-1"),
        std::pair("2147483647a.2147483647.2147483647",
                  "2147483647|a|2147483647|2147483647")})
    EXPECT_EQ(quietly([&of = text] { return shown(mln_version(of)); }), fields);
  EXPECT_EQ(shown(mln_version(std::string(5000, '0') + "1a.01.000")),
            "1|a|1|0");
}

// The last text is printed up to its NUL.
TEST(VersionParse, PrintsTwoLinesForAMalformedText) {
  for (const std::string& text :
       {std::string("2016A"), std::string("2016a.1.0.0"), std::string(),
        std::string("%s%n"), std::string("2016a\0b", 7)}) {
    errno = EIO;
    prints([&] { EXPECT_EQ(shown(mln_version(text)), unset); },
           unparsed(text.c_str(), EIO));
  }
}

TEST(VersionParse, UnsetsWhatAnEarlierTextSet) {
  mln_version version("2016a.1.2");
  version.parse("2017b");
  EXPECT_EQ(shown(version), "2017|b|-1|-1");
  version.parse("2016a.1.2");
  printed_by([&] { version.parse("nonsense"); });
  EXPECT_EQ(shown(version), unset);
}

// The conversion beneath has the range of long.
TEST(VersionParse, ThrowsOutOfRangeWithTheErrorOfTheStandardConversion) {
  const int in_long = sizeof(long) > sizeof(int) ? EXDEV : ERANGE;
  for (const auto& [text, error] :
       {std::pair("2147483648a", in_long), std::pair("1a.2147483648", in_long),
        std::pair("1a.1.4294967296", in_long),
        std::pair("99999999999999999999a", ERANGE)})
    quietly([&of = text, &left = error] {
      errno = EXDEV;
      EXPECT_THROW(mln_version{of}, std::out_of_range);
      EXPECT_EQ(errno, left) << of;
    });
}

TEST(VersionParse, KeepsTheFieldsBeforeANumberThatDoesNotFit) {
  mln_version version("2016a.1.2");
  EXPECT_THROW(version.parse("2147483648b.3.4"), std::out_of_range);
  EXPECT_EQ(shown(version), "2016|a|1|2");
  EXPECT_THROW(version.parse("2017b.2147483648.4"), std::out_of_range);
  EXPECT_EQ(shown(version), "2017|b|1|2");
  EXPECT_THROW(version.parse("2018c.5.2147483648"), std::out_of_range);
  EXPECT_EQ(shown(version), "2018|c|5|2");
}

void expect_newer(const mln_version& newer, const mln_version& older) {
  EXPECT_TRUE(newer > older) << shown(newer) << " > " << shown(older);
  EXPECT_FALSE(older > newer) << shown(older) << " > " << shown(newer);
  EXPECT_FALSE(newer == older) << shown(newer) << " == " << shown(older);
}

TEST(VersionOrder, GoesByYearThenLettersThenMajorThenMinor) {
  const std::string many(1500, 'm');
  const std::vector<std::string> ascending = {
      // A missing number is older than any other.
      "0a", "2016a", "2016a.0", "2016a.0.0", "2016a.1", "2016a.1.0",
      "2016a.1.1",
      // Numbers are not compared as texts.
      "2016a.1.9", "2016a.1.10", "2016a.2.0", "2016a.9.9", "2016a.10",
      // Letters are, by the first byte that differs.
      "2016az.99", "2016b", "2016b.0.0", "2016" + many, "2016" + many + "a",
      "2016" + many + "az.9", "2016" + many + "b", "2016" + many + "b.1",
      "2016z", "2016z.1.9", "2016za", "2017a", "10000a"};
  for (auto newer = ascending.begin(); newer != ascending.end(); ++newer)
    for (auto older = ascending.begin(); older != newer; ++older)
      expect_newer(mln_version(*newer), mln_version(*older));
}

TEST(VersionOrder, ComparesLettersByUnsignedBytes) {
  mln_version low;
  mln_version high;
  low.letters = "z";
  high.letters = "\xe4";
  expect_newer(high, low);
}

TEST(VersionOrder, HasTheUnsetValueBelowEveryParsedOne) {
  expect_newer(mln_version("0a"), mln_version());
  EXPECT_FALSE(mln_version() > mln_version());
  EXPECT_TRUE(mln_version() == mln_version());
}

TEST(VersionOrder, HasNumbersEqualThatAreWrittenInAnotherWay) {
  EXPECT_TRUE(mln_version("2016a.1.2") == mln_version("2016a.01.002"));
}

}  // namespace
