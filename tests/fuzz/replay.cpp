// SPDX-License-Identifier: BSD-2-Clause
//
// Stands in for a fuzzing engine: gives every seed in a file to the target
// once, so that what was ever found stays found, with any compiler. The first
// lines of the file tell its format.
#include <fstream>

#include "tests/fuzz/property.h"

namespace {

std::string seed_in(const std::string& line) {
  std::string seed;
  for (std::size_t i = 1; i + 1 < line.size(); ++i) {
    if (line[i] == '\\') {
      seed += static_cast<char>(std::stoi(line.substr(i + 2, 2), nullptr, 16));
      i += 3;
    } else {
      seed += line[i];
    }
  }
  return seed;
}

}  // namespace

int main(int, char** argv) {
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
  std::printf("%d seeds\n", seeds);
  return seeds == 0;
}
