// SPDX-License-Identifier: BSD-2-Clause
#include "support/first_word.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>

#include "support/special_file.h"

namespace {

constexpr auto is_white_space = [](char byte) {
  return byte == ' ' || (byte >= '\t' && byte <= '\r');
};

// Appends to the caller's word, so that what was read remains if memory runs
// out.
void extract_word(int file, std::string& word) {
  char buffer[4096];
  for (;;) {
    const ssize_t count = ::read(file, buffer, sizeof buffer);
    if (count <= 0) return;
    const char* const stop = buffer + count;
    const char* start = buffer;
    if (word.empty()) start = std::find_if_not(start, stop, is_white_space);
    const char* const end = std::find_if(start, stop, is_white_space);
    word.append(start, end);
    if (end != stop) return;
  }
}

}  // namespace

std::string read_first_word(const std::string& path) {
  std::string word;
  if (is_special_file(path)) return word;
  const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return word;
  try {
    extract_word(file, word);
  } catch (...) {
    // A word that does not fit into memory is cut, as a file stream would cut
    // it, so that one absurd file does not make a data set unusable.
  }
  ::close(file);
  return word;
}
