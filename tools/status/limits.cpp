// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/limits.h"

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
#include <csignal>
#include <cstring>

#include "tools/status/failure.h"

void end_with_parent() { must(::prctl(PR_SET_PDEATHSIG, SIGKILL), "prctl"); }

void become_the_boot() {
  // Not allowed where this user is not really root, and needless there.
  if (::setgroups(0, nullptr) != 0 && errno != EPERM) must(-1, "setgroups");
  must(::setresgid(0, 0, 0), "setresgid");
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
#if !defined(__SANITIZE_ADDRESS__)
  // Sanitizers reserve terabytes of addresses.
  rlimit limit{};
  must(::getrlimit(RLIMIT_AS, &limit), "getrlimit");
  limit.rlim_max = std::min<rlim_t>(limit.rlim_max, most_memory);
  limit.rlim_cur = std::min(limit.rlim_cur, limit.rlim_max);
  must(::setrlimit(RLIMIT_AS, &limit), "setrlimit");
#endif
}

void limit_time() {
  const itimerval timer{{}, {0, most_milliseconds * 1000}};
  must(::setitimer(ITIMER_PROF, &timer, nullptr), "setitimer");
}

std::string why_ended(int status) {
  if (!WIFSIGNALED(status)) return "ended without a reason";
  if (WTERMSIG(status) == SIGPROF)
    return "it takes more than " + std::to_string(most_milliseconds) +
           " ms of processor time";
  return std::string("ended by ") + ::strsignal(WTERMSIG(status));
}
