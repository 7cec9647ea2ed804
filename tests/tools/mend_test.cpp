// SPDX-License-Identifier: BSD-2-Clause
#include "tests/device/device.h"

using namespace device;

namespace {

const std::string icu = update("2024a.1.0") + "/icutz";
const std::string older_icu = update("2023d.1.0") + "/icutz";

class Mend : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_system("2023c", "44l");
    install_update("2023d.1.0", "44l");
    install_update("2024a.1.0", "44l");
  }

  static void expect_end(int status, const std::string& log) {
    const outcome mended = run({MARLIN_MEND});
    EXPECT_EQ(mended.exit_status, status);
    EXPECT_EQ(mended.log, log);
  }

  static void expect_left_alone() {
    expect_nothing_changed_by([] { expect_end(0, ""); });
  }

  // Only "zoneinfo" goes.
  static void expect_mended() {
    snapshot before = look_at_everything();
    expect_end(0,
               "marlin-mend: /var/db/timezone/zoneinfo did not fit "
               "/var/db/timezone/icutz; marlin makes both anew\n");
    snapshot after = look_at_everything();
    before.erase(zoneinfo);
    before.erase(timezone_root);
    after.erase(timezone_root);
    EXPECT_EQ(after, before);
  }
};

TEST_F(Mend, LeavesLinksOfOneSetAlone) {
  point_links_at_system();
  expect_left_alone();
  point_links_at_update("2024a.1.0");
  expect_left_alone();
}

// It counts as none, for marlin as well.
TEST_F(Mend, LeavesALegacyLinkThatDanglesAlone) {
  point_links_at_system();
  make_link(legacy_icutz, "/nowhere");
  expect_left_alone();
}

TEST_F(Mend, LeavesToMarlinWhatItResetsAnyway) {
  expect_left_alone();
  make_link(icutz, icu);
  expect_left_alone();
  for (const char* target :
       {"/elsewhere", "/usr/share/zoneinfo.default/", "/var/db/timezone/tz",
        "tz/2024a.1.0/zoneinfo", "/var/db/timezone/tz/2024a.1.0",
        "/var/db/timezone/tz//zoneinfo"}) {
    point_zoneinfo_at(target);
    expect_left_alone();
  }
  make_directory(zoneinfo);
  expect_left_alone();
}

TEST_F(Mend, LeavesADirectoryInPlaceOfTheIcuLinkAlone) {
  make_directory(icutz);
  for (const auto& target : {update("2024a.1.0") + "/zoneinfo", system_tree}) {
    point_zoneinfo_at(target);
    expect_left_alone();
  }
}

TEST_F(Mend, MendsAnActivationThatWasCutShort) {
  announce("2024a.1.0");
  for (const auto& left : {std::string(), older_icu}) {
    wipe(record);
    point_links_at_update("2024a.1.0");
    left.empty() ? wipe(icutz) : make_link(icutz, left);
    expect_mended();
    EXPECT_EQ(boot().exit_status, 0);
    expect_links_at_update("2024a.1.0");
    EXPECT_EQ(file_at(record), "2023c.1.0_2024a.1.0");
    expect_left_alone();
  }
}

TEST_F(Mend, MendsAResetThatWasCutShort) {
  point_links_at_system();
  make_link(icutz, icu);
  expect_mended();
  EXPECT_EQ(boot().exit_status, 0);
  expect_links_at_system();
  expect_left_alone();
}

TEST_F(Mend, ComparesWholeNames) {
  for (const char* name : {"2024a.1.0/icutz/", "2024a.1.0/icutzx",
                           "2024a.1.00/icutz", "2024a.1/icutz", "2024a.1.0"}) {
    point_zoneinfo_at(update("2024a.1.0") + "/zoneinfo");
    make_link(icutz, update(name));
    expect_mended();
  }
}

TEST_F(Mend, ReckonsWithALinkInItsFormerPlace) {
  point_zoneinfo_at(update("2024a.1.0") + "/zoneinfo");
  make_link(legacy_icutz, icu);
  expect_left_alone();
  make_link(legacy_icutz, older_icu);
  expect_mended();
}

// marlin removes it, and then there is no ICU data.
TEST_F(Mend, TakesAFileForNoLinkInItsFormerPlace) {
  make_file(legacy_icutz);
  point_links_at_system();
  expect_left_alone();
  point_zoneinfo_at(update("2024a.1.0") + "/zoneinfo");
  expect_mended();
}

TEST_F(Mend, GoesOnWhenItsLogIsUnreadOrCannotBeWrittenWhole) {
  for (const auto lose_the_log : {leave_the_log_unread, forbid_files_to_grow}) {
    point_links_at_system();
    make_link(icutz, icu);
    EXPECT_EQ(run({MARLIN_MEND}, lose_the_log).exit_status, 0);
    EXPECT_EQ(link_at(zoneinfo), nothing);
  }
}

TEST_F(Mend, TellsThatItCannotRemoveTheLink) {
  point_links_at_system();
  make_link(icutz, icu);
  set_mode(timezone_root, 0555);
  expect_end(1,
             "marlin-mend: cannot remove /var/db/timezone/zoneinfo, which does "
             "not fit /var/db/timezone/icutz: Permission denied\n");
  set_mode(timezone_root, 0755);
}

}  // namespace
