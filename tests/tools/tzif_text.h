// SPDX-License-Identifier: BSD-2-Clause
//
// Zone files for tests, built from their parts so that each can be broken.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace tzif {

inline std::string bytes(std::int64_t number, int size) {
  std::string text;
  for (int at = size - 1; at >= 0; --at)
    text += static_cast<char>(static_cast<std::uint64_t>(number) >> (8 * at) &
                              0xff);
  return text;
}

struct type {
  std::int32_t offset;
  std::uint8_t summer;
  std::uint8_t abbreviation;
};

// A header and its data.
struct block {
  char version = '2';
  std::vector<std::int64_t> times{-1000, 0, 1000};
  std::string types_of_times{std::string("\1\0\1", 3)};
  std::vector<type> types{{3600, 0, 0}, {7200, 1, 4}};
  std::string letters{std::string("CET\0CEST\0", 9)};
  std::vector<std::int64_t> leaps{};
  std::string standard{};
  std::string universal{};

  std::string text(int time_size) const {
    std::string all = "TZif" + std::string(1, version) + std::string(15, '\0');
    for (const std::size_t count :
         {universal.size(), standard.size(), leaps.size(), times.size(),
          types.size(), letters.size()})
      all += bytes(static_cast<std::int64_t>(count), 4);
    for (const auto time : times) all += bytes(time, time_size);
    all += types_of_times;
    for (const auto& each : types)
      all += bytes(each.offset, 4) + bytes(each.summer, 1) +
             bytes(each.abbreviation, 1);
    all += letters;
    for (const auto leap : leaps) all += bytes(leap, time_size) + bytes(1, 4);
    return all + standard + universal;
  }
};

inline std::string file(const block& first, const block& second,
                        const std::string& footer = "\nCET-1\n") {
  return first.text(4) + second.text(8) + footer;
}

inline std::string file() { return file({}, {}); }

}  // namespace tzif
