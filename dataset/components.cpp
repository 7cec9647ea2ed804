// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/components.h"

#include <algorithm>

bool compatible_components(const component_list& receivers,
                           const component_list& others) {
  // std::equal would compare the lengths first, and ask no component if they
  // differ.
  const std::size_t common = std::min(receivers.size(), others.size());
  for (std::size_t i = 0; i < common; ++i) {
    if (!receivers[i]->compatible_schema(*others[i])) return false;
  }
  return receivers.size() == others.size();
}
