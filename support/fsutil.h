// SPDX-License-Identifier: BSD-2-Clause
//
// The four file-system calls with which the links are inspected and rewritten.
// A path goes to the system exactly as given, up to its first NUL. Nothing is
// normalised, retried or remembered.
//
// A hard failure is printed with warn(3) and then thrown as a bare `int`: the
// errno of the failing call. There is no exception class, because no handler
// ever looks at the value; the path is in the warning. For remove() and
// read_symlink() a missing path is not a failure.
//
// All that is thrown anywhere in the program:
//   int, an errno                      a failed call, here or in dataset/icu.h
//   int, -1                            driver/link_rejected.h
//   std::invalid_argument, "badpath"   dataset/dataset.h
//   std::out_of_range                  a number in a version, support/version.h
//   std::bad_alloc, std::length_error  no memory
//
// Always call these qualified: the C library's remove(3) is used as well, as
// std::remove, and differs (it never reports, and it deletes empty
// directories).
#pragma once

#include <string>

namespace fsutil {

// unlink(2). A missing path is quiet. Any other failure, as for a directory,
// prints "remove: could not remove PATH" and throws errno. Returns whether
// errno is zero afterwards, which no caller uses.
bool remove(const std::string& path);

// access(2) with F_OK: whether the path can be reached, through any links. A
// dangling link does not exist. Any failure means false; prints and throws
// nothing.
bool exists(const std::string& path);

// readlink(2). Returns the target, cut without notice to its first 1024 bytes,
// or the empty string for a missing path. Any other failure, as for a path that
// is not a link (EINVAL), prints "read_symlink: PATH" and throws errno.
std::string read_symlink(const std::string& path);

// symlink(2), with its order of arguments: the text to store, then the path of
// the new link. Returns 0. Never replaces anything and never looks at the
// target. On failure prints "create_symlink: from LINK to TARGET" and throws
// errno.
int create_symlink(const std::string& target, const std::string& link);

}  // namespace fsutil
