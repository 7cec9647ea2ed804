// SPDX-License-Identifier: BSD-2-Clause
//
// Downloaded data is not trusted to be well formed, and a broken system
// partition must not stop a boot either.
#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include "tests/device/device.h"

using namespace device;

namespace {

class UntrustedData : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_system("2023c", "44l");
    install_update("2024a.1.0", "44l");
    point_links_at_system();
    announce("2024a.1.0");
  }

  // An update's own "+VERSION" decides nothing, whatever it holds.
  static void expect_activation() {
    const outcome booted = boot();
    EXPECT_EQ(booted.exit_status, 0);
    EXPECT_EQ(booted.log, "");
    EXPECT_EQ(link_at(zoneinfo), update("2024a.1.0") + "/zoneinfo");
  }

  const std::string version_file = update("2024a.1.0") + "/zoneinfo/+VERSION";
};

TEST_F(UntrustedData, OfAnyContentInAVersionFileIsHarmless) {
  for (const std::string& content :
       {std::string(), std::string(70'000, '\0'), std::string("%s%n%s\n"),
        std::string(1u << 20, '9'), std::string("\xff\xfe\x80")}) {
    point_links_at_system();
    make_file(version_file, content);
    expect_activation();
  }
}

TEST_F(UntrustedData, OfAnyKindInPlaceOfAVersionFileIsHarmless) {
  wipe(version_file);
  expect_activation();

  point_links_at_system();
  make_directory(version_file);
  expect_activation();

  point_links_at_system();
  wipe(version_file);
  make_fifo(version_file);
  expect_activation();

  point_links_at_system();
  make_link(version_file, "/dev/zero");
  expect_activation();

  point_links_at_system();
  make_link(version_file, version_file);
  expect_activation();
}

TEST_F(UntrustedData, OfAFifoInPlaceOfTheFormatFileCountsAsNone) {
  wipe(system_icu + "/icutzformat.txt");
  make_fifo(system_icu + "/icutzformat.txt");
  const outcome booted = boot();
  EXPECT_EQ(booted.exit_status, 0);
  EXPECT_THAT(booted.lines(),
              lines(failure("New update not compatible or older version: "
                            "2024a.1.0 vs. 2023c.1.0",
                            ENOENT)));
}

TEST_F(UntrustedData, OfAFifoInPlaceOfTheSystemsVersionCountsAsNone) {
  wipe(system_tree + "/+VERSION");
  make_fifo(system_tree + "/+VERSION");
  const auto first =
      failure("Cannot parse version string .1.0, results.size() = 0", ENOENT);
  const auto second = failure("Cannot parse version string .1.0", ENOENT);
  EXPECT_THAT(boot().lines(), lines(first, second, first, second));
  EXPECT_EQ(file_at(record), ".1.0_2024a.1.0");
}

TEST_F(UntrustedData, OfAFifoInPlaceOfTheRecordIsLeftAlone) {
  make_fifo(record);
  expect_activation();
  EXPECT_EQ(file_at(record), "(something else)");
}

// The lines of a boot's trace that open a version, the format or the record.
std::vector<std::string> opened_by_a_boot() {
  const std::string trace = "/var/db/trace";
  EXPECT_EQ(
      run({"/usr/bin/strace", "-qq", "-o", trace, "-e", "trace=open,openat",
           "-E", "ASAN_OPTIONS=detect_leaks=0", MARLIN_PROGRAM})
          .exit_status,
      0);
  std::vector<std::string> opened;
  for (const auto& line : outcome{0, 0, file_at(trace)}.lines()) {
    for (const char* name : {"+VERSION", "icutzformat", "TZVersionDiffRecord"})
      if (line.find(name) != std::string::npos) opened.push_back(line);
  }
  wipe(trace);
  return opened;
}

TEST_F(UntrustedData, IsOpenedPlainlyWhereItIsAFile) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  const auto opened = opened_by_a_boot();
  // Two data sets of the system, the update, the record.
  EXPECT_EQ(opened.size(), 6u);
  EXPECT_THAT(opened,
              ::testing::Each(::testing::AnyOf(
                  ::testing::HasSubstr(", O_RDONLY|O_CLOEXEC) = "),
                  ::testing::HasSubstr(
                      ", O_WRONLY|O_CREAT|O_TRUNC|O_CLOEXEC, 0666) = "))));
}

TEST_F(UntrustedData, IsNeverOpenedWhereItIsAFifoASocketOrADevice) {
  if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
  const auto put = [](const std::string& path, const char* device) {
    wipe(path);
    make_link(path, device);
  };
  make_fifo("/var/db/fifo");
  make_socket("/var/db/socket");
  for (const char* device : {"/dev/null", "/dev/zero", "/dev/full", "/dev/tty",
                             "/var/db/fifo", "/var/db/socket"}) {
    wipe(system_icu);
    make_file(system_icu + "/icutzformat.txt", "44l");
    put(system_tree + "/+VERSION", device);
    put(version_file, device);
    put(record, device);
    point_links_at_system();
    // What is left is the format file, once for each of two data sets.
    EXPECT_EQ(opened_by_a_boot().size(), 2u) << device;
    EXPECT_EQ(link_at(zoneinfo), update("2024a.1.0") + "/zoneinfo") << device;
    put(system_icu + "/icutzformat.txt", device);
    EXPECT_THAT(opened_by_a_boot(), ::testing::IsEmpty()) << device;
  }
}

TEST_F(UntrustedData, OfA64MebibyteVersionOfTheSystemIsReadWhole) {
  const std::string word(64u << 20, '7');
  make_file(system_tree + "/+VERSION", word);
  wipe(tz_latest);
  const outcome booted = boot();
  EXPECT_EQ(booted.exit_status, 0);
  // Two lines for the system's data set and two for the current one.
  const std::string first =
      "marlin: Cannot parse version string " + word + ".1.0, results.size()";
  EXPECT_EQ(booted.log.compare(0, first.size(), first), 0);
  EXPECT_EQ(booted.lines().size(), 4u);
}

TEST_F(UntrustedData, OfA64MebibyteVersionIsRecordedWhole) {
  const std::string word(64u << 20, 'x');
  make_file(system_tree + "/+VERSION", word);
  EXPECT_EQ(boot().exit_status, 0);
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
  EXPECT_EQ(link_at(zoneinfo), update("2024a.1.0") + "/zoneinfo");
  wipe(version_file);
}

TEST_F(UntrustedData, OfLinkTargetsBeyondTheLimitIsCutAndRejected) {
  for (const std::size_t size : {1023u, 1024u, 1025u, 4095u}) {
    const std::string target = "/" + std::string(size - 1, 'x');
    point_zoneinfo_at(target);
    wipe(tz_latest);
    EXPECT_THAT(
        boot().lines(),
        lines(failure("Bad zoneinfo link " + target.substr(0, 1024), ENOENT),
              failure("Invalid current symlinks; resetting to system partition",
                      ENOENT)));
    EXPECT_EQ(link_at(zoneinfo), system_tree);
  }
}

TEST_F(UntrustedData, OfAnUpdateNameOf255BytesIsOneVersion) {
  const std::string name = "2024" + std::string(251, 'z');
  install_update(name, "44l");
  announce(name);
  EXPECT_EQ(boot().exit_status, 0);
  EXPECT_EQ(link_at(zoneinfo), update(name) + "/zoneinfo");
  EXPECT_EQ(file_at(record), "2023c.1.0_" + name);
}

TEST_F(UntrustedData, OfNamesWithNewlinesAndPercentSignsIsPrintedAsItIs) {
  const std::string name = "2024a\n%s%n";
  install_update(name, "44l");
  announce(name);
  EXPECT_THAT(boot().log,
              ::testing::HasSubstr(
                  "marlin: Cannot parse version string 2024a\n%s%n: "));
  EXPECT_EQ(link_at(zoneinfo), system_tree);
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
