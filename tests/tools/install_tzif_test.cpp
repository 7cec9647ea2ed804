// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/tzif.h"

#include <gtest/gtest.h>

#include "tests/tools/tzif_text.h"

namespace {

using tzif::block;
using tzif::file;

const std::string counts = "has counts that do not fit each other";

TEST(TzifFile, OfEachVersionIsAccepted) {
  for (const char version : {'2', '3', '4'}) {
    block one{.version = version};
    EXPECT_STREQ(tzif_flaw(file(one, one)), nullptr) << version;
  }
  EXPECT_STREQ(tzif_flaw(block{.version = '\0'}.text(4)), nullptr);
}

TEST(TzifFile, WithEverythingThatItCanHoldIsAccepted) {
  const block full{.leaps = {78796800, 94694401},
                   .standard = std::string("\1\0", 2),
                   .universal = std::string("\1\0", 2)};
  EXPECT_STREQ(tzif_flaw(file(full, full, "\n\n")), nullptr);
  const block small{.times = {},
                    .types_of_times = {},
                    .types = {{0, 0, 0}},
                    .letters = std::string(1, '\0')};
  EXPECT_STREQ(
      tzif_flaw(file(small, block{.times = {INT64_MIN, INT64_MAX},
                                  .types_of_times = std::string(2, '\1')})),
      nullptr);
}

TEST(TzifFile, OfAnotherVersionIsRefused) {
  for (const char version : {'\1', '1', '5', 'x'}) {
    block one{.version = version};
    EXPECT_STREQ(tzif_flaw(file(one, one)),
                 "is of a version that is not known");
  }
  EXPECT_STREQ(tzif_flaw(file({.version = '2'}, {.version = '3'})),
               "has two versions");
}

TEST(TzifFile, ThatIsSomethingElseIsRefused) {
  for (const char* text : {"", "TZi", "#!/bin/sh", "TZIF2"})
    EXPECT_STREQ(tzif_flaw(text), "is not a TZif file");
  EXPECT_STREQ(tzif_flaw(block{}.text(4) + "\nUTC0\n"), "is not a TZif file");
}

TEST(TzifFile, CutAtAnyByteIsRefused) {
  const std::string whole = file();
  for (std::size_t size = 0; size < whole.size(); ++size)
    EXPECT_STRNE(tzif_flaw(whole.substr(0, size)), nullptr) << size;
  const std::string first = block{.version = '\0'}.text(4);
  for (std::size_t size = 0; size < first.size(); ++size)
    EXPECT_STRNE(tzif_flaw(first.substr(0, size)), nullptr) << size;
}

TEST(TzifFile, WithMoreAtItsEndIsRefused) {
  EXPECT_STREQ(tzif_flaw(block{.version = '\0'}.text(4) + "x"),
               "has more at its end");
  for (const char* footer : {"", "\n", "CET-1\n", "\nCET-1", "\nCET\n-1\n",
                             "\nC\tT\n", "\nCET-1\nx"})
    EXPECT_STREQ(tzif_flaw(file({}, {}, footer)),
                 "has no footer, or more after it")
        << footer;
}

TEST(TzifFile, WithCountsThatDoNotFitIsRefused) {
  EXPECT_EQ(tzif_flaw(file({}, {.types = {}})), counts);
  EXPECT_EQ(tzif_flaw(file({}, {.letters = {}})), counts);
  EXPECT_EQ(tzif_flaw(file({}, {.standard = std::string(1, '\0')})), counts);
  EXPECT_EQ(tzif_flaw(file({}, {.universal = std::string(3, '\0')})), counts);
}

TEST(TzifFile, OfWhichACountIsHugeIsCutShort) {
  for (const std::size_t at : {28u, 32u}) {
    std::string text = file();
    text.replace(at, 4, "\xff\xff\xff\xff");
    EXPECT_STREQ(tzif_flaw(text), "is cut short") << at;
  }
  for (const std::size_t at : {20u, 24u, 36u}) {
    std::string text = file();
    text.replace(at, 4, "\xff\xff\xff\xff");
    EXPECT_EQ(tzif_flaw(text), counts) << at;
  }
}

TEST(TzifFile, WithTimesOutOfOrderIsRefused) {
  const char* const flaw = "has times that are not in order";
  EXPECT_STREQ(tzif_flaw(file({}, {.times = {0, 0, 1}})), flaw);
  EXPECT_STREQ(tzif_flaw(file({}, {.times = {0, -1, 1}})), flaw);
  EXPECT_STREQ(tzif_flaw(file({.times = {1, 0, 2}}, {})), flaw);
  EXPECT_STREQ(tzif_flaw(file({}, {.leaps = {2, 1}})),
               "has leap seconds that are not in order");
}

TEST(TzifFile, WithATypeThatIsNotThereIsRefused) {
  EXPECT_STREQ(
      tzif_flaw(file({}, {.types_of_times = std::string("\0\2\0", 3)})),
      "has a time of a type that it lacks");
}

TEST(TzifFile, WithATypeThatMakesNoSenseIsRefused) {
  EXPECT_STREQ(tzif_flaw(file({}, {.types = {{INT32_MIN, 0, 0}, {0, 0, 0}}})),
               "has a type of local time that cannot be");
  EXPECT_STREQ(tzif_flaw(file({}, {.types = {{0, 2, 0}, {0, 0, 0}}})),
               "has a type of local time that cannot be");
  EXPECT_STREQ(tzif_flaw(file({}, {.types = {{0, 0, 9}, {0, 0, 0}}})),
               "has a type of local time without an abbreviation");
  EXPECT_STREQ(tzif_flaw(file({}, {.letters = "CETCEST"})),
               "has a type of local time without an abbreviation");
  EXPECT_STREQ(tzif_flaw(file({}, {.standard = std::string("\0\2", 2)})),
               "has an indicator that is neither 0 nor 1");
}

TEST(TzifFile, WithAnyByteChangedDoesNoHarm) {
  const std::string whole = file();
  for (std::size_t at = 0; at < whole.size(); ++at) {
    for (const char byte : {'\0', '\1', '\x7f', '\x80', '\xff'}) {
      std::string text = whole;
      text[at] = byte;
      tzif_flaw(text);
    }
  }
}

}  // namespace
