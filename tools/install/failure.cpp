// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/failure.h"

#include <cerrno>
#include <cstring>

#include "tools/escaped.h"

void refuse(const std::string& what) { throw refusal{{status::failed, what}}; }

void fail(const char* what, std::string_view name) {
  const char* const reason = std::strerror(errno);
  throw failure{status::failed, std::string("cannot ") + what + " " +
                                    escaped(name) + ": " + reason};
}
