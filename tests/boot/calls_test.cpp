// SPDX-License-Identifier: BSD-2-Clause
//
// What a boot asks of the kernel.
#include <cerrno>

#include "tests/device/device.h"

using namespace device;
using ::testing::IsEmpty;
using ::testing::SizeIs;

namespace {

class Calls : public SoundDeviceTest {
 protected:
  void SetUp() override {
    if (emulated()) GTEST_SKIP() << "strace would show the emulator's calls";
    SoundDeviceTest::SetUp();
    install_and_announce("2024a.1.0", "44l");
  }

  // The lines of a boot's trace that open a version, the format or the record.
  static std::vector<std::string> opened_by_a_boot() {
    auto opened = trace({"-e", "trace=open,openat"}).calls;
    std::erase_if(opened, [](const std::string& line) {
      return !std::regex_search(line, std::regex("\\+VERSION|format|Record"));
    });
    return opened;
  }
};

class WholeListOfCalls : public Calls {
 protected:
#ifdef __SANITIZE_ADDRESS__
  void SetUp() override {
    GTEST_SKIP() << "a sanitizer makes calls of its own";
  }
#endif

  // A call with what it is about: two texts for a link, the path and the flags
  // of what is opened, otherwise the first argument. The C library's choice of
  // variants is undone, and calls for memory are left out.
  static std::string plain(std::string call) {
    for (const auto& [found, replaced] :
         {std::pair("^(brk|mmap|munmap|mprotect|madvise|mremap)\\(.*", ""),
          std::pair("AT_FDCWD, ", ""),
          std::pair("^(access|faccess|open|readlink|symlink|unlink)at2?", "$1"),
          std::pair("^(faccess)", "access"),
          std::pair("^(newfstatat|fstatat64|fstat|statx)", "stat"),
          std::pair("^(open|symlink)\\((.*?)\\) .*", "$1 $2\n"),
          std::pair("^(\\w+)\\(([^,)]*).*", "$1 $2\n")})
      call = std::regex_replace(call, std::regex(found), replaced);
    return call;
  }
};

// From main() on: no lock, no umask, no rename, no sync, no second fcntl,
// nothing on standard output, no look at the environment or the locale.
TEST_F(WholeListOfCalls, OfAMigrationAnActivationAndACorrection) {
  make_link(legacy_icutz, "/usr/share/icu");
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
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
  const std::string the_system =
      R"(stat "/usr/share/zoneinfo.default/+VERSION"
open "/usr/share/zoneinfo.default/+VERSION", O_RDONLY|O_CLOEXEC
read 3
close 3
stat "/usr/share/icu/icutzformat.txt"
open "/usr/share/icu/icutzformat.txt", O_RDONLY|O_CLOEXEC
read 3
close 3
)";
  EXPECT_EQ(calls, R"(rt_sigaction SIGPIPE
rt_sigaction SIGXFSZ
access "/var/db/icutz"
access "/var/db/timezone/icutz"
readlink "/var/db/icutz"
symlink "/usr/share/icu", "/var/db/timezone/icutz"
access "/var/db/icutz"
unlink "/var/db/icutz"
unlink "/var/db/icu"
)" + the_system + R"(readlink "/var/db/timezone/tz_latest"
readlink "/var/db/timezone/zoneinfo"
)" + the_system + R"(stat "/var/db/timezone/tz/2024a.1.0/zoneinfo/+VERSION"
open "/var/db/timezone/tz/2024a.1.0/zoneinfo/+VERSION", O_RDONLY|O_CLOEXEC
read 3
close 3
stat "/var/db/timezone/tz/2024a.1.0/icutz"
open ".", O_RDONLY
fchdir 3
open "/var/db/timezone/tz/2024a.1.0/icutz", O_RDONLY|O_NONBLOCK|O_CLOEXEC|O_DIRECTORY
stat 4
stat 4
fchdir 4
getdents64 4
stat "icutz44l.dat"
getdents64 4
close 4
fchdir 3
close 3
unlink "/var/db/timezone/zoneinfo"
symlink "/var/db/timezone/tz/2024a.1.0/zoneinfo", "/var/db/timezone/zoneinfo"
unlink "/var/db/timezone/icutz"
unlink "/var/db/icutz"
symlink "/var/db/timezone/tz/2024a.1.0/icutz", "/var/db/timezone/icutz"
stat "/var/db/timezone/TZVersionDiffRecord"
open "/var/db/timezone/TZVersionDiffRecord", O_WRONLY|O_CREAT|O_TRUNC|O_CLOEXEC, 0666
write 3
close 3
readlink "/var/db/timezone/localtime"
write 2
access "/var/db/timezone/zoneinfo/Europe/Paris"
unlink "/var/db/timezone/localtime"
symlink "/var/db/timezone/zoneinfo/Europe/Paris", "/var/db/timezone/localtime"
exit_group 0
)");
}

TEST_F(Calls, NeverOpenAFifoOrADevice) {
  make_fifo("/var/db/fifo");
  for (const char* device :
       {"/dev/null", "/dev/zero", "/dev/full", "/dev/tty", "/var/db/fifo"}) {
    SCOPED_TRACE(device);
    make_file(system_icu + "/icutzformat.txt", "44l");
    make_link(system_tree + "/+VERSION", device);
    make_link(update("2024a.1.0") + "/zoneinfo/+VERSION", device);
    make_link(record, device);
    point_links_at_system();
    // What is left is the format file, once for each of two data sets.
    EXPECT_THAT(opened_by_a_boot(), SizeIs(2));
    expect_links_at_update("2024a.1.0");
    make_link(system_icu + "/icutzformat.txt", device);
    EXPECT_THAT(opened_by_a_boot(), IsEmpty());
  }
}

// What was only said to be written is missing from the record.
TEST_F(Calls, OfAShortWriteGoOnBehindWhatWasTaken) {
  for (const auto& [taken, recorded] :
       {std::pair("1", "023c.1.0_2024a.1.0"), std::pair("0", "")}) {
    point_links_at_system();
    const std::string first = "inject=write:when=1:retval=";
    EXPECT_EQ(trace({"-P", record, "-e", first + taken}).log, "");
    EXPECT_EQ(file_at(record), recorded);
  }
}

}  // namespace
