// SPDX-License-Identifier: BSD-2-Clause
//
// Whole boots with the real program.
#include <sys/resource.h>
#include <sys/stat.h>

#include <cerrno>
#include <csignal>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string invalid_links =
    "Invalid current symlinks; resetting to system partition";
const std::string incompatible =
    "Symlink points at data incompatible with installed system";
const std::string unable_to_locate =
    "Unable to locate data; resetting to system partition";

std::string not_activated(const std::string& update,
                          const std::string& current) {
  return "New update not compatible or older version: " + update + " vs. " +
         current;
}

// What a reset prints when the old "zoneinfo" cannot be removed.
std::vector<::testing::Matcher<std::string>> lines_of_a_failed_reset(
    int error) {
  return {failure("remove: could not remove /var/db/timezone/zoneinfo", error),
          failure("Unlink of zoneinfo softlink failed", error),
          failure("create_symlink: from /var/db/timezone/zoneinfo to "
                  "/usr/share/zoneinfo.default",
                  EEXIST)};
}

// A sound device: system 2023c with ICU schema 44l, never updated.
class StartupPass : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_system("2023c", "44l");
    point_links_at_system();
  }

  static void expect_links_at_system() {
    EXPECT_EQ(link_at(zoneinfo), "/usr/share/zoneinfo.default");
    EXPECT_EQ(link_at(icutz), nothing);
  }
  static void expect_links_at_update(const std::string& version) {
    EXPECT_EQ(link_at(zoneinfo),
              "/var/db/timezone/tz/" + version + "/zoneinfo");
    EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/" + version + "/icutz");
  }
  // Boots, and expects an exit with status 0 after these lines.
  template <typename Lines>
  static void boot_prints(const Lines& expected) {
    const outcome booted = boot();
    EXPECT_EQ(booted.exit_status, 0);
    EXPECT_THAT(booted.lines(), expected);
  }
  // Boots, and expects that this changes nothing, down to inodes and times.
  template <typename Lines>
  static void boot_changes_nothing_and_prints(const Lines& expected) {
    const auto before = look_at_everything();
    boot_prints(expected);
    EXPECT_EQ(look_at_everything(), before);
  }
};

// --- Nothing to do

TEST_F(StartupPass, TouchesNothingOnADeviceThatWasNeverUpdated) {
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(StartupPass, TouchesNothingWhileAnUpdateIsActive) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(StartupPass, KeepsAnUpdateOfTheSystemsOwnVersion) {
  install_update("2023c.1.0", "44l");
  point_links_at_update("2023c.1.0");
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(StartupPass, KeepsARecordOnBootsThatActivateNothing) {
  make_file(record, "2022a.1.0_2023c.1.0");
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(StartupPass, IgnoresItsArgumentsAndEnvironment) {
  const auto before = look_at_everything();
  const outcome booted =
      run({MARLIN_PROGRAM, "--help", "/var/db/timezone"}, [] {
        ::setenv("TZ", "Mars/Base", 1);
        ::setenv("TZDIR", "/var/db", 1);
      });
  EXPECT_EQ(booted.exit_status, 0);
  EXPECT_EQ(booted.log, "");
  EXPECT_EQ(look_at_everything(), before);
}

// --- Updates

TEST_F(StartupPass, ActivatesACompatibleNewerUpdate) {
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  boot_prints(no_lines());
  expect_links_at_update("2024a.1.0");
  EXPECT_EQ(file_at(record), "2023c.1.0_2024a.1.0");
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(StartupPass, ActivatesAnUpdateOverAnEarlierOne) {
  install_update("2024a.1.0", "44l");
  install_update("2024b.1.0", "44l");
  point_links_at_update("2024a.1.0");
  announce("2024b.1.0");
  make_file(record, std::string(100, 'x'));
  boot_prints(no_lines());
  expect_links_at_update("2024b.1.0");
  EXPECT_EQ(file_at(record), "2024a.1.0_2024b.1.0");
}

TEST_F(StartupPass, ReportsTheActiveUpdateAnnouncedAgainOnEveryBoot) {
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  boot();
  for (int boots = 0; boots < 3; ++boots) {
    boot_changes_nothing_and_prints(
        lines(failure(not_activated("2024a.1.0", "2024a.1.0"), ENOENT)));
  }
}

TEST_F(StartupPass, RefusesAnUpdateThatIsNotNewer) {
  install_update("2023b.1.0", "44l");
  install_update("2023c.1.0", "44l");
  for (const std::string version : {"2023b.1.0", "2023c.1.0"}) {
    announce(version);
    boot_changes_nothing_and_prints(
        lines(failure(not_activated(version, "2023c.1.0"), ENOENT)));
  }
}

TEST_F(StartupPass, RefusesAnUpdateOfAnotherSchema) {
  install_update("2024a.1.0", "45l");
  announce("2024a.1.0");
  boot_changes_nothing_and_prints(
      lines(failure(not_activated("2024a.1.0", "2023c.1.0"), ENOENT)));
}

TEST_F(StartupPass, RefusesAnUpdateWithoutIcuData) {
  install_update("2024a.1.0", "44l");
  wipe(update("2024a.1.0") + "/icutz");
  announce("2024a.1.0");
  boot_changes_nothing_and_prints(
      lines(failure("No ICU schema found for /var/db/timezone/tz/2024a.1.0", 0),
            failure(not_activated("2024a.1.0", "2023c.1.0"), 0)));
}

TEST_F(StartupPass, ActivatesAnUpdateWithoutASchemaOnASystemWithoutOne) {
  wipe(system_icu);
  make_directory(update("2024a.1.0"));
  announce("2024a.1.0");
  boot_prints(lines(
      failure("No ICU schema found for /var/db/timezone/tz/2024a.1.0", 0)));
  expect_links_at_update("2024a.1.0");
}

TEST_F(StartupPass, RefusesAnUpdateWhoseNameIsNoVersion) {
  install_update("newest", "44l");
  announce("newest");
  boot_changes_nothing_and_prints(lines(
      failure("Cannot parse version string newest, results.size() = 0", ENOENT),
      failure("Cannot parse version string newest", ENOENT),
      failure(not_activated("newest", "2023c.1.0"), ENOENT)));
}

TEST_F(StartupPass, RefusesAnAnnouncementWithATrailingSlashAsUnparseable) {
  install_update("2024a.1.0", "44l");
  make_link(tz_latest, update("2024a.1.0") + "/");
  boot_changes_nothing_and_prints(lines(
      failure("Cannot parse version string 2024a.1.0/, results.size() = 0",
              ENOENT),
      failure("Cannot parse version string 2024a.1.0/", ENOENT),
      failure(not_activated("2024a.1.0/", "2023c.1.0"), ENOENT)));
}

TEST_F(StartupPass, ComparesTheUpdateWithTheCurrentSetAndNotWithTheSystem) {
  install_update("2024b.1.0", "44l");
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024b.1.0");
  announce("2024a.1.0");
  boot_changes_nothing_and_prints(
      lines(failure(not_activated("2024a.1.0", "2024b.1.0"), ENOENT)));
}

TEST_F(StartupPass, ActivatesAnUpdateThoughItsAnnouncedDirectoryIsMissing) {
  // Only the schema is compared, and here neither has one. The links then lead
  // nowhere, and the next boot finds nothing wrong with them.
  wipe(system_icu);
  make_link(tz_latest, update("2024a.1.0"));
  boot_prints(lines(
      failure("No ICU schema found for /var/db/timezone/tz/2024a.1.0", 0)));
  expect_links_at_update("2024a.1.0");
}

// --- The end of a line that follows no failing call

TEST_F(StartupPass, EndsALineInTheErrorOfTheLastCallThatFailed) {
  install_update("2023b.1.0", "44l");
  announce("2023b.1.0");
  // The legacy link was looked for, and "/var/db/icu".
  boot_prints(lines(failure(not_activated("2023b.1.0", "2023c.1.0"), ENOENT)));
  point_links_at_update("2023b.1.0");
  boot_prints(lines(failure(incompatible, ENOENT),
                    failure(not_activated("2023b.1.0", "2023b.1.0"), ENOENT)));

  make_file(old_icu + "/file");
  boot_prints(
      lines(failure(not_activated("2023b.1.0", "2023c.1.0"), ENOTEMPTY)));
  make_link(tz_latest, "nonsense");
  boot_prints(lines(
      failure("mln_dataset::create_components: bad path nonsense", ENOENT),
      failure(unable_to_locate, ENOENT)));
  wipe(tz_latest);
  point_zoneinfo_at("nonsense");
  boot_prints(lines(failure("Bad zoneinfo link nonsense", ENOENT),
                    failure(invalid_links, ENOENT)));
}

TEST_F(StartupPass, EndsALineInSuccessAfterAWalkToTheEnd) {
  make_directory(update("2024a.1.0") + "/icutz");
  announce("2024a.1.0");
  boot_prints(
      lines(failure("No ICU schema found for /var/db/timezone/tz/2024a.1.0", 0),
            failure(not_activated("2024a.1.0", "2023c.1.0"), 0)));
}

// --- Links that make no sense

TEST_F(StartupPass, KeepsALinkToAnotherNameInTheDataSet) {
  install_update("2024a.1.0", "44l");
  point_zoneinfo_at(update("2024a.1.0") + "/icutz");
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(StartupPass, ResetsLinksThatWereWiped) {
  wipe(zoneinfo);
  wipe(local_time);
  boot_prints(lines(
      failure("Bad zoneinfo link ", ENOENT), failure(invalid_links, ENOENT),
      failure("localtime link invalid; resetting to America/Los_Angeles",
              ENOENT)));
  expect_links_at_system();
  EXPECT_EQ(link_at(local_time), default_localtime);
  EXPECT_EQ(file_at(record), nothing);
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(StartupPass, ResetsAZoneinfoLinkThatNamesNoDataSet) {
  point_zoneinfo_at("/usr/share/zoneinfo");
  make_link(icutz, "/var/db/old");
  boot_prints(lines(failure("Bad zoneinfo link /usr/share/zoneinfo", ENOENT),
                    failure(invalid_links, ENOENT)));
  expect_links_at_system();
}

TEST_F(StartupPass, ReplacesAFileInPlaceOfTheZoneinfoLink) {
  wipe(zoneinfo);
  make_file(zoneinfo);
  boot_prints(lines(failure("read_symlink: /var/db/timezone/zoneinfo", EINVAL),
                    failure(invalid_links, EINVAL)));
  expect_links_at_system();
}

TEST_F(StartupPass, StillActivatesAnUpdateAfterResettingBadLinks) {
  point_zoneinfo_at("nonsense");
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  boot_prints(lines(failure("Bad zoneinfo link nonsense", ENOENT),
                    failure(invalid_links, ENOENT)));
  expect_links_at_update("2024a.1.0");
  EXPECT_EQ(file_at(record), "2023c.1.0_2024a.1.0");
}

TEST_F(StartupPass, StillRefusesAnUpdateAfterResettingBadLinks) {
  point_zoneinfo_at("nonsense");
  install_update("2024a.1.0", "45l");
  announce("2024a.1.0");
  boot_prints(lines(failure("Bad zoneinfo link nonsense", ENOENT),
                    failure(invalid_links, ENOENT),
                    failure(not_activated("2024a.1.0", "2023c.1.0"), ENOENT)));
  expect_links_at_system();
  EXPECT_EQ(file_at(record), nothing);
}

// --- A current set that cannot be used any more

TEST_F(StartupPass, ResetsAnUpdateThatASystemUpgradeOvertook) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  install_system("2024b", "44l");
  boot_prints(lines(failure(incompatible, ENOENT)));
  expect_links_at_system();
  EXPECT_EQ(file_at(record), nothing);
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(StartupPass, ResetsAnUpdateOfAnotherSchemaThanTheSystems) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  install_system("2023c", "45l");
  boot_prints(lines(failure(incompatible, ENOENT)));
  expect_links_at_system();
}

TEST_F(StartupPass, ResetsAnUpdateThatIsGone) {
  point_links_at_update("2024a.1.0");
  boot_prints(
      lines(failure("No ICU schema found for /var/db/timezone/tz/2024a.1.0", 0),
            failure(incompatible, 0)));
  expect_links_at_system();
}

TEST_F(StartupPass, ResetsACurrentSetWhoseNameIsNoVersion) {
  install_update("odd", "44l");
  point_links_at_update("odd");
  boot_prints(lines(
      failure("Cannot parse version string odd, results.size() = 0", ENOENT),
      failure("Cannot parse version string odd", ENOENT),
      failure(incompatible, ENOENT)));
  expect_links_at_system();
}

TEST_F(StartupPass, ReadsTheSystemsDataAnewForAReset) {
  install_update("2024a.1.0", "45l");
  wipe(system_tree + "/+VERSION");
  const auto first =
      failure("Cannot parse version string .1.0, results.size() = 0", ENOENT);
  const auto second = failure("Cannot parse version string .1.0", ENOENT);

  point_links_at_update("2024a.1.0");
  boot_prints(
      lines(first, second, failure(incompatible, ENOENT), first, second));
  // Here the current data set becomes the system's, and is read as well.
  point_zoneinfo_at("nonsense");
  boot_prints(
      lines(first, second, failure("Bad zoneinfo link nonsense", ENOENT),
            failure(invalid_links, ENOENT), first, second, first, second));
}

TEST_F(StartupPass, StillComparesWithTheOldCurrentSetAfterAReset) {
  // 2024b is newer than the 2024a that was current, so it is activated, though
  // the system's 2025a, to which the links were just reset, is newer still.
  install_update("2024a.1.0", "44l");
  install_update("2024b.1.0", "44l");
  point_links_at_update("2024a.1.0");
  install_system("2025a", "44l");
  announce("2024b.1.0");
  boot_prints(lines(failure(incompatible, ENOENT)));
  expect_links_at_update("2024b.1.0");

  // The next boot finds it older than the system, and announced once more.
  boot_prints(lines(failure(incompatible, ENOENT),
                    failure(not_activated("2024b.1.0", "2024b.1.0"), ENOENT)));
  expect_links_at_system();

  boot_changes_nothing_and_prints(
      lines(failure(not_activated("2024b.1.0", "2025a.1.0"), ENOENT)));
}

TEST_F(StartupPass, RecordsTheSystemVersionFirstAfterAReset) {
  install_update("2024a.1.0", "44l");
  install_update("2026a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  install_system("2025a", "44l");
  announce("2026a.1.0");
  boot_prints(lines(failure(incompatible, ENOENT)));
  expect_links_at_update("2026a.1.0");
  EXPECT_EQ(file_at(record), "2025a.1.0_2026a.1.0");
}

TEST_F(StartupPass, TakesTheSystemsSchemaForTheUpdateAlsoAfterAReset) {
  install_update("2024a.1.0", "44l");
  install_update("2026a.1.0", "44l");
  install_update("2026b.1.0", "45l");
  point_links_at_update("2024a.1.0");
  install_system("2023c", "45l");
  announce("2026a.1.0");
  boot_prints(lines(failure(incompatible, ENOENT),
                    failure(not_activated("2026a.1.0", "2024a.1.0"), ENOENT)));
  expect_links_at_system();

  point_links_at_update("2024a.1.0");
  announce("2026b.1.0");
  boot_prints(lines(failure(incompatible, ENOENT)));
  expect_links_at_update("2026b.1.0");
  EXPECT_EQ(file_at(record), "2023c.1.0_2026b.1.0");
}

TEST_F(StartupPass, RefusesTheOvertakenUpdateThatIsStillAnnounced) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  announce("2024a.1.0");
  install_system("2024b", "44l");
  boot_prints(lines(failure(incompatible, ENOENT),
                    failure(not_activated("2024a.1.0", "2024a.1.0"), ENOENT)));
  expect_links_at_system();
  boot_changes_nothing_and_prints(
      lines(failure(not_activated("2024a.1.0", "2024b.1.0"), ENOENT)));
}

// --- The last resort

TEST_F(StartupPass, ResetsValidLinksWhenTheAnnouncementIsAFile) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  make_file(tz_latest);
  boot_prints(lines(failure("read_symlink: /var/db/timezone/tz_latest", EINVAL),
                    failure(unable_to_locate, EINVAL)));
  expect_links_at_system();
}

TEST_F(StartupPass, ReadsTheAnnouncementBeforeTheCurrentLinks) {
  point_zoneinfo_at("nonsense");
  make_file(tz_latest);
  boot_prints(lines(failure("read_symlink: /var/db/timezone/tz_latest", EINVAL),
                    failure(unable_to_locate, EINVAL)));
  expect_links_at_system();
}

TEST_F(StartupPass, ResetsValidLinksWhenTheAnnouncementIsOutsideTheDownloads) {
  install_update("2024a.1.0", "44l");
  for (const std::string target :
       {"tz/2024a.1.0", "/usr/share/zoneinfo.default", "/var/db/timezone/tz/",
        "/var/db/timezone/tz"}) {
    point_links_at_update("2024a.1.0");
    make_link(tz_latest, target);
    boot_prints(lines(
        failure("mln_dataset::create_components: bad path " + target, ENOENT),
        failure(unable_to_locate, ENOENT)));
    expect_links_at_system();
    EXPECT_EQ(link_at(tz_latest), target);
  }
}

TEST_F(StartupPass, PrintsTheLastResortAfterEarlierLinesOfThePass) {
  point_zoneinfo_at("nonsense");
  make_link(tz_latest, "nonsense too");
  boot_prints(lines(
      failure("Bad zoneinfo link nonsense", ENOENT),
      failure(invalid_links, ENOENT),
      failure("mln_dataset::create_components: bad path nonsense too", ENOENT),
      failure(unable_to_locate, ENOENT)));
  expect_links_at_system();
}

TEST_F(StartupPass, ResetsWhenTheUpdatesNumbersDoNotFit) {
  install_update("2147483648a", "44l");
  announce("2147483648a");
  boot_prints(lines(failure(unable_to_locate, ENOENT)));
  expect_links_at_system();
}

TEST_F(StartupPass, ResetsWhenTheCurrentSetsNumbersDoNotFit) {
  install_update("1a.99999999999", "44l");
  point_links_at_update("1a.99999999999");
  boot_prints(lines(failure(unable_to_locate, ENOENT)));
  expect_links_at_system();
}

TEST_F(StartupPass, UndoesAnActivationThatStopsHalfway) {
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  make_directory(icutz);
  boot_prints(
      lines(failure("remove: could not remove /var/db/timezone/icutz", EISDIR),
            failure("unlink of ICU softlink failed", EISDIR),
            failure("create_symlink: from /var/db/timezone/icutz to "
                    "/var/db/timezone/tz/2024a.1.0/icutz",
                    EEXIST),
            failure(unable_to_locate, EEXIST),
            failure("remove: could not remove /var/db/timezone/icutz", EISDIR),
            failure("unlink of ICU softlink failed", EISDIR)));
  EXPECT_EQ(link_at(zoneinfo), "/usr/share/zoneinfo.default");
  EXPECT_EQ(file_at(record), nothing);
}

TEST_F(StartupPass, StillRepairsTheLocalTimeAfterTheLastResort) {
  make_file(tz_latest);
  wipe(local_time);
  boot_prints(
      lines(failure("read_symlink: /var/db/timezone/tz_latest", EINVAL),
            failure(unable_to_locate, EINVAL),
            failure("localtime link invalid; resetting to America/Los_Angeles",
                    ENOENT)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(StartupPass, EndsWithADefaultLocalTimeWhenTheCorrectedLinkFails) {
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  const outcome booted =
      run({"/usr/bin/strace", "-qq", "-o", "/dev/null", "-E",
           "ASAN_OPTIONS=detect_leaks=0", "-e",
           "inject=?symlink,symlinkat:error=EIO:when=1", MARLIN_PROGRAM});
  EXPECT_EQ(booted.exit_status, 0);
  EXPECT_THAT(
      booted.lines(),
      lines(failure("Correcting localtime link to "
                    "/var/db/timezone/zoneinfo/Europe/Paris",
                    ENOENT),
            failure("create_symlink: from /var/db/timezone/localtime to "
                    "/var/db/timezone/zoneinfo/Europe/Paris",
                    EIO),
            failure("localtime link invalid; resetting to America/Los_Angeles",
                    EIO)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

// --- Ends that are not an exit

TEST_F(StartupPass, EndsAbnormallyWhenTheLastResortFails) {
  wipe(zoneinfo);
  make_directory(zoneinfo);
  wipe(local_time);
  const outcome booted = boot();
  EXPECT_EQ(booted.signal, SIGABRT);
  const auto reset = lines_of_a_failed_reset(EISDIR);
  EXPECT_THAT(
      booted.lines(),
      lines(failure("read_symlink: /var/db/timezone/zoneinfo", EINVAL),
            failure(invalid_links, EINVAL), reset[0], reset[1], reset[2],
            failure(unable_to_locate, EEXIST), reset[0], reset[1], reset[2],
            ::testing::StartsWith("terminate called")));
  EXPECT_EQ(link_at(local_time), nothing) << "the repair ran all the same";
}

TEST_F(StartupPass, EndsAbnormallyWhenTheSystemsOwnNumbersDoNotFit) {
  install_system("2147483648a", "44l");
  const auto before = look_at_everything();
  const outcome booted = boot();
  EXPECT_EQ(booted.signal, SIGABRT);
  EXPECT_THAT(booted.lines(), lines(failure(unable_to_locate, ENOENT),
                                    ::testing::StartsWith("terminate called"),
                                    ::testing::StartsWith("  what():")));
  EXPECT_EQ(look_at_everything(), before);
}

TEST_F(StartupPass, EndsAbnormallyWhenTheLocalTimeCannotBeReset) {
  wipe(local_time);
  make_file(local_time + "/in-the-way");
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  const outcome booted = boot();
  EXPECT_EQ(booted.signal, SIGABRT);
  EXPECT_THAT(
      booted.lines(),
      lines(failure("read_symlink: /var/db/timezone/localtime", EINVAL),
            failure("localtime link invalid; resetting to America/Los_Angeles",
                    EINVAL),
            failure("create_symlink: from /var/db/timezone/localtime to "
                    "/var/db/timezone/zoneinfo/America/Los_Angeles",
                    EEXIST),
            ::testing::StartsWith("terminate called")));
  expect_links_at_update("2024a.1.0");
  EXPECT_EQ(file_at(record), "2023c.1.0_2024a.1.0");
}

TEST_F(StartupPass, EndsAbnormallyWithoutATimezoneDirectory) {
  wipe(timezone_root);
  const outcome booted = boot();
  EXPECT_EQ(booted.signal, SIGABRT);
  const auto no_link = failure(
      "create_symlink: from /var/db/timezone/zoneinfo to "
      "/usr/share/zoneinfo.default",
      ENOENT);
  EXPECT_THAT(booted.lines(), lines(failure("Bad zoneinfo link ", ENOENT),
                                    failure(invalid_links, ENOENT), no_link,
                                    failure(unable_to_locate, ENOENT), no_link,
                                    ::testing::StartsWith("terminate called")));
}

TEST_F(StartupPass, EndsAbnormallyInADirectoryThatCannotBeWritten) {
  point_zoneinfo_at("nonsense");
  set_mode(timezone_root, 0555);
  const auto before = look_at_everything();
  const outcome booted = boot();
  EXPECT_EQ(booted.signal, SIGABRT);
  const auto reset = lines_of_a_failed_reset(EACCES);
  EXPECT_THAT(
      booted.lines(),
      lines(failure("Bad zoneinfo link nonsense", ENOENT),
            failure(invalid_links, ENOENT), reset[0], reset[1], reset[2],
            failure(unable_to_locate, EEXIST), reset[0], reset[1], reset[2],
            ::testing::StartsWith("terminate called")));
  EXPECT_EQ(look_at_everything(), before);
}

TEST_F(StartupPass, NeedsNoWritableDirectoryWhenThereIsNothingToDo) {
  set_mode(timezone_root, 0555);
  boot_changes_nothing_and_prints(no_lines());
}

// --- The first steps

TEST_F(StartupPass, MovesTheLegacyLinkBeforeLookingAtAnyData) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  wipe(icutz);
  make_link(legacy_icutz, update("2024a.1.0") + "/icutz");
  boot_prints(no_lines());
  expect_links_at_update("2024a.1.0");
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(StartupPass, DeletesADanglingLegacyLinkWithTheNextReset) {
  make_link(legacy_icutz, "/var/db/gone");
  boot_changes_nothing_and_prints(no_lines());
  wipe(zoneinfo);
  boot();
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(StartupPass, RemovesTheObsoleteIcuLinkFileOrEmptyDirectory) {
  make_link(old_icu, "/var/db/gone");
  boot_prints(no_lines());
  EXPECT_EQ(link_at(old_icu), nothing);
  make_file(old_icu);
  boot_prints(no_lines());
  EXPECT_EQ(link_at(old_icu), nothing);
  make_directory(old_icu);
  boot_prints(no_lines());
  EXPECT_EQ(link_at(old_icu), nothing);
}

TEST_F(StartupPass, QuietlyLeavesANonEmptyObsoleteIcuDirectoryAtEveryBoot) {
  make_file(old_icu + "/file");
  boot_changes_nothing_and_prints(no_lines());
  boot_changes_nothing_and_prints(no_lines());
}

// --- What is read, and how often

TEST_F(StartupPass, ReadsTheSystemPartitionAnewForEveryDataSetOfIts) {
  // As the system's, as the current set, and for the reset after "invalid".
  wipe(system_tree);
  wipe(zoneinfo);
  const auto first =
      failure("Cannot parse version string .1.0, results.size() = 0", ENOENT);
  const auto second = failure("Cannot parse version string .1.0", ENOENT);
  boot_prints(lines(first, second, failure("Bad zoneinfo link ", ENOENT),
                    failure(invalid_links, ENOENT), first, second, first,
                    second));
  expect_links_at_system();
}

TEST_F(StartupPass, ActivatesAnUpdateOnASystemWithoutAVersion) {
  wipe(system_tree);
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  const outcome booted = boot();
  EXPECT_EQ(booted.exit_status, 0);
  expect_links_at_update("2024a.1.0");
  EXPECT_EQ(file_at(record), ".1.0_2024a.1.0");
}

TEST_F(StartupPass, KeepsNulBytesOfTheSystemsVersionInTheRecord) {
  const std::string release("20\0", 3);
  install_system(release, "44l");
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  const auto first =
      failure("Cannot parse version string 20, results.size() = 0", ENOENT);
  const auto second = failure("Cannot parse version string 20", ENOENT);
  boot_prints(lines(first, second, first, second));
  EXPECT_EQ(file_at(record), release + ".1.0_2024a.1.0");
}

TEST_F(StartupPass, GoesOnWithoutARecordThatCannotBeWritten) {
  make_directory(record);
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  point_localtime_at("/nowhere");
  // The failure is not reported, but the next line ends in it.
  boot_prints(lines(failure(
      "localtime link invalid; resetting to America/Los_Angeles", EISDIR)));
  expect_links_at_update("2024a.1.0");
}

TEST_F(StartupPass, BuildsTheSystemsSetBeforeReadingTheAnnouncement) {
  wipe(system_tree);
  make_file(tz_latest);
  const auto first =
      failure("Cannot parse version string .1.0, results.size() = 0", ENOENT);
  const auto second = failure("Cannot parse version string .1.0", ENOENT);
  boot_prints(lines(first, second,
                    failure("read_symlink: /var/db/timezone/tz_latest", EINVAL),
                    failure(unable_to_locate, EINVAL), first, second));
}

TEST_F(StartupPass, ChecksTheCurrentSetBeforeBuildingTheUpdate) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  install_system("2025a", "44l");
  make_link(tz_latest, "nonsense");
  boot_prints(lines(
      failure(incompatible, ENOENT),
      failure("mln_dataset::create_components: bad path nonsense", ENOENT),
      failure(unable_to_locate, ENOENT)));
  expect_links_at_system();
}

TEST_F(StartupPass, MigratesTheLegacyLinkBeforeReadingAnyLink) {
  make_directory(legacy_icutz);
  wipe(zoneinfo);
  boot_prints(lines(
      failure("read_symlink: /var/db/icutz", EINVAL),
      failure("Could not migrate /var/db/icutz to /var/db/timezone/icutz",
              EINVAL),
      failure("remove: could not remove /var/db/icutz", EISDIR),
      failure("Could not remove /var/db/icutz", EISDIR),
      failure("Bad zoneinfo link ", ENOENT), failure(invalid_links, ENOENT),
      failure("remove: could not remove /var/db/icutz", EISDIR),
      failure("unlink of ICU softlink failed", EISDIR)));
  expect_links_at_system();
}

TEST_F(StartupPass, MovesALegacyLinkThatResolvesThroughTheObsoleteIcu) {
  make_directory(old_icu);
  make_link(legacy_icutz, old_icu);
  boot_prints(no_lines());
  EXPECT_EQ(link_at(icutz), old_icu);
  EXPECT_EQ(link_at(legacy_icutz), nothing);
  EXPECT_EQ(link_at(old_icu), nothing);
}

TEST_F(StartupPass, RemovesTheObsoleteIcuBeforeAnythingThatCanEndTheBoot) {
  make_file(old_icu);
  install_system("2147483648a", "44l");
  EXPECT_EQ(boot().signal, SIGABRT);
  EXPECT_EQ(link_at(old_icu), nothing);
}

TEST_F(StartupPass, TakesTheLastResortWhenTheResetOfAnOldSetFails) {
  install_update("2024a.1.0", "44l");
  point_links_at_update("2024a.1.0");
  install_system("2025a", "44l");
  set_mode(timezone_root, 0555);
  const auto before = look_at_everything();
  const outcome booted = boot();
  EXPECT_EQ(booted.signal, SIGABRT);
  const auto reset = lines_of_a_failed_reset(EACCES);
  EXPECT_THAT(booted.lines(),
              lines(failure(incompatible, ENOENT), reset[0], reset[1], reset[2],
                    failure(unable_to_locate, EEXIST), reset[0], reset[1],
                    reset[2], ::testing::StartsWith("terminate called")));
  EXPECT_EQ(look_at_everything(), before);
}

TEST_F(StartupPass, KeepsARecordThroughEveryReset) {
  make_file(record, "2022a.1.0_2023c.1.0");
  const auto before = look_at({record});
  const auto reset = [&] {
    EXPECT_EQ(boot().exit_status, 0);
    expect_links_at_system();
    EXPECT_EQ(look_at({record}), before);
  };
  point_zoneinfo_at("nonsense");
  reset();
  install_update("2022b.1.0", "44l");
  point_links_at_update("2022b.1.0");
  reset();
  make_file(tz_latest);
  reset();
}

TEST_F(StartupPass, CreatesTheRecordWithTheDefaultPermissions) {
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  for (const mode_t mask : {0022u, 0077u, 0u}) {
    point_links_at_system();
    wipe(record);
    const outcome booted = run({MARLIN_PROGRAM}, [mask] { ::umask(mask); });
    EXPECT_EQ(booted.exit_status, 0);
    EXPECT_EQ(look_at({record}).at(record).mode, S_IFREG | (0666u & ~mask));
  }
}

TEST_F(StartupPass, GoesOnWhenTheRecordCannotBeWrittenWhole) {
  install_update("2024a.1.0", "44l");
  announce("2024a.1.0");
  make_file(record, std::string(100, 'x'));
  const outcome booted = run({MARLIN_PROGRAM}, [] {
    ::signal(SIGXFSZ, SIG_IGN);
    const rlimit limit{5, 5};
    ::setrlimit(RLIMIT_FSIZE, &limit);
  });
  EXPECT_EQ(booted.exit_status, 0);
  EXPECT_EQ(booted.log, "");
  EXPECT_EQ(file_at(record), "2023c");
  expect_links_at_update("2024a.1.0");
}

}  // namespace
