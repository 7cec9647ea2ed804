// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/path_text.h"

std::string joined(std::string_view start, std::string_view text) {
  std::string path(start);
  for (bool down = false;;) {
    const std::string_view step = text.substr(0, text.find('/'));
    const bool last = step.size() == text.size();
    if (step == ".." && !down) {
      if (path.empty()) return {};
      path.resize(path.find('/') == path.npos ? 0 : path.rfind('/'));
    } else if (!step.empty() && step != ".") {
      if (!path.empty()) path += '/';
      path += step;
      down = true;
      if (last) return path;
    }
    if (last) return path.empty() ? path : path + '/';
    text.remove_prefix(step.size() + 1);
  }
}
