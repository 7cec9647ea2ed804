// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/rehearsal.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <exception>
#include <new>
#include <stdexcept>

#include "driver/startup.h"
#include "tools/status/throwaway.h"

namespace {

// What the child tells, one message after the other.
enum class kind : std::uint32_t { line, refusal, returned, threw };
struct header {
  kind what;
  std::int32_t error;
  std::uint32_t format_length;
  std::uint32_t text_length;
};

int channel = -1;

void write_all(const void* bytes, std::size_t count) {
  auto* rest = static_cast<const char*>(bytes);
  while (count > 0) {
    const ssize_t written = ::write(channel, rest, count);
    if (written <= 0) ::_exit(1);
    rest += written;
    count -= static_cast<std::size_t>(written);
  }
}

void tell(kind what, const line& said = {}) {
  const int error = errno;
  const header head{what, said.error,
                    static_cast<std::uint32_t>(said.format.size()),
                    static_cast<std::uint32_t>(said.text.size())};
  write_all(&head, sizeof head);
  write_all(said.format.data(), said.format.size());
  write_all(said.text.data(), said.text.size());
  errno = error;
}

[[noreturn]] void run_and_tell(int pipe) {
  end_with_parent();
  channel = pipe;
  limit_time();
  take_lines([](const line& said) { tell(kind::line, said); });
  std::set_new_handler([] {
    tell(kind::refusal);
    throw std::bad_alloc();
  });
  try {
    // As at the start of a process; some lines end with the text for it.
    errno = 0;
    run_startup_pass();
    tell(kind::returned);
  } catch (int error) {
    tell(kind::threw, {{}, std::strerror(error), error});
  } catch (const std::out_of_range&) {
    tell(kind::threw, {{}, "a number in a version is too large", 0});
  } catch (const std::exception& failure) {
    tell(kind::threw, {{}, failure.what(), 0});
  }
  ::_exit(0);
}

// What is left of the messages.
class reader {
 public:
  explicit reader(int pipe) : pipe_(pipe) {}

  // False at the end, also in the middle of a message.
  bool read(void* bytes, std::size_t count) const {
    auto* rest = static_cast<char*>(bytes);
    while (count > 0) {
      const ssize_t got = ::read(pipe_, rest, count);
      if (got <= 0) return false;
      rest += got;
      count -= static_cast<std::size_t>(got);
    }
    return true;
  }

  bool read(std::string& text, std::size_t count) const {
    text.resize(count);
    return read(text.data(), count);
  }

 private:
  int pipe_;
};

// Returns whether the boot came to its end.
bool listen(const reader& child, rehearsal& boot) {
  header head{};
  line said;
  while (child.read(&head, sizeof head) &&
         child.read(said.format, head.format_length) &&
         child.read(said.text, head.text_length)) {
    said.error = head.error;
    switch (head.what) {
      case kind::line:
        boot.lines.push_back(said);
        break;
      case kind::refusal:
        ++boot.refusals;
        break;
      case kind::returned:
        boot.ends_normally = true;
        return true;
      case kind::threw:
        boot.thrown = said.text;
        return true;
    }
  }
  return false;
}

}  // namespace

rehearsal rehearse_boot() {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0)
    throw cannot_tell(std::string("pipe: ") + std::strerror(errno));
  const pid_t child = ::fork();
  if (child < 0)
    throw cannot_tell(std::string("fork: ") + std::strerror(errno));
  if (child == 0) {
    ::close(ends[0]);
    run_and_tell(ends[1]);
  }
  ::close(ends[1]);
  rehearsal boot;
  const bool is_whole = listen(reader(ends[0]), boot);
  ::close(ends[0]);
  int status = 0;
  ::waitpid(child, &status, 0);
  if (!is_whole) throw cannot_tell("the next boot: " + why_ended(status));
  return boot;
}
