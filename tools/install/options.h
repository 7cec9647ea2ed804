// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>

enum class job {
  install,
  check,
  audit,
  settle,
  withdraw,
  prune,
  help,
  version
};

struct options {
  job what = job::install;
  bool force = false;
  bool json = false;
  std::string verifier{};   // for the first two; empty: none
  std::string directory{};  // of the update, for the first two
};

extern const char usage[];

// Understands the command line, or throws `failure` with status::bad_use.
options options_in(int argc, char** argv);
