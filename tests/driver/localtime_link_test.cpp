// SPDX-License-Identifier: BSD-2-Clause
#include "driver/localtime_link.h"

#include <cerrno>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string resetting =
    "localtime link invalid; resetting to America/Los_Angeles";

class LocaltimeLinkRepair : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_system("2023c", "44l");
    point_zoneinfo_at(system_tree);
  }

  // No call fails before the warning, so it ends with an older error's text.
  static void repair_after_an_old_error() {
    errno = EXDEV;
    repair_localtime_link();
  }
  static void leaves_alone(const std::string& target) {
    point_localtime_at(target);
    const auto before = look_at_everything();
    EXPECT_THAT(printed_by(repair_localtime_link), no_lines());
    EXPECT_EQ(look_at_everything(), before);
  }
  static void corrects(const std::string& target, const std::string& to) {
    point_localtime_at(target);
    EXPECT_THAT(printed_by(repair_after_an_old_error),
                lines(failure("Correcting localtime link to " + to, EXDEV)));
    EXPECT_EQ(link_at(local_time), to);
  }
  static void resets(const std::string& target) {
    point_localtime_at(target);
    EXPECT_THAT(printed_by(repair_after_an_old_error),
                lines(failure(resetting, EXDEV)));
    EXPECT_EQ(link_at(local_time), default_localtime);
  }
};

TEST_F(LocaltimeLinkRepair, LeavesALinkIntoTheActiveTreeAlone) {
  leaves_alone("/var/db/timezone/zoneinfo/Europe/Paris");
}

TEST_F(LocaltimeLinkRepair, LeavesALinkToAMissingZoneAlone) {
  leaves_alone("/var/db/timezone/zoneinfo/Nowhere");
}

TEST_F(LocaltimeLinkRepair, AcceptsThePrefixWithoutASeparator) {
  leaves_alone("/var/db/timezone/zoneinfo");
  leaves_alone("/var/db/timezone/zoneinfo2/Europe/Paris");
  leaves_alone("/var/db/timezone/zoneinfo/../tz/x/zoneinfo/Europe/Paris");
}

TEST_F(LocaltimeLinkRepair, CorrectsALinkIntoTheFormerTree) {
  corrects("/usr/share/zoneinfo/Europe/Paris",
           "/var/db/timezone/zoneinfo/Europe/Paris");
}

TEST_F(LocaltimeLinkRepair, CorrectsALinkToTheFormerTreeItself) {
  corrects("/usr/share/zoneinfo", "/var/db/timezone/zoneinfo");
}

TEST_F(LocaltimeLinkRepair, LooksForTheCorrectedZoneInTheActiveDataSet) {
  make_file(update("2024a.1.0") + "/zoneinfo/Europe/Kyiv");
  point_zoneinfo_at(update("2024a.1.0") + "/zoneinfo");
  corrects("/usr/share/zoneinfo/Europe/Kyiv",
           "/var/db/timezone/zoneinfo/Europe/Kyiv");
}

TEST_F(LocaltimeLinkRepair, AnnouncesACorrectionThatThenFails) {
  point_localtime_at("/usr/share/zoneinfo/Mars/Base");
  EXPECT_THAT(printed_by(repair_after_an_old_error),
              lines(failure("Correcting localtime link to "
                            "/var/db/timezone/zoneinfo/Mars/Base",
                            EXDEV),
                    failure(resetting, ENOENT)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(LocaltimeLinkRepair, CorrectsThePrefixWithoutASeparatorAndThenResets) {
  point_localtime_at("/usr/share/zoneinfo.default/Europe/Paris");
  EXPECT_THAT(printed_by(repair_after_an_old_error),
              lines(failure("Correcting localtime link to "
                            "/var/db/timezone/zoneinfo.default/Europe/Paris",
                            EXDEV),
                    failure(resetting, ENOENT)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(LocaltimeLinkRepair, ResetsWhenTheZoneinfoLinkDoesNotWork) {
  point_zoneinfo_at("/var/db/gone");
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  EXPECT_THAT(printed_by(repair_after_an_old_error),
              lines(failure("Correcting localtime link to "
                            "/var/db/timezone/zoneinfo/Europe/Paris",
                            EXDEV),
                    failure(resetting, ENOENT)));
  EXPECT_EQ(link_at(local_time), default_localtime);
  EXPECT_THAT(printed_by(repair_localtime_link), no_lines());
}

TEST_F(LocaltimeLinkRepair, ResetsAMissingLink) {
  EXPECT_THAT(printed_by(repair_localtime_link),
              lines(failure(resetting, ENOENT)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(LocaltimeLinkRepair, ResetsARelativeLink) {
  resets("zoneinfo/Europe/Paris");
  resets("../zoneinfo/Europe/Paris");
  resets("../../../usr/share/zoneinfo/Europe/Paris");
}

TEST_F(LocaltimeLinkRepair, ResetsALinkToAnywhereElse) {
  resets("/");
  resets("/usr/share/zoneinf");
  resets("/usr/share/zoneinfX/Europe/Paris");
  resets("/usr/share/Zoneinfo/Europe/Paris");
  resets("/var/db/timezone/zoneinf");
  resets("/VAR/db/timezone/zoneinfo/Europe/Paris");
  resets("//var/db/timezone/zoneinfo/Europe/Paris");
  resets("/var/db/timezone/tz/2024a.1.0/zoneinfo/Europe/Paris");
  resets("%s%n");
}

TEST_F(LocaltimeLinkRepair, ResetsToTheDefaultZoneWhetherOrNotItExists) {
  wipe(system_tree);
  resets("/elsewhere");
}

TEST_F(LocaltimeLinkRepair, ReplacesAFile) {
  make_file(local_time, "TZif");
  EXPECT_THAT(printed_by(repair_localtime_link),
              lines(failure("read_symlink: /var/db/timezone/localtime", EINVAL),
                    failure(resetting, EINVAL)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(LocaltimeLinkRepair, ReplacesAnEmptyDirectory) {
  make_directory(local_time);
  EXPECT_THAT(printed_by(repair_localtime_link),
              lines(failure("read_symlink: /var/db/timezone/localtime", EINVAL),
                    failure(resetting, EINVAL)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(LocaltimeLinkRepair, ThrowsWhenADirectoryStandsInTheWay) {
  make_file(local_time + "/file");
  EXPECT_THAT(
      printed_by([] { EXPECT_EQ(thrown_by(repair_localtime_link), EEXIST); }),
      lines(failure("read_symlink: /var/db/timezone/localtime", EINVAL),
            failure(resetting, EINVAL),
            failure("create_symlink: from /var/db/timezone/localtime to "
                    "/var/db/timezone/zoneinfo/America/Los_Angeles",
                    EEXIST)));
}

TEST_F(LocaltimeLinkRepair, ThrowsWithoutATimezoneDirectory) {
  wipe(timezone_root);
  EXPECT_THAT(
      printed_by([] { EXPECT_EQ(thrown_by(repair_localtime_link), ENOENT); }),
      lines(failure(resetting, ENOENT),
            failure("create_symlink: from /var/db/timezone/localtime to "
                    "/var/db/timezone/zoneinfo/America/Los_Angeles",
                    ENOENT)));
}

TEST_F(LocaltimeLinkRepair, FallsBackWhenTheCorrectedLinkCannotBeCreated) {
  // In a directory that cannot be written the old link stays, so creating the
  // corrected one fails, and so does the default one.
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  set_mode(timezone_root, 0555);
  EXPECT_THAT(
      printed_by(
          [] { EXPECT_EQ(thrown_by(repair_after_an_old_error), EEXIST); }),
      lines(failure("Correcting localtime link to "
                    "/var/db/timezone/zoneinfo/Europe/Paris",
                    EXDEV),
            failure("create_symlink: from /var/db/timezone/localtime to "
                    "/var/db/timezone/zoneinfo/Europe/Paris",
                    EEXIST),
            failure(resetting, EEXIST),
            failure("create_symlink: from /var/db/timezone/localtime to "
                    "/var/db/timezone/zoneinfo/America/Los_Angeles",
                    EEXIST)));
  EXPECT_EQ(link_at(local_time), "/usr/share/zoneinfo/Europe/Paris");
}

TEST_F(LocaltimeLinkRepair, CutsALongCorrectionLikeEveryLinkThatIsRead) {
  std::string rest = "/Europe";
  while (rest.size() < 1100) rest += "/./././.";
  rest.resize(1024 - std::string("/usr/share/zoneinfo").size());
  corrects("/usr/share/zoneinfo" + rest + "/Paris",
           "/var/db/timezone/zoneinfo" + rest);
}

}  // namespace
