// SPDX-License-Identifier: BSD-2-Clause
#include "support/first_word.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string_view>

namespace {

constexpr auto is_white_space = [](char byte) {
  return byte == ' ' || (byte >= '\t' && byte <= '\r');
};

class input_file {
 public:
  // Without O_NONBLOCK a FIFO would block the boot until somebody wrote to it;
  // without O_NOCTTY a terminal could become the controlling one.
  explicit input_file(const std::string& path)
      : descriptor_{::open(path.c_str(),
                           O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY)} {}
  ~input_file() {
    if (is_open()) ::close(descriptor_);
  }
  input_file(const input_file&) = delete;
  input_file& operator=(const input_file&) = delete;

  bool is_open() const { return descriptor_ >= 0; }

  // The next bytes, placed in `buffer`; none at the end or after a failure.
  std::string_view read(char* buffer, std::size_t size) {
    // pread(2), because it fails on what has no positions: a FIFO, a socket, a
    // terminal.
    const ssize_t count = ::pread(descriptor_, buffer, size, position_);
    if (count <= 0) return {};
    const auto length = static_cast<std::size_t>(count);
    // A device that has positions, such as /dev/zero, may never end. It does
    // harm only if it fills the buffer at once; therefore small files skip the
    // check.
    if (position_ == 0 && length == size && is_special()) return {};
    position_ += count;
    return {buffer, length};
  }

 private:
  bool is_special() const {
    struct stat status {};
    return ::fstat(descriptor_, &status) == 0 && !S_ISREG(status.st_mode);
  }

  int descriptor_;
  off_t position_ = 0;
};

void extract_word(input_file& file, std::string& word) {
  char buffer[4096];
  for (;;) {
    const std::string_view bytes = file.read(buffer, sizeof buffer);
    if (bytes.empty()) return;
    auto start = bytes.begin();
    if (word.empty())
      start = std::find_if_not(start, bytes.end(), is_white_space);
    const auto end = std::find_if(start, bytes.end(), is_white_space);
    word.append(start, end);
    if (end != bytes.end()) return;
  }
}

}  // namespace

std::string read_first_word(const std::string& path) {
  std::string word;
  input_file file(path);
  if (!file.is_open()) return word;
  try {
    extract_word(file, word);
  } catch (...) {
    // A word that does not fit into memory is cut, as a file stream would cut
    // it, so that one absurd file does not make a data set unusable.
  }
  return word;
}
