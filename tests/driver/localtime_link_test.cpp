// SPDX-License-Identifier: BSD-2-Clause
#include "driver/localtime_link.h"

#include <cerrno>

#include "tests/device/device.h"

using namespace device;

namespace {

class LocaltimeLinkRepair : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_system("2023c", "44l");
    point_zoneinfo_at(system_tree);
  }

  static void leaves_alone(const std::string& target) {
    point_localtime_at(target);
    expect_nothing_changed_by([] { quietly(repair_localtime_link); });
  }
  // No call fails before the warning, so it ends with an older error's text.
  static void repair_after_an_old_error() {
    errno = EXDEV;
    repair_localtime_link();
  }
  template <typename... Lines>
  static void repairs(const std::string& target, const std::string& to,
                      const Lines&... expected) {
    point_localtime_at(target);
    prints(repair_after_an_old_error, expected...);
    EXPECT_EQ(link_at(local_time), to);
  }
  static void corrects(const std::string& target, const std::string& to) {
    repairs(target, to, correcting_localtime(to, EXDEV));
  }
  static void resets(const std::string& target) {
    repairs(target, default_localtime, resetting_localtime(EXDEV));
  }
};

TEST_F(LocaltimeLinkRepair, LeavesALinkToAMissingZoneAlone) {
  leaves_alone("/var/db/timezone/zoneinfo/Europe/Paris");
  leaves_alone("/var/db/timezone/zoneinfo/Nowhere");
  leaves_alone("/var/db/timezone/zoneinfo/Europe/Paris\n");
}

TEST_F(LocaltimeLinkRepair, AcceptsThePrefixWithoutASeparator) {
  leaves_alone("/var/db/timezone/zoneinfo");
  leaves_alone("/var/db/timezone/zoneinfo2/Europe/Paris");
  leaves_alone("/var/db/timezone/zoneinfo" + std::string(1100, 'x'));
  leaves_alone("/var/db/timezone/zoneinfo/../tz/x/zoneinfo/Europe/Paris");
}

TEST_F(LocaltimeLinkRepair, CorrectsALinkIntoTheFormerTreeOrToItself) {
  for (const std::string rest : {"/Europe/Paris", "", "/"})
    corrects("/usr/share/zoneinfo" + rest, "/var/db/timezone/zoneinfo" + rest);
}

TEST_F(LocaltimeLinkRepair, LooksForTheCorrectedZoneInTheActiveDataSet) {
  make_file(update("2024a.1.0") + "/zoneinfo/Europe/Kyiv");
  point_zoneinfo_at(update("2024a.1.0") + "/zoneinfo");
  corrects("/usr/share/zoneinfo/Europe/Kyiv",
           "/var/db/timezone/zoneinfo/Europe/Kyiv");
}

// Only the prefix is replaced, though nothing separates it or it comes again.
TEST_F(LocaltimeLinkRepair, AnnouncesACorrectionThatThenFails) {
  wipe(system_tree + "/Europe");
  for (const std::string rest :
       {"/usr/share/zoneinfo/Base", ".default/Europe/Paris", "/Europe/Paris"})
    repairs("/usr/share/zoneinfo" + rest, default_localtime,
            correcting_localtime("/var/db/timezone/zoneinfo" + rest, EXDEV),
            resetting_localtime());
}

TEST_F(LocaltimeLinkRepair, ResetsARelativeLinkOrOneToAnywhereElse) {
  for (const char* target :
       {"zoneinfo/Europe/Paris", "../../../usr/share/zoneinfo/Europe/Paris",
        "/", "/usr/share/zoneinf", "/usr/share/zoneinfX/Europe/Paris",
        "/usr/share/Zoneinfo/Europe/Paris", "/var/db/timezone/zoneinf",
        "//var/db/timezone/zoneinfo/Europe/Paris",
        "/var/db/timezone/tz/2024a.1.0/zoneinfo/Europe/Paris",
        "/usr/share/lib/zoneinfo/Europe/Paris", "%s%n"})
    resets(target);
}

TEST_F(LocaltimeLinkRepair, ResetsToTheDefaultZoneWhetherOrNotItExists) {
  wipe(system_tree);
  resets("/elsewhere");
}

TEST_F(LocaltimeLinkRepair, ReplacesAFileOrAnEmptyDirectory) {
  const auto replaces_it = [] {
    prints(repair_localtime_link, cannot_read(local_time, EINVAL),
           resetting_localtime(EINVAL));
    EXPECT_EQ(link_at(local_time), default_localtime);
  };
  make_file(local_time, "TZif");
  replaces_it();
  make_directory(local_time);
  replaces_it();
}

// In a directory that cannot be written the old link stays, so creating the
// corrected one fails, and so does the default one.
TEST_F(LocaltimeLinkRepair, FallsBackWhenTheCorrectedLinkCannotBeCreated) {
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  set_mode(timezone_root, 0555);
  throws(EEXIST, repair_after_an_old_error,
         correcting_localtime(zoneinfo + "/Europe/Paris", EXDEV),
         cannot_link(local_time, zoneinfo + "/Europe/Paris", EEXIST),
         resetting_localtime(EEXIST),
         cannot_link(local_time, default_localtime, EEXIST));
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
