// SPDX-License-Identifier: BSD-2-Clause
#include "tools/escaped.h"

std::string escaped(std::string_view text) {
  static constexpr char digits[] = "0123456789abcdef";
  std::string shown;
  for (const char letter : text) {
    const auto byte = static_cast<unsigned char>(letter);
    if (letter == '\\') {
      shown += "\\\\";
    } else if (byte >= ' ' && byte <= '~') {
      shown += letter;
    } else {
      shown += "\\x";
      shown += digits[byte / 16];
      shown += digits[byte % 16];
    }
  }
  return shown;
}
