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
    make_directory("/var/db/other");
  }

  static void changes_nothing() {
    expect_nothing_changed_by([] { quietly(migrate_legacy_icu_link); });
  }
  static void only_removes_the_legacy_link(int error) {
    make_link(legacy_icutz, "/var/db/data");
    EXPECT_THAT(
        printed_by(migrate_legacy_icu_link),
        lines(cannot_link(icutz, "/var/db/data", error), not_migrated(error)));
    EXPECT_EQ(link_at(legacy_icutz), nothing);
  }
};

TEST_F(LegacyIcuMigration, DoesNothingWithoutALegacyLink) {
  make_link(icutz, "/var/db/data");
  changes_nothing();
}

// A relative text then names another place.
TEST_F(LegacyIcuMigration, MovesTheLegacyLinkWithItsTextUnchanged) {
  for (const std::string text : {"/var/db/data", "..//db/./data/", "data"}) {
    wipe(icutz);
    make_link(legacy_icutz, text);
    quietly(migrate_legacy_icu_link);
    EXPECT_EQ(link_at(icutz), text);
    EXPECT_EQ(link_at(legacy_icutz), nothing);
  }
}

TEST_F(LegacyIcuMigration, HasAPresentLinkThatResolvesOrADirectoryWin) {
  const auto present_wins = [] {
    make_link(legacy_icutz, "/var/db/data");
    quietly(migrate_legacy_icu_link);
    EXPECT_EQ(link_at(legacy_icutz), nothing);
  };
  make_link(icutz, "/var/db/other");
  present_wins();
  EXPECT_EQ(link_at(icutz), "/var/db/other");
  make_directory(icutz);
  present_wins();
  EXPECT_EQ(link_at(icutz), "(a directory)");
}

TEST_F(LegacyIcuMigration, LeavesALegacyLinkThatDangles) {
  make_link(legacy_icutz, "/var/db/gone");
  changes_nothing();
}

TEST_F(LegacyIcuMigration, RemovesTheLegacyLinkAlsoWhenMigrationFailed) {
  make_link(icutz, "/var/db/gone");
  only_removes_the_legacy_link(EEXIST);
  EXPECT_EQ(link_at(icutz), "/var/db/gone");
  wipe(icutz);
  set_mode(timezone_root, 0555);
  only_removes_the_legacy_link(EACCES);
  wipe(timezone_root);
  only_removes_the_legacy_link(ENOENT);
}

TEST_F(LegacyIcuMigration, OfADirectoryIsReportedOnEveryBoot) {
  make_directory(legacy_icutz);
  for (int boots = 0; boots < 2; ++boots) {
    EXPECT_THAT(
        printed_by(migrate_legacy_icu_link),
        lines(cannot_read(legacy_icutz, EINVAL), not_migrated(EINVAL),
              cannot_remove(legacy_icutz, EISDIR), not_removed(EISDIR)));
    EXPECT_EQ(link_at(legacy_icutz), "(a directory)");
    EXPECT_EQ(link_at(icutz), nothing);
  }
}

TEST_F(LegacyIcuMigration, OfADirectoryBesideAPresentLinkOnlyFailsToRemove) {
  make_directory(legacy_icutz);
  make_link(icutz, "/var/db/data");
  for (int boots = 0; boots < 2; ++boots) {
    EXPECT_THAT(
        printed_by(migrate_legacy_icu_link),
        lines(cannot_remove(legacy_icutz, EISDIR), not_removed(EISDIR)));
    EXPECT_EQ(link_at(icutz), "/var/db/data");
  }
}

TEST_F(LegacyIcuMigration, OfAFileRemovesIt) {
  make_file(legacy_icutz);
  EXPECT_THAT(printed_by(migrate_legacy_icu_link),
              lines(cannot_read(legacy_icutz, EINVAL), not_migrated(EINVAL)));
  EXPECT_EQ(link_at(legacy_icutz), nothing);
  EXPECT_EQ(link_at(icutz), nothing);
}

TEST_F(LegacyIcuMigration, OfALegacyLinkThatCannotBeRemovedIsReported) {
  make_link(legacy_icutz, "/var/db/data");
  set_mode("/var/db", 0555);
  EXPECT_THAT(printed_by(migrate_legacy_icu_link),
              lines(cannot_remove(legacy_icutz, EACCES), not_removed(EACCES)));
  EXPECT_EQ(link_at(icutz), "/var/db/data");
  set_mode("/var/db", 0755);
}

}  // namespace
