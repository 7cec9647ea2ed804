// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <unistd.h>

#include <cstddef>
#include <cstdio>

// Tells on standard output, if it is a terminal, how far a copy is.
class progress {
 public:
  explicit progress(std::size_t all) : all_(all) {}
  ~progress() {
    if (shown_) std::fputs("\r\033[K", stdout), std::fflush(stdout);
  }
  progress(const progress&) = delete;
  progress& operator=(const progress&) = delete;

  void step() {
    if (++done_ % 32 != 0 || !terminal_) return;
    shown_ = true;
    std::printf("\rinstalling: %zu %%", done_ * 100 / all_);
    std::fflush(stdout);
  }

 private:
  std::size_t all_;
  std::size_t done_ = 0;
  bool terminal_ = ::isatty(STDOUT_FILENO) == 1;
  bool shown_ = false;
};
