// SPDX-License-Identifier: BSD-2-Clause
#include <err.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <new>

#include "tools/install/failure.h"
#include "tools/install/jobs.h"

// What the boot's own classes complain of is for a boot to tell.
extern "C" void warn(const char*, ...) {}

int main(int argc, char** argv) {
  // Each would end the program between two steps; the failed call is told.
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
  // Where it is ignored nobody learns how a program ended.
  std::signal(SIGCHLD, SIG_DFL);
  try {
    const int ended = run_job(options_in(argc, argv));
    if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0) return ended;
    std::fprintf(
        stderr,
        "marlin-install: cannot write to standard output: %s; all else "
        "is done\n",
        std::strerror(errno));
    return status::failed;
  } catch (const failure& told) {
    std::fprintf(stderr, "marlin-install: %s\n", told.line.c_str());
    return told.exit_status;
  } catch (const std::bad_alloc&) {
    std::fputs("marlin-install: out of memory; run it again\n", stderr);
    return status::failed;
  }
}
