// SPDX-License-Identifier: BSD-2-Clause
//
// What a boot can see, to compare a device with a layer over it.
#pragma once

#include <map>
#include <string>

// The kind, mode, size, target, access list and names of each place that a boot
// looks at or changes, as it stands there and where it leads. No owners. Opens
// nothing but directories. Throws std::bad_alloc only.
using sight = std::map<std::string, std::string>;
sight look_around();
