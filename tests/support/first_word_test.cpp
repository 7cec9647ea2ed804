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

  static std::string read_quietly() {
    return quietly([] { return read_first_word(path); });
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
}

TEST_F(FirstWord, KnowsSixKindsOfWhiteSpaceAndNoOther) {
  for (const char byte : std::string(" \t\n\v\f\r")) {
    EXPECT_EQ(of(std::string(2, byte) + "a" + byte + "b"), "a");
  }
  for (int byte = 0; byte < 256; ++byte) {
    const auto in_between = static_cast<char>(byte);
    of(std::string("a") + in_between + "b");
    EXPECT_EQ(read_first_word(path), by_stream()) << byte;
  }
}

TEST_F(FirstWord, IsEmptyWhenTheFileHasNone) {
  EXPECT_EQ(of(""), "");
  EXPECT_EQ(of(" \t\n\v\f\r"), "");
  EXPECT_EQ(of(std::string(100'000, ' ')), "");
}

TEST_F(FirstWord, KeepsAByteOrderMarkAnEndOfTextAndNulBytes) {
  for (const std::string& word :
       {std::string("\xEF\xBB\xBF"
                    "2016a"),
        std::string("2016a\x1a"), std::string("20\0a", 4),
        std::string(1, '\0')}) {
    EXPECT_EQ(of(word), word);
    EXPECT_EQ(of(word + " x"), word);
  }
}

TEST_F(FirstWord, HasNoLimitOfLength) {
  for (const std::size_t size :
       {4094u, 4095u, 4096u, 4097u, 8191u, 8192u, 8193u, 1'000'000u}) {
    const std::string word(size, 'x');
    EXPECT_EQ(of(word), word) << size;
    EXPECT_EQ(of(word + " y"), word) << size;
    EXPECT_EQ(of(" " + word + "\ny"), word) << size;
    EXPECT_EQ(of(std::string(size, '\n') + "y z"), "y") << size;
    EXPECT_EQ(of(std::string(size, '\n') + word), word) << size;
  }
}

TEST_F(FirstWord, IsQuietlyEmptyWithoutAFileThatMayBeRead) {
  EXPECT_EQ(read_quietly(), "");
  make_directory(path);
  EXPECT_EQ(read_quietly(), "");
  make_file(path, "2016a", 0);
  EXPECT_EQ(read_quietly(), "");
}

TEST_F(FirstWord, FollowsALinkAndNeedsNoPermissionToWrite) {
  make_file("/usr/share/real", "2016a", 0444);
  make_link(path, "real");
  EXPECT_EQ(read_first_word(path), "2016a");
}

TEST_F(FirstWord, OfAFileWithoutASizeIsRead) {
  EXPECT_EQ(read_first_word("/proc/sys/kernel/ostype"), "Linux");
}

TEST_F(FirstWord, OfAFifoASocketOrADeviceIsEmpty) {
  make_fifo("/usr/share/fifo");
  const int fifo = ::open("/usr/share/fifo", O_RDWR);
  ASSERT_EQ(::write(fifo, "2016a ", 6), 6);
  make_socket("/usr/share/socket");
  for (const char* special :
       {"fifo", "socket", "/dev/null", "/dev/zero", "/dev/full", "/dev/random",
        "/dev/urandom", "/dev/tty", "/dev/ptmx"}) {
    make_link(path, special);
    EXPECT_EQ(read_first_word(path), "") << special;
  }
  ::close(fifo);
}

TEST_F(FirstWord, LeavesTheErrorOfOpeningTheFileOrOfAnEarlierCall) {
  const auto left_by_reading = [&] {
    errno = EXDEV;
    read_first_word(path);
    return errno;
  };
  EXPECT_EQ(left_by_reading(), ENOENT);
  make_file(path, "2016a");
  EXPECT_EQ(left_by_reading(), EXDEV);
  set_mode(path, 0);
  EXPECT_EQ(left_by_reading(), EACCES);
  make_socket(path);
  EXPECT_EQ(left_by_reading(), ENXIO);
  make_directory(path);
  EXPECT_EQ(left_by_reading(), EISDIR);
  make_fifo(path);
  EXPECT_EQ(left_by_reading(), EXDEV);
}

}  // namespace
