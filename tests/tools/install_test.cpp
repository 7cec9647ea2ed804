// SPDX-License-Identifier: BSD-2-Clause
//
// The installer of updates as a program: what it takes, what it refuses and
// why, and that a refused update leaves no trace.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string version = "2024b.1.0";
const std::string source = "/var/db/incoming/" + version;
const std::string paris = source + "/zoneinfo/Europe/Paris";
const std::string icu = source + "/icutz/icutz44l.dat";

// As docs/integration.md has it for updates that another tool made.
void seal(const std::string& place = source) {
  EXPECT_EQ(run({"/usr/bin/sh", "-c",
                 "cd \"$0\" && find icutz zoneinfo -type f -print0 | LC_ALL=C "
                 "sort -z | xargs -0 sha256sum >SHA256SUMS",
                 place})
                .exit_status,
            0);
}

std::vector<std::string> command(std::vector<std::string> words) {
  words.insert(words.begin(), MARLIN_INSTALL);
  return words;
}

outcome install(const std::vector<std::string>& words = {source}) {
  outcome result = run(command(words));
  std::cout << result.log;
  return result;
}

// On standard output.
std::string told_by(const std::vector<std::string>& words) {
  const int told = ::memfd_create("told", MFD_CLOEXEC);
  run(command(words), [&] { ::dup2(told, STDOUT_FILENO); });
  std::string text(10'000, '\0');
  text.resize(
      static_cast<std::size_t>(::pread(told, text.data(), text.size(), 0)));
  ::close(told);
  return text;
}

std::vector<std::string> names_of_sets() {
  std::vector<std::string> names;
  for (const auto& [path, here] : look_at({downloads}))
    if (path.size() > downloads.size() && path.rfind('/') == downloads.size())
      names.push_back(path.substr(downloads.size() + 1));
  return names;
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
    make_file(place + "/zoneinfo/America/Los_Angeles", "TZif, west");
    make_file(place + "/zoneinfo/Europe/Paris", "TZif, east");
    make_file(place + "/icutz/icutz44l.dat", "ICU data");
    seal(place);
  }

  static void expect_installed(const std::string& name = version) {
    EXPECT_EQ(link_at(tz_latest), update(name));
    for (const std::string path :
         {"/zoneinfo/Europe/Paris", "/icutz/icutz44l.dat", "/SHA256SUMS"})
      EXPECT_EQ(file_at(update(name) + path), file_at(source + path));
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
    expect_no_trace_of([&] { expect_end(status, line); });
    expect_no_trace_of([&] { expect_end(status, line, {"--check", source}); });
  }

  static void expect_refused_by(std::vector<std::string> words,
                                const std::string& why) {
    words.push_back(source);
    expect_no_trace_of([&] {
      expect_end(
          1, "marlin-install: 2024b.1.0: " + why + "; nothing was changed\n",
          words);
    });
  }

  // But for the time of the directory in which there was a hidden copy.
  static void expect_no_trace_of(const std::function<void()>& act) {
    const auto look = [] {
      snapshot seen = look_at_everything();
      seen[downloads].modified = seen[downloads].changed = 0;
      return seen;
    };
    const snapshot before = look();
    act();
    EXPECT_EQ(look(), before);
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

TEST_F(Installer, KeepsZonesThatAreOneFile) {
  make_file(source + "/zoneinfo/leapseconds", "a table");
  make_file(source + "/icutz/zoneinfo64.res", "beside");
  make_file(source + "/SHA256SUMS.sig", "a signature");
  ASSERT_EQ(::link(paris.c_str(), (source + "/zoneinfo/CET").c_str()), 0);
  seal();
  EXPECT_EQ(install().exit_status, 0);
  expect_installed();
  EXPECT_EQ(file_at(update(version) + "/icutz/zoneinfo64.res"), "beside");
  EXPECT_EQ(file_at(update(version) + "/SHA256SUMS.sig"), "a signature");
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
  EXPECT_EQ(file_at(downloads + "/.marlin-install.new"), nothing);
  expect_installed();
}

TEST_F(Installer, DeletesWhatAnotherOneLeft) {
  make_file(downloads + "/.marlin-install.new/zoneinfo/x", "half");
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
  for (const auto& words :
       std::vector<std::vector<std::string>>{{source},
                                             {"--check", source},
                                             {"--prune"},
                                             {"--withdraw"},
                                             {"--settle"}}) {
    expect_end(3,
               "marlin-install: another marlin-install is running; try again "
               "later\n",
               words);
  }
  EXPECT_EQ(install({"--audit"}).exit_status, 0);
  ::close(other);
  EXPECT_EQ(install().exit_status, 0);
}

TEST_F(Installer, ChecksWithoutAChange) {
  expect_no_trace_of([] { expect_end(0, "", {"--check", source}); });
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
  EXPECT_EQ(install().exit_status, 0);
  wipe(tz_latest);
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

TEST_F(Installer, NeverChangesAWholeSetThatIsNeeded) {
  EXPECT_EQ(install().exit_status, 0);
  expect_refused("it is not newer than 2024b.1.0, which is announced", 4);
  expect_nothing_changed_by([] {
    expect_end(1,
               "marlin-install: 2024b.1.0: a set of this version is in use or "
               "announced; give other data another; nothing was changed\n",
               {"--force", source});
  });
}

// As docs/integration.md has it.
TEST_F(Installer, GoesBackToAnOlderSetByForceAndWithoutTheLink) {
  install_and_use("2024c.1.0", "44l");
  EXPECT_EQ(install({"--force", source}).exit_status, 0);
  wipe(zoneinfo);
  EXPECT_EQ(boot().exit_status, 0);
  expect_links_at_update(version);
}

// What is in use or announced, and lost, damaged, or without a manifest as one
// that an older installer made.
TEST_F(Installer, PutsBackASetThatIsNotWhole) {
  const auto damages = std::vector<std::function<void()>>{
      [] { wipe(update(version)); },
      [] { make_file(update(version), "a file"); },
      [] { make_file(update(version) + "/icutz/icutz44l.dat", "ICU"); },
      [] { wipe(update(version) + "/zoneinfo/Europe"); },
      [] { wipe(update(version) + "/SHA256SUMS"); }};
  EXPECT_EQ(install().exit_status, 0);
  for (const auto& damage : damages) {
    damage();
    expect_end(0, "");
    EXPECT_EQ(link_at(tz_latest), update(version));
    EXPECT_EQ(install().exit_status, 4);
  }
  expect_installed();  // and boots
  wipe(tz_latest);
  for (const auto& damage : damages) {
    damage();
    expect_end(0, "");
    EXPECT_EQ(link_at(tz_latest), nothing) << "in use, not to be announced";
    expect_links_at_update(version);
    EXPECT_EQ(install({"--audit"}).exit_status, 0);
  }
  install_and_announce("2024c.1.0", "44l");
  wipe(update(version));
  expect_end(0, "");
  EXPECT_EQ(link_at(tz_latest), update("2024c.1.0")) << "newer, as it was";
  boot_prints(no_lines());
  expect_links_at_update("2024c.1.0");
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
  make_file(system_tree + "/Europe/Lisbon");
  point_localtime_at(zoneinfo + "/Europe/Lisbon");
  expect_refused("it lacks the zone that the device is set to, Europe/Lisbon");
  make_file(system_tree + "/Asia/\x1b");
  point_localtime_at("/usr/share/zoneinfo/Asia/\x1b");
  expect_refused("it lacks the zone that the device is set to, Asia/\\x1b");
}

// No update would ever fit such a device.
TEST_F(Installer, TakesNoZoneAwayFromADeviceThatHasNone) {
  for (const std::string zone : {"Mars/Base", "Europe", "../zoneinfo"}) {
    wipe(tz_latest);
    point_localtime_at(zoneinfo + "/" + zone);
    expect_end(0, "");
  }
}

TEST_F(Installer, RefusesADirectoryThatCannotBeItsPlace) {
  wipe(downloads);
  expect_end(
      1,
      "marlin-install: cannot open /var/db/timezone/tz/: No such file or "
      "directory\n");
  make_directory(downloads, 0775);
  expect_end(1,
             "marlin-install: /var/db/timezone/tz/ can be written by others "
             "than its owner; give it the mode 755\n");
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
  seal();
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
  seal();
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
     "zoneinfo/Europe/Paris is a link"},
    {"ALinkFromZoneToZone", [] { make_link(zones + "/CET", "Europe/Paris"); },
     "zoneinfo/CET is a link"},
    {"ALinkForTheTree", [] { make_link(zones, "/usr/share/zoneinfo.default"); },
     "zoneinfo is a link, not a directory"},
    {"ALinkForTheIcuDirectory",
     [] { make_link(source + "/icutz", "/usr/share/icu"); },
     "icutz is a link, not a directory"},
    {"ALinkForTheIcuData", [] { make_link(icu, "../zoneinfo/+VERSION"); },
     "icutz/icutz44l.dat is a link"},
    {"NoTree", [] { wipe(zones); }, "zoneinfo is missing, not a directory"},
    {"NoIcuDirectory", [] { wipe(source + "/icutz"); },
     "icutz is missing, not a directory"},
    {"AFileForTheTree", [] { make_file(zones); },
     "zoneinfo is a file, not a directory"},
    {"NoIcuData", [] { wipe(icu); }, "icutz holds no file icutzNNx.dat"},
    {"ADirectoryForTheIcuData", [] { make_directory(icu); },
     "icutz/icutz44l.dat is a directory"},
    {"TwoSchemas", [] { make_file(source + "/icutz/icutz45l.dat"); },
     "icutz holds more than one file icutzNNx.dat"},
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
     "zoneinfo/Europe/Paris has the set-user-ID, the set-group-ID or the "
     "sticky bit"},
    {"AnotherEntry", [] { make_file(source + "/README"); },
     "README does not belong in an update"},
    {"AHiddenEntry", [] { make_file(source + "/.\n"); },
     ".\\x0a does not belong in an update"},
    {"ANameWithALineEnd", [] { make_file(zones + "/a\nb"); },
     "zoneinfo/a\\x0ab has a name that no zone has"},
    {"ANameWithABlank", [] { make_file(zones + "/a b"); },
     "zoneinfo/a b has a name that no zone has"},
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

// What its manifest says is all that is looked at in a file.
TEST_F(Installer, RefusesWhatIsNotAsItsManifestHasIt) {
  const std::string manifest = source + "/SHA256SUMS";
  const std::string whole = file_at(manifest);
  for (const auto& [why, damage] :
       std::vector<std::pair<std::string, std::function<void()>>>{
           {"zoneinfo/Europe/Paris is not as SHA256SUMS has it",
            [] { make_file(paris, "TZif, East"); }},
           {"icutz/icutz44l.dat is not as SHA256SUMS has it",
            [] { make_file(icu); }},
           {"SHA256SUMS lists what is missing, \"zoneinfo/Europe/Paris\"",
            [] { wipe(paris); }},
           {"SHA256SUMS lists what is missing, \"zoneinfo/Europe/Paris\"",
            [] { ::rename(paris.c_str(), (zones + "/Zulu").c_str()); }},
           {"zoneinfo/Europe/Nice is not in SHA256SUMS",
            [] { make_file(zones + "/Europe/Nice"); }},
           {"zoneinfo/Zulu is not in SHA256SUMS",
            [] { make_file(zones + "/Zulu"); }},
           {"icutz/icutz44l.dat is not in SHA256SUMS",
            [&] { make_file(manifest); }},
           {"it has no SHA256SUMS", [&] { wipe(manifest); }},
           {"SHA256SUMS is a link",
            [&] { make_link(manifest, "icutz/icutz44l.dat"); }},
           {"SHA256SUMS is a FIFO", [&] { make_fifo(manifest); }},
           {"SHA256SUMS lists what is missing, \"\\x1b[2J\"",
            [&] {
              make_file(manifest, whole + std::string(66, 'x') + "\033[2J\n");
            }},
           {"SHA256SUMS lists what is missing, \"zoneinfo/Europe/Paris\"",
            [&] {
              make_file(manifest, whole + whole.substr(whole.size() - 88));
            }},
           {"zoneinfo/Europe/Paris is not as SHA256SUMS has it",
            [&] { make_file(manifest, whole.substr(0, whole.size() - 1)); }},
           {"SHA256SUMS is larger than 4 MiB",
            [&] { make_sparse(manifest, 5 << 20); }}}) {
    SCOPED_TRACE(why);
    wipe(source);
    make_source(source);
    damage();
    expect_refused(why);
  }
}

// "$1" has to be the copy; what the source becomes meanwhile does not matter.
TEST_F(Installer, LetsAProgramVerifyTheCopy) {
  const std::string program = "/var/db/verify", seen = "/var/db/seen";
  const auto verify_by = [&](const std::string& script) {
    make_file(program, "#!/bin/sh\n" + script + "\n", 0755);
  };
  verify_by("exit 7");
  expect_refused_by({"--verify", program},
                    program + " refuses it, with status 7");
  verify_by("kill $$");
  expect_refused_by({"--verify", program},
                    program + " refuses it, with status 143");
  if (!emulated())
    expect_refused_by({"--verify", "/nowhere"},
                      "cannot run /nowhere: No such file or directory");
  verify_by("echo $# $1 >" + seen + "; cat $1/SHA256SUMS >>" + seen +
            "; readlink " + tz_latest + " >>" + seen + "; echo ICU >" + icu);
  const std::string manifest = file_at(source + "/SHA256SUMS");
  expect_end(0, "", {"--force", "--verify", program, source});
  EXPECT_EQ(file_at(seen),
            "1 /var/db/timezone/tz/.marlin-install.new\n" + manifest);
  EXPECT_EQ(file_at(update(version) + "/icutz/icutz44l.dat"), "ICU data");
  EXPECT_EQ(file_at(icu), "ICU\n");
}

TEST_F(Installer, RefusesANameThatIsNotAVersion) {
  for (const std::string name :
       {"latest", "2024", "2024b.", "2024b.1.0.0", "-2024b",
        "2024b.99999999999", "2024b\n.1.0"}) {
    const std::string place = "/var/db/other/" + name;
    make_source(place);
    const outcome refused = install({place});
    EXPECT_EQ(refused.exit_status, 1);
    EXPECT_THAT(refused.lines(), ::testing::SizeIs(1));
    EXPECT_THAT(
        refused.log,
        ::testing::EndsWith(": its name is not a version such as 2024a.1.0; "
                            "nothing was changed\n"));
    EXPECT_EQ(link_at(tz_latest), nothing);
  }
  expect_end(1,
             "marlin-install: /: its name is not a version such as 2024a.1.0; "
             "nothing was changed\n",
             {"/"});
}

TEST_F(Installer, RefusesWhatIsNotADirectory) {
  make_file("/var/db/2024c.1.0", "an archive, perhaps");
  make_link("/var/db/2024d.1.0", source);
  make_fifo("/var/db/2024e.1.0");
  for (const std::string place :
       {"/var/db/2024c.1.0", "/var/db/2024d.1.0", "/var/db/2024e.1.0",
        "/var/db/2024f.1.0", ""}) {
    const outcome refused = install({place});
    EXPECT_EQ(refused.exit_status, 1);
    EXPECT_THAT(refused.log,
                ::testing::StartsWith("marlin-install: cannot open " + place));
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

// What the next boot finds depends on the announcement only; what a later one
// could be told of, not on a wrong order of commands.
TEST_F(Installer, PrunesOnlyWhatNothingNeeds) {
  for (const char* name :
       {"2023d.1.0", "2023e.1.0", "2024a.1.0", "2024c.1.0", "2024d.1.0"})
    install_update(name, "44l");
  install_update("2024e.1.0", "43l");
  point_links_at_update("2024a.1.0");
  make_link(icutz, update("2023d.1.0") + "/icutz");
  announce("2024d.1.0");
  make_file(downloads + "/notes.txt", "somebody's");
  make_directory(downloads + "/.incoming");
  make_file("/var/db/elsewhere/x");
  make_link(update("2023a.1.0"), "/var/db/elsewhere");
  make_file(downloads + "/.marlin-install.new/x");
  EXPECT_THAT(told_by({"--prune"}),
              ::testing::MatchesRegex(
                  "removed what an earlier one left: 1 files, "
                  "[0-9]+ kB\n(kept 2024c.1.0: it is newer than what "
                  "is in use; --force --prune removes it\n|removed "
                  "202[34]e.1.0: [0-9] files, [0-9]+ kB\n)+"));
  EXPECT_THAT(names_of_sets(),
              ::testing::UnorderedElementsAre(
                  "2023a.1.0", "2023d.1.0", "2024a.1.0", "2024c.1.0",
                  "2024d.1.0", "notes.txt", ".incoming"));
  EXPECT_EQ(install({"--force", "--prune"}).log, "");
  EXPECT_THAT(names_of_sets(),
              ::testing::Not(::testing::Contains("2024c.1.0")));
}

TEST_F(Installer, SettlesOnlyWhatIsInUse) {
  install_update("2023d.1.0", "44l");
  EXPECT_EQ(install().exit_status, 0);
  expect_nothing_changed_by(
      [] { EXPECT_EQ(told_by({"--settle"}), "nothing to settle\n"); });
  boot_prints(no_lines());
  make_link(icutz, update("2023d.1.0") + "/icutz");
  expect_nothing_changed_by([] {
    EXPECT_EQ(told_by({"--settle"}), "nothing to settle\n") << "two releases";
  });
  make_link(icutz, update(version) + "/icutz");
  EXPECT_THAT(told_by({"--settle"}),
              ::testing::MatchesRegex("removed 2023d.1.0: .*\n2024b.1.0 is in "
                                      "use and no longer announced\n"));
  EXPECT_EQ(link_at(tz_latest), nothing);
  EXPECT_THAT(names_of_sets(), ::testing::UnorderedElementsAre(version));
  boot_changes_nothing_and_prints(no_lines());
}

TEST_F(Installer, AuditsWithoutAChange) {
  EXPECT_EQ(install().exit_status, 0);
  EXPECT_EQ(told_by({"--audit"}), "2024b.1.0: whole; in use or announced\n");
  install_update("2023d.1.0", "44l");
  make_file(update("2023e.1.0") + "/SHA256SUMS");
  make_file(update("2023e.1.0") + "/zoneinfo/a");
  make_file(update(version) + "/zoneinfo/Europe/Paris", "TZ");
  point_zoneinfo_at(update("2023\"c") + "/zoneinfo");
  expect_nothing_changed_by([] {
    EXPECT_EQ(install({"--audit"}).exit_status, 1);
    EXPECT_EQ(told_by({"--audit"}),
              "2023\"c: lost; in use or announced\n"
              "2023d.1.0: without a manifest\n"
              "2023e.1.0: damaged, icutz is missing, not a directory\n"
              "2024b.1.0: damaged, zoneinfo/Europe/Paris is not as SHA256SUMS "
              "has it; in use or announced\n");
    EXPECT_THAT(
        told_by({"--audit", "--json"}),
        ::testing::AllOf(
            ::testing::StartsWith(
                "{\"sets\": [\n  {\"name\": \"2023\\\"c\", "
                "\"condition\": \"lost\", \"needed\": true},"),
            ::testing::EndsWith("{\"name\": \"2024b.1.0\", \"condition\": "
                                "\"damaged\", \"needed\": true}\n]}\n")));
  });
}

TEST_F(Installer, SaysThatItsWordsWereLost) {
  install_update("2023d.1.0", "44l");
  for (const auto& words :
       std::vector<std::vector<std::string>>{{"--help"},
                                             {"--version"},
                                             {"--check", source},
                                             {"--audit"},
                                             {source},
                                             {"--settle"},
                                             {"--prune"},
                                             {"--withdraw"}}) {
    const outcome lost = run(command(words), [] {
      ::dup2(::open("/dev/full", O_WRONLY), STDOUT_FILENO);
    });
    EXPECT_EQ(lost.exit_status, 1) << ::testing::PrintToString(words);
    EXPECT_EQ(lost.log,
              "marlin-install: cannot write to standard output: No space left "
              "on device; all else is done\n");
  }
}

TEST_F(Installer, DoesOneThingAtATime) {
  for (const auto& words :
       std::vector<std::vector<std::string>>{{},
                                             {source, source},
                                             {"--check"},
                                             {"--prune", source},
                                             {"--withdraw", "--prune"},
                                             {"--force", "--settle"},
                                             {"--chec", source},
                                             {"--p"},
                                             {"--verify"},
                                             {"--verify", "", source},
                                             {"--verify", "x", "--prune"},
                                             {"--json", "--prune"},
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
