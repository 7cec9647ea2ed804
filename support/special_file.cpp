// SPDX-License-Identifier: BSD-2-Clause
#include "support/special_file.h"

#include <sys/stat.h>

bool is_special_file(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode) &&
         !S_ISDIR(status.st_mode);
}
