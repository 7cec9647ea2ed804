// SPDX-License-Identifier: BSD-2-Clause
#include "driver/legacy_icu_link.h"

#include <cerrno>

#include "tests/device/device.h"

using namespace device;

namespace {

class LegacyIcuMigration : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    make_directory("/var/db/data");
  }

  template <typename... Lines>
  static void removes_the_legacy_link(const Lines&... expected) {
    prints(migrate_legacy_icu_link, expected...);
    EXPECT_EQ(link_at(legacy_icutz), nothing);
  }
  // Also at the next boot.
  template <typename... Lines>
  static void fails_every_time(const Lines&... expected) {
    expect_nothing_changed_by([&] {
      prints(migrate_legacy_icu_link, expected...);
      prints(migrate_legacy_icu_link, expected...);
    });
  }
};

// A relative text then names another place.
TEST_F(LegacyIcuMigration, MovesTheLegacyLinkWithItsTextUnchanged) {
  for (const std::string text : {"/var/db/data", "..//db/./data/", "data"}) {
    wipe(icutz);
    make_link(legacy_icutz, text);
    removes_the_legacy_link();
    EXPECT_EQ(link_at(icutz), text);
  }
}

TEST_F(LegacyIcuMigration, HasAPresentLinkThatResolvesOrADirectoryWin) {
  make_link(icutz, "/usr/share");
  make_link(legacy_icutz, "/var/db/data");
  removes_the_legacy_link();
  EXPECT_EQ(link_at(icutz), "/usr/share");
  make_directory(icutz);
  make_link(legacy_icutz, "/var/db/data");
  removes_the_legacy_link();
  EXPECT_EQ(link_at(icutz), "(a directory)");
}

TEST_F(LegacyIcuMigration, RemovesTheLegacyLinkAlsoWhenMigrationFailed) {
  const auto only_removes_it = [](int error) {
    make_link(legacy_icutz, "/var/db/data");
    removes_the_legacy_link(cannot_link(icutz, "/var/db/data", error),
                            not_migrated(error));
  };
  make_link(icutz, "/var/db/gone");
  only_removes_it(EEXIST);
  EXPECT_EQ(link_at(icutz), "/var/db/gone");
  wipe(icutz);
  set_mode(timezone_root, 0555);
  only_removes_it(EACCES);
  wipe(timezone_root);
  only_removes_it(ENOENT);
}

TEST_F(LegacyIcuMigration, OfADirectoryIsReportedOnEveryBoot) {
  make_directory(legacy_icutz);
  const auto stays =
      lines(cannot_remove(legacy_icutz, EISDIR), not_removed(EISDIR));
  fails_every_time(cannot_read(legacy_icutz, EINVAL), not_migrated(EINVAL),
                   stays);
  make_link(icutz, "/var/db/data");
  fails_every_time(stays);
}

TEST_F(LegacyIcuMigration, OfAFileRemovesIt) {
  make_file(legacy_icutz);
  removes_the_legacy_link(cannot_read(legacy_icutz, EINVAL),
                          not_migrated(EINVAL));
  EXPECT_EQ(link_at(icutz), nothing);
}

TEST_F(LegacyIcuMigration, OfALegacyLinkThatCannotBeRemovedIsReported) {
  make_link(legacy_icutz, "/var/db/data");
  set_mode("/var/db", 0555);
  prints(migrate_legacy_icu_link, cannot_remove(legacy_icutz, EACCES),
         not_removed(EACCES));
  EXPECT_EQ(link_at(icutz), "/var/db/data");
  set_mode("/var/db", 0755);
}

}  // namespace
