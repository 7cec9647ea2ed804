// SPDX-License-Identifier: BSD-2-Clause
//
// marlin-status: which data a device uses, and what its next boot will do.
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#include "tools/status/failure.h"
#include "tools/status/limits.h"
#include "tools/status/options.h"
#include "tools/status/report.h"

namespace {

// In seconds, for storage that never answers.
constexpr unsigned longest_wait = 30;

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

int tell(const options& chosen) {
  const look wanted = of_terminal();
  const report told = examine(chosen.root);
  const std::string text = chosen.wanted == form::json ? in_json(told)
                           : chosen.wanted == form::reasons
                               ? in_reasons(told)
                               : in_rows(told, wanted);
  if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size() ||
      std::fflush(stdout) != 0)
    must(-1, "standard output");
  return static_cast<int>(told.why.is);
}

// In a child: whatever a device does to it, there is an answer.
int tell_or_say_why_not(const options& chosen) {
  std::string why;
  try {
    end_with_parent();
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
  // A limit on the size of files fails a write, which is told.
  std::signal(SIGXFSZ, SIG_IGN);
  const options chosen = options_in(count, words);
  // If it is ignored, nobody is told how a child ends.
  std::signal(SIGCHLD, SIG_DFL);
  const pid_t child = ::fork();
  if (child < 0) refuse(not_here, std::string("fork: ") + std::strerror(errno));
  if (child == 0) std::_Exit(tell_or_say_why_not(chosen));

  // The default action of the alarm would be silent.
  std::signal(SIGALRM, [](int) {
    constexpr char text[] =
        "marlin-status: cannot tell: the device does not answer\n";
    static_cast<void>(!::write(STDERR_FILENO, text, sizeof text - 1));
    std::_Exit(not_here);
  });
  ::alarm(longest_wait);
  int status = 0;
  if (::waitpid(child, &status, 0) != child)
    refuse(not_here, std::string("wait: ") + std::strerror(errno));
  if (WIFEXITED(status)) return WEXITSTATUS(status);
  refuse(not_here, "cannot tell: " + why_ended(status));
}
