// SPDX-License-Identifier: BSD-2-Clause
//
// What the search for an ICU schema asks of fts(3), and what it makes of
// entries and failures that no file system here can be brought to yield. This
// program's own definitions stand in for the C library's.
#include <fts.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "dataset/dataset.h"
#include "dataset/icu.h"
#include "tests/device/device.h"

using namespace device;

namespace {

struct scripted_entry {
  std::string name = "icutz44l.dat";
  int level = 1;
  int info = FTS_F;
  int error = 0;
  mode_t mode = S_IFREG | 0644;
  uid_t owner = 0;
};

struct {
  std::vector<scripted_entry> entries;
  int open_error = 0;
  int error_of_closing = 0;

  std::string root;
  int options = 0;
  bool sorted = false;
  int closed = 0;
  std::size_t read = 0;
  std::vector<std::string> skipped;
} walk;

struct stat entry_status;
FTSENT* last_read;

}  // namespace

extern "C" {

FTS* fts_open(char* const* roots, int options,
              int (*compare)(const FTSENT**, const FTSENT**)) {
  walk.root = roots[0];
  EXPECT_EQ(roots[1], nullptr);
  walk.options = options;
  walk.sorted = compare != nullptr;
  void* const opened = &walk;
  if (walk.open_error == 0) return static_cast<FTS*>(opened);
  errno = walk.open_error;
  return nullptr;
}

FTSENT* fts_read(FTS*) {
  if (walk.read == walk.entries.size()) return nullptr;
  const scripted_entry& scripted = walk.entries[walk.read++];
  std::free(last_read);
  FTSENT* const entry = last_read = static_cast<FTSENT*>(
      std::calloc(1, sizeof(FTSENT) + scripted.name.size() + 1));
  std::memcpy(entry->fts_name, scripted.name.c_str(), scripted.name.size() + 1);
  entry->fts_namelen = static_cast<unsigned short>(scripted.name.size());
  entry->fts_level = static_cast<short>(scripted.level);
  entry->fts_info = static_cast<unsigned short>(scripted.info);
  entry->fts_errno = scripted.error;
  entry_status.st_mode = scripted.mode;
  entry_status.st_uid = scripted.owner;
  entry->fts_statp = &entry_status;
  return entry;
}

int fts_set(FTS*, FTSENT* entry, int instruction) {
  EXPECT_EQ(instruction, FTS_SKIP);
  walk.skipped.emplace_back(entry->fts_name);
  return 0;
}

// A byte at a time.
ssize_t read(int file, void* bytes, size_t size) {
  return ::syscall(SYS_read, file, bytes, std::min<size_t>(size, 1));
}

int fts_close(FTS*) {
  ++walk.closed;
  if (walk.error_of_closing != 0) errno = walk.error_of_closing;
  return 0;
}

}  // extern "C"

namespace {

struct IcuWalk : public DeviceTest {
  void SetUp() override {
    DeviceTest::SetUp();
    walk = {};
  }

  static std::string schema() {
    return mln_icu("/var/db/timezone/tz/2024a.1.0").schema;
  }
};

TEST_F(IcuWalk, FollowsOnlyTheRootAndStaysOnItsDeviceInDirectoryOrder) {
  printed_by(schema);
  EXPECT_EQ(walk.root, "/var/db/timezone/tz/2024a.1.0/icutz");
  EXPECT_EQ(walk.options, 0x51);
  EXPECT_FALSE(walk.sorted);
  EXPECT_EQ(walk.closed, 1);
}

TEST_F(IcuWalk, ThatCannotBeStartedIsReportedAndThrown) {
  for (const int error : {ENOMEM, EMFILE, EIO, EINVAL}) {
    walk.open_error = error;
    throws(error, schema,
           failure("tz_icu::initialize: fts_open of "
                   "/var/db/timezone/tz/2024a.1.0/icutz failed, " +
                       std::string(std::strerror(error)),
                   error));
    EXPECT_EQ(walk.closed, 0);
  }
  printed_by([] {
    EXPECT_EQ(thrown_by([] { mln_dataset("/var/db/timezone/tz/x"); }), EINVAL);
    // The number is read after the line is printed, which fails here.
    ::close(STDERR_FILENO);
    EXPECT_EQ(thrown_by(schema), EBADF);
  });
}

TEST_F(IcuWalk, EndsAtTheFirstNameThatMatches) {
  walk.entries = {{"readme"}, {""}, {"icutz44l.dat"}, {"icutz45l.dat"}};
  EXPECT_EQ(schema(), "44l");
  EXPECT_EQ(walk.read, 3u);
  EXPECT_EQ(walk.closed, 1);
}

TEST_F(IcuWalk, PassesOverWhatIsNoReadableFileDirectlyInTheRoot) {
  std::vector<scripted_entry> others = {
      {.error = EIO}, {.level = 0}, {.level = 2}, {.mode = S_IFREG | 0773}};
  for (const int info : {FTS_D, FTS_DP, FTS_DC, FTS_DNR, FTS_DEFAULT, FTS_ERR,
                         FTS_NS, FTS_NSOK, FTS_SL, FTS_SLNONE})
    others.push_back({.info = info});
  for (const auto& other : others) {
    walk = {};
    walk.entries = {
        other, {.name = "icutz45l.dat", .mode = S_IFREG | 0004, .owner = 4711}};
    EXPECT_EQ(schema(), "45l")
        << "error " << other.error << ", level " << other.level << ", mode "
        << other.mode << ", info " << other.info;
  }
}

TEST_F(IcuWalk, EntersTheRootButNoDirectoryBelowIt) {
  walk.entries = {{.name = "icutz", .level = 0, .info = FTS_D},
                  {.name = "below", .level = 1, .info = FTS_D},
                  {.name = "left", .level = 1, .info = FTS_DP},
                  {"icutz45l.dat"}};
  EXPECT_EQ(schema(), "45l");
  EXPECT_EQ(walk.skipped, std::vector<std::string>{"below"});
}

TEST_F(IcuWalk, IsClosedBeforeAMissingSchemaIsReported) {
  walk.error_of_closing = EXDEV;
  prints(schema, no_schema_in("/var/db/timezone/tz/2024a.1.0", EXDEV));
}

TEST_F(IcuWalk, IsNotStartedForTheSystemPartition) {
  make_file(system_icu + "/icutzformat.txt", "44l and more");
  EXPECT_EQ(quietly([] { return mln_icu().schema; }), "44l");
  EXPECT_EQ(walk.root, "");
}

}  // namespace
