// SPDX-License-Identifier: BSD-2-Clause
#include "support/special_file.h"

#include <sys/stat.h>

#include <cerrno>

bool is_special_file(const std::string& path) {
  const int error_so_far = errno;
  struct stat status {};
  const bool is_special = ::stat(path.c_str(), &status) == 0 &&
                          !S_ISREG(status.st_mode) &&
                          !S_ISDIR(status.st_mode) && !S_ISSOCK(status.st_mode);
  errno = error_so_far;
  return is_special;
}
