// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/components.h"

#include <algorithm>

bool compatible_components(const component_list& receivers,
                           const component_list& others) {
  return std::equal(receivers.begin(), receivers.end(), others.begin(),
                    others.end(), [](const auto& receiver, const auto& other) {
                      return receiver->compatible_schema(*other);
                    });
}
