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
  throws(
      error, [&] { fsutil::remove(at); }, cannot_remove(at, error));
}
void read_fails(const std::string& at, int error) {
  throws(
      error, [&] { fsutil::read_symlink(at); }, cannot_read(at, error));
}
void create_fails(const std::string& at, int error) {
  throws(
      error, [&] { fsutil::create_symlink("x", at); },
      cannot_link(at, "x", error));
}

// Each with the error of reaching it.
std::vector<std::pair<std::string, int>> unreachable_paths() {
  make_link("/var/db/shut/link", "x");
  set_mode("/var/db/shut", 0);
  make_file("/var/db/file");
  make_link("/var/db/loop", "/var/db/loop");
  return {{"/var/db/shut/link", EACCES},
          {"/var/db/file/x", ENOTDIR},
          {"/var/db/loop/x", ELOOP},
          {"/var/db/" + std::string(256, 'x'), ENAMETOOLONG}};
}

TEST_F(Remove, ReadingAndCreatingFailWhereAPathCannotBeReached) {
  for (const auto& [unreached, error] : unreachable_paths()) {
    remove_fails(unreached, error);
    read_fails(unreached, error);
    create_fails(unreached, error);
  }
  create_fails("/var/db/no/link", ENOENT);
}

TEST_F(Exists, IsQuietlyFalseForAPathThatCannotBeReachedAndLeavesItsError) {
  make_link("/var/db/dangling", "/var/db/gone");
  auto paths = unreachable_paths();
  paths.insert(paths.end(), {{path, ENOENT}, {"/var/db/dangling", ENOENT}});
  for (const auto& [unreached, error] : paths) {
    EXPECT_FALSE(quietly([&at = unreached] { return fsutil::exists(at); }));
    errno = EXDEV;
    fsutil::exists(unreached);
    EXPECT_EQ(errno, error) << unreached;
  }
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

TEST_F(Remove, DeletesALinkAndNotWhatItNames) {
  make_file("/var/db/timezone/target");
  make_link(path, "/var/db/timezone/target");
  quietly([] { fsutil::remove(path); });
  EXPECT_EQ(link_at(path), nothing);
  EXPECT_EQ(file_at("/var/db/timezone/target"), "");
}

TEST_F(Remove, OfAMissingPathReportsFalseAndPrintsNothing) {
  errno = 0;
  EXPECT_FALSE(quietly([] { return fsutil::remove(path); }));
}

TEST_F(Remove, ReportsFalseAfterASuccessWhenErrnoWasStale) {
  for (const int stale : {0, EIO}) {
    make_file(path);
    errno = stale;
    EXPECT_EQ(fsutil::remove(path), stale == 0);
    EXPECT_EQ(link_at(path), nothing);
  }
}

TEST_F(Remove, OfADirectoryOrWithoutPermissionPrintsAndThrowsTheErrorNumber) {
  for (const std::string directory : {"/var/db/timezone/x", "/var/db/%s%n"}) {
    make_directory(directory);
    remove_fails(directory, EISDIR);
    EXPECT_EQ(link_at(directory), "(a directory)");
  }
  make_file(path);
  set_mode(timezone_root, 0555);
  remove_fails(path, EACCES);
  EXPECT_EQ(file_at(path), "");
}

TEST_F(Exists, IsTrueForAFileThatNobodyMayReadADirectoryAndALinkToAFile) {
  make_file("/var/db/file", "", 0);
  make_link(path, "/var/db/file");
  for (const char* reached : {"/var/db/file", "/var/db", path.c_str()})
    EXPECT_TRUE(fsutil::exists(reached)) << reached;
}

TEST_F(ReadSymlink, ReturnsTheTargetAsItIsStored) {
  for (const std::string target : {"../%s//a/./b/", "\n", " x\r\n"}) {
    make_link(path, target);
    EXPECT_EQ(quietly([] { return fsutil::read_symlink(path); }), target);
  }
}

TEST_F(ReadSymlink, OfAMissingPathIsQuietlyEmpty) {
  for (const std::string missing : {"/var/db/gone", "/var/db/gone/link"})
    EXPECT_EQ(quietly([&] { return fsutil::read_symlink(missing); }), "");
}

TEST_F(ReadSymlink, OfAFileOrADirectoryPrintsAndThrowsTheErrorNumber) {
  make_file(path);
  read_fails(path, EINVAL);
  make_directory(path);
  read_fails(path, EINVAL);
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
  EXPECT_EQ(quietly([] { return fsutil::create_symlink("some//text/", path); }),
            0);
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
  throws(
      17, [] { fsutil::create_symlink("x", path); },
      failure("create_symlink: from " + path + " to x", EEXIST));
  EXPECT_EQ(link_at(path), "/var/db/other");
}

}  // namespace
