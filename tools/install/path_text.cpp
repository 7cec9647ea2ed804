// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/path_text.h"

#include <algorithm>
#include <vector>

std::string joined(std::string_view start, std::string_view text) {
  std::vector<std::string_view> way;
  const std::string both = std::string(start) + "/" + std::string(text);
  for (std::string_view rest = both; !rest.empty();) {
    const std::string_view step = rest.substr(0, rest.find('/'));
    rest.remove_prefix(std::min(step.size() + 1, rest.size()));
    if (step == "..") {
      if (way.empty()) return {};
      way.pop_back();
    } else if (!step.empty() && step != ".") {
      way.push_back(step);
    }
  }
  std::string path;
  for (const auto& step : way) {
    if (!path.empty()) path += '/';
    path += step;
  }
  return path;
}
