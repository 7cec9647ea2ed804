// SPDX-License-Identifier: BSD-2-Clause
//
// Starts every test program: outside of a private device it first moves itself
// into one, so that a test can be run straight from the build directory.
#include <errno.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

namespace {

bool only_lists_tests(int argc, char** argv) {
  for (int i = 1; i < argc; ++i) {
    if (std::string(argv[i]).starts_with("--gtest_list_tests")) return true;
  }
  return false;
}

[[noreturn]] void move_into_private_device(int argc, char** argv) {
  // Coverage counters and the logs of sanitizers go to the build directory.
  std::vector<std::string> words = {MARLIN_SOURCE_DIR "/scripts/private-device",
                                    "--writable", MARLIN_BINARY_DIR, "--"};
  if (*MARLIN_EMULATOR != '\0') words.emplace_back(MARLIN_EMULATOR);
  words.emplace_back(MARLIN_TEST_PROGRAM_DIR "/" +
                     std::string(program_invocation_short_name));
  words.insert(words.end(), argv + 1, argv + argc);
  std::vector<char*> arguments;
  for (auto& word : words) arguments.push_back(word.data());
  arguments.push_back(nullptr);
  ::execv(arguments[0], arguments.data());
  std::perror(arguments[0]);
  std::exit(1);
}

}  // namespace

int main(int argc, char** argv) {
  if (!only_lists_tests(argc, argv) &&
      std::getenv("MARLIN_PRIVATE_DEVICE") == nullptr)
    move_into_private_device(argc, argv);
  ::testing::InitGoogleMock(&argc, argv);
  // Lines begin with the program's name, whichever program calls the function.
  static char name[] = "marlin";
  program_invocation_short_name = name;
  return RUN_ALL_TESTS();
}
