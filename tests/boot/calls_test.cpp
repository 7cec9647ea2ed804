// SPDX-License-Identifier: BSD-2-Clause
//
// Every call of a boot, in order: no lock, no umask, no rename, no sync, no
// second fcntl, nothing on standard output, no look at the environment or the
// locale.
#include "tests/device/device.h"

using namespace device;

namespace {

class Calls : public SoundDeviceTest {
 protected:
  void SetUp() override {
    if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
    SoundDeviceTest::SetUp();
  }
};

using ::testing::Contains;
using ::testing::EndsWith;

class WholeListOfCalls : public Calls {
 protected:
#ifdef __SANITIZE_ADDRESS__
  void SetUp() override {
    GTEST_SKIP() << "a sanitizer makes calls of its own";
  }
#endif

  // A line for every call from main() on, except those for memory, the C
  // library's choice of variants undone: "call path", or "call number" where
  // the first argument is a descriptor.
  static std::string of_a_boot() {
    const auto booted = trace({}, {MARLIN_PROGRAM}, [] {
      ::setenv("LC_ALL", "de_DE.UTF-8", 1);
      ::setenv("TZ", "Europe/Paris", 1);
    });
    std::string calls;
    for (const auto& line : booted.calls) {
      if (line.find("SIGPIPE, {sa_handler=SIG_IGN") != std::string::npos)
        calls.clear();
      calls += plain(line);
    }
    return calls;
  }

  static std::string reads(const std::string& path) {
    return "stat " + path + "\nopen " + path + "\nread 3\nclose 3\n";
  }
  const std::string reads_the_system =
      reads("/usr/share/zoneinfo.default/+VERSION") +
      reads("/usr/share/icu/icutzformat.txt");
  const std::string reads_an_update =
      reads("/var/db/timezone/tz/2024a.1.0/zoneinfo/+VERSION") +
      "stat /var/db/timezone/tz/2024a.1.0/icutz\n"
      "open .\n"
      "fchdir 3\n"
      "open /var/db/timezone/tz/2024a.1.0/icutz\n"
      "stat 4\n"
      "stat 4\n"
      "fchdir 4\n"
      "getdents64 4\n"
      "stat icutz44l.dat\n"
      "getdents64 4\n"
      "close 4\n"
      "fchdir 3\n"
      "close 3\n";
  const std::string reads_the_links = "unlink /var/db/icu\n" +
                                      reads_the_system +
                                      "readlink /var/db/timezone/tz_latest\n"
                                      "readlink /var/db/timezone/zoneinfo\n";
  const std::string start =
      "rt_sigaction\n"
      "rt_sigaction\n"
      "access /var/db/icutz\n"
      "access /var/db/icutz\n" +
      reads_the_links;
  const std::string relinks_zoneinfo =
      "unlink /var/db/timezone/zoneinfo\n"
      "symlink /var/db/timezone/zoneinfo\n"
      "unlink /var/db/timezone/icutz\n"
      "unlink /var/db/icutz\n";
  const std::string end =
      "readlink /var/db/timezone/localtime\n"
      "exit_group 0\n";

 private:
  static std::string plain(const std::string& line) {
    std::string call = line.substr(0, line.find('('));
    for (const char* memory :
         {"brk", "mmap", "munmap", "mprotect", "madvise", "mremap"})
      if (call == memory) return {};
    if (call == "rt_sigaction") return call + "\n";
    if (call.ends_with("stat") || call == "newfstatat" || call == "statx")
      call = "stat";
    else if (call.ends_with("at"))
      call.resize(call.size() - 2);
    const std::string arguments = line.substr(line.find('(') + 1);
    auto begin = arguments.find('"');
    if (begin == std::string::npos || arguments.starts_with("4, \"\"") ||
        call == "read" || call == "write")
      return call + " " + arguments.substr(0, arguments.find_first_of(",)")) +
             "\n";
    if (call == "symlink")  // the target comes first
      begin = arguments.rfind('"', arguments.rfind('"') - 1);
    return call + " " +
           arguments.substr(begin + 1,
                            arguments.find('"', begin + 1) - begin - 1) +
           "\n";
  }
};

TEST_F(WholeListOfCalls, OfABootWithNothingToDo) {
  EXPECT_EQ(of_a_boot(), start + reads_the_system + end);
}

// The legacy link is tested anew before it is removed.
TEST_F(WholeListOfCalls, OfAMigration) {
  make_link(legacy_icutz, "/usr/share/icu");
  EXPECT_EQ(of_a_boot(),
            "rt_sigaction\n"
            "rt_sigaction\n"
            "access /var/db/icutz\n"
            "access /var/db/timezone/icutz\n"
            "readlink /var/db/icutz\n"
            "symlink /var/db/timezone/icutz\n"
            "access /var/db/icutz\n"
            "unlink /var/db/icutz\n" +
                reads_the_links + reads_the_system + end);
}

TEST_F(WholeListOfCalls, OfABootWithAnUpdateInUse) {
  install_and_use("2024a.1.0", "44l");
  EXPECT_EQ(of_a_boot(), start + reads_an_update + end);
}

TEST_F(WholeListOfCalls, OfAnActivation) {
  install_and_announce("2024a.1.0", "44l");
  EXPECT_EQ(of_a_boot(), start + reads_the_system + reads_an_update +
                             relinks_zoneinfo +
                             "symlink /var/db/timezone/icutz\n"
                             "stat /var/db/timezone/TZVersionDiffRecord\n"
                             "open /var/db/timezone/TZVersionDiffRecord\n"
                             "write 3\n"
                             "close 3\n" +
                             end);
}

TEST_F(WholeListOfCalls, OfAReset) {
  install_and_use("2024a.1.0", "44l");
  install_system("2025a", "44l");
  EXPECT_EQ(of_a_boot(), start + reads_an_update + "write 2\n" +
                             reads_the_system + relinks_zoneinfo + end);
}

TEST_F(WholeListOfCalls, OfACorrectionOfTheLocalTime) {
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  EXPECT_EQ(of_a_boot(), start + reads_the_system +
                             "readlink /var/db/timezone/localtime\n"
                             "write 2\n"
                             "access /var/db/timezone/zoneinfo/Europe/Paris\n"
                             "unlink /var/db/timezone/localtime\n"
                             "symlink /var/db/timezone/localtime\n"
                             "exit_group 0\n");
}

// Where stat(2) fails open(2) has to tell.
TEST_F(Calls, ThatCannotTellAFileFromADeviceOpenIt) {
  install_and_announce("2024a.1.0", "44l");
  const auto booted =
      trace({"-P", record, "-P", system_tree + "/+VERSION", "-e",
             "inject=?fstat,?fstat64,?newfstatat,?fstatat64,?statx:error=EIO"});
  EXPECT_EQ(booted.log, "");
  EXPECT_EQ(file_at(record), "2023c.1.0_2024a.1.0");
  // The system's word is read twice: it is also the current one.
  EXPECT_THAT(booted.calls, Contains(EndsWith("(INJECTED)")).Times(3));
}

// What was only said to be written is missing from the record.
TEST_F(Calls, OfAShortWriteGoOnBehindWhatWasTaken) {
  install_and_announce("2024a.1.0", "44l");
  const auto boot_with_first_write_taking = [](const std::string& bytes) {
    point_links_at_system();
    EXPECT_EQ(
        trace({"-P", record, "-e", "inject=write:retval=" + bytes + ":when=1"})
            .log,
        "");
  };
  boot_with_first_write_taking("1");
  EXPECT_EQ(file_at(record), "023c.1.0_2024a.1.0");
  boot_with_first_write_taking("0");
  EXPECT_EQ(file_at(record), "");
}

}  // namespace
