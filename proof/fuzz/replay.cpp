// SPDX-License-Identifier: BSD-2-Clause
//
// Stands in for a fuzzing engine: gives every seed in a directory to the target
// once, so that what was ever found stays found, with any compiler.
#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "proof/fuzz/property.h"

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: %s DIRECTORY\n", argv[0]);
    return 2;
  }
  std::vector<std::filesystem::path> seeds;
  for (const auto& entry : std::filesystem::directory_iterator(argv[1]))
    seeds.push_back(entry.path());
  std::sort(seeds.begin(), seeds.end());
  for (const auto& seed : seeds) {
    std::ifstream file(seed, std::ios::binary);
    const std::vector<char> bytes{std::istreambuf_iterator<char>(file), {}};
    std::printf("%s\n", seed.c_str());
    std::fflush(stdout);
    LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(bytes.data()),
                           bytes.size());
  }
  if (seeds.empty()) {
    std::fprintf(stderr, "%s: no seed in %s\n", argv[0], argv[1]);
    return 1;
  }
  return 0;
}
