// SPDX-License-Identifier: BSD-2-Clause
//
// What a data set consists of: one component for each kind of data that is
// linked into "/var/db/timezone/".
#pragma once

#include <memory>
#include <vector>

#include "dataset/dataset_component.h"
#include "dataset/icu.h"
#include "dataset/zoneinfo.h"

using component_list = std::vector<std::shared_ptr<mln_dataset_component>>;

// Whether two lists have the same length and every component of `receivers`
// accepts the one at its position in `others`. Asks from the front and stops at
// the first refusal or the end of either list. Throws what a component throws.
bool compatible_components(const component_list& receivers,
                           const component_list& others);
