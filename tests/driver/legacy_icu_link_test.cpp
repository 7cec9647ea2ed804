// SPDX-License-Identifier: BSD-2-Clause
#include "driver/legacy_icu_link.h"

#include <cerrno>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string could_not_migrate =
    "Could not migrate /var/db/icutz to /var/db/timezone/icutz";
const std::string could_not_remove = "Could not remove /var/db/icutz";

class LegacyIcuMigration : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    make_directory("/var/db/data");
    make_directory("/var/db/other");
  }
};

TEST_F(LegacyIcuMigration, DoesNothingWithoutALegacyLink) {
  make_link(icutz, "/var/db/data");
  const auto before = look_at_everything();
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(look_at_everything(), before);
}

TEST_F(LegacyIcuMigration, MovesTheLegacyLinkToItsPresentPlace) {
  make_link(legacy_icutz, "/var/db/data");
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(link_at(icutz), "/var/db/data");
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(LegacyIcuMigration, CopiesTheTextUnchanged) {
  make_link(legacy_icutz, "..//db/./data/");
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(link_at(icutz), "..//db/./data/");
}

TEST_F(LegacyIcuMigration, CopiesARelativeTextThoughItThenNamesAnotherPlace) {
  make_link(legacy_icutz, "data");
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(link_at(icutz), "data");
}

TEST_F(LegacyIcuMigration, HasAPresentLinkThatResolvesWin) {
  make_link(legacy_icutz, "/var/db/data");
  make_link(icutz, "/var/db/other");
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(link_at(icutz), "/var/db/other");
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(LegacyIcuMigration, LeavesALegacyLinkThatDangles) {
  make_link(legacy_icutz, "/var/db/gone");
  const auto before = look_at_everything();
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(look_at_everything(), before);
}

TEST_F(LegacyIcuMigration, RemovesTheLegacyLinkAlsoWhenMigrationFailed) {
  make_link(legacy_icutz, "/var/db/data");
  make_link(icutz, "/var/db/gone");
  EXPECT_THAT(printed_by(migrate_legacy_icu_link),
              lines(failure("create_symlink: from /var/db/timezone/icutz to "
                            "/var/db/data",
                            EEXIST),
                    failure(could_not_migrate, EEXIST)));
  EXPECT_EQ(link_at(icutz), "/var/db/gone");
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(LegacyIcuMigration, OfADirectoryIsReportedOnEveryBoot) {
  make_directory(legacy_icutz);
  for (int boots = 0; boots < 2; ++boots) {
    EXPECT_THAT(printed_by(migrate_legacy_icu_link),
                lines(failure("read_symlink: /var/db/icutz", EINVAL),
                      failure(could_not_migrate, EINVAL),
                      failure("remove: could not remove /var/db/icutz", EISDIR),
                      failure(could_not_remove, EISDIR)));
    EXPECT_EQ(link_at(legacy_icutz), "(a directory)");
    EXPECT_EQ(link_at(icutz), nothing);
  }
}

TEST_F(LegacyIcuMigration, OfADirectoryBesideAPresentLinkOnlyFailsToRemove) {
  make_directory(legacy_icutz);
  make_link(icutz, "/var/db/data");
  for (int boots = 0; boots < 2; ++boots) {
    EXPECT_THAT(printed_by(migrate_legacy_icu_link),
                lines(failure("remove: could not remove /var/db/icutz", EISDIR),
                      failure(could_not_remove, EISDIR)));
    EXPECT_EQ(link_at(icutz), "/var/db/data");
  }
}

TEST_F(LegacyIcuMigration, OfAFileRemovesIt) {
  make_file(legacy_icutz);
  EXPECT_THAT(printed_by(migrate_legacy_icu_link),
              lines(failure("read_symlink: /var/db/icutz", EINVAL),
                    failure(could_not_migrate, EINVAL)));
  EXPECT_EQ(link_at(legacy_icutz), nothing);
  EXPECT_EQ(link_at(icutz), nothing);
}

TEST_F(LegacyIcuMigration, WithoutATimezoneDirectoryStillRemovesTheLegacyLink) {
  wipe(timezone_root);
  make_link(legacy_icutz, "/var/db/data");
  EXPECT_THAT(printed_by(migrate_legacy_icu_link),
              lines(failure("create_symlink: from /var/db/timezone/icutz to "
                            "/var/db/data",
                            ENOENT),
                    failure(could_not_migrate, ENOENT)));
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(LegacyIcuMigration, IntoAReadOnlyDirectoryStillRemovesTheLegacyLink) {
  set_mode(timezone_root, 0555);
  make_link(legacy_icutz, "/var/db/data");
  EXPECT_THAT(printed_by(migrate_legacy_icu_link),
              lines(failure("create_symlink: from /var/db/timezone/icutz to "
                            "/var/db/data",
                            EACCES),
                    failure(could_not_migrate, EACCES)));
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(LegacyIcuMigration, OfALegacyLinkThatCannotBeRemovedIsReported) {
  make_link(legacy_icutz, "/var/db/data");
  set_mode("/var/db", 0555);
  EXPECT_THAT(printed_by(migrate_legacy_icu_link),
              lines(failure("remove: could not remove /var/db/icutz", EACCES),
                    failure(could_not_remove, EACCES)));
  EXPECT_EQ(link_at(icutz), "/var/db/data");
  set_mode("/var/db", 0755);
}

TEST_F(LegacyIcuMigration, PrintsNothingTheSecondTime) {
  make_link(legacy_icutz, "/var/db/data");
  migrate_legacy_icu_link();
  const auto before = look_at_everything();
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(look_at_everything(), before);
}

TEST_F(LegacyIcuMigration, CutsALongTextLikeEveryLinkThatIsRead) {
  std::string target = "/var/db/data";
  while (target.size() < 1100) target += "/./././.";
  make_link(legacy_icutz, target);
  EXPECT_THAT(printed_by(migrate_legacy_icu_link), no_lines());
  EXPECT_EQ(link_at(icutz), target.substr(0, 1024));
}

}  // namespace
