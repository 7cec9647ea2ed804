// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/options.h"

#include <getopt.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "tools/escaped.h"

namespace {

constexpr char help[] =
    R"(usage: marlin-status [--root DIR] [--json | --check]

Tells which time-zone data a device uses, and what its next boot will do.
Nothing is changed: the boot is run in a throw-away layer over the device.

  --root DIR   the device unpacked or mounted in DIR, not this system
  --json       one JSON object
  --check      only the reasons for a status of 1 or 2
  --version    the version of this program

Exit status: 0 sound, 1 the next boot changes something on purpose,
2 something is wrong, 64 bad use, 77 it cannot be told here.
)";

[[noreturn]] void misused(const std::string& why) {
  refuse(bad_use, why + "; see --help");
}

[[noreturn]] void print_and_exit(const char* text) {
  if (std::fputs(text, stdout) < 0 || std::fflush(stdout) != 0)
    refuse(not_here, std::string("standard output: ") + std::strerror(errno));
  std::exit(0);
}

// Numbers that no letter has.
enum { root = 256, json, check, version };
const option known[] = {{"root", required_argument, nullptr, root},
                        {"json", no_argument, nullptr, json},
                        {"check", no_argument, nullptr, check},
                        {"help", no_argument, nullptr, 'h'},
                        {"version", no_argument, nullptr, version},
                        {}};

}  // namespace

options options_in(int count, char** words) {
  options chosen;
  opterr = 0;
  for (;;) {
    const int at = optind;
    switch (const int letter =
                ::getopt_long(count, words, "+:h", known, nullptr)) {
      case root:
        chosen.root = optarg;
        if (chosen.root.empty()) misused("--root needs a directory");
        break;
      case json:
      case check:
        if (chosen.wanted != form::rows)
          misused("one of --json and --check is enough");
        chosen.wanted = letter == json ? form::json : form::reasons;
        break;
      case 'h':
        print_and_exit(help);
      case version:
        print_and_exit("marlin-status " MARLIN_VERSION "\n");
      case -1:
        if (optind == count) return chosen;
        misused(escaped(words[optind]) + " is not expected");
      case ':':
        misused("--root needs a directory");
      default:
        misused(escaped(words[at]) + " is not understood");
    }
  }
}

void refuse(int status, const std::string& why) {
  std::fprintf(stderr, "marlin-status: %s\n", why.c_str());
  std::exit(status);
}
