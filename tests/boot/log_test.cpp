// SPDX-License-Identifier: BSD-2-Clause
//
// A log that is gone, full or torn must not change what a boot does.
#include <fcntl.h>
#include <unistd.h>

#include "tests/device/device.h"

using namespace device;

namespace {

// Boots a device on which everything is wrong, so that much is printed, and an
// update is activated and recorded all the same.
class Log : public DeviceTest {
 protected:
  static void expect_the_boot_of_a_damaged_device(
      const std::function<void()>& in_the_child,
      const std::string& recorded = "2023c.1.0_2024a.1.0") {
    install_system("2023c", "44l");
    install_and_announce("2024a.1.0", "44l");
    point_zoneinfo_at("nonsense");
    make_file(local_time, "not a link");

    const outcome booted = run({MARLIN_PROGRAM}, in_the_child);
    EXPECT_EQ(booted.exit_status, 0);
    EXPECT_EQ(booted.log, "");
    expect_links_at_update("2024a.1.0");
    EXPECT_EQ(link_at(local_time), default_localtime);
    EXPECT_EQ(file_at(record), recorded);
    EXPECT_EQ(file_at(system_tree + "/+VERSION"), "2023c\n");
    EXPECT_EQ(file_at(system_icu + "/icutzformat.txt"), "44l\n");
  }
};

TEST_F(Log, MayBeClosed) {
  expect_the_boot_of_a_damaged_device([] { ::close(STDERR_FILENO); });
}

TEST_F(Log, MayBeFull) {
  expect_the_boot_of_a_damaged_device(
      [] { ::dup2(::open("/dev/full", O_WRONLY), STDERR_FILENO); });
}

TEST_F(Log, MayBeAPipeThatNobodyReads) {
  expect_the_boot_of_a_damaged_device(leave_the_log_unread);
}

// The record is lost with the log.
TEST_F(Log, MayBeAFileThatMayNotGrow) {
  expect_the_boot_of_a_damaged_device(forbid_files_to_grow, "");
}

TEST_F(Log, NeverLandsInAFileOfTheDeviceWhenNoDescriptorIsOpen) {
  expect_the_boot_of_a_damaged_device([] {
    for (int descriptor = 0; descriptor <= 2; ++descriptor) ::close(descriptor);
  });
}

TEST_F(Log, GetsEveryLineInOneWrite) {
  install_system("2023c", "44l");
  int ends[2];
  // Every write to a packet pipe is read as one.
  ASSERT_EQ(::pipe2(ends, O_DIRECT), 0);
  run({MARLIN_PROGRAM}, [&] { ::dup2(ends[1], STDERR_FILENO); });
  ::close(ends[1]);
  std::vector<std::string> writes;
  char bytes[4096];
  for (ssize_t count; (count = ::read(ends[0], bytes, sizeof bytes)) > 0;)
    writes.emplace_back(bytes, static_cast<std::size_t>(count));
  ::close(ends[0]);

  const auto one_line = ::testing::MatchesRegex("marlin: [^\n]*\n");
  EXPECT_THAT(writes, ::testing::ElementsAre(one_line, one_line, one_line));
}

}  // namespace
