// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/rehearsal.h"

#include <cerrno>
#include <cstring>
#include <exception>
#include <stdexcept>

#include "driver/startup.h"
#include "tools/status/facts.h"
#include "tools/status/limits.h"

namespace {

rehearsal boot;

}  // namespace

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
