// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>
#include <string_view>

// Where `text` leads from the directory `start`, both relative: "a/b" and
// "../c//./d" give "a/c/d". By the text alone, which is right as long as no
// directory on the way is a link. Empty when it leads out of the top, or to it.
std::string joined(std::string_view start, std::string_view text);
