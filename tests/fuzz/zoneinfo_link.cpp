// SPDX-License-Identifier: BSD-2-Clause
//
// Targets of the "zoneinfo" link, against the rule for them said once more,
// byte by byte, and the line that a rejected one prints.
#include <cstring>

#include "driver/dataset_links.h"
#include "tests/fuzz/property.h"

namespace {

const std::string rejected = "rejected";  // no accepted result looks like it

std::string by_the_rule(const char* target, std::size_t length) {
  if (length >= 21 && std::memcmp(target, "/var/db/timezone/tz/", 20) == 0) {
    std::size_t last_slash = length - 1;
    while (target[last_slash] != '/') --last_slash;
    if (last_slash <= 20) return rejected;
    return {target, last_slash};
  }
  if (length == 27 &&
      std::memcmp(target, "/usr/share/zoneinfo.default", 27) == 0)
    return "";
  return rejected;
}

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string target(text_of(data, size));
  std::string result;
  const std::string printed = printed_by([&] {
    try {
      result = dataset_path_from_link(target);
    } catch (int thrown) {
      expect(thrown == -1, "a rejection throws -1");
      result = rejected;
    }
  });
  expect(result == by_the_rule(target.data(), size), "the rule decides");
  expect(printed ==
             (result == rejected ? warning("Bad zoneinfo link " + target) : ""),
         "a rejection prints its line, and nothing else is printed");
  return 0;
}
