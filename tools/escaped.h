// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>
#include <string_view>

// Text of a device, made safe to show. Printable ASCII stays as it is, a
// backslash becomes two, and every other byte becomes "\xNN": a name can then
// neither move a cursor nor look like a row of its own, and no two texts are
// shown alike. Throws std::bad_alloc only.
std::string escaped(std::string_view text);
