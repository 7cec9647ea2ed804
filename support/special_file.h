// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>

// Whether a FIFO, a socket or a device stands at `path`, or where a link there
// leads. None of these is ever opened: opening a FIFO may wait for ever, and
// opening a device may start something. A path for which stat(2) fails is left
// to open(2), which then leaves the error. Prints and throws nothing.
bool is_special_file(const std::string& path);
