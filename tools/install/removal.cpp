// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/removal.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "tools/install/failure.h"
#include "tools/install/files.h"

namespace {

class removal {
 public:
  removal(int parent, const std::string& name, const std::string& path)
      : path_(path), top_(open_owned(parent, name)) {}

  // Each round deletes all that was listed. Some file systems list less than
  // everything while entries are deleted.
  removed all() {
    while (round_of(top_.number(), [&](const std::string& name) {
      const descriptor below = open_owned(top_.number(), name);
      while (round_of(below.number(), [&](const std::string& deeper) {
        move_up(below.number(), deeper);
      })) {
      }
      unlink(top_.number(), name, AT_REMOVEDIR);
    })) {
    }
    return gone_;
  }

 private:
  descriptor open_owned(int parent, const std::string& name) const {
    // A directory that its own owner may not read: its mode has to be changed
    // by name. Root reads any directory, so that no link can lead it elsewhere.
    if (::faccessat(parent, name.c_str(), R_OK, 0) != 0 &&
        ::fchmodat(parent, name.c_str(), 0700, 0) != 0)
      fail("remove", path_);
    descriptor directory = open_directory(parent, name, path_);
    if (::fchmod(directory.number(), 0700) != 0) fail("remove", path_);
    return directory;
  }

  void unlink(int parent, const std::string& name, int flags) const {
    if (::unlinkat(parent, name.c_str(), flags) != 0) fail("remove", path_);
  }

  // Deletes what is not a directory, and hands the rest on. Whether there was
  // anything.
  template <typename Directory>
  bool round_of(int directory, Directory take) {
    const listing entries = open_listing(directory, path_);
    bool any = false;
    while (const char* const found = next_name(entries.get(), path_)) {
      const std::string name = found;
      const struct stat status = status_of(directory, name, path_);
      any = true;
      if (S_ISDIR(status.st_mode)) {
        take(name);
        continue;
      }
      unlink(directory, name, 0);
      ++gone_.files;
      if (status.st_nlink == 1)
        gone_.bytes += static_cast<std::uint64_t>(status.st_blocks) * 512;
    }
    return any;
  }

  void move_up(int parent, const std::string& name) {
    // Moving it takes the right to write into it.
    static_cast<void>(open_owned(parent, name));
    for (;;) {
      std::string free = ".";
      free += std::to_string(moved_++);
      if (::renameat(parent, name.c_str(), top_.number(), free.c_str()) == 0)
        return;
      if (errno != ENOTEMPTY && errno != EEXIST && errno != ENOTDIR)
        fail("remove", path_);
    }
  }

  const std::string& path_;
  descriptor top_;
  removed gone_{};
  std::uint64_t moved_ = 0;
};

}  // namespace

removed remove_entry(int parent, const std::string& name,
                     const std::string& path) {
  const struct stat status = status_of(parent, name, path);
  if (status.st_mode == 0) return {};
  const bool directory = S_ISDIR(status.st_mode);
  removed gone{1, static_cast<std::uint64_t>(status.st_blocks) * 512};
  if (directory) gone = removal(parent, name, path).all();
  if (::unlinkat(parent, name.c_str(), directory ? AT_REMOVEDIR : 0) != 0)
    fail("remove", path);
  return gone;
}
