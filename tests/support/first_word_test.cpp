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
  // Also expects what the standard library's formatted extraction makes of it.
  static std::string of(const std::string& content) {
    make_file(path, content);
    std::string word;
    std::ifstream(path) >> word;
    EXPECT_TRUE(read_first_word(path) == word)
        << content.size() << " bytes: " << content.substr(0, 20);
    return word;
  }

  static int error_after_reading() {
    errno = EXDEV;
    EXPECT_EQ(read_first_word(path), "");
    return errno;
  }
};

TEST_F(FirstWord, IsWhatAStreamExtractsWhateverByteStandsInIt) {
  EXPECT_EQ(of("\n  2016a,x y\n"), "2016a,x");
  EXPECT_EQ(of("#2015z\n2016a"), "#2015z");
  EXPECT_EQ(of("\xEF\xBB\xBF#"), "\xEF\xBB\xBF#");
  EXPECT_EQ(of(""), "");
  for (int byte = 0; byte < 256; ++byte) {
    const std::string pair(2, static_cast<char>(byte));
    for (const auto& content : {pair, pair + "a b", "a" + pair + "b"})
      of(content);
  }
}

TEST_F(FirstWord, HasNoLimitOfLength) {
  for (const std::size_t size :
       {4094u, 4095u, 4096u, 4097u, 8191u, 8192u, 8193u, 1'000'000u}) {
    const std::string word(size, 'x');
    const std::string space(size, '\n');
    for (const auto& content :
         {word, " " + word + "\ny", space + "y z", space + word, space})
      of(content);
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
