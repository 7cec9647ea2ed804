// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/options.h"

#include <getopt.h>

#include "tools/escaped.h"
#include "tools/install/failure.h"

const char usage[] =
    "usage: marlin-install [--force] DIR\n"
    "       marlin-install [--force] --check DIR\n"
    "       marlin-install --withdraw | --prune | --help | --version\n"
    "\n"
    "Installs the time-zone data in DIR, an unpacked update whose origin you "
    "have\n"
    "verified, and announces it to the next boot.\n"
    "\n"
    "  --check     only says whether it can be installed\n"
    "  --force     also if it is not newer than what the device has\n"
    "  --withdraw  removes the announcement; deletes no data\n"
    "  --prune     deletes all sets that are neither in use nor announced\n"
    "\n"
    "Exit status: 0 done; 1 refused or failed; 2 bad use; 3 another one is at\n"
    "work; 4 the device has this update or a newer one. See "
    "marlin-install(8).\n";

namespace {

[[noreturn]] void misused(const std::string& why) {
  throw failure{status::bad_use, why + "; see --help"};
}

const option known[] = {{"check", no_argument, nullptr, 'c'},
                        {"withdraw", no_argument, nullptr, 'w'},
                        {"prune", no_argument, nullptr, 'p'},
                        {"help", no_argument, nullptr, 'h'},
                        {"version", no_argument, nullptr, 'v'},
                        {"force", no_argument, nullptr, 'f'},
                        {nullptr, 0, nullptr, 0}};

job job_of(int letter) {
  switch (letter) {
    case 'c':
      return job::check;
    case 'w':
      return job::withdraw;
    case 'p':
      return job::prune;
    case 'h':
      return job::help;
    default:
      return job::version;
  }
}

}  // namespace

options options_in(int argc, char** argv) {
  options wanted;
  opterr = 0;
  for (;;) {
    const int at = optind;
    // "+": what follows DIR is no option.
    const int letter = ::getopt_long(argc, argv, "+", known, nullptr);
    if (letter == -1) break;
    if (letter == '?') misused(escaped(argv[at]) + " is not understood");
    if (letter == 'f') {
      wanted.force = true;
    } else if (wanted.what == job::install) {
      wanted.what = job_of(letter);
    } else {
      misused("one of the options at a time");
    }
  }
  const bool takes_directory =
      wanted.what == job::install || wanted.what == job::check;
  if (argc - optind != (takes_directory ? 1 : 0))
    misused(takes_directory ? "give the directory of one update"
                            : "this option takes no directory");
  if (wanted.force && !takes_directory)
    misused("--force is for installing and --check");
  if (takes_directory) wanted.directory = argv[optind];
  return wanted;
}
