// SPDX-License-Identifier: BSD-2-Clause
//
// The grammar of version texts: a release year, its letters, and up to two
// numbers after dots, as in 2024a.1.0.
#pragma once

#include <optional>
#include <string_view>

// The four groups of a match, as parts of the matched text. A group is empty
// exactly when it took no part in the match.
struct mln_version_groups {
  std::string_view year;
  std::string_view letters;
  std::string_view major{};
  std::string_view minor{};
};

// Matches the whole of `text`, including any NUL bytes, in one pass.
std::optional<mln_version_groups> match_version_text(std::string_view text);
