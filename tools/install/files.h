// SPDX-License-Identifier: BSD-2-Clause
//
// Files and directories, reached from a directory that is open, never through a
// link. A call that fails throws `failure`; `path` is what its line names.
#pragma once

#include <dirent.h>
#include <sys/stat.h>

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include "tools/descriptor.h"

// lstat(2) of an entry; a missing one has the mode 0.
struct stat status_of(int directory, const std::string& name,
                      const std::string& path);

// open(2) of a directory; a link to one is not one.
descriptor open_directory(int parent, const std::string& name,
                          const std::string& path);

// The names in a directory, sorted, without "." and "..". Stops reading after
// `most` of them.
std::vector<std::string> names_in(int directory, std::size_t most,
                                  const std::string& path);

// A directory to read entry by entry, however many there are.
struct close_listing {
  void operator()(DIR* listing) const { ::closedir(listing); }
};
using listing = std::unique_ptr<DIR, close_listing>;
listing open_listing(int directory, const std::string& path);
// The next name, or nullptr at the end.
const char* next_name(DIR* entries, const std::string& path);

// readlink(2). Empty when there is no link.
std::string link_text(int directory, const std::string& name,
                      const std::string& path);

// read(2) of a regular file: a read that comes short ends it. Refuses more
// bytes than `most`.
std::string read_all(int file, std::size_t most, const std::string& path);

// fsync(2).
void sync(int file, const std::string& path);

// rename(2), or the exchange of two entries.
void rename_entry(int directory, const std::string& from, const std::string& to,
                  const std::string& path);
void exchange_entries(int directory, const std::string& one,
                      const std::string& other, const std::string& path);
