// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/rehearsal.h"

#include <err.h>
#include <grp.h>
#include <linux/capability.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <new>
#include <stdexcept>
#include <utility>

#include "driver/startup.h"
#include "tools/status/failure.h"

namespace {

constexpr unsigned most_milliseconds = 600;
constexpr std::size_t longest_line = 131072;  // that is kept

unsigned refused = 0;
std::vector<line> lines;

}  // namespace

void end_with_parent() { must(::prctl(PR_SET_PDEATHSIG, SIGKILL), "prctl"); }

void become_the_boot() {
  // Not allowed where this user is not really root, and needless there.
  if (::setgroups(0, nullptr) != 0 && errno != EPERM) must(-1, "setgroups");
  must(::setresgid(0, 0, 0), "setresgid");
  must(::setresuid(0, 0, 0), "setresuid", "; run this as root");
  const rlimit none{0, 0};
  must(::setrlimit(RLIMIT_CORE, &none), "setrlimit");
  ::umask(022);
  must(::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0), "no_new_privs");
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  const __user_cap_data_struct no_capability[2] = {};
  must(::syscall(SYS_capset, &header, no_capability), "capset");
  // Another group, or other capabilities, take this back.
  end_with_parent();
}

void limit_memory() {
  std::set_new_handler([] {
    ++refused;
    throw std::bad_alloc();
  });
#if !defined(__SANITIZE_ADDRESS__)
  // Sanitizers reserve terabytes of addresses.
  rlimit limit{};
  must(::getrlimit(RLIMIT_AS, &limit), "getrlimit");
  limit.rlim_cur = std::min<rlim_t>(limit.rlim_cur, most_memory);
  must(::setrlimit(RLIMIT_AS, &limit), "setrlimit");
#endif
}

unsigned refusals() { return refused; }

void limit_time() {
  const itimerval timer{{}, {0, most_milliseconds * 1000}};
  must(::setitimer(ITIMER_PROF, &timer, nullptr), "setitimer");
}

std::string why_ended(int status) {
  if (WTERMSIG(status) == SIGPROF)
    return "it takes more than " + std::to_string(most_milliseconds) +
           " ms of processor time";
  return std::string("ended by ") + ::strsignal(WTERMSIG(status));
}

// In place of the C library's. The name is the boot program's, which the device
// will print.
extern "C" void warn(const char* format, ...) {
  const int error = errno;
  static char message[longest_line];
  std::va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(message, sizeof message, format, arguments);
  va_end(arguments);
  lines.push_back(
      {format, std::string("marlin: ") + message + ": " + std::strerror(error),
       error});
  errno = error;
}

std::vector<line> take_lines() {
  for (const auto& said : lines)
    if (said.error == ENOMEM) throw std::bad_alloc();
  return std::exchange(lines, {});
}

rehearsal rehearse_boot() {
  rehearsal boot;
  take_lines();
  limit_time();
  try {
    // As at the start of a process; some lines end with the text for it.
    errno = 0;
    run_startup_pass();
    boot.ends_normally = true;
  } catch (int error) {
    boot.thrown = std::strerror(error);
  } catch (const std::out_of_range&) {
    boot.thrown = "a number in a version is too large";
  } catch (const std::exception& failure) {
    boot.thrown = failure.what();
  }
  boot.may_change_links = ::access("/var/db/timezone", W_OK | X_OK) == 0;
  boot.lines = take_lines();
  return boot;
}
