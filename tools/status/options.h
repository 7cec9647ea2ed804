// SPDX-License-Identifier: BSD-2-Clause
//
// What the command line asks for.
#pragma once

#include <string>

// The exit statuses that no device has; those of devices are verdicts.
inline constexpr int bad_use = 64;
inline constexpr int not_here = 77;

enum class form { rows, json, reasons };

struct options {
  std::string root = "/";
  form wanted = form::rows;
};

// Ends the program after --help, --version and bad use.
options options_in(int count, char** words);

// Ends the program with a line on standard error.
[[noreturn]] void refuse(int status, const std::string& why);
