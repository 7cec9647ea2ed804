// SPDX-License-Identifier: BSD-2-Clause
#include "tests/device/device.h"

using namespace device;

namespace {

class DataProtection : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_system("2023c", "44l");
    point_links_at_system();
  }

  // The first calls of a boot, as the build for a platform with
  // data-protection classes makes them. Descriptors are numbered the same way
  // in every run. What the shell redirects stays so for the program.
  static std::vector<std::string> first_calls(
      std::size_t count, const std::string& redirections = "",
      const std::string& program = MARLIN_WITH_CLASSES) {
    const std::string trace = "/var/db/trace";
    const outcome booted =
        run({"/usr/bin/strace", "-qq", "-o", trace, "-e",
             "trace=open,openat,fcntl,fcntl64,close,access,faccessat", "-E",
             "ASAN_OPTIONS=detect_leaks=0", "/bin/sh", "-c",
             "exec " + program + " " + redirections});
    EXPECT_EQ(booted.exit_status, 0);
    EXPECT_EQ(booted.log, "");
    std::vector<std::string> calls = outcome{0, 0, file_at(trace)}.lines();
    wipe(trace);
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

TEST_F(DataProtection, AsksForClassDOnBothDirectoriesBeforeAllElse) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  EXPECT_THAT(
      first_calls(7),
      ElementsAre(
          HasSubstr("\"/var/db/timezone/\", O_RDONLY|O_CLOEXEC) = 3"),
          AllOf(StartsWith("fcntl(3, 0x40"), HasSubstr(", 0x4)")),
          StartsWith("close(3)"),
          HasSubstr("\"/var/db/timezone/tz/\", O_RDONLY|O_CLOEXEC) = 3"),
          AllOf(StartsWith("fcntl(3, 0x40"), HasSubstr(", 0x4)")),
          StartsWith("close(3)"), HasSubstr("\"/var/db/icutz\"")));
}

TEST_F(DataProtection, AsksForClassDOnADirectoryThatIsNamed) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  EXPECT_THAT(
      first_calls(3, downloads, CLASS_D),
      ElementsAre(HasSubstr("\"" + downloads + "\", O_RDONLY|O_CLOEXEC) = 3"),
                  AllOf(StartsWith("fcntl(3, 0x40"), HasSubstr(", 0x4)")),
                  StartsWith("close(3)")));
}

TEST_F(DataProtection, TakesDescriptorZeroForADescriptor) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  EXPECT_THAT(
      first_calls(3, "<&-"),
      ElementsAre(HasSubstr("\"/var/db/timezone/\", O_RDONLY|O_CLOEXEC) = 0"),
                  StartsWith("fcntl(0, 0x40"), StartsWith("close(0)")));
}

TEST_F(DataProtection, IsQuietlyLeftOutForADirectoryThatCannotBeOpened) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  const auto second_fails = [](const std::string& error) {
    return ElementsAre(
        HasSubstr("\"/var/db/timezone/\", O_RDONLY|O_CLOEXEC) = 3"),
        StartsWith("fcntl(3, 0x40"), StartsWith("close(3)"),
        HasSubstr("\"/var/db/timezone/tz/\", O_RDONLY|O_CLOEXEC) = -1 " +
                  error),
        HasSubstr("\"/var/db/icutz\""));
  };
  wipe(downloads);
  EXPECT_THAT(first_calls(5), second_fails("ENOENT"));
  EXPECT_EQ(link_at(downloads), nothing);
  make_file(downloads);
  EXPECT_THAT(first_calls(5), second_fails("ENOTDIR"));

  wipe(downloads);
  make_directory(downloads);
  set_mode(timezone_root, 0311);
  EXPECT_THAT(
      first_calls(5),
      ElementsAre(
          HasSubstr("\"/var/db/timezone/\", O_RDONLY|O_CLOEXEC) = -1 EACCES"),
          HasSubstr("\"/var/db/timezone/tz/\", O_RDONLY|O_CLOEXEC) = 3"),
          StartsWith("fcntl(3, 0x40"), StartsWith("close(3)"),
          HasSubstr("\"/var/db/icutz\"")));
}

TEST_F(DataProtection, CreatesNoDirectoryAndReportsNone) {
  wipe(timezone_root);
  const outcome booted = run({MARLIN_WITH_CLASSES});
  EXPECT_THAT(booted.lines().front(),
              StartsWith("marlin_with_classes: Bad zoneinfo link : "));
  EXPECT_EQ(link_at(timezone_root), nothing);
}

}  // namespace
