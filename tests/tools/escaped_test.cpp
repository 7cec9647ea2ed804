// SPDX-License-Identifier: BSD-2-Clause
#include "tools/escaped.h"

#include <gtest/gtest.h>

TEST(Escaped, ShowsNoByteThatMovesACursorOrBeginsALineAndNoTwoTextsAlike) {
  const std::pair<std::string, std::string> shown_as[] = {
      {"2024a.1.0 ~/zoneinfo", "2024a.1.0 ~/zoneinfo"},
      {"", ""},
      {"\033[2J\n\r\t\x7f", "\\x1b[2J\\x0a\\x0d\\x09\\x7f"},
      {std::string(1, '\0'), "\\x00"},
      {"\xc2\x9b\xff", "\\xc2\\x9b\\xff"},
      {"\\x1b", "\\\\x1b"}};
  for (const auto& [text, shown] : shown_as) EXPECT_EQ(escaped(text), shown);
}
