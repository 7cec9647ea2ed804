// SPDX-License-Identifier: BSD-2-Clause
//
// The kernel's list of mounts, as proc(5) describes "/proc/PID/mountinfo".
#pragma once

#include <string>
#include <string_view>
#include <vector>

// The places below `directory` at which something is mounted, parents first and
// each once, without `directory` itself. `mountinfo` is the text of the list,
// in which blanks and other bytes of a path are written as "\NNN". Lines that
// are not of its form are skipped. Throws std::bad_alloc only.
std::vector<std::string> mounts_below(std::string_view mountinfo,
                                      std::string_view directory);
