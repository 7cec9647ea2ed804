// SPDX-License-Identifier: BSD-2-Clause
//
// The installer of updates as a program: what it takes, what it refuses and
// why, and that a refused update leaves no trace.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>

#include "tests/device/device.h"
#include "tests/tools/tzif_text.h"

using namespace device;

namespace {

const std::string version = "2024b.1.0";
const std::string source = "/var/db/incoming/" + version;
const std::string paris = source + "/zoneinfo/Europe/Paris";
const std::string icu = source + "/icutz/icutz44l.dat";

std::string icu_data(char big = 0, char ebcdic = 0) {
  std::string data(100, '\0');
  data.replace(0, 4, std::string("\x20\0\xda\x27", 4));
  data[8] = big;
  data[9] = ebcdic;
  return data;
}

outcome install(std::vector<std::string> words = {source}) {
  words.insert(words.begin(), MARLIN_INSTALL);
  outcome result = run(words);
  std::cout << result.log;
  return result;
}

class Installer : public SoundDeviceTest {
 protected:
  void SetUp() override {
    SoundDeviceTest::SetUp();
    point_localtime_at(zoneinfo + "/Europe/Paris");
    make_source(source);
  }

  static void make_source(const std::string& place) {
    const auto release = place.substr(place.rfind('/') + 1, 5);
    make_file(place + "/zoneinfo/+VERSION", release + "\n");
    make_file(place + "/zoneinfo/America/Los_Angeles", tzif::file());
    make_file(place + "/zoneinfo/Europe/Paris", tzif::file());
    make_file(place + "/icutz/icutz44l.dat", icu_data());
  }

  static void expect_installed(const std::string& name = version) {
    EXPECT_EQ(link_at(tz_latest), update(name));
    EXPECT_EQ(file_at(update(name) + "/zoneinfo/Europe/Paris"), tzif::file());
    EXPECT_EQ(file_at(update(name) + "/icutz/icutz44l.dat"), icu_data());
    boot_prints(no_lines());
    expect_links_at_update(name);
    EXPECT_EQ(link_at(local_time), zoneinfo + "/Europe/Paris");
  }

  // Runs it, and expects this status and these bytes on standard error.
  static void expect_end(int status, const std::string& log,
                         const std::vector<std::string>& words = {source}) {
    const outcome ended = install(words);
    EXPECT_EQ(ended.exit_status, status);
    EXPECT_EQ(ended.log, log);
  }

  static void expect_refused(const std::string& why, int status = 1) {
    const std::string line =
        "marlin-install: 2024b.1.0: " + why + "; nothing was changed\n";
    expect_nothing_changed_by([&] { expect_end(status, line); });
    expect_nothing_changed_by([&] {
      expect_end(status, line, {"--check", source});
    });
  }
};

// --- What it takes ----------------------------------------------------------

TEST_F(Installer, InstallsAnUpdateThatTheNextBootTakes) {
  expect_end(0, "");
  EXPECT_EQ(link_at(zoneinfo), system_tree) << "before the boot";
  EXPECT_EQ(file_at(record), nothing);
  expect_installed();
}

TEST_F(Installer, GivesEverythingTheModesOfASet) {
  for (const auto& path : {source, source + "/zoneinfo", source + "/icutz",
                           source + "/zoneinfo/Europe"})
    set_mode(path, 0775);
  for (const auto& path : {paris, icu}) set_mode(path, 0755);
  const auto closed = [] { ::umask(077); };
  EXPECT_EQ(run({MARLIN_INSTALL, source}, closed).exit_status, 0);
  for (const auto& [path, here] : look_at({update(version)}))
    EXPECT_EQ(here.mode & 07777u, S_ISDIR(here.mode) ? 0755u : 0644u) << path;
  expect_installed();
}

TEST_F(Installer, KeepsLinksBetweenZones) {
  make_file(source + "/zoneinfo/leapseconds", "a table");
  make_file(source + "/zoneinfo/zone1970.tab", "another");
  make_file(source + "/icutz/zoneinfo64.res", "beside");
  make_link(source + "/zoneinfo/MET", "Europe/Paris");
  make_link(source + "/zoneinfo/Europe/Nice", "../Europe/./Paris");
  ASSERT_EQ(::link(paris.c_str(), (source + "/zoneinfo/CET").c_str()), 0);
  point_localtime_at(zoneinfo + "/Europe/Nice");
  EXPECT_EQ(install().exit_status, 0);
  EXPECT_EQ(link_at(update(version) + "/zoneinfo/MET"), "Europe/Paris");
  EXPECT_EQ(link_at(update(version) + "/zoneinfo/Europe/Nice"),
            "../Europe/./Paris");
  EXPECT_EQ(file_at(update(version) + "/icutz/zoneinfo64.res"), "beside");
  auto seen = look_at({update(version)});
  EXPECT_EQ(seen[update(version) + "/zoneinfo/CET"].inode,
            seen[update(version) + "/zoneinfo/Europe/Paris"].inode);
}

TEST_F(Installer, TakesTheNameFromADirectoryThatIsGivenInAnyWay) {
  for (const std::string& given :
       {source + "/", source + "///", source + "/.", source + "/icutz/.."}) {
    SCOPED_TRACE(given);
    wipe(tz_latest);
    EXPECT_EQ(install({"--", given}).log, "");
    EXPECT_EQ(link_at(tz_latest), update(version));
  }
}

TEST_F(Installer, ReplacesASetOfThatNameThatNothingNeeds) {
  make_file(update(version) + "/half", "left behind");
  EXPECT_EQ(install().exit_status, 0);
  EXPECT_EQ(file_at(update(version) + "/half"), nothing);
  EXPECT_EQ(file_at(downloads + "/.marlin-install.old"), nothing);
  expect_installed();
}

TEST_F(Installer, DeletesWhatAnotherOneLeft) {
  make_file(downloads + "/.marlin-install.new/zoneinfo/x", "half");
  make_file(downloads + "/.marlin-install.old/y", "half");
  make_link(timezone_root + "/.marlin-install.tz_latest", "/nowhere");
  EXPECT_EQ(install().exit_status, 0);
  for (const auto& [path, here] : look_at({timezone_root}))
    EXPECT_EQ(path.find("/.marlin"), std::string::npos) << path;
}

TEST_F(Installer, ReplacesAnAnnouncementOfAnySort) {
  for (const auto& make : std::vector<std::function<void()>>{
           [] { announce("2024a.1.0"); },  // dangles
           [] { make_link(tz_latest, "/elsewhere"); },
           [] { make_link(tz_latest, update("9999z.1.0")); },
           [] { make_file(tz_latest, "no link"); }}) {
    make();
    EXPECT_EQ(install().exit_status, 0);
    EXPECT_EQ(link_at(tz_latest), update(version));
  }
}

TEST_F(Installer, IsNotTheOnlyOneWhenTheLockIsTaken) {
  const int other = ::open(downloads.c_str(), O_RDONLY | O_DIRECTORY);
  ASSERT_EQ(::flock(other, LOCK_EX), 0);
  for (const auto& words : std::vector<std::vector<std::string>>{
           {source}, {"--prune"}, {"--withdraw"}}) {
    expect_end(3,
               "marlin-install: another one is at work on this device; "
               "try again later\n",
               words);
  }
  EXPECT_EQ(install({"--check", source}).exit_status, 0);
  ::close(other);
  EXPECT_EQ(install().exit_status, 0);
}

TEST_F(Installer, ChecksWithoutAChange) {
  expect_nothing_changed_by([] { expect_end(0, "", {"--check", source}); });
}

TEST_F(Installer, ShowsOnATerminalHowFarItIs) {
  for (int i = 0; i < 100; ++i)
    make_file(source + "/zoneinfo/Etc/" + std::to_string(i), tzif::file());
  const int terminal = ::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
  ASSERT_EQ(::grantpt(terminal) + ::unlockpt(terminal), 0);
  const std::string other_end = ::ptsname(terminal);
  const outcome shown = run({MARLIN_INSTALL, source}, [&] {
    ::dup2(::open(other_end.c_str(), O_RDWR | O_NOCTTY), STDOUT_FILENO);
  });
  EXPECT_EQ(shown.exit_status, 0);
  // It hands on what was written in pieces, and fails after the last.
  std::string text;
  for (char byte; ::read(terminal, &byte, 1) == 1;) text += byte;
  EXPECT_EQ(text,
            "\rinstalling: 29 %\rinstalling: 59 %\rinstalling: 89 %\r\033[K"
            "2024b.1.0 is announced; the next boot decides\r\n");
  ::close(terminal);
}

// --- What is not newer ------------------------------------------------------

TEST_F(Installer, RefusesWhatIsNotNewerThanTheSystem) {
  install_system("2024b", "44l");
  expect_refused("it is not newer than 2024b.1.0, which is the system's", 4);
}

TEST_F(Installer, RefusesWhatIsNotNewerThanWhatIsAnnounced) {
  install_and_announce("2024c.1.0", "44l");
  expect_refused("it is not newer than 2024c.1.0, which is announced", 4);
}

// The next boot refuses that one, and every later boot.
TEST_F(Installer, ReplacesAnAnnouncementThatDoesNotFitTheSystem) {
  install_and_announce("2024c.1.0", "43l");
  EXPECT_EQ(install().exit_status, 0);
  expect_installed();
}

TEST_F(Installer, ChecksAlsoWhetherASetOfThatNameIsNeeded) {
  install_update(version, "44l");
  make_link(icutz, update(version) + "/icutz");
  expect_refused(
      "a set of this version is in use or announced; give other data another");
}

TEST_F(Installer, RefusesWhatIsNotNewerThanWhatIsInUse) {
  install_and_use("2024c.1.0", "44l");
  expect_refused("it is not newer than 2024c.1.0, which is in use", 4);
}

TEST_F(Installer, IsForcedToInstallWhatIsNotNewer) {
  install_system("2024b", "44l");
  install_and_announce("2024c.1.0", "44l");
  EXPECT_EQ(install({"--force", "--check", source}).exit_status, 0);
  EXPECT_EQ(link_at(tz_latest), update("2024c.1.0"));
  EXPECT_EQ(install({"--force", source}).exit_status, 0);
  EXPECT_EQ(link_at(tz_latest), update(version));
}

TEST_F(Installer, NeverChangesASetThatIsNeeded) {
  EXPECT_EQ(install().exit_status, 0);
  expect_nothing_changed_by([] {
    expect_end(1,
               "marlin-install: 2024b.1.0: a set of this version is in use or "
               "announced; give other data another; nothing was changed\n",
               {"--force", source});
  });
}

TEST_F(Installer, TakesAnUpdateBesideASystemWithoutAVersion) {
  make_file(system_tree + "/+VERSION", "\n");
  EXPECT_EQ(install().log, "");
}

// --- What does not fit the device -------------------------------------------

TEST_F(Installer, RefusesAnotherSchemaThanTheSystems) {
  make_file(system_icu + "/icutzformat.txt", "45l\n");
  expect_refused("its ICU schema is 44l, the system's is 45l");
  wipe(system_icu + "/icutzformat.txt");
  expect_refused("its ICU schema is 44l, the system's is missing");
}

TEST_F(Installer, RefusesAnUpdateWithoutTheUsersZone) {
  point_localtime_at(zoneinfo + "/Europe/Lisbon");
  expect_refused("it lacks the zone that the device is set to, Europe/Lisbon");
  point_localtime_at("/usr/share/zoneinfo/Asia/\x1b");
  expect_refused("it lacks the zone that the device is set to, Asia/\\x1b");
}

TEST_F(Installer, RefusesADirectoryThatCannotBeItsPlace) {
  wipe(downloads);
  expect_end(
      1,
      "marlin-install: cannot open /var/db/timezone/tz/: No such file or "
      "directory\n");
}

TEST_F(Installer, TakesBackASetThatCannotBeAnnounced) {
  make_directory(tz_latest);
  expect_end(
      1,
      "marlin-install: 2024b.1.0: cannot rename "
      "/var/db/timezone/tz_latest: Is a directory; nothing was changed\n");
  EXPECT_EQ(file_at(update(version)), nothing);
  EXPECT_EQ(link_at(timezone_root + "/.marlin-install.tz_latest"), nothing);
}

TEST_F(Installer, BringsBackTheSetThatItWasToReplace) {
  install_update(version, "43l");
  make_directory(tz_latest);
  EXPECT_EQ(install().exit_status, 1);
  EXPECT_NE(file_at(update(version) + "/icutz/icutz43l.dat"), nothing);
  EXPECT_EQ(file_at(update(version) + "/icutz/icutz44l.dat"), nothing);
}

TEST_F(Installer, TakesBackACopyThatCannotBeWrittenWhole) {
  make_file(source + "/icutz/large.res", std::string(1u << 20, 'x'));
  const snapshot before = look_at_everything();
  const outcome failed = run({MARLIN_INSTALL, source}, [] {
    const rlimit limit{1u << 19, 1u << 19};
    ::setrlimit(RLIMIT_FSIZE, &limit);
  });
  EXPECT_EQ(failed.exit_status, 1);
  EXPECT_THAT(
      failed.log,
      ::testing::EndsWith("large.res: File too large; nothing was changed\n"));
  EXPECT_THAT(failed.lines(), ::testing::SizeIs(1));
  const auto after = look_at_everything();
  EXPECT_EQ(after.size(), before.size());
  EXPECT_EQ(link_at(tz_latest), nothing);
}

// --- Hostile updates --------------------------------------------------------

struct hostile {
  const char* name;
  std::function<void()> make;
  std::string why;
};
void PrintTo(const hostile& shown, std::ostream* out) { *out << shown.name; }

class HostileUpdate : public Installer,
                      public ::testing::WithParamInterface<hostile> {};

TEST_P(HostileUpdate, LeavesNoTrace) {
  GetParam().make();
  expect_refused(GetParam().why);
  boot_prints(no_lines());
  expect_links_at_system();
}

void make_sparse(const std::string& path, off_t size) {
  make_file(path, "x");
  ASSERT_EQ(::truncate(path.c_str(), size), 0);
}

const std::string zones = source + "/zoneinfo";

const hostile hostile_updates[] = {
    {"AFifoForAZone", [] { make_fifo(paris); },
     "zoneinfo/Europe/Paris is a FIFO"},
    {"ASocketForAZone", [] { make_socket(paris); },
     "zoneinfo/Europe/Paris is a socket"},
    {"AFifoForTheVersion", [] { make_fifo(zones + "/+VERSION"); },
     "zoneinfo/+VERSION is a FIFO"},
    {"AFifoForTheIcuData", [] { make_fifo(icu); },
     "icutz/icutz44l.dat is a FIFO"},
    {"ALinkToADevice", [] { make_link(paris, "/dev/zero"); },
     "zoneinfo/Europe/Paris is a link that leads out, to /dev/zero"},
    {"AnAbsoluteLinkInside", [] { make_link(zones + "/CET", paris); },
     "zoneinfo/CET is a link that leads out, to " + paris},
    {"ALinkThatClimbsOut",
     [] { make_link(zones + "/CET", "../../../../etc/passwd"); },
     "zoneinfo/CET is a link that leads out, to ../../../../etc/passwd"},
    {"ALinkIntoTheIcuData",
     [] { make_link(zones + "/CET", "../icutz/icutz44l.dat"); },
     "zoneinfo/CET is a link that leads out, to ../icutz/icutz44l.dat"},
    {"ALinkOutAndBackIn",
     [] { make_link(zones + "/CET", "../../2024b.1.0/zoneinfo/Europe/Paris"); },
     "zoneinfo/CET is a link that leads out, to "
     "../../2024b.1.0/zoneinfo/Europe/Paris"},
    {"ALinkToItself", [] { make_link(zones + "/CET", "CET"); },
     "zoneinfo/CET is a link that does not lead to a zone"},
    {"ALinkToNothing", [] { make_link(zones + "/CET", "Europe/Rome"); },
     "zoneinfo/CET is a link that does not lead to a zone"},
    {"ALinkToADirectory", [] { make_link(zones + "/EU", "Europe"); },
     "zoneinfo/EU is a link that does not lead to a zone"},
    {"ALinkToAFileAsADirectory",
     [] { make_link(zones + "/CET", "Europe/Paris/"); },
     "zoneinfo/CET is a link that does not lead to a zone"},
    {"ALinkByWayOfNothing",
     [] { make_link(zones + "/CET", "Asia/../Europe/Paris"); },
     "zoneinfo/CET is a link that does not lead to a zone"},
    {"ALinkToATable", [] { make_link(zones + "/CET", "+VERSION"); },
     "zoneinfo/CET is a link that does not lead to a zone"},
    {"ALinkWithBytesForATerminal",
     [] { make_link(zones + "/CET", "/\033[2J"); },
     "zoneinfo/CET is a link that leads out, to /\\x1b[2J"},
    {"ALinkForTheTree", [] { make_link(zones, "/usr/share/zoneinfo.default"); },
     "zoneinfo is a link, not a directory"},
    {"ALinkForTheIcuDirectory",
     [] { make_link(source + "/icutz", "/usr/share/icu"); },
     "icutz is a link, not a directory"},
    {"ALinkForTheIcuData", [] { make_link(icu, "../zoneinfo/+VERSION"); },
     "icutz/icutz44l.dat is a link"},
    {"NoTree", [] { wipe(zones); }, "zoneinfo is gone, not a directory"},
    {"NoIcuDirectory", [] { wipe(source + "/icutz"); },
     "icutz is gone, not a directory"},
    {"AFileForTheTree", [] { make_file(zones); },
     "zoneinfo is a file, not a directory"},
    {"NoIcuData", [] { wipe(icu); }, "icutz holds no file icutzNNx.dat"},
    {"ADirectoryForTheIcuData", [] { make_directory(icu); },
     "icutz/icutz44l.dat is a directory"},
    {"TwoSchemas",
     [] { make_file(source + "/icutz/icutz45l.dat", icu_data()); },
     "icutz holds more than one file icutzNNx.dat"},
    {"AnotherByteOrder", [] { make_file(icu, icu_data(1)); },
     "icutz/icutz44l.dat has another byte order than its name says"},
    {"AnotherCharacterSet", [] { make_file(icu, icu_data(0, 1)); },
     "icutz/icutz44l.dat has another byte order than its name says"},
    {"IcuDataThatIsNone", [] { make_file(icu, std::string(100, 'x')); },
     "icutz/icutz44l.dat is not a file of ICU data"},
    {"EmptyIcuData", [] { make_file(icu); },
     "icutz/icutz44l.dat is not a file of ICU data"},
    {"NoVersion", [] { wipe(zones + "/+VERSION"); },
     "zoneinfo/+VERSION names no release"},
    {"AnEmptyVersion", [] { make_file(zones + "/+VERSION", " \n"); },
     "zoneinfo/+VERSION names no release"},
    {"AnotherRelease", [] { make_file(zones + "/+VERSION", "2024c\n"); },
     "zoneinfo/+VERSION says 2024c, another release than its name"},
    {"AReleaseWithBytesForATerminal",
     [] { make_file(zones + "/+VERSION", "2024b\033[0m\n"); },
     "zoneinfo/+VERSION says 2024b\\x1b[0m, another release than its name"},
    {"AReleaseWithoutAnEnd",
     [] { make_file(zones + "/+VERSION", std::string(1u << 20, '2')); },
     "zoneinfo/+VERSION says " + std::string(40, '2') +
         ", another release than its name"},
    {"NoZone",
     [] {
       wipe(zones);
       make_file(zones + "/+VERSION", "2024b\n");
     },
     "zoneinfo holds no zone"},
    {"AZoneOfText", [] { make_file(paris, "TZ=CET\n"); },
     "zoneinfo/Europe/Paris is not a TZif file"},
    {"AnEmptyZone", [] { make_file(paris); },
     "zoneinfo/Europe/Paris is not a TZif file"},
    {"AZoneCutShort", [] { make_file(paris, tzif::file().substr(0, 90)); },
     "zoneinfo/Europe/Paris is cut short"},
    {"AZoneWithHugeCounts",
     [] {
       std::string text = tzif::file();
       make_file(paris, text.replace(32, 4, "\xff\xff\xff\xff"));
     },
     "zoneinfo/Europe/Paris is cut short"},
    {"ATableUnderTheNameOfAZone",
     [] {
       ASSERT_EQ(
           ::link((zones + "/+VERSION").c_str(), (zones + "/CET").c_str()), 0);
     },
     "zoneinfo/CET is not a TZif file"},
    {"AZoneThatNobodyMayRead", [] { set_mode(paris, 0600); },
     "zoneinfo/Europe/Paris cannot be read by all"},
    {"ADirectoryThatNobodyMayEnter", [] { set_mode(zones + "/Europe", 0700); },
     "zoneinfo/Europe cannot be read by all"},
    {"AFileThatAllMayWrite", [] { set_mode(paris, 0666); },
     "zoneinfo/Europe/Paris can be written by all"},
    {"ADirectoryThatAllMayWrite", [] { set_mode(zones + "/Europe", 0777); },
     "zoneinfo/Europe can be written by all"},
    {"AnUpdateThatAllMayWrite", [] { set_mode(source, 01777); },
     "the update can be written by all"},
    {"AnUpdateThatNobodyMayEnter", [] { set_mode(source, 0700); },
     "the update cannot be read by all"},
    {"AFileThatRunsAsSomebodyElse", [] { set_mode(paris, 04755); },
     "zoneinfo/Europe/Paris runs as somebody else"},
    {"AnotherEntry", [] { make_file(source + "/README"); },
     "README does not belong in an update"},
    {"AHiddenEntry", [] { make_file(source + "/.\n"); },
     ".\\x0a does not belong in an update"},
    {"ANameWithALineEnd", [] { make_file(zones + "/a\nb", tzif::file()); },
     "zoneinfo/a\\x0ab is no name for a zone"},
    {"ANameWithABlank", [] { make_file(zones + "/a b", tzif::file()); },
     "zoneinfo/a b is no name for a zone"},
    {"ADirectoryInTheIcuDirectory",
     [] { make_directory(source + "/icutz/below"); },
     "icutz/below is a directory"},
    {"ADeepTree", [] { make_directory(zones + "/a/b/c/d/e/f/g/h/i"); },
     "zoneinfo/a/b/c/d/e/f/g/h is deeper than a zone can be"},
    {"TooManyEntries",
     [] {
       for (int i = 0; i < 9000; ++i)
         ASSERT_EQ(
             ::link(paris.c_str(), (zones + "/" + std::to_string(i)).c_str()),
             0);
     },
     "it has more than 8192 entries"},
    {"AHugeFile", [] { make_sparse(source + "/icutz/x.res", 5 << 20); },
     "icutz/x.res is larger than 4 MiB"},
    {"AHugeZone", [] { make_sparse(paris, 5 << 20); },
     "zoneinfo/Europe/Paris is larger than 4 MiB"},
    {"MuchInAll",
     [] {
       for (int i = 0; i < 9; ++i)
         make_sparse(source + "/icutz/" + std::to_string(i) + ".res", 4 << 20);
     },
     "it is larger than 32 MiB"},
};

INSTANTIATE_TEST_SUITE_P(, HostileUpdate, ::testing::ValuesIn(hostile_updates),
                         [](const auto& shown) {
                           return std::string(shown.param.name);
                         });

TEST_F(Installer, RefusesANameThatIsNoVersion) {
  for (const std::string name :
       {"latest", "2024", "2024b.", "2024b.1.0.0", "-2024b",
        "2024b.99999999999", "2024b\n.1.0"}) {
    const std::string place = "/var/db/other/" + name;
    make_source(place);
    const outcome refused = install({place});
    EXPECT_EQ(refused.exit_status, 1);
    EXPECT_THAT(refused.lines(), ::testing::SizeIs(1));
    EXPECT_THAT(refused.log, ::testing::EndsWith(
                                 ": its name is no version such as 2024a.1.0; "
                                 "nothing was changed\n"));
    EXPECT_EQ(link_at(tz_latest), nothing);
  }
  expect_end(1,
             "marlin-install: /: its name is no version such as 2024a.1.0; "
             "nothing was changed\n",
             {"/"});
}

TEST_F(Installer, RefusesWhatIsNoDirectory) {
  make_file("/var/db/2024c.1.0", "an archive, perhaps");
  make_link("/var/db/2024d.1.0", source);
  make_fifo("/var/db/2024e.1.0");
  for (const std::string place :
       {"/var/db/2024c.1.0", "/var/db/2024d.1.0", "/var/db/2024e.1.0",
        "/var/db/2024f.1.0", ""}) {
    const outcome refused = install({place});
    EXPECT_EQ(refused.exit_status, 1);
    EXPECT_THAT(refused.log,
                ::testing::StartsWith(
                    "marlin-install: cannot open the directory " + place));
    EXPECT_THAT(refused.lines(), ::testing::SizeIs(1));
  }
}

// --- Its other jobs ---------------------------------------------------------

TEST_F(Installer, WithdrawsAnAnnouncement) {
  EXPECT_EQ(install().exit_status, 0);
  EXPECT_EQ(install({"--withdraw"}).exit_status, 0);
  EXPECT_EQ(link_at(tz_latest), nothing);
  EXPECT_EQ(file_at(update(version) + "/zoneinfo/+VERSION"), "2024b\n");
  EXPECT_EQ(install({"--withdraw"}).exit_status, 0) << "there is none any more";
}

TEST_F(Installer, PrunesOnlyWhatNothingNeeds) {
  for (const char* name : {"2023d.1.0", "2024a.1.0", "2024c.1.0", "2024d.1.0"})
    install_update(name, "44l");
  point_links_at_update("2024a.1.0");
  make_link(icutz, update("2023d.1.0") + "/icutz");
  announce("2024d.1.0");
  make_file(downloads + "/notes.txt", "somebody's");
  make_directory(downloads + "/.incoming");
  make_link(update("2024e.1.0"), "/var/db/incoming");
  make_file(downloads + "/.marlin-install.old/x");
  EXPECT_EQ(install({"--prune"}).log, "");
  std::vector<std::string> left;
  for (const auto& [path, here] : look_at({downloads}))
    if (path.rfind('/') == downloads.size())
      left.push_back(path.substr(downloads.size() + 1));
  EXPECT_THAT(left, ::testing::UnorderedElementsAre("2023d.1.0", "2024a.1.0",
                                                    "2024d.1.0", "notes.txt",
                                                    ".incoming"));
  EXPECT_EQ(file_at(paris), tzif::file()) << "behind a link";
}

TEST_F(Installer, TellsWhatItPrunes) {
  make_file(downloads + "/.marlin-install.new/x", "of one that was stopped");
  make_file(update("2022a.1.0") + "/zoneinfo/+VERSION", "2022a");
  const std::string told = "/var/db/told";
  run({MARLIN_INSTALL, "--prune"}, [&] {
    ::dup2(::open(told.c_str(), O_WRONLY | O_CREAT, 0644), STDOUT_FILENO);
  });
  EXPECT_THAT(file_at(told),
              ::testing::MatchesRegex("removed what an earlier one left: 1 "
                                      "files, [0-9]+ kB\nremoved 2022a.1.0: 1 "
                                      "files, [0-9]+ kB\n"));
}

TEST_F(Installer, DoesOneThingAtATime) {
  for (const auto& words :
       std::vector<std::vector<std::string>>{{},
                                             {source, source},
                                             {"--check"},
                                             {"--prune", source},
                                             {"--withdraw", "--prune"},
                                             {"--force", "--prune"},
                                             {"--chec", "x", "y"},
                                             {"--check=x"},
                                             {"-x"},
                                             {"--\033"}}) {
    const outcome misused = install(words);
    EXPECT_EQ(misused.exit_status, 2) << ::testing::PrintToString(words);
    EXPECT_THAT(misused.log, ::testing::EndsWith("; see --help\n"));
    EXPECT_THAT(misused.log, ::testing::Not(::testing::HasSubstr("\033")));
    EXPECT_THAT(misused.lines(), ::testing::SizeIs(1));
  }
  EXPECT_EQ(install({"--help"}).exit_status, 0);
  EXPECT_EQ(install({"--version"}).exit_status, 0);
}

}  // namespace
