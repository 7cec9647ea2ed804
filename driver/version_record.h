// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>

// Replaces the content of "/var/db/timezone/TZVersionDiffRecord" by `from`,
// "_", `to`, with no newline. The file is created with the default permissions
// where there is none. Quiet and without effect when it cannot be opened, as
// which a FIFO, a socket or a device counts; see is_special_file(). Write
// errors are not checked and nothing is synced. open(2), write(2). Throws only
// on memory exhaustion.
void record_version_change(const std::string& from, const std::string& to);
