// SPDX-License-Identifier: BSD-2-Clause
//
// A list of mounts, of any form.
#include "tools/status/mounts.h"

#include <algorithm>

#include "tests/fuzz/property.h"

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text = text_of(data, size);
  const auto places = mounts_below(text, "/a");
  for (const auto& place : places) {
    expect(place.starts_with("/a/") && place.size() > 3, "it is below");
    expect(place.size() <= size, "it is from the list");
  }
  expect(std::adjacent_find(places.begin(), places.end(),
                            std::greater_equal<>()) == places.end(),
         "they are sorted, and each is there once");
  return 0;
}
