// SPDX-License-Identifier: BSD-2-Clause
//
// The warnings of a boot, each taken whole where the program hands it to
// warn(3): no text inside one can look like another.
#pragma once

#include <string>
#include <string_view>

struct line {
  std::string format;  // as the program gives it, such as "read_symlink: %s"
  std::string text;    // as it is printed, without the newline
  int error = 0;       // the errno whose text the line ends with
};

// Where the warnings of this process go, instead of to standard error: a
// function that is called with each, or nullptr for nowhere. This program has
// its own warn(3) for it, which leaves errno alone.
using line_sink = void (*)(const line&);
void take_lines(line_sink sink);

// The longest text that is kept of a line.
inline constexpr std::size_t longest_line = 131072;
