// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/mounts.h"

#include <algorithm>

namespace {

bool is_octal(char digit) { return digit >= '0' && digit <= '7'; }

std::string decoded(std::string_view field) {
  std::string path;
  for (std::size_t i = 0; i < field.size(); ++i) {
    const std::string_view code = field.substr(i, 4);
    if (code.size() == 4 && code[0] == '\\' &&
        std::all_of(code.begin() + 1, code.end(), is_octal)) {
      path += static_cast<char>((code[1] - '0') * 64 + (code[2] - '0') * 8 +
                                (code[3] - '0'));
      i += 3;
    } else {
      path += field[i];
    }
  }
  return path;
}

// Takes the first piece off a text.
std::string_view next(std::string_view& rest, char separator) {
  const std::size_t end = std::min(rest.find(separator), rest.size());
  const std::string_view piece = rest.substr(0, end);
  rest.remove_prefix(std::min(end + 1, rest.size()));
  return piece;
}

}  // namespace

std::vector<std::string> mounts_below(std::string_view mountinfo,
                                      std::string_view directory) {
  std::vector<std::string> places;
  while (!mountinfo.empty()) {
    std::string_view line = next(mountinfo, '\n');
    // Number, parent's number, device, root of the mount, its place.
    for (int field = 0; field < 4; ++field) next(line, ' ');
    std::string place = decoded(next(line, ' '));
    if (place.size() > directory.size() + 1 && place.starts_with(directory) &&
        place[directory.size()] == '/')
      places.push_back(std::move(place));
  }
  std::sort(places.begin(), places.end());
  places.erase(std::unique(places.begin(), places.end()), places.end());
  return places;
}
