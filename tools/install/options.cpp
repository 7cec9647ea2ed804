// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/options.h"

#include <map>
#include <string_view>

#include "tools/escaped.h"
#include "tools/install/failure.h"

const char usage[] =
    R"(usage: marlin-install [--force] [--verify PROGRAM] [--check] DIR
       marlin-install --audit [--json]
       marlin-install --settle | --withdraw | [--force] --prune
       marlin-install --help | --version

Installs the time-zone data in DIR, an unpacked update with its manifest
SHA256SUMS, and announces it to the next boot. No option can be abbreviated.

  --verify PROGRAM  refuses the update unless PROGRAM, which gets the path of
                    the checked copy, ends with status 0
  --check           only says whether it can be installed
  --force           also if it is not newer than what the device has; for
                    --prune: also what is newer than the data in use
  --audit           says of each set on the device whether it is whole
  --json            for programs
  --settle          if the announced set is in use: --withdraw and --prune
  --withdraw        removes the announcement; deletes no data
  --prune           deletes all sets that are neither in use nor announced

Exit status: 0 done; 1 refused, failed, or a set is not whole; 2 bad use;
3 another marlin-install is running; 4 the device has this update or a newer
one. See marlin-install(8).
)";

namespace {

[[noreturn]] void misused(const std::string& why) {
  throw failure{status::bad_use, why + "; see --help"};
}

const std::map<std::string_view, job> jobs{
    {"--check", job::check},    {"--audit", job::audit},
    {"--settle", job::settle},  {"--withdraw", job::withdraw},
    {"--prune", job::prune},    {"--help", job::help},
    {"--version", job::version}};

}  // namespace

// Not by getopt_long(3): it takes any beginning of an option for the option,
// and "--p" would delete data.
options options_in(int argc, char** argv) {
  options wanted;
  int at = 1;
  for (; at < argc && *argv[at] == '-'; ++at) {
    const std::string_view word = argv[at];
    const auto found = jobs.find(word);
    if (word == "--") {
      ++at;
      break;
    } else if (word == "--force") {
      wanted.force = true;
    } else if (word == "--json") {
      wanted.json = true;
    } else if (word == "--verify") {
      if (++at == argc || *argv[at] == '\0') misused("give --verify a program");
      wanted.verifier = argv[at];
    } else if (found == jobs.end()) {
      misused(escaped(word) + " is not understood");
    } else if (wanted.what != job::install) {
      misused("one of the options at a time");
    } else {
      wanted.what = found->second;
    }
  }
  const bool takes_directory =
      wanted.what == job::install || wanted.what == job::check;
  if (argc - at != (takes_directory ? 1 : 0))
    misused(takes_directory ? "give the directory of one update"
                            : "this option takes no directory");
  if (wanted.force && !takes_directory && wanted.what != job::prune)
    misused("--force is for installing, --check and --prune");
  if (!wanted.verifier.empty() && !takes_directory)
    misused("--verify is for installing and --check");
  if (wanted.json && wanted.what != job::audit)
    misused("--json is for --audit");
  if (takes_directory) wanted.directory = argv[at];
  return wanted;
}
