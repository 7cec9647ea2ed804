// SPDX-License-Identifier: BSD-2-Clause
//
// Stands in for a fuzzing engine: gives every seed in a file to the target
// once, so that what was ever found stays found, with any compiler. The first
// lines of the file tell its format.
#include <fstream>

#include "tests/fuzz/property.h"

namespace {

[[noreturn]] void refuse(const std::string& line) {
  std::fprintf(stderr, "not a seed: %s\n", line.c_str());
  std::exit(2);
}

std::string seed_in(const std::string& line) {
  if (line.size() < 2 || !line.starts_with('"') || !line.ends_with('"'))
    refuse(line);
  std::string seed;
  for (std::size_t i = 1; i + 1 < line.size(); ++i) {
    const char kind = line[i] == '\\' ? line[++i] : '\0';
    if (kind == 'x') {
      seed += static_cast<char>(std::stoi(line.substr(i + 1, 2), nullptr, 16));
      i += 2;
    } else if (kind == 'n') {
      seed += '\n';
    } else if (kind == '\0' || kind == '\\') {
      seed += line[i];
    } else {
      refuse(line);
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
