// SPDX-License-Identifier: BSD-2-Clause
//
// Downloaded data is not trusted to be well formed, and a broken system
// partition must not stop a boot either.
#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include "tests/device/device.h"

using namespace device;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

namespace {

class UntrustedData : public SoundDeviceTest {
 protected:
  void SetUp() override {
    SoundDeviceTest::SetUp();
    install_and_announce("2024a.1.0", "44l");
  }

  // An update's own "+VERSION" decides nothing, whatever it holds.
  static void expect_activation() {
    point_links_at_system();
    boot_prints(no_lines());
    expect_links_at_update("2024a.1.0");
  }

  const std::string version_file = update("2024a.1.0") + "/zoneinfo/+VERSION";
};

TEST_F(UntrustedData, OfAnyContentInAVersionFileIsHarmless) {
  for (const std::string& content :
       {std::string(), std::string(70'000, '\0'), std::string("%s%n%s\n"),
        std::string(1u << 20, '9'), std::string("\xff\xfe\x80")}) {
    make_file(version_file, content);
    expect_activation();
  }
}

TEST_F(UntrustedData, OfAnyKindInPlaceOfAVersionFileIsHarmless) {
  wipe(version_file);
  expect_activation();
  make_directory(version_file);
  expect_activation();
  make_fifo(version_file);
  expect_activation();
  make_link(version_file, "/dev/zero");
  expect_activation();
  make_link(version_file, version_file);
  expect_activation();
}

TEST_F(UntrustedData, OfAFifoInPlaceOfAFileOfTheSystemOrTheRecordCountsAsNone) {
  const auto none = unparsed(".1.0");
  make_fifo(system_tree + "/+VERSION");
  boot_prints(lines(none, none));
  EXPECT_EQ(file_at(record), ".1.0_2024a.1.0");

  make_fifo(record);
  point_links_at_system();
  boot_prints(lines(none, none));
  expect_links_at_update("2024a.1.0");
  EXPECT_EQ(file_at(record), "(something else)");

  make_fifo(system_icu + "/icutzformat.txt");
  point_links_at_system();
  boot_prints(lines(none, none, refused("2024a.1.0", ".1.0")));
}

// The lines of a boot's trace that open a version, the format or the record.
std::vector<std::string> opened_by_a_boot() {
  std::vector<std::string> opened;
  for (const auto& line : trace({"-e", "trace=open,openat"}).calls) {
    for (const char* name : {"+VERSION", "icutzformat", "TZVersionDiffRecord"})
      if (line.find(name) != std::string::npos) opened.push_back(line);
  }
  return opened;
}

TEST_F(UntrustedData, IsOpenedPlainlyWhereItIsAFile) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  const auto read = HasSubstr(", O_RDONLY|O_CLOEXEC) = ");
  const auto written =
      HasSubstr(", O_WRONLY|O_CREAT|O_TRUNC|O_CLOEXEC, 0666) = ");
  // Two data sets of the system, the update, the record.
  EXPECT_THAT(opened_by_a_boot(),
              ElementsAre(read, read, read, read, read, written));
}

TEST_F(UntrustedData, IsNeverOpenedWhereItIsAFifoASocketOrADevice) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  make_fifo("/var/db/fifo");
  make_socket("/var/db/socket");
  for (const char* device : {"/dev/null", "/dev/zero", "/dev/full", "/dev/tty",
                             "/var/db/fifo", "/var/db/socket"}) {
    SCOPED_TRACE(device);
    make_file(system_icu + "/icutzformat.txt", "44l");
    make_link(system_tree + "/+VERSION", device);
    make_link(version_file, device);
    make_link(record, device);
    point_links_at_system();
    // What is left is the format file, once for each of two data sets.
    EXPECT_THAT(opened_by_a_boot(), SizeIs(2));
    expect_links_at_update("2024a.1.0");
    make_link(system_icu + "/icutzformat.txt", device);
    EXPECT_THAT(opened_by_a_boot(), IsEmpty());
  }
}

TEST_F(UntrustedData, OfA64MebibyteVersionOfTheSystemIsReadWhole) {
  const std::string word(64u << 20, '7');
  make_file(system_tree + "/+VERSION", word);
  const outcome booted = boot();
  EXPECT_EQ(booted.exit_status, 0);
  // Two lines for the system's data set and two for the current one. Not by a
  // matcher, which would print them.
  EXPECT_EQ(booted.lines().size(), 4u);
  EXPECT_TRUE(booted.log.starts_with("marlin: Cannot parse version string " +
                                     word + ".1.0, results.size()"));
  EXPECT_TRUE(file_at(record) == word + ".1.0_2024a.1.0");
}

TEST_F(UntrustedData, OfAVersionThatDoesNotFitIntoMemoryIsHarmless) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizer needs more memory than this test allows";
#endif
  if (emulated()) GTEST_SKIP() << "the limit would be the emulator's";
  // A sparse file, so that only the reading process meets the size.
  make_file(version_file, "x");
  ASSERT_EQ(::truncate(version_file.c_str(), 1l << 40), 0);
  const outcome booted = run({MARLIN_PROGRAM}, [] {
    const rlimit limit{256u << 20, 256u << 20};
    ::setrlimit(RLIMIT_AS, &limit);
  });
  EXPECT_EQ(booted.exit_status, 0);
  EXPECT_EQ(booted.log, "");
  expect_links_at_update("2024a.1.0");
  wipe(version_file);
}

TEST_F(UntrustedData, OfLinkTargetsBeyondTheLimitIsCutAndRejected) {
  wipe(tz_latest);
  for (const std::size_t size : {1023u, 1024u, 1025u, 4095u}) {
    const std::string target = "/" + std::string(size - 1, 'x');
    point_zoneinfo_at(target);
    boot_prints(
        lines(bad_zoneinfo_link(target.substr(0, 1024)), invalid_links()));
    expect_links_at_system();
  }
}

TEST_F(UntrustedData, OfAnUpdateNameOf255BytesIsOneVersion) {
  const std::string name = "2024" + std::string(251, 'z');
  install_and_announce(name, "44l");
  boot_prints(no_lines());
  expect_links_at_update(name);
  EXPECT_EQ(file_at(record), "2023c.1.0_" + name);
}

TEST_F(UntrustedData, OfNamesWithNewlinesAndPercentSignsIsPrintedAsItIs) {
  const std::string name = "2024a\n%s%n";
  install_and_announce(name, "44l");
  EXPECT_THAT(boot().log,
              HasSubstr("marlin: Cannot parse version string 2024a\n%s%n: "));
  expect_links_at_system();
}

TEST_F(UntrustedData, OfATreeDeeperThanAWalkCanGoIsNotWalked) {
  // Deeper than the longest path that fts(3) can count, 65535 bytes.
  const std::string icu = update("2024a.1.0") + "/icutz";
  ASSERT_EQ(run({"/usr/bin/sh", "-c",
                 "cd " + icu +
                     " && n=$(printf %0200d 0); for i in $(seq 400); do mkdir "
                     "$n && cd -P $n || exit 1; done"})
                .exit_status,
            0);
  expect_activation();
  EXPECT_EQ(run({"/usr/bin/rm", "-r", icu}).exit_status, 0);
}

}  // namespace
