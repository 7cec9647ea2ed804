// SPDX-License-Identifier: BSD-2-Clause
#include "driver/version_record.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string both = "2023c.1.0_2024a.1.0";

class VersionRecord : public DeviceTest {
 protected:
  static void write() { record_version_change("2023c.1.0", "2024a.1.0"); }
};

TEST_F(VersionRecord, KeepsEveryByteOfBothVersions) {
  const std::string to("\xff\0", 2);
  for (const auto& from :
       {std::string("a\0b\n%s", 6), std::string(20u << 20, 'f')}) {
    record_version_change(from, to);
    EXPECT_TRUE(file_at(record) == from + "_" + to);
  }
}

TEST_F(VersionRecord, KeepsThePermissionsThatAreThereAndNeedsNoneToRead) {
  make_file(record, "", 0200);
  write();
  EXPECT_EQ(look_at({record}).at(record).mode, S_IFREG | 0200u);
  set_mode(record, 0600);
  EXPECT_EQ(file_at(record), both);
}

TEST_F(VersionRecord, FollowsALink) {
  make_link(record, "/var/db/elsewhere");
  write();
  EXPECT_EQ(file_at("/var/db/elsewhere"), both);
  EXPECT_EQ(link_at(record), "/var/db/elsewhere");
}

TEST_F(VersionRecord, IsQuietlyLeftOutWhenItCannotBeOpened) {
  make_file(record, "old", 0444);
  expect_nothing_changed_by([] { quietly(write); });
  make_directory(record);
  expect_nothing_changed_by([] { quietly(write); });
  wipe(timezone_root);
  expect_nothing_changed_by([] { quietly(write); });
}

TEST_F(VersionRecord, IsNotWrittenToAFifoThatIsReadNorToASocket) {
  make_fifo(record);
  const int reader = ::open(record.c_str(), O_RDONLY | O_NONBLOCK);
  ASSERT_GE(reader, 0);
  quietly(write);
  char byte = 0;
  EXPECT_EQ(::read(reader, &byte, 1), 0);
  ::close(reader);
  make_socket(record);
  quietly(write);
  EXPECT_EQ(file_at(record), "(something else)");
}

TEST_F(VersionRecord, LeavesTheErrorOfAnEarlierCall) {
  for (const int error : {0, EXDEV}) {
    wipe(record);
    errno = error;
    write();
    EXPECT_EQ(errno, error);
  }
}

}  // namespace
