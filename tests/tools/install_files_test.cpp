// SPDX-License-Identifier: BSD-2-Clause
#include <fcntl.h>
#include <sys/stat.h>

#include "tests/device/device.h"
#include "tools/install/device_facts.h"
#include "tools/install/failure.h"
#include "tools/install/removal.h"

using namespace device;

namespace {

class Removal : public DeviceTest {
 protected:
  static removed remove() { return remove_entry(AT_FDCWD, place, place); }
  inline static const std::string place = "/var/db/place";
};

TEST_F(Removal, TellsHowMuchItWas) {
  EXPECT_EQ(remove().files, 0u);
  make_file(place + "/a/b/one", std::string(5000, 'x'));
  make_file(place + "/two", "x");
  make_link(place + "/link", "/usr/share");
  const removed gone = remove();
  EXPECT_EQ(gone.files, 3u);
  EXPECT_EQ(gone.bytes, 8192u + 4096u);
  EXPECT_EQ(file_at(place), nothing);
}

TEST_F(Removal, FollowsNoLink) {
  make_file("/var/db/kept/file", "kept");
  make_link(place, "/var/db/kept");
  remove();
  make_directory(place);
  make_link(place + "/link", "/var/db/kept");
  remove();
  EXPECT_EQ(link_at(place), nothing);
  EXPECT_EQ(file_at("/var/db/kept/file"), "kept");
}

TEST_F(Removal, TakesDirectoriesThatAreClosed) {
  make_file(place + "/a/b/file");
  set_mode(place + "/a/b", 0000);
  set_mode(place + "/a", 0500);
  set_mode(place, 0000);
  remove();
  EXPECT_EQ(file_at(place), nothing);
}

TEST_F(Removal, GoesDeeperThanAnyPath) {
  make_directory(place);
  ASSERT_EQ(
      run({"/usr/bin/sh", "-c",
           "cd " + place +
               " && n=$(printf %0200d 0); for i in $(seq 500); do mkdir .$i "
               "$n && touch f && cd -P $n || exit 1; done"})
          .exit_status,
      0);
  EXPECT_EQ(remove().files, 500u);
  EXPECT_EQ(file_at(place), nothing);
}

TEST_F(Removal, TellsWhatCannotBeRemoved) {
  make_file("/var/db/closed/file");
  set_mode("/var/db/closed", 0555);
  try {
    remove_entry(AT_FDCWD, "/var/db/closed/file", "a\nname");
    FAIL() << "nothing was thrown";
  } catch (const ::failure& told) {
    EXPECT_EQ(told.line, "cannot remove a\\x0aname: Permission denied");
    EXPECT_EQ(told.exit_status, 1);
  }
}

class DeviceFacts : public DeviceTest {};

TEST_F(DeviceFacts, ASetIsNeededByAnyLinkIntoIt) {
  install_update("2024a.1.0", "44l");
  make_directory("/var/db/elsewhere");
  make_link(update("2024b.1.0"), "/var/db/elsewhere");
  point_zoneinfo_at(update("2024a.1.0") + "/zoneinfo");
  make_link(icutz, update("2023d.1.0") + "/icutz");
  make_link(tz_latest, "tz/../tz/2024a.1.0");
  make_link(legacy_icutz, update("2022a") + "/icutz");
  EXPECT_EQ(needed_sets(),
            (std::set<std::string>{"2022a", "2023d.1.0", "2024a.1.0"}));
  wipe(zoneinfo);
  EXPECT_TRUE(needed_sets().contains("2024a.1.0")) << "by the way of tz_latest";
}

TEST_F(DeviceFacts, TheUsersZoneIsReadFromTheTextAndHasToBeThere) {
  install_system("2023c", "44l");
  point_links_at_system();
  make_file(system_tree + "/Asia/Tokyo");
  for (const auto& [text, zone] :
       std::vector<std::pair<std::string, std::string>>{
           {zoneinfo + "/Europe/Paris", "Europe/Paris"},
           {zoneinfo + "//Europe/./Paris", "/Europe/./Paris"},
           {"/usr/share/zoneinfo/Asia/Tokyo", "Asia/Tokyo"},
           {zoneinfo + "/Mars/Base", ""},
           {zoneinfo + "/Europe", ""},
           {zoneinfo, ""},
           {zoneinfo + "x/Europe/Paris", ""},
           {zoneinfo + "/../zoneinfo/Europe/Paris", ""},
           {"/elsewhere/Europe/Paris", ""}}) {
    point_localtime_at(text);
    EXPECT_EQ(zone_of_the_user(), zone) << text;
  }
  wipe(local_time);
  EXPECT_EQ(zone_of_the_user(), "");
}

// Whatever order a directory has, and as the boot reads it.
TEST_F(DeviceFacts, ASetFitsByAFileThatTheBootCounts) {
  install_system("2023c", "44l");
  install_update("2024a.1.0", "44l");
  const std::string file = update("2024a.1.0") + "/icutz/icutz44l.dat";
  EXPECT_TRUE(fits_system("2024a.1.0"));
  set_mode(file, 0600);
  EXPECT_FALSE(printed_by([] { fits_system("2024a.1.0"); }).empty());
  EXPECT_FALSE(fits_system("2024a.1.0"));
  make_link(file, system_icu + "/icutzformat.txt");
  EXPECT_FALSE(fits_system("2024a.1.0"));
  EXPECT_FALSE(fits_system("2024b.1.0")) << "is not there";
}

TEST_F(DeviceFacts, NoTextPrintsALine) {
  quietly([] {
    for (const char* text :
         {"", "x", "2024", "2024a.99999999999", "99999999999999a", "2024a\n"})
      EXPECT_FALSE(version_in(text)) << text;
    EXPECT_TRUE(version_in("2024a.1.0"));
    EXPECT_EQ(system_version() + system_schema(), ".1.0");
  });
}

}  // namespace
