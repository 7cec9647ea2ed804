// SPDX-License-Identifier: BSD-2-Clause
#include "driver/version_record.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string_view>

#include "support/paths.h"

namespace {

bool is_special(int descriptor) {
  struct stat status {};
  return ::fstat(descriptor, &status) == 0 && !S_ISREG(status.st_mode);
}

void write_all(int descriptor, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = ::write(descriptor, bytes.data(), bytes.size());
    // A full disk costs the record and nothing else.
    if (written <= 0) return;
    bytes.remove_prefix(static_cast<std::size_t>(written));
  }
}

}  // namespace

void record_version_change(const std::string& from, const std::string& to) {
  const std::string record = from + "_" + to;
  // Without O_NONBLOCK a FIFO in the record's place would block the boot;
  // without O_NOCTTY a terminal could become the controlling one.
  const int descriptor = ::open(
      paths::version_record,
      O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NONBLOCK | O_NOCTTY, 0666);
  if (descriptor < 0) return;
  // Never write the record into a FIFO or a device.
  if (!is_special(descriptor)) write_all(descriptor, record);
  ::close(descriptor);
}
