// SPDX-License-Identifier: BSD-2-Clause
//
// marlin-status: which data a device uses, and what its next boot will do.
#include <getopt.h>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#include "tools/escaped.h"
#include "tools/status/failure.h"
#include "tools/status/rehearsal.h"
#include "tools/status/report.h"

namespace {

// The exit statuses that no device has; those of devices are verdicts.
constexpr int bad_use = 64;
constexpr int not_here = 77;

[[noreturn]] void refuse(int status, const std::string& why) {
  std::fprintf(stderr, "marlin-status: %s\n", why.c_str());
  std::_Exit(status);
}

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

void print(const std::string& text, const std::string& otherwise = {}) {
  if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size() ||
      std::fflush(stdout) != 0)
    refuse(not_here, otherwise + "standard output: " + std::strerror(errno));
}

std::string in_rows_for_terminal(const report& told) {
  winsize size{};
  look wanted;
  if (::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0)
    return in_rows(told, wanted);
  wanted.width = size.ws_col;
  const char* const colourless = std::getenv("NO_COLOR");
  wanted.has_colour = colourless == nullptr || *colourless == '\0';
  return in_rows(told, wanted);
}

struct options {
  std::string root = "/";
  std::string (*text_of)(const report&) = in_rows_for_terminal;
};

const option known[] = {{"root", required_argument, nullptr, 'r'},
                        {"json", no_argument, nullptr, 'j'},
                        {"check", no_argument, nullptr, 'c'},
                        {"help", no_argument, nullptr, 'h'},
                        {"version", no_argument, nullptr, 'v'},
                        {}};

options options_in(int count, char** words) {
  options chosen;
  opterr = 0;
  for (;;) {
    const int at = optind;
    switch (const int letter =
                ::getopt_long(count, words, "+:h", known, nullptr)) {
      case 'r':
        chosen.root = optarg;
        if (chosen.root.empty()) misused("--root needs a directory");
        break;
      case 'j':
      case 'c':
        if (chosen.text_of != in_rows_for_terminal)
          misused("one of --json and --check is enough");
        chosen.text_of = letter == 'j' ? in_json : in_reasons;
        break;
      case 'h':
        print(help);
        std::exit(0);
      case 'v':
        print("marlin-status " MARLIN_VERSION "\n");
        std::exit(0);
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

// In a child: whatever a device does to it, there is an answer.
int tell_or_refuse(const options& chosen) {
  std::string why;
  try {
    end_with_parent();
    const report told = examine(chosen.root);
    print(chosen.text_of(told), "cannot tell: ");
    return static_cast<int>(told.why.is);
  } catch (const cannot_tell& reason) {
    why = reason.what();
  } catch (const std::bad_alloc&) {
    why = "the next boot takes more than " + std::to_string(most_memory >> 20) +
          " MB of memory";
  } catch (...) {
    why = "nothing read explains the boot; is the device being changed?";
  }
  refuse(not_here, "cannot tell: " + why);
}

}  // namespace

int main(int count, char** words) {
  // A limit on the size of files fails a write, which is told.
  std::signal(SIGXFSZ, SIG_IGN);
  const options chosen = options_in(count, words);
  // What is inherited must not hide how a child ends, or that it does not.
  std::signal(SIGCHLD, SIG_DFL);
  const sigset_t none{};
  ::sigprocmask(SIG_SETMASK, &none, nullptr);
  const pid_t child = ::fork();
  if (child < 0) refuse(not_here, std::string("fork: ") + std::strerror(errno));
  if (child == 0) std::_Exit(tell_or_refuse(chosen));

  // The default action of the alarm would be silent.
  std::signal(SIGALRM, [](int) {
    constexpr char text[] =
        "marlin-status: cannot tell: the device does not answer\n";
    static_cast<void>(!::write(STDERR_FILENO, text, sizeof text - 1));
    std::_Exit(not_here);
  });
  // In seconds, for storage that never answers.
  ::alarm(30);
  int status = 0;
  if (::waitpid(child, &status, 0) != child)
    refuse(not_here, std::string("wait: ") + std::strerror(errno));
  if (WIFEXITED(status)) return WEXITSTATUS(status);
  refuse(not_here, "cannot tell: " + why_ended(status));
}
