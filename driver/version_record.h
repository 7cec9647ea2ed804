// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>

// Replaces the content of "/var/db/timezone/TZVersionDiffRecord" by `from`,
// "_", `to`, with no newline: "2023c.1.0_2024a.1.0". Creates the file with the
// default permissions if there is none. Does nothing, and prints nothing, when
// it cannot be opened; a FIFO or a device never is. Write errors are ignored
// and nothing is synced. Throws only on memory exhaustion. Calls: stat(2),
// open(2), write(2).
void record_version_change(const std::string& from, const std::string& to);
