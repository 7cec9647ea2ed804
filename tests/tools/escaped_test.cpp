// SPDX-License-Identifier: BSD-2-Clause
#include "tools/escaped.h"

#include <gtest/gtest.h>

namespace {

TEST(Escaped, PrintableTextIsShownAsItIs) {
  EXPECT_EQ(escaped("2024a.1.0 ~/zoneinfo"), "2024a.1.0 ~/zoneinfo");
  EXPECT_EQ(escaped(""), "");
}

TEST(Escaped, NoByteMovesACursorOrBeginsALine) {
  EXPECT_EQ(escaped("\033[2J\n\r\t\x7f"), "\\x1b[2J\\x0a\\x0d\\x09\\x7f");
  EXPECT_EQ(escaped(std::string(1, '\0')), "\\x00");
  EXPECT_EQ(escaped("\xc2\x9b\xff"), "\\xc2\\x9b\\xff");
}

TEST(Escaped, NoTwoTextsAreShownAlike) {
  EXPECT_EQ(escaped("\\x1b"), "\\\\x1b");
}

}  // namespace
