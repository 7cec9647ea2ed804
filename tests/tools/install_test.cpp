// SPDX-License-Identifier: BSD-2-Clause
//
// The installer of updates as a program: what it takes, what it refuses and
// why, and that a refused update leaves no trace.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <set>
#include <sstream>

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string version = "2024b.1.0";
const std::string source = "/var/db/incoming/" + version;
const std::string paris = source + "/zoneinfo/Europe/Paris";
const std::string icu = source + "/icutz/icutz44l.dat";

// As make-update writes it.
void seal(const std::string& place = source) {
  EXPECT_EQ(run({"/usr/bin/sh", "-c",
                 "cd \"$0\" && find icutz zoneinfo -type f -print0 | LC_ALL=C "
                 "sort -z | xargs -0 sha256sum >SHA256SUMS",
                 place})
                .exit_status,
            0);
}

using words = std::vector<std::string>;

// Command lines, split at each blank; DIR is the update.
std::vector<words> lines(const std::vector<std::string>& all) {
  std::vector<words> split(all.size());
  for (std::size_t i = 0; i < all.size(); ++i) {
    std::istringstream rest(all[i]);
    for (std::string word; std::getline(rest, word, ' ');)
      split[i].push_back(word == "DIR" ? source : word);
  }
  return split;
}

outcome install(words given = {source},
                const std::function<void()>& in_the_child = {}) {
  given.insert(given.begin(), MARLIN_INSTALL);
  outcome result = run(given, in_the_child);
  std::cout << result.log;
  return result;
}

// All that it prints.
std::string told_by(const words& given) {
  return install(given, [] { ::dup2(STDERR_FILENO, STDOUT_FILENO); }).log;
}

std::set<std::string> names_of_sets() {
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(downloads))
    names.insert(entry.path().filename());
  return names;
}

void make_source(const std::string& place = source) {
  make_file(place + "/zoneinfo/+VERSION",
            place.substr(place.rfind('/') + 1, 5) + "\n");
  make_file(place + "/zoneinfo/America/Los_Angeles", "TZif, west");
  make_file(place + "/zoneinfo/Europe/Paris", "TZif, east");
  make_file(place + "/icutz/icutz44l.dat", "ICU data");
  seal(place);
}

void expect_installed() {
  EXPECT_EQ(link_at(tz_latest), update(version));
  for (const std::string path :
       {"/zoneinfo/Europe/Paris", "/icutz/icutz44l.dat", "/SHA256SUMS"})
    EXPECT_EQ(file_at(update(version) + path), file_at(source + path));
  boot_prints();
  expect_links_at_update(version);
  EXPECT_EQ(link_at(local_time), zoneinfo + "/Europe/Paris");
}

// Runs it, and expects this status and these bytes on standard error.
void expect_end(int status, const std::string& log,
                const words& given = {source}) {
  SCOPED_TRACE(::testing::PrintToString(given));
  const outcome ended = install(given);
  EXPECT_EQ(ended.exit_status, status);
  EXPECT_EQ(ended.log, log);
}

// But for the time of the directory in which there was a hidden copy.
void expect_no_trace_of(const std::function<void()>& act) {
  const auto look = [] {
    snapshot seen = look_at_everything();
    seen[downloads].modified = seen[downloads].changed = 0;
    return seen;
  };
  const snapshot before = look();
  act();
  EXPECT_EQ(look(), before);
}

void expect_refused(const std::string& why, int status = 1,
                    const std::vector<words>& given = lines({"DIR",
                                                             "--check DIR"})) {
  const std::string log =
      "marlin-install: 2024b.1.0: " + why + "; nothing was changed\n";
  for (const auto& each : given)
    expect_no_trace_of([&] { expect_end(status, log, each); });
}

class Installer : public SoundDeviceTest {
 protected:
  void SetUp() override {
    SoundDeviceTest::SetUp();
    point_localtime_at(zoneinfo + "/Europe/Paris");
    make_source();
  }
};

// --- What it takes ----------------------------------------------------------

TEST_F(Installer, InstallsAnUpdateThatTheNextBootTakes) {
  expect_no_trace_of([] { expect_end(0, "", {"--check", source}); });
  expect_end(0, "");
  EXPECT_EQ(link_at(zoneinfo), system_tree) << "before the boot";
  EXPECT_EQ(file_at(record), nothing);
  expect_installed();
}

TEST_F(Installer, GivesEverythingTheModesOfASetAndKeepsZonesThatAreOneFile) {
  make_file(source + "/zoneinfo/leapseconds", "a table");
  make_file(source + "/icutz/zoneinfo64.res", "beside");
  make_file(source + "/SHA256SUMS.sig", "a signature");
  ASSERT_EQ(::link(paris.c_str(), (source + "/zoneinfo/CET").c_str()), 0);
  for (const auto& path : {source, source + "/zoneinfo", source + "/icutz",
                           source + "/zoneinfo/Europe", paris, icu})
    set_mode(path, 0775);
  seal();
  EXPECT_EQ(install({source}, [] { ::umask(077); }).exit_status, 0);
  auto seen = look_at({update(version)});
  for (const auto& [path, here] : seen)
    EXPECT_EQ(here.mode & 07777u, S_ISDIR(here.mode) ? 0755u : 0644u) << path;
  EXPECT_EQ(seen[update(version) + "/zoneinfo/CET"].inode,
            seen[update(version) + "/zoneinfo/Europe/Paris"].inode);
  EXPECT_EQ(file_at(update(version) + "/icutz/zoneinfo64.res"), "beside");
  EXPECT_EQ(file_at(update(version) + "/SHA256SUMS.sig"), "a signature");
  expect_installed();
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

TEST_F(Installer, ReplacesAnAnnouncementOfAnySort) {
  for (const auto& make : std::vector<std::function<void()>>{
           [] { announce("2024a.1.0"); },  // dangles
           // The next boot refuses that one, and every later boot.
           [] { install_and_announce("2024c.1.0", "43l"); },
           [] { make_link(tz_latest, "/elsewhere"); },
           [] { make_link(tz_latest, update("9999z.1.0")); },
           [] { make_file(tz_latest, "no link"); }}) {
    make();
    EXPECT_EQ(install().exit_status, 0);
    EXPECT_EQ(link_at(tz_latest), update(version));
  }
  expect_installed();
}

TEST_F(Installer, IsNotTheOnlyOneWhenTheLockIsTaken) {
  const int other = ::open(downloads.c_str(), O_RDONLY | O_DIRECTORY);
  ASSERT_EQ(::flock(other, LOCK_EX), 0);
  for (const auto& given :
       lines({"DIR", "--check DIR", "--prune", "--withdraw", "--settle"}))
    expect_end(3,
               "marlin-install: another marlin-install is running; try again "
               "later\n",
               given);
  EXPECT_EQ(install({"--audit"}).exit_status, 0);
  ::close(other);
  EXPECT_EQ(install().exit_status, 0);
}

// --- What is not newer ------------------------------------------------------

TEST_F(Installer, RefusesWhatIsNotNewer) {
  install_and_use("2024c.1.0", "44l");
  expect_refused("it is not newer than 2024c.1.0, which is in use", 4);
  install_and_announce("2024d.1.0", "44l");
  expect_refused("it is not newer than 2024d.1.0, which is announced", 4);
  expect_end(0, "", {"--force", "--check", source});
  EXPECT_EQ(link_at(tz_latest), update("2024d.1.0"));
  // The way back to an older set, as docs/integration.md has it.
  expect_end(0, "", {"--force", source});
  wipe(zoneinfo);
  EXPECT_EQ(boot().exit_status, 0);
  expect_links_at_update(version);
  install_system("2024b", "44l");
  expect_refused("it is not newer than 2024b.1.0, which is the system's", 4);
}

TEST_F(Installer, NeverChangesAWholeSetThatIsNeeded) {
  EXPECT_EQ(install().exit_status, 0);
  expect_refused("it is not newer than 2024b.1.0, which is announced", 4);
  const std::string why =
      "a set of this version is in use or announced; give other data another";
  expect_refused(why, 1, {{"--force", source}});
  wipe(tz_latest);
  make_link(icutz, update(version) + "/icutz");
  expect_refused(why);
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
  for (const std::string& announced : {update(version), nothing}) {
    for (const auto& damage : damages) {
      damage();
      expect_end(0, "");
      EXPECT_EQ(link_at(tz_latest), announced);
      expect_end(0, "", {"--audit"});
    }
    boot_prints();
    expect_links_at_update(version);
    wipe(tz_latest);  // it is in use, and not to be announced
  }
  install_and_announce("2024c.1.0", "44l");
  wipe(update(version));
  expect_end(0, "");
  EXPECT_EQ(link_at(tz_latest), update("2024c.1.0")) << "newer, as it was";
  boot_prints();
  expect_links_at_update("2024c.1.0");
}

// Perhaps it is whole, and no set ever changes.
TEST_F(Installer, ReplacesOnlyByForceWhatCannotBeRead) {
  EXPECT_EQ(install().exit_status, 0);
  set_mode(update(version), 0);
  const std::string why =
      "a set of this version is in use or announced, and cannot be checked, so "
      "that only --force replaces it: cannot open "
      "/var/db/timezone/tz/2024b.1.0: Permission denied";
  expect_refused(why);
  expect_end(0, "", {"--force", source});
  expect_end(0, "", {"--audit"});
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

TEST_F(Installer, RefusesADirectoryThatCannotBeItsPlace) {
  wipe(downloads);
  expect_end(1,
             "marlin-install: cannot open /var/db/timezone/tz/: No such file "
             "or directory\n");
  make_directory(downloads, 0775);
  expect_end(1,
             "marlin-install: /var/db/timezone/tz/ can be written by others "
             "than its owner; give it the mode 755\n");
}

TEST_F(Installer, TakesBackASetThatCannotBeAnnounced) {
  make_directory(tz_latest);
  const std::string line =
      "marlin-install: 2024b.1.0: cannot rename /var/db/timezone/tz_latest: Is "
      "a directory; nothing was changed\n";
  expect_end(1, line);
  EXPECT_EQ(file_at(update(version)), nothing);
  EXPECT_EQ(link_at(timezone_root + "/.marlin-install.tz_latest"), nothing);
  install_update(version, "43l");
  expect_end(1, line);
  EXPECT_NE(file_at(update(version) + "/icutz/icutz43l.dat"), nothing);
  EXPECT_EQ(file_at(update(version) + "/icutz/icutz44l.dat"), nothing);
}

TEST_F(Installer, TakesBackACopyThatCannotBeWrittenWhole) {
  make_file(source + "/icutz/large.res", std::string(2000, 'x'));
  seal();
  const auto limit_files = [] {
    const rlimit limit{1000, 1000};
    ::setrlimit(RLIMIT_FSIZE, &limit);
  };
  expect_no_trace_of([&] {
    EXPECT_EQ(install({source}, limit_files).log,
              "marlin-install: 2024b.1.0: cannot write "
              "/var/db/timezone/tz/.marlin-install.new/icutz/large.res: "
              "File too large; nothing was changed\n");
  });
}

// --- Hostile updates --------------------------------------------------------

using action = std::function<void()>;

action file(const std::string& path, const std::string& content = "") {
  return [=] { make_file(source + "/" + path, content); };
}

action link(const std::string& path, const std::string& target) {
  return [=] { make_link(source + "/" + path, target); };
}

action mode(const std::string& path, mode_t bits) {
  return [=] { set_mode(source + path, bits); };
}

action gone(const std::string& path) {
  return [=] { wipe(source + "/" + path); };
}

const std::string zones = source + "/zoneinfo";
const std::string manifest = source + "/SHA256SUMS";

// `prepare` is for what was damaged.
void expect_each_refused(
    const std::vector<std::pair<std::string, action>>& damages,
    const action& prepare) {
  for (const auto& [why, damage] : damages) {
    wipe(source);
    make_source();
    damage();
    prepare();
    expect_refused(why);
  }
  boot_prints();
  expect_links_at_system();
}

TEST_F(Installer, RefusesWhatNoSetCanHave) {
  expect_each_refused(
      {{"zoneinfo/Europe/Paris is a socket", [] { make_socket(paris); }},
       {"zoneinfo/Europe/Paris is a link",
        link("zoneinfo/Europe/Paris", "/dev/zero")},
       {"zoneinfo/CET is a link", link("zoneinfo/CET", "Europe/Paris")},
       {"zoneinfo is a link, not a directory",
        link("zoneinfo", "/usr/share/zoneinfo.default")},
       {"zoneinfo is missing, not a directory", gone("zoneinfo")},
       {"icutz is a file, not a directory", file("icutz")},
       {"icutz holds no file icutzNNx.dat", gone("icutz/icutz44l.dat")},
       {"icutz holds more than one file icutzNNx.dat",
        file("icutz/icutz45l.dat")},
       {"icutz/icutz44l.dat is a directory", [] { make_directory(icu); }},
       {"zoneinfo/+VERSION names no release", file("zoneinfo/+VERSION", " \n")},
       {"zoneinfo/+VERSION says 2024b\\x1b[0m, another release than its "
        "name",
        file("zoneinfo/+VERSION", "2024b\033[0m\n")},
       {"zoneinfo/+VERSION says " + std::string(40, '2') +
            ", another release than its name",
        file("zoneinfo/+VERSION", std::string(1u << 20, '2'))},
       {"zoneinfo/Europe/Paris cannot be read by all",
        mode("/zoneinfo/Europe/Paris", 0600)},
       {"zoneinfo/Europe cannot be read by all",
        mode("/zoneinfo/Europe", 0700)},
       {"zoneinfo/Europe/Paris can be written by all",
        mode("/zoneinfo/Europe/Paris", 0666)},
       {"zoneinfo/Europe can be written by all",
        mode("/zoneinfo/Europe", 0777)},
       {"the update can be written by all", mode("", 01777)},
       {"the update cannot be read by all", mode("", 0700)},
       {"zoneinfo/Europe/Paris has the set-user-ID, the set-group-ID or "
        "the sticky bit",
        mode("/zoneinfo/Europe/Paris", 04755)},
       {"README does not belong in an update", file("README")},
       {".\\x0a does not belong in an update", file(".\n")},
       {"zoneinfo/a\\x0ab has a name that no zone has", file("zoneinfo/a\nb")},
       {"zoneinfo/a b has a name that no zone has", file("zoneinfo/a b")},
       {"zoneinfo/empty has no file", [] { make_directory(zones + "/empty"); }},
       {"icutz/below is a directory",
        [] { make_directory(source + "/icutz/below"); }},
       {"zoneinfo/a/b/c/d/e/f/g/h is deeper than a zone can be",
        [] { make_directory(zones + "/a/b/c/d/e/f/g/h/i"); }},
       {"it has more than 8192 entries",
        [] {
          run({"/usr/bin/sh", "-c",
               "cd " + zones + " && seq 9000 | xargs touch"});
        }},
       {"icutz/x.res is larger than 4 MiB",
        file("icutz/x.res", std::string((4 << 20) + 1, 'x'))},
       {"it is larger than 32 MiB",
        [] {
          for (char letter = 'a'; letter < 'i'; ++letter)
            file(std::string("icutz/") + letter, std::string(4 << 20, 'x'))();
        }},
       // The last, because a FIFO leaves the test 30 seconds.
       {"zoneinfo/Europe/Paris is a FIFO", [] { make_fifo(paris); }}},
      [] { seal(); });
}

// What its manifest says is all that is looked at in a file.
TEST_F(Installer, RefusesWhatIsNotAsItsManifestHasIt) {
  const std::string whole = file_at(manifest);
  const std::string lacks_paris =
      "SHA256SUMS lists what is missing, \"zoneinfo/Europe/Paris\"";
  expect_each_refused(
      {{"zoneinfo/Europe/Paris is not as SHA256SUMS has it",
        file("zoneinfo/Europe/Paris", "TZif, East")},
       {lacks_paris, gone("zoneinfo/Europe")},
       {lacks_paris,
        [] {
          ::rename((zones + "/Europe").c_str(), (zones + "/Zulu").c_str());
        }},
       {lacks_paris,
        file("SHA256SUMS", whole + whole.substr(whole.size() - 88))},
       {"zoneinfo/Europe/Nice is not in SHA256SUMS",
        file("zoneinfo/Europe/Nice")},
       {"zoneinfo/Zulu is not in SHA256SUMS", file("zoneinfo/Zulu")},
       {"icutz/icutz44l.dat is not in SHA256SUMS", file("SHA256SUMS")},
       {"it has no SHA256SUMS", gone("SHA256SUMS")},
       {"SHA256SUMS is a link", link("SHA256SUMS", "icutz/icutz44l.dat")},
       {"SHA256SUMS is a FIFO", [] { make_fifo(manifest); }},
       {"SHA256SUMS lists what is missing, \"\\x1b[2J\"",
        file("SHA256SUMS", whole + std::string(66, 'x') + "\033[2J\n")},
       {"zoneinfo/Europe/Paris is not as SHA256SUMS has it",
        file("SHA256SUMS", whole.substr(0, whole.size() - 1))},
       // One file under both names, and no hash of it.
       {"SHA256SUMS lists what is missing, \"\"",
        [&] {
          make_file(manifest, whole.substr(0, whole.size() - 88) +
                                  "zoneinfo/Europe/Paris\n");
          wipe(paris);
          ASSERT_EQ(::link(manifest.c_str(), paris.c_str()), 0);
        }},
       {"SHA256SUMS is larger than 4 MiB",
        file("SHA256SUMS", std::string(5 << 20, 'x'))}},
      [] {});
}

// Whatever emulates processes tells it too late.
TEST_F(Installer, TellsOfAProgramThatCannotBeRun) {
  if (!emulated())
    expect_refused("cannot run /nowhere: No such file or directory", 1,
                   {{"--verify", "/nowhere", source}});
}

// "$1" has to be the copy; what the source becomes meanwhile does not matter.
TEST_F(Installer, LetsAProgramVerifyTheCopy) {
  const std::string program = "/var/db/verify", seen = "/var/db/seen";
  const auto verify_by = [&](const std::string& script) {
    make_file(program, "#!/bin/sh\n" + script + "\n", 0755);
  };
  const std::vector<words> verified{{"--verify", program, source}};
  verify_by("exit 7");
  expect_refused(program + " refuses it, with status 7", 1, verified);
  verify_by("kill $$");
  expect_refused(program + " refuses it, with status 143", 1, verified);
  verify_by("echo $# $1 >" + seen + "; cat $1/SHA256SUMS >>" + seen +
            "; readlink " + tz_latest + " >>" + seen + "; echo ICU >" + icu);
  const std::string listed = file_at(manifest);
  expect_end(0, "", {"--force", "--verify", program, source});
  EXPECT_EQ(file_at(seen),
            "1 /var/db/timezone/tz/.marlin-install.new\n" + listed);
  EXPECT_EQ(file_at(update(version) + "/icutz/icutz44l.dat"), "ICU data");
  EXPECT_EQ(file_at(icu), "ICU\n");
}

TEST_F(Installer, RefusesANameThatIsNotAVersion) {
  for (const std::string name : {"latest", "2024", "2024b.", "2024b.1.0.0",
                                 "2024b.99999999999", "-2024b", "/"}) {
    const std::string place = name == "/" ? name : "/var/db/other/" + name;
    make_source("/var/db/other/" + name);
    expect_no_trace_of([&] {
      expect_end(1,
                 "marlin-install: " + name +
                     ": its name is not a version such as 2024a.1.0; nothing "
                     "was changed\n",
                 {place});
    });
  }
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
  boot_prints();
  for (const auto& other : {update("2023d.1.0") + "/icutz", update(version)}) {
    make_link(icutz, other);
    expect_nothing_changed_by([] {
      EXPECT_EQ(told_by({"--settle"}), "nothing to settle\n") << "not in use";
    });
  }
  make_link(icutz, update(version) + "/icutz");
  EXPECT_THAT(told_by({"--settle"}),
              ::testing::MatchesRegex("removed 2023d.1.0: .*\n2024b.1.0 is in "
                                      "use and no longer announced\n"));
  EXPECT_EQ(link_at(tz_latest), nothing);
  EXPECT_THAT(names_of_sets(), ::testing::UnorderedElementsAre(version));
  boot_only_prints();
}

TEST_F(Installer, AuditsWithoutAChange) {
  EXPECT_EQ(install().exit_status, 0);
  EXPECT_EQ(told_by({"--audit"}), "2024b.1.0: whole; in use or announced\n");
  install_update("2023d.1.0", "44l");
  make_directory(update("2023c.1.0"), 0);
  make_link(update("2023f.1.0"), "2023f.1.0");
  make_file(update("2023e.1.0") + "/SHA256SUMS");
  make_file(update("2023e.1.0") + "/zoneinfo/a");
  make_file(update(version) + "/zoneinfo/Europe/Paris", "TZ");
  point_zoneinfo_at(update("2023\"c") + "/zoneinfo");
  expect_nothing_changed_by([] {
    EXPECT_EQ(install({"--audit"}).exit_status, 1);
    EXPECT_EQ(told_by({"--audit"}),
              "2023\"c: lost; in use or announced\n"
              "2023c.1.0: unreadable, cannot open "
              "/var/db/timezone/tz/2023c.1.0: Permission denied\n"
              "2023d.1.0: without a manifest\n"
              "2023e.1.0: damaged, icutz is missing, not a directory\n"
              "2023f.1.0: damaged, it is not a directory\n"
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
  for (const auto& given :
       lines({"--help", "--version", "--check DIR", "--audit", "DIR",
              "--settle", "--prune", "--withdraw"})) {
    SCOPED_TRACE(::testing::PrintToString(given));
    const outcome lost = install(
        given, [] { ::dup2(::open("/dev/full", O_WRONLY), STDOUT_FILENO); });
    EXPECT_EQ(lost.exit_status, 1);
    EXPECT_EQ(lost.log,
              "marlin-install: cannot write to standard output: No space left "
              "on device; all else is done\n");
  }
}

TEST_F(Installer, DoesOneThingAtATime) {
  for (const auto& given :
       lines({"", "DIR DIR", "--check", "--prune DIR", "--withdraw --prune",
              "--force --settle", "--chec DIR", "--p", "--verify",
              "--verify  DIR", "--verify x --prune", "--json --prune",
              "--check=x", "-x", "--\033"})) {
    SCOPED_TRACE(::testing::PrintToString(given));
    const outcome misused = install(given);
    EXPECT_EQ(misused.exit_status, 2);
    EXPECT_THAT(misused.log, ::testing::EndsWith("; see --help\n"));
    EXPECT_THAT(misused.log, ::testing::Not(::testing::HasSubstr("\033")));
    EXPECT_THAT(misused.lines(), ::testing::SizeIs(1));
  }
  EXPECT_EQ(install({"--help"}).exit_status, 0);
  EXPECT_EQ(install({"--version"}).exit_status, 0);
}

}  // namespace
