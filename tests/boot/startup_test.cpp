// SPDX-License-Identifier: BSD-2-Clause
//
// Whole boots with the real program.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <tuple>

#include "tests/device/device.h"

using namespace device;

namespace {

// A sound device on which an update was in use before: it has left its record.
class StartupPass : public SoundDeviceTest {
 protected:
  void SetUp() override {
    SoundDeviceTest::SetUp();
    make_file(record, std::string(100, 'x'));
  }

  // Boots, and expects the system's links and the old record after these lines.
  template <typename... Lines>
  static void boot_resets(const Lines&... expected) {
    const auto before = look_at({record});
    boot_prints(expected...);
    expect_links_at_system();
    EXPECT_EQ(look_at({record}), before);
  }

  // Boots, and expects this update's links and a record of both versions.
  template <typename... Lines>
  static void boot_activates(const std::string& version,
                             const std::string& from,
                             const Lines&... expected) {
    boot_prints(expected...);
    expect_activated(version, from);
  }
  static void expect_activated(const std::string& version,
                               const std::string& from) {
    expect_links_at_update(version);
    EXPECT_EQ(file_at(record), from + "_" + version);
  }

  // Boots, and expects an abnormal end after these lines. What the language's
  // library prints at such an end is its own.
  template <typename... Lines>
  static void boot_aborts_after(const Lines&... expected) {
    const outcome booted = boot();
    EXPECT_EQ(booted.signal, SIGABRT);
    log_lines printed = booted.lines();
    std::erase_if(printed, [](const std::string& line) {
      return line.starts_with("terminate called") ||
             line.starts_with("  what():");
    });
    EXPECT_EQ(printed, lines(expected...));
  }

  // Of a reset when the old "zoneinfo" cannot be removed.
  static log_lines failed_reset(int error) {
    return lines(zoneinfo_stays(error),
                 cannot_link(zoneinfo, system_tree, EEXIST));
  }
};

// --- Nothing to do

TEST_F(StartupPass, TouchesNothingOnADeviceThatWasNeverUpdated) {
  boot_only_prints();
  wipe(record);
  boot_only_prints();
}

TEST_F(StartupPass, TouchesNothingWhileAnUpdateIsActiveThatIsNotOlder) {
  for (const std::string version : {"2024a.1.0", "2023c.1.0"}) {
    install_and_use(version, "44l");
    boot_only_prints();
  }
}

TEST_F(StartupPass, IgnoresItsArgumentsAndEnvironment) {
  expect_nothing_changed_by([] {
    const outcome booted =
        run({MARLIN_PROGRAM, "--help", "/var/db/timezone"}, [] {
          ::setenv("TZ", "Mars/Base", 1);
          ::setenv("TZDIR", "/var/db", 1);
        });
    EXPECT_EQ(booted.exit_status, 0);
    EXPECT_EQ(booted.log, "");
  });
}

// --- Updates

TEST_F(StartupPass, ActivatesACompatibleNewerUpdate) {
  for (const std::string version : {"2024a.1.0", "2024a"}) {
    point_links_at_system();
    install_and_announce(version, "44l");
    boot_activates(version, "2023c.1.0");
    EXPECT_EQ(link_at(local_time), default_localtime);
  }
}

// Later than a time of 32 bits can tell. Not the directories: there is an
// fts(3) with 64 bits that enters none of these.
TEST_F(StartupPass, ActivatesAnUpdateWithFilesOfTheYear2100) {
  install_and_announce("2024a.1.0", "44l");
  run({"/usr/bin/find", "/usr/share", "/var/db", "-type", "f", "-exec", "touch",
       "-d", "2100-01-01", "{}", "+"});
  boot_prints();
  expect_links_at_update("2024a.1.0");
}

// Its version equals the system's; the texts are recorded as they are.
TEST_F(StartupPass, ActivatesAnUpdateOverAnEarlierOne) {
  install_and_use("2023c.01.0", "44l");
  install_and_announce("2023c.02", "44l");
  boot_activates("2023c.02", "2023c.01.0");
}

TEST_F(StartupPass, ReportsTheActiveUpdateAnnouncedAgainOnEveryBoot) {
  install_and_announce("2024a.1.0", "44l");
  boot();
  for (int boots = 0; boots < 3; ++boots)
    boot_only_prints(refused("2024a.1.0", "2024a.1.0"));
}

TEST_F(StartupPass, RefusesAnUpdateThatIsNotNewerOrOfAnotherSchema) {
  for (const auto& [version, schema] :
       {std::pair("2023b.1.0", "44l"), std::pair("2023c.1.00", "44l"),
        std::pair("2024a.1.0", "45l")}) {
    install_and_announce(version, schema);
    boot_only_prints(refused(version, "2023c.1.0"));
  }
}

TEST_F(StartupPass, RefusesAnUpdateWithoutIcuData) {
  install_and_announce("2024a.1.0", "44l");
  const auto expected = lines(no_schema_in(update("2024a.1.0")),
                              refused("2024a.1.0", "2023c.1.0", 0));
  wipe(update("2024a.1.0") + "/icutz");
  boot_only_prints(expected);
  make_directory(update("2024a.1.0") + "/icutz");
  boot_only_prints(expected);
}

// Only the schema is compared, and here neither has one. The links may then
// lead nowhere.
TEST_F(StartupPass, ActivatesAnEmptyOrMissingUpdateOnASystemWithoutASchema) {
  wipe(system_icu);
  announce("2024a.1.0");
  boot_activates("2024a.1.0", "2023c.1.0", no_schema_in(update("2024a.1.0")));
  point_links_at_system();
  make_directory(update("2024a.1.0"));
  boot_activates("2024a.1.0", "2023c.1.0", no_schema_in(update("2024a.1.0")));
}

TEST_F(StartupPass, RefusesAnUpdateWhoseNameIsNoVersion) {
  install_update("newest", "44l");
  install_update("2024a.1.0", "44l");
  for (const std::string name : {"newest", "2024a.1.0/"}) {
    announce(name);
    boot_only_prints(unparsed(name), refused(name, "2023c.1.0"));
  }
  for (const std::string name : {"2024a.1.0/zoneinfo", "..", "%s%n"}) {
    announce(name);
    boot_only_prints(unparsed(name), no_schema_in(update(name)),
                     refused(name, "2023c.1.0", 0));
  }
}

TEST_F(StartupPass, ComparesTheUpdateWithTheCurrentSetAndNotWithTheSystem) {
  install_and_use("2024b.1.0", "44l");
  install_and_announce("2024a.1.0", "44l");
  boot_only_prints(refused("2024a.1.0", "2024b.1.0"));
}

// --- The end of a line that follows no failing call

TEST_F(StartupPass, EndsALineInTheErrorOfTheLastCallThatFailed) {
  install_and_announce("2023b.1.0", "44l");
  // The legacy link was looked for, and "/var/db/icu".
  boot_prints(refused("2023b.1.0", "2023c.1.0", ENOENT));
  make_file(old_icu + "/file");
  boot_prints(refused("2023b.1.0", "2023c.1.0", ENOTEMPTY));
  wipe(tz_latest);
  set_mode(system_tree + "/+VERSION", 0);
  const auto none = unparsed(".1.0", EACCES);
  boot_prints(none, none);
}

// --- Links that make no sense

TEST_F(StartupPass, ResetsLinksThatWereWiped) {
  wipe(zoneinfo);
  wipe(local_time);
  boot_resets(bad_zoneinfo_link(""), invalid_links(), resetting_localtime());
  EXPECT_EQ(link_at(local_time), default_localtime);
  boot_only_prints();
}

TEST_F(StartupPass, ReplacesAFileInPlaceOfTheZoneinfoLink) {
  make_file(zoneinfo);
  make_link(icutz, "/var/db/old");
  boot_resets(cannot_read(zoneinfo, EINVAL), invalid_links(EINVAL));
}

TEST_F(StartupPass, StillActivatesOrRefusesAnUpdateAfterResettingBadLinks) {
  const auto reset = lines(bad_zoneinfo_link("nonsense"), invalid_links());
  point_zoneinfo_at("nonsense");
  install_and_announce("2024b.1.0", "45l");
  boot_resets(reset, refused("2024b.1.0", "2023c.1.0"));

  point_zoneinfo_at("nonsense");
  install_and_announce("2024a.1.0", "44l");
  boot_activates("2024a.1.0", "2023c.1.0", reset);
}

// --- A current set that cannot be used any more

TEST_F(StartupPass, ResetsAnUpdateThatIsOlderThanTheSystemOrOfAnotherSchema) {
  for (const auto& [version, release, schema] :
       {std::tuple("2024b.1", "2024b", "44l"),
        std::tuple("2024a.1.0", "2023c", "45l")}) {
    install_and_use(version, "44l");
    install_system(release, schema);
    boot_resets(incompatible());
    boot_only_prints();
  }
}

TEST_F(StartupPass, ResetsAnUpdateThatIsGoneOrWhoseNameIsNoVersion) {
  point_links_at_update("2024a.1.0");
  boot_resets(no_schema_in(update("2024a.1.0")), incompatible(0));
  install_and_use("odd", "44l");
  boot_resets(unparsed("odd"), incompatible());
}

TEST_F(StartupPass, KeepsACurrentSetWithoutAVersionWhereTheSystemHasNone) {
  wipe(system_tree);
  install_and_use("odd", "44l");
  boot_only_prints(unparsed(".1.0"), unparsed("odd"));
}

TEST_F(StartupPass, ReadsTheSystemsDataAnewForAReset) {
  install_and_use("2024a.1.0", "45l");
  wipe(system_tree + "/+VERSION");
  const auto none = unparsed(".1.0");
  boot_resets(none, incompatible(), none);
  // Once for the system's set, for the reset, and for the current set.
  point_zoneinfo_at("nonsense");
  boot_resets(none, bad_zoneinfo_link("nonsense"), invalid_links(), none, none);
}

TEST_F(StartupPass, StillComparesWithTheOldCurrentSetAfterAReset) {
  // 2024b is newer than the 2024a that was current, so it is activated, though
  // the system's 2025a, to which the links were just reset, is newer still.
  install_and_use("2024a.1.0", "44l");
  install_and_announce("2024b.1.0", "44l");
  install_system("2025a", "44l");
  boot_activates("2024b.1.0", "2025a.1.0", incompatible());

  // The next boot finds it older than the system, and announced once more.
  boot_resets(incompatible(), refused("2024b.1.0", "2024b.1.0"));

  boot_only_prints(refused("2024b.1.0", "2025a.1.0"));
}

// Also where it equals the update's, or is newer.
TEST_F(StartupPass, RecordsTheSystemVersionFirstAfterAReset) {
  install_update("2024a.1.0", "44l");
  install_and_announce("2026a.1.0", "44l");
  for (const std::string release : {"2025a", "2026a", "2027a"}) {
    point_links_at_update("2024a.1.0");
    install_system(release, "44l");
    boot_activates("2026a.1.0", release + ".1.0", incompatible());
  }
}

TEST_F(StartupPass, TakesANulForAByteOfARelease) {
  const std::string release("2023c\0x", 7);
  install_system(release, "44l");
  install_and_announce("2024a.1.0", "44l");
  EXPECT_EQ(boot().exit_status, 0);
  expect_activated("2024a.1.0", release + ".1.0");
}

TEST_F(StartupPass, TakesTheSystemsSchemaForTheUpdateAlsoAfterAReset) {
  install_and_use("2024a.1.0", "44l");
  install_system("2023c", "45l");
  install_and_announce("2026a.1.0", "44l");
  boot_resets(incompatible(), refused("2026a.1.0", "2024a.1.0"));

  point_links_at_update("2024a.1.0");
  install_and_announce("2026b.1.0", "45l");
  boot_activates("2026b.1.0", "2023c.1.0", incompatible());
}

// --- The last resort

TEST_F(StartupPass,
       ResetsValidLinksAndRepairsTheLocalTimeWhenTheAnnouncementIsAFile) {
  install_and_use("2024a.1.0", "44l");
  make_file(tz_latest);
  wipe(local_time);
  boot_resets(cannot_read(tz_latest, EINVAL), unable_to_locate(EINVAL),
              resetting_localtime());
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(StartupPass, ReadsTheAnnouncementBeforeTheCurrentLinks) {
  point_zoneinfo_at("nonsense");
  make_file(tz_latest);
  boot_resets(cannot_read(tz_latest, EINVAL), unable_to_locate(EINVAL));
}

TEST_F(StartupPass, ResetsValidLinksWhenTheAnnouncementIsOutsideTheDownloads) {
  install_update("2024a.1.0", "44l");
  for (const std::string target :
       {"tz/2024a.1.0", "/usr/share/zoneinfo.default", "/var/db/timezone/tz/",
        "/var/db/timezone/tz", "/"}) {
    point_links_at_update("2024a.1.0");
    make_link(tz_latest, target);
    boot_resets(bad_path(target), unable_to_locate());
    EXPECT_EQ(link_at(tz_latest), target);
  }
}

// The error that a number of 2147483648 leaves: the standard conversion has the
// range of long.
constexpr int of_the_number = sizeof(long) > sizeof(int) ? ENOENT : ERANGE;

TEST_F(StartupPass, ResetsWhenNumbersOfTheUpdateOrTheCurrentSetDoNotFit) {
  install_and_announce("2147483648a", "44l");
  boot_resets(unable_to_locate(of_the_number));
  wipe(tz_latest);
  install_and_use("1a.99999999999", "44l");
  boot_resets(unable_to_locate(of_the_number));
}

TEST_F(StartupPass, UndoesAnActivationThatStopsHalfway) {
  wipe(record);
  install_and_announce("2024a.1.0", "44l");
  make_directory(icutz);
  boot_prints(icu_link_stays(icutz, EISDIR),
              cannot_link(icutz, update("2024a.1.0") + "/icutz", EEXIST),
              unable_to_locate(EEXIST), icu_link_stays(icutz, EISDIR));
  EXPECT_EQ(link_at(zoneinfo), "/usr/share/zoneinfo.default");
  EXPECT_EQ(file_at(record), nothing);
}

// --- Ends that are not an exit

TEST_F(StartupPass, EndsAbnormallyWhenTheLastResortFails) {
  make_directory(zoneinfo);
  wipe(local_time);
  const auto reset = failed_reset(EISDIR);
  boot_aborts_after(cannot_read(zoneinfo, EINVAL), invalid_links(EINVAL), reset,
                    unable_to_locate(EEXIST), reset);
  EXPECT_EQ(link_at(local_time), nothing) << "the repair ran all the same";
}

TEST_F(StartupPass, EndsAbnormallyWhenTheSystemsOwnNumbersDoNotFit) {
  install_system("2147483648a", "44l");
  make_file(old_icu);
  const auto aborts = [] {
    boot_aborts_after(unable_to_locate(of_the_number));
  };
  aborts();
  EXPECT_EQ(link_at(old_icu), nothing) << "it goes before a boot can end";
  expect_nothing_changed_by(aborts);
}

TEST_F(StartupPass, EndsAbnormallyWhenTheLocalTimeCannotBeReset) {
  wipe(local_time);
  make_file(local_time + "/in-the-way");
  install_and_announce("2024a.1.0", "44l");
  boot_aborts_after(cannot_read(local_time, EINVAL),
                    resetting_localtime(EINVAL),
                    cannot_link(local_time, default_localtime, EEXIST));
  expect_activated("2024a.1.0", "2023c.1.0");
}

TEST_F(StartupPass, EndsAbnormallyWithoutATimezoneDirectory) {
  wipe(timezone_root);
  const auto no_link = cannot_link(zoneinfo, system_tree, ENOENT);
  boot_aborts_after(bad_zoneinfo_link(""), invalid_links(), no_link,
                    unable_to_locate(), no_link);
}

TEST_F(StartupPass, EndsAbnormallyInADirectoryThatCannotBeWritten) {
  install_and_use("2022a.1.0", "44l");
  set_mode(timezone_root, 0555);
  const auto reset = failed_reset(EACCES);
  expect_nothing_changed_by([&] {
    boot_aborts_after(incompatible(), reset, unable_to_locate(EEXIST), reset);
  });
}

// --- The first steps

TEST_F(StartupPass, DeletesADanglingLegacyLinkWithTheNextReset) {
  make_link(legacy_icutz, "/var/db/gone");
  boot_only_prints();
  wipe(zoneinfo);
  boot();
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(StartupPass, RemovesTheObsoleteIcuUnlessItIsADirectoryWithFiles) {
  const auto removes_it = [] {
    boot_prints();
    EXPECT_EQ(link_at(old_icu), nothing);
  };
  make_link(old_icu, "/var/db/gone");
  removes_it();
  make_file(old_icu);
  removes_it();
  make_directory(old_icu);
  removes_it();
  make_file(old_icu + "/file");
  boot_only_prints();
}

// --- What is read and written, in which order

TEST_F(StartupPass, ActivatesAnUpdateOnASystemWithoutAVersion) {
  wipe(system_tree);
  install_and_announce("2024a.1.0", "44l");
  boot_activates("2024a.1.0", ".1.0", unparsed(".1.0"), unparsed(".1.0"));
}

TEST_F(StartupPass, GoesOnWithoutARecordThatCannotBeWritten) {
  make_directory(record);
  install_and_announce("2024a.1.0", "44l");
  point_localtime_at("/nowhere");
  // The failure is not reported, but the next line ends in it.
  boot_prints(resetting_localtime(EISDIR));
  expect_links_at_update("2024a.1.0");
}

TEST_F(StartupPass, BuildsTheSystemsSetBeforeReadingTheAnnouncement) {
  wipe(system_tree);
  make_file(tz_latest);
  const auto none = unparsed(".1.0");
  boot_prints(none, cannot_read(tz_latest, EINVAL), unable_to_locate(EINVAL),
              none);
}

TEST_F(StartupPass, ChecksTheCurrentSetBeforeBuildingTheUpdate) {
  install_and_use("2024a.1.0", "44l");
  install_system("2025a", "44l");
  make_link(tz_latest, "nonsense");
  const auto unbuilt = lines(bad_path("nonsense"), unable_to_locate());
  boot_resets(incompatible(), unbuilt);
  wipe(zoneinfo);
  boot_resets(bad_zoneinfo_link(""), invalid_links(), unbuilt);
}

TEST_F(StartupPass, MovesALegacyLinkThatResolvesThroughTheObsoleteIcu) {
  make_directory(old_icu);
  make_link(legacy_icutz, old_icu);
  boot_prints();
  EXPECT_EQ(link_at(icutz), old_icu);
  EXPECT_EQ(link_at(legacy_icutz), nothing);
  EXPECT_EQ(link_at(old_icu), nothing);
}

TEST_F(StartupPass, CreatesTheRecordWithTheDefaultPermissions) {
  install_and_announce("2024a.1.0", "44l");
  for (const mode_t mask : {0022u, 0077u, 0u}) {
    point_links_at_system();
    wipe(record);
    const outcome booted = run({MARLIN_PROGRAM}, [mask] { ::umask(mask); });
    EXPECT_EQ(booted.exit_status, 0);
    EXPECT_EQ(look_at({record}).at(record).mode, S_IFREG | (0666u & ~mask));
  }
}

// --- The log

// A limit on files costs the record, too, also where nothing is printed.
TEST_F(StartupPass, GoesOnWhenNobodyReadsItsLogOrItCannotBeWrittenWhole) {
  install_and_announce("2024a.1.0", "44l");
  for (const auto& [lose_it, target, recorded] :
       {std::tuple(&leave_the_log_unread, "nonsense", "2023c.1.0_2024a.1.0"),
        std::tuple(&forbid_files_to_grow, "nonsense", ""),
        std::tuple(&forbid_files_to_grow, system_tree.c_str(), "")}) {
    point_zoneinfo_at(target);
    const outcome booted = run({MARLIN_PROGRAM}, lose_it);
    EXPECT_EQ(booted.exit_status, 0);
    expect_links_at_update("2024a.1.0");
    EXPECT_EQ(file_at(record), recorded);
  }
}

TEST_F(StartupPass, NeedsNoDescriptorOfItsCaller) {
  install_and_announce("2024a.1.0", "44l");
  point_zoneinfo_at("nonsense");
  const outcome booted = run({MARLIN_PROGRAM}, [] { ::close_range(0, 2, 0); });
  EXPECT_EQ(booted.exit_status, 0);
  expect_activated("2024a.1.0", "2023c.1.0");
}

}  // namespace
