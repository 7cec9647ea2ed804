// SPDX-License-Identifier: BSD-2-Clause
//
// marlin-status: which data a device uses, and what its next boot will do.
#include <getopt.h>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <string>

#include "tools/escaped.h"
#include "tools/status/report.h"
#include "tools/status/throwaway.h"

namespace {

constexpr int bad_use = 64;
constexpr int not_here = 77;

constexpr unsigned longest_wait =
    30;  // seconds, for storage that never answers

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

enum class form { rows, json, reasons };

struct options {
  std::string root = "/";
  form wanted = form::rows;
};

[[noreturn]] void refuse(int status, const std::string& why) {
  std::fprintf(stderr, "marlin-status: %s\n", why.c_str());
  std::exit(status);
}

// Ends the program, after --help and --version too.
void print_and_exit(const std::string& text) {
  if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size() ||
      std::fflush(stdout) != 0)
    refuse(not_here, std::string("standard output: ") + std::strerror(errno));
  std::exit(0);
}

options parse(int count, char** words) {
  // Numbers that no letter has.
  enum { root = 256, json, check, help_, version };
  static const option known[] = {{"root", required_argument, nullptr, root},
                                 {"json", no_argument, nullptr, json},
                                 {"check", no_argument, nullptr, check},
                                 {"help", no_argument, nullptr, help_},
                                 {"version", no_argument, nullptr, version},
                                 {}};
  options chosen;
  int letter = 0;
  opterr = 0;
  while ((letter = getopt_long(count, words, "+:h", known, nullptr)) != -1) {
    switch (letter) {
      case root:
        chosen.root = optarg;
        break;
      case json:
      case check:
        if (chosen.wanted != form::rows)
          refuse(bad_use, "one of --json and --check is enough; see --help");
        chosen.wanted = letter == json ? form::json : form::reasons;
        break;
      case 'h':
      case help_:
        print_and_exit(help);
        break;
      case version:
        print_and_exit("marlin-status " MARLIN_VERSION "\n");
        break;
      case ':':
        refuse(bad_use, "--root needs a directory; see --help");
      default:
        refuse(bad_use,
               (optopt != 0 && optopt < root
                    ? std::string("-") +
                          escaped(std::string(1, static_cast<char>(optopt)))
                    : escaped(words[optind - 1])) +
                   " is not understood; see --help");
    }
  }
  if (chosen.root.empty())
    refuse(bad_use, "--root needs a directory; see --help");
  if (optind != count)
    refuse(bad_use, escaped(words[optind]) + " is not expected; see --help");
  return chosen;
}

look of_terminal() {
  winsize size{};
  look wanted;
  if (::isatty(STDOUT_FILENO) == 0) return wanted;
  if (::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0)
    wanted.width = size.ws_col;
  const char* const colourless = std::getenv("NO_COLOR");
  wanted.has_colour = colourless == nullptr || *colourless == '\0';
  return wanted;
}

std::vector<std::string> unknown(const report& told, bool is_running_system) {
  std::vector<std::string> texts;
  const auto has_several = [](const std::optional<dataset_facts>& set) {
    return set && set->has_several_schemas;
  };
  if (!is_running_system &&
      (has_several(told.device.current) || has_several(told.device.update)))
    texts.emplace_back(
        "which ICU data file comes first on the device's own file system");
  if (!(told.after.zoneinfo == told.device.links.zoneinfo) ||
      !(told.after.icutz == told.device.links.icutz) ||
      !(told.after.localtime == told.device.links.localtime))
    texts.emplace_back("whether there is space for the links");
  if (!is_running_system)
    texts.emplace_back("what the device mounts over this tree");
  return texts;
}

// A word that is cut costs one refusal, and an update's decides nothing.
void insist_on_enough_memory(const report& told) {
  using enum dataset_facts::state;
  const auto lacks_memory = [](const std::optional<dataset_facts>& set) {
    return set && set->ends == no_memory;
  };
  unsigned expected = 0;
  for (const auto* set : {&told.device.current, &told.device.update})
    if (*set && !(*set)->path.empty() && (*set)->word_is_cut) ++expected;
  if (told.device.system.word_is_cut || told.boot.refusals > expected ||
      lacks_memory(told.device.current) || lacks_memory(told.device.update) ||
      std::any_of(told.boot.lines.begin(), told.boot.lines.end(),
                  [](const line& said) { return said.error == ENOMEM; }))
    throw cannot_tell("the next boot takes more than " +
                      std::to_string(most_memory >> 20) + " MB of memory");
}

// In a user namespace this user is the device's root only as far as the device
// is this user's. What is sound for somebody with the rights of everybody is
// sound.
void insist_on_rights(const report& told, const place& here) {
  if (!here.has_all_users && !told.device.foreign_part.empty() &&
      (told.why.is != verdict::sound || told.device.has_closed_part))
    throw cannot_tell(escaped(told.device.foreign_part) +
                      " belongs to another user, whose rights this user has "
                      "not; run this as root");
}

report examine(const options& chosen) {
  const place here = enter_throwaway_device(chosen.root);
  become_the_boot();
  limit_memory();
  limit_time();
  report told;
  told.device = read_device();
  insist_on_enough_memory(told);
  told.boot = rehearse_boot();
  told.after = read_links();
  insist_on_enough_memory(told);
  told.why = explain(told.device, told.boot, told.after);
  insist_on_rights(told, here);
  told.cannot_know = unknown(told, here.is_running_system);
  return told;
}

int tell(const options& chosen) {
  const look wanted = of_terminal();
  const report told = examine(chosen);
  const std::string text = chosen.wanted == form::json ? in_json(told)
                           : chosen.wanted == form::reasons
                               ? in_reasons(told)
                               : in_rows(told, wanted);
  if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size() ||
      std::fflush(stdout) != 0)
    throw cannot_tell(std::string("standard output: ") + std::strerror(errno));
  return static_cast<int>(told.why.is);
}

// In a child: whatever a device does to it, there is an answer.
int tell_or_say_why_not(const options& chosen) {
  std::string why;
  try {
    return tell(chosen);
  } catch (const cannot_tell& reason) {
    why = reason.what();
  } catch (const std::bad_alloc&) {
    why = "it takes more memory than there is";
  } catch (...) {
    why =
        "what the boot did does not follow from what was read; is the device "
        "being changed?";
  }
  std::fprintf(stderr, "marlin-status: cannot tell: %s\n", why.c_str());
  return not_here;
}

}  // namespace

int main(int count, char** words) {
  const options chosen = parse(count, words);
  // A limit on the size of files fails a write, which is told.
  ::signal(SIGXFSZ, SIG_IGN);
  // If it is ignored, nobody is told how a child ends.
  ::signal(SIGCHLD, SIG_DFL);
  const pid_t child = ::fork();
  if (child < 0) refuse(not_here, std::string("fork: ") + std::strerror(errno));
  if (child == 0) {
    end_with_parent();
    std::_Exit(tell_or_say_why_not(chosen));
  }

  // The default action of the alarm would be silent.
  ::signal(SIGALRM, [](int) {
    constexpr char text[] =
        "marlin-status: cannot tell: the device does not answer\n";
    static_cast<void>(!::write(STDERR_FILENO, text, sizeof text - 1));
    std::_Exit(not_here);
  });
  ::alarm(longest_wait);
  int status = 0;
  ::waitpid(child, &status, 0);
  if (WIFEXITED(status)) return WEXITSTATUS(status);
  refuse(not_here, "cannot tell: " + why_ended(status));
}
