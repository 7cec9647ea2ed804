// SPDX-License-Identifier: BSD-2-Clause
//
// A device to test on: "/var/db" and "/usr/share" as file systems of its own,
// built with words of the domain, booted, and looked at afterwards. The places
// and texts are written out here once more, on purpose: a wrong constant in the
// program must not make its own test right.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <type_traits>
#include <vector>

#include "tests/device/warnings.h"

namespace device {

// Links and files that the program owns or reads.
inline const std::string zoneinfo = "/var/db/timezone/zoneinfo";
inline const std::string icutz = "/var/db/timezone/icutz";
inline const std::string local_time = "/var/db/timezone/localtime";
inline const std::string tz_latest = "/var/db/timezone/tz_latest";
inline const std::string record = "/var/db/timezone/TZVersionDiffRecord";
inline const std::string legacy_icutz = "/var/db/icutz";
inline const std::string old_icu = "/var/db/icu";

// Directories of the data.
inline const std::string timezone_root = "/var/db/timezone";
inline const std::string downloads = "/var/db/timezone/tz";
inline const std::string system_tree = "/usr/share/zoneinfo.default";
inline const std::string system_icu = "/usr/share/icu";
inline const std::string default_localtime =
    "/var/db/timezone/zoneinfo/America/Los_Angeles";

// The directory of the update with this version.
std::string update(const std::string& version);

// --- Building a device -----------------------------------------------------

// Each removes whatever else is there. A file that is made anew keeps its
// inode, and a directory what is in it.
void make_directory(const std::string& path, mode_t mode = 0755);
void make_file(const std::string& path, const std::string& content = {},
               mode_t mode = 0644);
// Who opens it waits for ever: from here the test has 30 seconds, then SIGALRM
// ends it.
void make_fifo(const std::string& path);
void make_socket(const std::string& path);
void make_link(const std::string& path, const std::string& target);
void set_mode(const std::string& path, mode_t mode);
// Removes whatever is there, with all that is in it.
void wipe(const std::string& path);

// A system partition with the zones Los Angeles and Paris.
void install_system(const std::string& release, const std::string& format);
// A downloaded update, with the same zones and an ICU data file.
void install_update(const std::string& version, const std::string& schema);
// What an installer of updates does last.
void announce(const std::string& version);
void install_and_announce(const std::string& version,
                          const std::string& schema);
// Makes an update, or with no version the system partition, the active set.
void point_links_at_update(const std::string& version);
void point_links_at_system();
void install_and_use(const std::string& version, const std::string& schema);
void point_zoneinfo_at(const std::string& target);
void point_localtime_at(const std::string& target);

// --- Looking at it ---------------------------------------------------------

struct entry {
  mode_t mode;
  ino_t inode;
  std::int64_t modified;  // in nanoseconds
  std::int64_t changed;
  std::string content;  // of a regular file, or the target of a link
  bool operator==(const entry&) const = default;
};
void PrintTo(const entry& shown, std::ostream* out);

using snapshot = std::map<std::string, entry>;

// Everything at and below these paths, down to inode numbers and times.
snapshot look_at(const std::vector<std::string>& paths);
// Everything on the device.
snapshot look_at_everything();
// The device for a person to read.
std::string listing();

// The target of a link, or a description of what is there instead.
std::string link_at(const std::string& path);
// The content of a regular file, or a description of what is there instead.
std::string file_at(const std::string& path);
inline const std::string nothing = "(nothing)";

void expect_links_at_system();
void expect_links_at_update(const std::string& version);

// Expects that `act` changes nothing, down to inodes and times.
void expect_nothing_changed_by(const std::function<void()>& act);

// Expects that a second `activate` makes the link once more that the first one
// made, and throws if the old one cannot be removed.
void expect_made_anew(const std::string& link,
                      const std::function<void()>& activate);

// --- Booting ---------------------------------------------------------------

struct outcome {
  int exit_status;  // of a process that exited, otherwise -1
  int signal;       // that ended the process, otherwise 0
  std::string log;  // the bytes of standard error
  log_lines lines() const;
};

// Whether the program under test was built for another machine, and runs below
// an emulator: what the kernel sees of it are the emulator's calls and memory.
bool emulated();

// Runs a program to its end.
outcome run(const std::vector<std::string>& command,
            const std::function<void()>& in_the_child = {});

// For the child, where these signals end a process as they do by default:
// standard error becomes a pipe that nobody reads; no file may grow.
void leave_the_log_unread();
void forbid_files_to_grow();

// Runs a program under strace(1) with these options and expects that it exits
// with status 0.
struct traced_outcome : outcome {
  std::vector<std::string> calls;  // the lines of the trace
};
traced_outcome trace(const std::vector<std::string>& options,
                     const std::vector<std::string>& command = {MARLIN_PROGRAM},
                     const std::function<void()>& in_the_child = {});

// Boots: runs marlin and expects that no data set, no announcement and nothing
// on the system partition was changed by it.
outcome boot();

// Boots, and expects an exit with status 0 after these lines and no other.
template <typename... Lines>
void boot_prints(const Lines&... expected) {
  const outcome booted = boot();
  EXPECT_EQ(booted.exit_status, 0);
  EXPECT_EQ(booted.lines(), lines(expected...));
}
// The same of a boot that changes nothing.
template <typename... Lines>
void boot_only_prints(const Lines&... expected) {
  expect_nothing_changed_by([&] { boot_prints(expected...); });
}

// --- Calling its functions in this process -----------------------------------

// The lines that `act` prints to standard error.
log_lines printed_by(const std::function<void()>& act);

// The int that `act` throws; fails the test when it throws none.
int thrown_by(const std::function<void()>& act);

// Expects that `act` prints these lines and no other.
template <typename... Lines>
void prints(const std::function<void()>& act, const Lines&... expected) {
  EXPECT_EQ(printed_by(act), lines(expected...));
}

// The same of an act that throws this int at its end.
template <typename... Lines>
void throws(int error, const std::function<void()>& act,
            const Lines&... expected) {
  prints([&] { EXPECT_EQ(thrown_by(act), error); }, expected...);
}

// The result of `act`, which is expected to print nothing.
template <typename Act>
auto quietly(const Act& act) {
  if constexpr (std::is_void_v<std::invoke_result_t<Act>>) {
    prints(act);
  } else {
    std::optional<std::invoke_result_t<Act>> result;
    prints([&] { result = act(); });
    return *result;
  }
}

// Every test that touches the device derives from this. Refuses to touch
// anything outside of a private device; starts from an empty one that has only
// "/var/db/timezone/tz"; shows the whole device when a test has failed.
class DeviceTest : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;
};

// With a sound device: system 2023c with ICU schema 44l, never updated.
class SoundDeviceTest : public DeviceTest {
 protected:
  void SetUp() override;
};

// Why this process may not touch "/var/db" and "/usr/share"; empty if it may.
std::string why_not_private();

}  // namespace device
