// SPDX-License-Identifier: BSD-2-Clause
#include "tests/device/device.h"

using namespace device;

namespace {

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

  static void expect_mended() {
    snapshot before = look_at_everything();
    expect_end(0,
               "marlin-mend: /var/db/timezone/zoneinfo did not fit "
               "/var/db/timezone/icutz; marlin makes both anew\n");
    before.erase(zoneinfo);
    snapshot after = look_at_everything();
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
  make_link(icutz, update("2024a.1.0") + "/icutz");
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
  point_links_at_update("2024a.1.0");
  make_directory(icutz);
  expect_left_alone();
  point_links_at_system();
  make_directory(icutz);
  expect_left_alone();
}

TEST_F(Mend, MendsAnActivationThatWasCutShort) {
  for (const char* older : {"", "2023d.1.0"}) {
    point_links_at_update("2024a.1.0");
    wipe(icutz);
    wipe(record);
    if (*older != '\0') make_link(icutz, update(older) + "/icutz");
    announce("2024a.1.0");
    expect_mended();
    EXPECT_EQ(boot().exit_status, 0);
    expect_links_at_update("2024a.1.0");
    EXPECT_EQ(file_at(record), "2023c.1.0_2024a.1.0");
    expect_left_alone();
  }
}

TEST_F(Mend, MendsAResetThatWasCutShort) {
  point_links_at_system();
  make_link(icutz, update("2024a.1.0") + "/icutz");
  expect_mended();
  EXPECT_EQ(boot().exit_status, 0);
  expect_links_at_system();
  expect_left_alone();
}

TEST_F(Mend, ComparesWholeNames) {
  point_links_at_update("2024a.1.0");
  for (const char* name : {"2024a.1.0/icutz/", "2024a.1.0/icutzx",
                           "2024a.1.00/icutz", "2024a.1/icutz", "2024a.1.0"}) {
    point_zoneinfo_at(update("2024a.1.0") + "/zoneinfo");
    make_link(icutz, update(name));
    expect_mended();
  }
}

TEST_F(Mend, ReckonsWithALinkInItsFormerPlace) {
  point_links_at_update("2024a.1.0");
  wipe(icutz);
  make_link(legacy_icutz, update("2024a.1.0") + "/icutz");
  expect_left_alone();
  EXPECT_EQ(boot().log, "");
  EXPECT_EQ(link_at(icutz), update("2024a.1.0") + "/icutz");
  wipe(icutz);
  make_link(legacy_icutz, update("2023d.1.0") + "/icutz");
  expect_mended();
}

TEST_F(Mend, GoesOnWithoutALog) {
  for (const auto lose_the_log : {leave_the_log_unread, forbid_files_to_grow}) {
    point_links_at_system();
    make_link(icutz, update("2024a.1.0") + "/icutz");
    EXPECT_EQ(run({MARLIN_MEND}, lose_the_log).exit_status, 0);
    EXPECT_EQ(link_at(zoneinfo), nothing);
  }
}

TEST_F(Mend, TellsThatItCannotRemoveTheLink) {
  point_links_at_system();
  make_link(icutz, update("2024a.1.0") + "/icutz");
  set_mode(timezone_root, 0555);
  expect_end(
      1,
      "marlin-mend: cannot remove /var/db/timezone/zoneinfo, which does not "
      "fit /var/db/timezone/icutz: Permission denied\n");
  set_mode(timezone_root, 0755);
  EXPECT_EQ(boot().exit_status, 0);
}

}  // namespace
