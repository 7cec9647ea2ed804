// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <string>

// Why something cannot be told here, in a few words for a person.
struct cannot_tell : std::runtime_error {
  using std::runtime_error::runtime_error;
};

// Throws cannot_tell if a call has failed, with its error and what to do.
inline void must(long result, const std::string& what,
                 const char* advice = "") {
  if (result < 0)
    throw cannot_tell(what + ": " + std::strerror(errno) + advice);
}
