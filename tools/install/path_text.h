// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>
#include <string_view>

// Where `text` leads from the directory `start`, both relative: "a/b" and
// "../c//./d" give "a/c/d". Empty when it leads out of the top, or to it. What
// only a look at the way could tell stays in it, so that no file has such a
// name: a ".." behind a name, and a "/" at the end.
std::string joined(std::string_view start, std::string_view text);
