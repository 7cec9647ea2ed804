// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/rehearsal.h"

#include <err.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <exception>
#include <stdexcept>

#include "driver/startup.h"
#include "tools/status/facts.h"
#include "tools/status/limits.h"

namespace {

constexpr std::size_t longest_line = 131072;  // that is kept

line_sink sink = nullptr;
rehearsal boot;

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

rehearsal rehearse_boot() {
  boot = {};
  limit_time();
  const unsigned before = refusals();
  take_lines([](const line& said) { boot.lines.push_back(said); });
  try {
    // As at the start of a process; some lines end with the text for it.
    errno = 0;
    run_startup_pass();
    boot.ends_normally = true;
  } catch (int error) {
    boot.thrown = std::strerror(error);
  } catch (const std::out_of_range&) {
    boot.thrown = "a number in a version is too large";
  } catch (const std::exception& failure) {
    boot.thrown = failure.what();
  }
  take_lines(nullptr);
  boot.refusals = refusals() - before;
  return std::move(boot);
}
