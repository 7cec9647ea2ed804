// SPDX-License-Identifier: BSD-2-Clause
#include "support/first_word.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string path = "/usr/share/file";

class FirstWord : public DeviceTest {
 protected:
  static std::string of(const std::string& content) {
    make_file(path, content);
    return read_first_word(path);
  }

  static int error_after_reading() {
    errno = EXDEV;
    EXPECT_EQ(read_first_word(path), "");
    return errno;
  }

  // What the standard library's formatted extraction makes of the file.
  static std::string by_stream() {
    std::ifstream file(path);
    std::string word;
    file >> word;
    return word;
  }
};

TEST_F(FirstWord, EndsAtWhiteSpaceOrAtTheEndOfTheFile) {
  EXPECT_EQ(of("2016a"), "2016a");
  EXPECT_EQ(of("2016a\n"), "2016a");
  EXPECT_EQ(of("2016a,x y"), "2016a,x");
  EXPECT_EQ(of("# 2016a"), "#");
  EXPECT_EQ(of("#2015z\n2016a"), "#2015z");
  EXPECT_EQ(of("\n  2016a more\n"), "2016a");
  EXPECT_EQ(of(""), "");
  EXPECT_EQ(of(" \t\n\v\f\r"), "");
}

TEST_F(FirstWord, IsWhatAStreamExtractsWhateverByteStandsInIt) {
  for (int byte = 0; byte < 256; ++byte) {
    const std::string pair(2, static_cast<char>(byte));
    for (const auto& content : {pair, pair + "a b", "a" + pair + "b"}) {
      of(content);
      EXPECT_EQ(read_first_word(path), by_stream()) << byte;
    }
  }
}

TEST_F(FirstWord, KeepsAByteOrderMark) {
  const std::string word =
      "\xEF\xBB\xBF"
      "2016a";
  EXPECT_EQ(of(word + " x"), word);
}

TEST_F(FirstWord, HasNoLimitOfLength) {
  for (const std::size_t size :
       {4094u, 4095u, 4096u, 4097u, 8191u, 8192u, 8193u, 1'000'000u}) {
    const std::string word(size, 'x');
    const std::string space(size, '\n');
    EXPECT_EQ(of(word), word) << size;
    EXPECT_EQ(of(" " + word + "\ny"), word) << size;
    EXPECT_EQ(of(space + "y z"), "y") << size;
    EXPECT_EQ(of(space + word), word) << size;
    EXPECT_EQ(of(space), "") << size;
  }
}

TEST_F(FirstWord, FollowsALinkAndNeedsNoPermissionToWrite) {
  make_file("/usr/share/real", "2016a", 0444);
  make_link(path, "real");
  EXPECT_EQ(read_first_word(path), "2016a");
}

TEST_F(FirstWord, OfAFileWithoutASizeIsRead) {
  EXPECT_EQ(read_first_word("/proc/sys/kernel/ostype"), "Linux");
}

TEST_F(FirstWord, OfAFifoOrADeviceIsEmptyAndTheErrorOfAnEarlierCallStays) {
  make_fifo("/usr/share/fifo");
  const int fifo = ::open("/usr/share/fifo", O_RDWR);
  ASSERT_EQ(::write(fifo, "2016a ", 6), 6);
  for (const char* special : {"fifo", "/dev/null", "/dev/zero", "/dev/full",
                              "/dev/random", "/dev/tty", "/dev/ptmx"}) {
    make_link(path, special);
    EXPECT_EQ(error_after_reading(), EXDEV) << special;
  }
  ::close(fifo);
}

TEST_F(FirstWord, IsQuietlyEmptyWithTheErrorOfAFileThatMayNotBeRead) {
  quietly([] {
    EXPECT_EQ(error_after_reading(), ENOENT);
    make_directory(path);
    EXPECT_EQ(error_after_reading(), EISDIR);
    make_socket(path);
    EXPECT_EQ(error_after_reading(), ENXIO);
    make_file(path, "2016a", 0);
    EXPECT_EQ(error_after_reading(), EACCES);
  });
}

TEST_F(FirstWord, LeavesTheErrorOfAnEarlierCall) {
  make_file(path, "2016a");
  errno = EXDEV;
  EXPECT_EQ(read_first_word(path), "2016a");
  EXPECT_EQ(errno, EXDEV);
}

}  // namespace
