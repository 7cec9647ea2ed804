// SPDX-License-Identifier: BSD-2-Clause
#include <sys/stat.h>

#include <csignal>
#include <cstdio>
#include <new>

#include "tools/install/failure.h"
#include "tools/install/jobs.h"

int main(int argc, char** argv) {
  // Each would end the program between two steps; the failed call is told.
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
  try {
    run_job(options_in(argc, argv));
    return status::done;
  } catch (const failure& told) {
    std::fprintf(stderr, "marlin-install: %s\n", told.line.c_str());
    return told.exit_status;
  } catch (const std::bad_alloc&) {
    std::fputs("marlin-install: out of memory; run it again\n", stderr);
    return status::failed;
  }
}
