// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>

// Whether a FIFO or a device stands at `path`, or where a link there leads.
// Neither is ever opened: opening a FIFO may wait for ever, and opening a
// device may start something. If stat(2) fails the answer is no. Leaves errno
// as it was, for the end of a later line; if open(2) then fails, it leaves the
// error. Prints and throws nothing.
bool is_special_file(const std::string& path);
