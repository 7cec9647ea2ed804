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

TEST_F(Remove, DeletesALinkAndNotWhatItNames) {
  make_file("/var/db/timezone/target");
  make_link(path, "/var/db/timezone/target");
  EXPECT_THAT(printed_by([] { fsutil::remove(path); }), no_lines());
  EXPECT_EQ(link_at(path), nothing);
  EXPECT_EQ(file_at("/var/db/timezone/target"), "");
}

TEST_F(Remove, OfAMissingPathReportsFalseAndPrintsNothing) {
  bool result = true;
  EXPECT_THAT(printed_by([&] {
                errno = 0;
                result = fsutil::remove(path);
              }),
              no_lines());
  EXPECT_FALSE(result);
}

TEST_F(Remove, ReportsTrueAfterASuccessWhenErrnoWasZero) {
  make_file(path);
  errno = 0;
  EXPECT_TRUE(fsutil::remove(path));
}

TEST_F(Remove, ReportsFalseAfterASuccessWhenErrnoWasStale) {
  make_file(path);
  errno = EIO;
  EXPECT_FALSE(fsutil::remove(path));
  EXPECT_EQ(link_at(path), nothing);
}

TEST_F(Remove, OfADirectoryPrintsAndThrowsTheErrorNumber) {
  make_directory(path);
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(thrown_by([] { fsutil::remove(path); }), EISDIR);
              }),
              lines(failure("remove: could not remove " + path, EISDIR)));
  EXPECT_EQ(link_at(path), "(a directory)");
}

TEST_F(Remove, WithoutPermissionPrintsAndThrowsTheErrorNumber) {
  make_file(path);
  set_mode(timezone_root, 0555);
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(thrown_by([] { fsutil::remove(path); }), EACCES);
              }),
              lines(failure("remove: could not remove " + path, EACCES)));
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

TEST_F(Remove, BelowAFileIsAFailureAndNotAMissingPath) {
  make_file(path);
  EXPECT_THAT(
      printed_by([] {
        EXPECT_EQ(thrown_by([] { fsutil::remove(path + "/x"); }), ENOTDIR);
      }),
      lines(failure("remove: could not remove " + path + "/x", ENOTDIR)));
}

TEST_F(Remove, TakesThePathUpToItsFirstNul) {
  make_file(path);
  fsutil::remove(path + std::string("\0more", 5));
  EXPECT_EQ(link_at(path), nothing);
}

TEST_F(Remove, DoesNotTakeThePathForAFormat) {
  EXPECT_THAT(printed_by([] {
                make_directory("/var/db/%s%n");
                EXPECT_EQ(thrown_by([] { fsutil::remove("/var/db/%s%n"); }),
                          EISDIR);
              }),
              lines(failure("remove: could not remove /var/db/%s%n", EISDIR)));
}

TEST_F(Exists, IsTrueForAFileADirectoryAndALinkToOne) {
  make_file("/var/db/file");
  make_link(path, "/var/db/file");
  EXPECT_TRUE(fsutil::exists("/var/db/file"));
  EXPECT_TRUE(fsutil::exists("/var/db"));
  EXPECT_TRUE(fsutil::exists(path));
}

TEST_F(Exists, LeavesTheErrorOfAMissingPath) {
  errno = EXDEV;
  EXPECT_FALSE(fsutil::exists(path));
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(Exists, TakesThePathUpToItsFirstNul) {
  make_file(path);
  EXPECT_TRUE(fsutil::exists(path + std::string("\0x", 2)));
}

TEST_F(Exists, IsTrueForAFileThatNobodyMayRead) {
  make_file(path, "", 0);
  EXPECT_TRUE(fsutil::exists(path));
}

TEST_F(Exists, IsQuietlyFalseForAMissingPath) {
  EXPECT_THAT(printed_by([] { EXPECT_FALSE(fsutil::exists(path)); }),
              no_lines());
}

TEST_F(Exists, IsFalseForADanglingLink) {
  make_link(path, "/var/db/gone");
  EXPECT_FALSE(fsutil::exists(path));
}

TEST_F(Exists, IsQuietlyFalseWhenThePathCannotBeReached) {
  make_file("/var/db/closed/file");
  set_mode("/var/db/closed", 0);
  EXPECT_THAT(
      printed_by([] { EXPECT_FALSE(fsutil::exists("/var/db/closed/file")); }),
      no_lines());
  make_link(path, path);
  EXPECT_THAT(printed_by([] { EXPECT_FALSE(fsutil::exists(path)); }),
              no_lines());
}

TEST_F(ReadSymlink, ReturnsTheTargetAsItIsStored) {
  make_link(path, "../%s//a/./b/");
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(fsutil::read_symlink(path), "../%s//a/./b/");
              }),
              no_lines());
}

TEST_F(ReadSymlink, TakesThePathUpToItsFirstNul) {
  make_link(path, "target");
  EXPECT_EQ(fsutil::read_symlink(path + std::string("\0x", 2)), "target");
}

TEST_F(ReadSymlink, OfAMissingPathIsQuietlyEmpty) {
  EXPECT_THAT(printed_by([] { EXPECT_EQ(fsutil::read_symlink(path), ""); }),
              no_lines());
  EXPECT_EQ(fsutil::read_symlink("/var/db/gone/link"), "");
}

TEST_F(ReadSymlink, OfAFilePrintsAndThrowsTheErrorNumber) {
  make_file(path);
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(thrown_by([] { fsutil::read_symlink(path); }),
                          EINVAL);
              }),
              lines(failure("read_symlink: " + path, EINVAL)));
}

TEST_F(ReadSymlink, OfADirectoryPrintsAndThrowsTheErrorNumber) {
  make_directory(path);
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(thrown_by([] { fsutil::read_symlink(path); }),
                          EINVAL);
              }),
              lines(failure("read_symlink: " + path, EINVAL)));
}

TEST_F(ReadSymlink, ThatCannotBeReachedPrintsAndThrowsTheErrorNumber) {
  make_directory("/var/db/shut");
  make_link("/var/db/shut/link", "x");
  set_mode("/var/db/shut", 0);
  EXPECT_THAT(
      printed_by([] {
        EXPECT_EQ(thrown_by([] { fsutil::read_symlink("/var/db/shut/link"); }),
                  EACCES);
      }),
      lines(failure("read_symlink: /var/db/shut/link", EACCES)));
}

TEST_F(ReadSymlink, BelowAFileIsAFailureAndNotAMissingPath) {
  make_file(path);
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(thrown_by([] { fsutil::read_symlink(path + "/x"); }),
                          ENOTDIR);
              }),
              lines(failure("read_symlink: " + path + "/x", ENOTDIR)));
}

TEST_F(ReadSymlink, OfAnEndlessNameIsAFailureAndNotAMissingPath) {
  const std::string endless = "/var/db/" + std::string(256, 'x');
  EXPECT_THAT(printed_by([&] {
                EXPECT_EQ(thrown_by([&] { fsutil::read_symlink(endless); }),
                          ENAMETOOLONG);
                EXPECT_FALSE(fsutil::exists(endless));
              }),
              lines(failure("read_symlink: " + endless, ENAMETOOLONG)));
}

TEST_F(ReadSymlink, TakesATrailingSlashAsItIs) {
  make_link(path, "/var/db");
  EXPECT_THAT(
      printed_by([] {
        EXPECT_EQ(thrown_by([] { fsutil::read_symlink(path + "/"); }), EINVAL);
        EXPECT_EQ(thrown_by([] { fsutil::remove(path + "/"); }), ENOTDIR);
      }),
      lines(failure("read_symlink: " + path + "/", EINVAL),
            failure("remove: could not remove " + path + "/", ENOTDIR)));
  EXPECT_EQ(link_at(path), "/var/db");
}

TEST_F(ReadSymlink, CutsALongTargetToItsFirst1024Bytes) {
  const std::string start = std::string(1023, 'a');
  for (const std::string rest : {"", "b", "bc", "bcd"}) {
    make_link(path, start + rest);
    EXPECT_THAT(printed_by([&] {
                  EXPECT_EQ(fsutil::read_symlink(path),
                            start + rest.substr(0, 1));
                }),
                no_lines());
  }
  make_link(path, start + std::string(4095 - 1023, 'b'));
  EXPECT_EQ(fsutil::read_symlink(path), start + "b");
}

TEST_F(CreateSymlink, StoresTheFirstTextInALinkAtTheSecond) {
  int result = -1;
  EXPECT_THAT(
      printed_by([&] { result = fsutil::create_symlink("some//text/", path); }),
      no_lines());
  EXPECT_EQ(result, 0);
  EXPECT_EQ(link_at(path), "some//text/");
}

TEST_F(CreateSymlink, TakesBothTextsUpToTheirFirstNul) {
  const std::string rest("\0x", 2);
  fsutil::create_symlink("target" + rest, path + rest);
  EXPECT_EQ(link_at(path), "target");
}

TEST_F(CreateSymlink, MakesADanglingLinkWithoutComplaint) {
  EXPECT_THAT(printed_by([] { fsutil::create_symlink("/var/db/gone", path); }),
              no_lines());
  EXPECT_EQ(link_at(path), "/var/db/gone");
}

TEST_F(CreateSymlink, NamesTheLinkFirstAndTheTargetSecondOnFailure) {
  make_link(zoneinfo, "/var/db/other");
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(thrown_by([] {
                            fsutil::create_symlink(
                                "/usr/share/zoneinfo.default",
                                "/var/db/timezone/zoneinfo");
                          }),
                          17);
              }),
              lines(failure("create_symlink: from /var/db/timezone/zoneinfo to "
                            "/usr/share/zoneinfo.default",
                            EEXIST)));
  EXPECT_EQ(link_at(zoneinfo), "/var/db/other");
}

TEST_F(CreateSymlink, InAMissingDirectoryPrintsAndThrows) {
  EXPECT_THAT(
      printed_by([] {
        EXPECT_EQ(
            thrown_by([] { fsutil::create_symlink("x", "/var/db/no/link"); }),
            ENOENT);
      }),
      lines(failure("create_symlink: from /var/db/no/link to x", ENOENT)));
}

TEST_F(CreateSymlink, WithoutPermissionPrintsAndThrows) {
  set_mode(timezone_root, 0555);
  EXPECT_THAT(printed_by([] {
                EXPECT_EQ(thrown_by([] { fsutil::create_symlink("x", path); }),
                          EACCES);
              }),
              lines(failure("create_symlink: from " + path + " to x", EACCES)));
}

}  // namespace
