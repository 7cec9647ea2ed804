// SPDX-License-Identifier: BSD-2-Clause
//
// The words of the other tests, tested themselves.
#include <gtest/gtest-spi.h>

#include <iostream>

#include "tests/device/device.h"

using namespace device;

namespace {

class PrivateDevice : public DeviceTest {};

// Is started outside of a private device too, where it must find a reason.
TEST(Guard, SaysWhyNot) {
  std::cout << "guard: [" << why_not_private() << "]\n";
}

TEST_F(PrivateDevice, RefusesPermissionEvenToRoot) {
  make_file("/var/db/file", "x", 0);
  EXPECT_EQ(file_at("/var/db/file"), "");
  set_mode("/var/db", 0555);
  const outcome created = run({"/usr/bin/touch", "/var/db/new"});
  set_mode("/var/db", 0755);
  EXPECT_NE(created.exit_status, 0);
}

TEST_F(PrivateDevice, ShowsEveryChangeInASnapshot) {
  const auto changes = [](const std::function<void()>& act) {
    const auto before = look_at_everything();
    EXPECT_EQ(look_at_everything(), before);
    act();
    EXPECT_FALSE(look_at_everything() == before);
  };
  changes([] { make_file("/var/db/file", "content"); });
  changes([] { make_file("/var/db/file", "Content"); });
  changes([] { wipe("/var/db/file"); });
  make_link("/var/db/link", "target");
  changes([] { make_link("/var/db/link", "target"); });
}

TEST_F(PrivateDevice, NoticesThatNothingWasThrown) {
  EXPECT_NONFATAL_FAILURE(thrown_by([] {}), "no int was thrown");
}

}  // namespace
