// SPDX-License-Identifier: BSD-2-Clause
#include "driver/data_protection.h"

#include <fcntl.h>
#include <unistd.h>

#include "support/paths.h"

namespace {

// Takes no std::string: nobody would catch the exception if its memory were
// refused.
void request_class_d([[maybe_unused]] const char* directory) {
#ifdef F_SETPROTECTIONCLASS
  constexpr int class_d = 4;
  const int descriptor = ::open(directory, O_RDONLY | O_CLOEXEC);
  if (descriptor < 0) return;
  // A refusal is not reported: the file system may have no classes.
  ::fcntl(descriptor, F_SETPROTECTIONCLASS, class_d);
  ::close(descriptor);
#endif
}

}  // namespace

void relax_data_protection() {
  request_class_d(paths::timezone_directory);
  request_class_d(paths::download_root);
}

void set_protection_class_d(const std::string& directory) {
  request_class_d(directory.c_str());
}
