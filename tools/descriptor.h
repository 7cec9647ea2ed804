// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <unistd.h>

#include <utility>

// Owns a file descriptor; a negative number is none.
class descriptor {
 public:
  explicit descriptor(int number = -1) : number_(number) {}
  descriptor(descriptor&& other) noexcept
      : number_(std::exchange(other.number_, -1)) {}
  descriptor& operator=(descriptor&& other) noexcept {
    std::swap(number_, other.number_);
    return *this;
  }
  ~descriptor() {
    if (number_ >= 0) ::close(number_);
  }
  int number() const { return number_; }
  int release() { return std::exchange(number_, -1); }

 private:
  int number_;
};
