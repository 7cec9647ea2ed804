// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>

enum class job { install, check, withdraw, prune, help, version };

struct options {
  job what = job::install;
  bool force = false;
  std::string directory{};  // of the update, for the first two
};

extern const char usage[];

// Understands the command line, or throws `failure` with status::bad_use.
options options_in(int argc, char** argv);
