// SPDX-License-Identifier: BSD-2-Clause
#include "support/fsutil.h"

#include <cerrno>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string path = "/var/db/timezone/something";

class Remove : public DeviceTest {};
class Exists : public DeviceTest {};
class ReadSymlink : public DeviceTest {};
class CreateSymlink : public DeviceTest {};

void remove_fails(const std::string& at, int error) {
  EXPECT_THAT(printed_before_throwing(error, [&] { fsutil::remove(at); }),
              lines(cannot_remove(at, error)));
}
void read_fails(const std::string& at, int error) {
  EXPECT_THAT(printed_before_throwing(error, [&] { fsutil::read_symlink(at); }),
              lines(cannot_read(at, error)));
}
void create_fails(const std::string& at, int error) {
  EXPECT_THAT(
      printed_before_throwing(error, [&] { fsutil::create_symlink("x", at); }),
      lines(cannot_link(at, "x", error)));
}

TEST_F(Remove, DeletesALinkAndNotWhatItNames) {
  make_file("/var/db/timezone/target");
  make_link(path, "/var/db/timezone/target");
  quietly([] { fsutil::remove(path); });
  EXPECT_EQ(link_at(path), nothing);
  EXPECT_EQ(file_at("/var/db/timezone/target"), "");
}

TEST_F(Remove, OfAMissingPathReportsFalseAndPrintsNothing) {
  EXPECT_FALSE(quietly([] {
    errno = 0;
    return fsutil::remove(path);
  }));
}

TEST_F(Remove, ReportsFalseAfterASuccessWhenErrnoWasStale) {
  for (const int stale : {0, EIO}) {
    make_file(path);
    errno = stale;
    EXPECT_EQ(fsutil::remove(path), stale == 0);
    EXPECT_EQ(link_at(path), nothing);
  }
}

TEST_F(Remove, OfADirectoryPrintsAndThrowsTheErrorNumber) {
  for (const char* directory : {path.c_str(), "/var/db/%s%n"}) {
    make_directory(directory);
    remove_fails(directory, EISDIR);
    EXPECT_EQ(link_at(directory), "(a directory)");
  }
}

TEST_F(Remove, WithoutPermissionPrintsAndThrowsTheErrorNumber) {
  make_file(path);
  set_mode(timezone_root, 0555);
  remove_fails(path, EACCES);
  EXPECT_EQ(file_at(path), "");
}

// Printing comes before the number is read: with no standard error to print to
// the number is the printing's own.
TEST_F(Remove, ThrowsTheNumberThatStandsAfterItsLineIsPrinted) {
  make_directory(path);
  printed_by([] {
    ::close(STDERR_FILENO);
    EXPECT_EQ(thrown_by([] { fsutil::remove(path); }), EBADF);
    EXPECT_EQ(thrown_by([] { fsutil::read_symlink(path); }), EBADF);
    EXPECT_EQ(thrown_by([] { fsutil::create_symlink("x", path); }), EBADF);
  });
}

TEST_F(Remove, ThatCannotReachThePathIsAFailureAndNotAMissingPath) {
  make_file(path);
  remove_fails(path + "/x", ENOTDIR);
  make_link(path, path);
  remove_fails(path + "/x", ELOOP);
  remove_fails("/var/db/" + std::string(256, 'x'), ENAMETOOLONG);
}

TEST_F(Exists, IsTrueForAFileThatNobodyMayReadADirectoryAndALinkToAFile) {
  make_file("/var/db/file", "", 0);
  make_link(path, "/var/db/file");
  EXPECT_TRUE(fsutil::exists("/var/db/file"));
  EXPECT_TRUE(fsutil::exists("/var/db"));
  EXPECT_TRUE(fsutil::exists(path));
}

TEST_F(Exists, IsQuietlyFalseForAMissingPathAndLeavesItsError) {
  quietly([] {
    errno = EXDEV;
    EXPECT_FALSE(fsutil::exists(path));
    EXPECT_EQ(errno, ENOENT);
  });
}

TEST_F(Exists, IsQuietlyFalseForADanglingLinkAndAPathThatCannotBeReached) {
  make_link(path, "/var/db/gone");
  EXPECT_FALSE(quietly([] { return fsutil::exists(path); }));
  make_link(path, path);
  EXPECT_FALSE(quietly([] { return fsutil::exists(path); }));
  make_file("/var/db/closed/file");
  set_mode("/var/db/closed", 0);
  EXPECT_FALSE(quietly([] { return fsutil::exists("/var/db/closed/file"); }));
}

TEST_F(ReadSymlink, ReturnsTheTargetAsItIsStored) {
  for (const std::string target : {"../%s//a/./b/", "\n", " x\r\n"}) {
    make_link(path, target);
    EXPECT_EQ(quietly([] { return fsutil::read_symlink(path); }), target);
  }
}

TEST_F(ReadSymlink, OfAMissingPathIsQuietlyEmpty) {
  EXPECT_EQ(quietly([] { return fsutil::read_symlink(path); }), "");
  EXPECT_EQ(fsutil::read_symlink("/var/db/gone/link"), "");
}

TEST_F(ReadSymlink, OfAFileOrADirectoryPrintsAndThrowsTheErrorNumber) {
  make_file(path);
  read_fails(path, EINVAL);
  make_directory(path);
  read_fails(path, EINVAL);
}

TEST_F(ReadSymlink, ThatCannotBeReachedIsAFailureAndNotAMissingPath) {
  make_directory("/var/db/shut");
  make_link("/var/db/shut/link", "x");
  set_mode("/var/db/shut", 0);
  read_fails("/var/db/shut/link", EACCES);
  make_file(path);
  read_fails(path + "/x", ENOTDIR);
  make_link(path, path);
  read_fails(path + "/x", ELOOP);
  const std::string endless = "/var/db/" + std::string(256, 'x');
  read_fails(endless, ENAMETOOLONG);
  EXPECT_FALSE(fsutil::exists(endless));
}

TEST_F(ReadSymlink, TakesATrailingSlashAsItIs) {
  make_link(path, "/var/db");
  read_fails(path + "/", EINVAL);
  remove_fails(path + "/", ENOTDIR);
  EXPECT_EQ(link_at(path), "/var/db");
}

TEST_F(ReadSymlink, CutsALongTargetToItsFirst1024Bytes) {
  for (const std::size_t size : {1023u, 1024u, 1025u, 1026u, 4095u}) {
    const std::string target =
        std::string(1023, 'a') + std::string(size - 1023, 'b');
    make_link(path, target);
    EXPECT_EQ(quietly([] { return fsutil::read_symlink(path); }),
              target.substr(0, 1024));
  }
}

TEST_F(CreateSymlink, StoresTheFirstTextInALinkAtTheSecondThoughItDangles) {
  const auto create = [] {
    return fsutil::create_symlink("some//text/", path);
  };
  EXPECT_EQ(quietly(create), 0);
  EXPECT_EQ(link_at(path), "some//text/");
}

TEST_F(CreateSymlink, TakesTextsUpToTheirFirstNulAsTheOtherCallsDo) {
  const std::string rest("\0x", 2);
  fsutil::create_symlink("/var/db" + rest, path + rest);
  EXPECT_EQ(link_at(path), "/var/db");
  EXPECT_EQ(fsutil::read_symlink(path + rest), "/var/db");
  EXPECT_TRUE(fsutil::exists(path + rest));
  fsutil::remove(path + rest);
  EXPECT_EQ(link_at(path), nothing);
}

TEST_F(CreateSymlink, NamesTheLinkFirstAndTheTargetSecondOnFailure) {
  make_link(path, "/var/db/other");
  EXPECT_THAT(
      printed_before_throwing(17, [] { fsutil::create_symlink("x", path); }),
      lines(failure("create_symlink: from " + path + " to x", EEXIST)));
  EXPECT_EQ(link_at(path), "/var/db/other");
}

TEST_F(CreateSymlink, WithoutADirectoryOrPermissionPrintsAndThrows) {
  create_fails("/var/db/no/link", ENOENT);
  set_mode(timezone_root, 0555);
  create_fails(path, EACCES);
}

}  // namespace
