// SPDX-License-Identifier: BSD-2-Clause
//
// How marlin-install ends when it cannot do what it was asked: one line, and an
// exit status. Thrown as a value, shown by main().
#pragma once

#include <string>
#include <string_view>

namespace status {

inline constexpr int done = 0;
inline constexpr int failed = 1;     // refused, not whole, or a call failed
inline constexpr int bad_use = 2;    // of the command line
inline constexpr int busy = 3;       // another marlin-install is running
inline constexpr int not_newer = 4;  // than what the device has

}  // namespace status

struct failure {
  int exit_status;
  std::string line;  // safe to show, without the program's name
};

// What was looked at is not as it has to be; no call has failed.
struct refusal : failure {};

// Throws `refusal` with status::failed. `what` must be safe to show.
[[noreturn]] void refuse(const std::string& what);

// Throws `failure` for a call that has just failed: "cannot WHAT: " and the
// text of errno. `name`, if any, is the path that the call was about, shown
// escaped.
[[noreturn]] void fail(const char* what, std::string_view name);
