// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>

// Whether a FIFO, a socket or a device stands at `path`, or where a link there
// leads. These are never opened: opening a FIFO can wait for ever, and opening
// a device can set it going. A regular file, a directory and whatever stat(2)
// fails for are left to open(2), which then tells the reason. Prints and throws
// nothing.
bool is_special_file(const std::string& path);
