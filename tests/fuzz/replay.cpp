// SPDX-License-Identifier: BSD-2-Clause
//
// Stands in for a fuzzing engine: gives every seed in a file to the target
// once, so that what was ever found stays found, with any compiler. The first
// lines of the file tell its format.
#include <charconv>
#include <fstream>

#include "tests/fuzz/property.h"

namespace {

[[noreturn]] void refuse(const std::string& line) {
  std::fprintf(stderr, "not a seed: %s\n", line.c_str());
  std::exit(2);
}

// The byte of the escape sequence at the start of `text`, which is cut off.
char take_escape(std::string_view& text, const std::string& line) {
  const char kind = text.size() > 1 ? text[1] : '\0';
  const std::size_t length = kind == 'x' ? 4 : 2;
  unsigned char byte = kind == 'n' ? '\n' : '\\';
  if (kind == 'x') {
    const std::string_view digits = text.substr(2, 2);
    const auto end = digits.data() + digits.size();
    if (digits.size() != 2 ||
        std::from_chars(digits.data(), end, byte, 16).ptr != end)
      refuse(line);
  } else if (kind != 'n' && kind != '\\') {
    refuse(line);
  }
  text.remove_prefix(length);
  return static_cast<char>(byte);
}

std::string seed_in(const std::string& line) {
  if (line.size() < 2 || !line.starts_with('"') || !line.ends_with('"'))
    refuse(line);
  std::string_view text = line;
  text = text.substr(1, text.size() - 2);
  std::string seed;
  while (!text.empty()) {
    if (text.front() == '\\') {
      seed += take_escape(text, line);
    } else {
      seed += text.front();
      text.remove_prefix(1);
    }
  }
  return seed;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: %s FILE\n", argv[0]);
    return 2;
  }
  std::ifstream file(argv[1]);
  int seeds = 0;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with('#')) continue;
    // Before it is tried, so that the last line is the seed that broke it.
    std::printf("%s\n", line.c_str());
    std::fflush(stdout);
    const std::string seed = seed_in(line);
    LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(seed.data()),
                           seed.size());
    ++seeds;
  }
  if (seeds == 0) {
    std::fprintf(stderr, "%s: no seed in %s\n", argv[0], argv[1]);
    return 1;
  }
  std::printf("%d seeds\n", seeds);
  return 0;
}
