// SPDX-License-Identifier: BSD-2-Clause
#include "driver/version_record.h"

#include <fcntl.h>
#include <unistd.h>

#include <string_view>

#include "support/paths.h"
#include "support/special_file.h"

namespace {

void write_all(int file, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = ::write(file, bytes.data(), bytes.size());
    // A full disk costs the record and nothing else.
    if (written <= 0) return;
    bytes.remove_prefix(static_cast<std::size_t>(written));
  }
}

}  // namespace

void record_version_change(const std::string& from, const std::string& to) {
  const std::string record = from + "_" + to;
  // Never write the record into a FIFO or a device.
  if (is_special_file(paths::version_record)) return;
  const int file = ::open(paths::version_record,
                          O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
  if (file < 0) return;
  write_all(file, record);
  ::close(file);
}
