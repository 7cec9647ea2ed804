// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/line.h"

#include <err.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace {

line_sink sink = nullptr;

}  // namespace

void take_lines(line_sink wanted) { sink = wanted; }

// In place of the C library's. The name is the boot program's, which the device
// will print.
extern "C" void warn(const char* format, ...) {
  const int error = errno;
  if (sink != nullptr) {
    static char message[longest_line];
    std::va_list arguments;
    va_start(arguments, format);
    std::vsnprintf(message, sizeof message, format, arguments);
    va_end(arguments);
    sink({format,
          std::string("marlin: ") + message + ": " + std::strerror(error),
          error});
  }
  errno = error;
}
