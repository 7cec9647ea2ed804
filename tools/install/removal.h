// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <cstdint>
#include <string>

struct removed {
  std::uint64_t files = 0;  // names of what is not a directory
  std::uint64_t bytes = 0;  // of disk space
};

// Deletes an entry, a directory with all that is in it. Follows no link, and
// takes neither more stack nor more memory or descriptors however deep or large
// the directory is: what is deeper is first moved up, into the directory
// itself. A missing entry is quiet. A call that fails throws `failure`, with
// `path` in its line; what is deleted by then is gone.
removed remove_entry(int parent, const std::string& name,
                     const std::string& path);
