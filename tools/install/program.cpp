// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/program.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstddef>

#include "tools/descriptor.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"

namespace {

constexpr std::size_t most_output = 32u << 20;

class settings {
 public:
  settings() {
    insist(::posix_spawn_file_actions_init(&actions));
    insist(::posix_spawnattr_init(&attributes));
    // As main() got them, or nearly: it ignores these.
    sigset_t ignored;
    ::sigemptyset(&ignored);
    ::sigaddset(&ignored, SIGPIPE);
    ::sigaddset(&ignored, SIGXFSZ);
    insist(::posix_spawnattr_setsigdefault(&attributes, &ignored));
    insist(::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF));
  }
  settings(const settings&) = delete;
  settings& operator=(const settings&) = delete;
  ~settings() {
    ::posix_spawnattr_destroy(&attributes);
    ::posix_spawn_file_actions_destroy(&actions);
  }

  // For functions that return an error number.
  static void insist(int error) {
    errno = error;
    if (error != 0) fail("run", "a program");
  }

  posix_spawn_file_actions_t actions{};
  posix_spawnattr_t attributes{};
};

int end_of(pid_t child, const std::string& name) {
  int status = 0;
  while (::waitpid(child, &status, 0) < 0) {
    if (errno != EINTR) fail("wait for", name);
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace

int run_program(std::vector<std::string> words, int directory,
                std::string* output) {
  const std::string& name = words.front();
  settings set;
  // Not a pipe: it would have to be emptied meanwhile.
  const descriptor printed(
      output != nullptr ? ::memfd_create("output", MFD_CLOEXEC) : -1);
  if (output != nullptr) {
    if (printed.number() < 0) fail("run", name);
    set.insist(
        ::posix_spawn_file_actions_adddup2(&set.actions, printed.number(), 1));
    set.insist(
        ::posix_spawn_file_actions_addfchdir_np(&set.actions, directory));
  }
  std::vector<char*> arguments;
  for (auto& word : words) arguments.push_back(word.data());
  arguments.push_back(nullptr);
  pid_t child = 0;
  errno = ::posix_spawnp(&child, name.c_str(), &set.actions, &set.attributes,
                         arguments.data(), environ);
  if (errno != 0) fail("run", name);
  const int status = end_of(child, name);
  if (output == nullptr) return status;
  if (::lseek(printed.number(), 0, SEEK_SET) != 0) fail("run", name);
  *output = read_all(printed.number(), most_output, name);
  return status;
}
