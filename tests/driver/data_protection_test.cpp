// SPDX-License-Identifier: BSD-2-Clause
#include "tests/device/device.h"

using namespace device;

namespace {

class DataProtection : public SoundDeviceTest {
 protected:
  void SetUp() override {
    if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
    SoundDeviceTest::SetUp();
  }

  // The first calls of a boot, as the build for a platform with
  // data-protection classes makes them. Descriptors are numbered the same way
  // in every run. What the shell redirects stays so for the program.
  static std::vector<std::string> first_calls(
      std::size_t count, const std::string& redirections = "",
      const std::string& program = MARLIN_WITH_CLASSES) {
    const auto booted =
        trace({"-e", "trace=open,openat,fcntl,fcntl64,close,access,faccessat"},
              {"/bin/sh", "-c", "exec " + program + " " + redirections});
    EXPECT_EQ(booted.log, "");
    std::vector<std::string> calls = booted.calls;
    while (!calls.empty() &&
           calls.front().find("/var/db/timezone/") == std::string::npos)
      calls.erase(calls.begin());
    if (calls.size() > count) calls.resize(count);
    return calls;
  }
};

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::StartsWith;

// The result is a descriptor, or "-1" and the name of an error.
auto opens(const std::string& directory, const std::string& result) {
  return HasSubstr('"' + directory + "\", O_RDONLY|O_CLOEXEC) = " + result);
}
auto asks_for_class_d(const std::string& descriptor) {
  return AllOf(StartsWith("fcntl(" + descriptor + ", 0x40"),
               HasSubstr(", 0x4)"));
}
auto closes(const std::string& descriptor) {
  return StartsWith("close(" + descriptor + ")");
}
const std::string first = "/var/db/timezone/";
const std::string second = "/var/db/timezone/tz/";
const auto looks_at_the_legacy_link = HasSubstr("\"/var/db/icutz\"");

TEST_F(DataProtection, AsksForClassDOnBothDirectoriesBeforeAllElse) {
  EXPECT_THAT(first_calls(7),
              ElementsAre(opens(first, "3"), asks_for_class_d("3"), closes("3"),
                          opens(second, "3"), asks_for_class_d("3"),
                          closes("3"), looks_at_the_legacy_link));
}

TEST_F(DataProtection, AsksForClassDOnWhateverIsNamed) {
  make_link("/var/db/timezone/link", downloads);
  make_file("/var/db/timezone/file");
  for (const char* name : {"tz", "link", "file"}) {
    const std::string path = first + name;
    EXPECT_THAT(
        first_calls(3, path, CLASS_D),
        ElementsAre(opens(path, "3"), asks_for_class_d("3"), closes("3")));
  }
}

TEST_F(DataProtection, TakesDescriptorZeroForADescriptor) {
  EXPECT_THAT(
      first_calls(3, "<&-"),
      ElementsAre(opens(first, "0"), asks_for_class_d("0"), closes("0")));
}

TEST_F(DataProtection, IsQuietlyLeftOutForADirectoryThatCannotBeOpened) {
  const auto second_fails = [](const std::string& error) {
    return ElementsAre(opens(first, "3"), asks_for_class_d("3"), closes("3"),
                       opens(second, "-1 " + error), looks_at_the_legacy_link);
  };
  wipe(downloads);
  EXPECT_THAT(first_calls(5), second_fails("ENOENT"));
  EXPECT_EQ(link_at(downloads), nothing);
  make_file(downloads);
  EXPECT_THAT(first_calls(5), second_fails("ENOTDIR"));

  make_directory(downloads);
  set_mode(timezone_root, 0311);
  EXPECT_THAT(first_calls(5),
              ElementsAre(opens(first, "-1 EACCES"), opens(second, "3"),
                          asks_for_class_d("3"), closes("3"),
                          looks_at_the_legacy_link));
}

TEST_F(DataProtection, CreatesNoDirectoryAndReportsNone) {
  wipe(timezone_root);
  const outcome booted = run({MARLIN_WITH_CLASSES});
  EXPECT_THAT(booted.lines().front(),
              StartsWith("marlin_with_classes: Bad zoneinfo link : "));
  EXPECT_EQ(link_at(timezone_root), nothing);
}

}  // namespace
