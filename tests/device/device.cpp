// SPDX-License-Identifier: BSD-2-Clause
#include "tests/device/device.h"

#include <fcntl.h>
#include <linux/close_range.h>
#include <linux/magic.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <sstream>
#include <stdexcept>

namespace device {
namespace {

namespace fs = std::filesystem;

// A device that cannot be built as asked is no device to test on.
void must(bool succeeded, const std::string& what) {
  if (succeeded) return;
  throw std::runtime_error("cannot " + what + ": " + std::strerror(errno));
}

std::string bytes_of(const std::string& path) {
  std::ostringstream bytes;
  bytes << std::ifstream(path, std::ios::binary).rdbuf();
  return bytes.str();
}

int new_log() {
  const int log = ::memfd_create("log", MFD_CLOEXEC);
  must(log >= 0, "create a log");
  return log;
}

std::string taken_from(int log) {
  const std::string bytes = bytes_of("/proc/self/fd/" + std::to_string(log));
  ::close(log);
  return bytes;
}

std::string target_of(const std::string& path) {
  std::error_code unreadable;
  return fs::read_symlink(path, unreadable);
}

std::int64_t nanoseconds(const timespec& time) {
  return time.tv_sec * 1'000'000'000 + time.tv_nsec;
}

void look_below(const std::string& path, snapshot& seen) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return;
  std::string content;
  if (S_ISREG(status.st_mode)) content = bytes_of(path);
  if (S_ISLNK(status.st_mode)) content = target_of(path);
  seen[path] = {status.st_mode, status.st_ino, nanoseconds(status.st_mtim),
                nanoseconds(status.st_ctim), content};
  if (!S_ISDIR(status.st_mode)) return;
  std::error_code closed;
  for (const auto& child : fs::directory_iterator(path, closed))
    look_below(child.path(), seen);
}

std::string describe(const std::string& path, mode_t wanted,
                     const std::function<std::string()>& content) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) {
    return errno == ENOENT ? nothing
                           : "(" + std::string(std::strerror(errno)) + ")";
  }
  if ((status.st_mode & S_IFMT) == wanted) return content();
  if (S_ISLNK(status.st_mode)) return "(a link to " + target_of(path) + ")";
  if (S_ISREG(status.st_mode)) return "(a file)";
  if (S_ISDIR(status.st_mode)) return "(a directory)";
  return "(something else)";
}

// Permissions that a test took away must not keep the next one from starting
// with an empty device.
void empty_directory(const std::string& path) {
  for (const auto& child : fs::directory_iterator(path)) wipe(child.path());
}

void make_room_for(const std::string& path) {
  wipe(path);
  fs::create_directories(fs::path(path).parent_path());
}

bool is_memory_file_system(const char* path) {
  struct statfs status {};
  return ::statfs(path, &status) == 0 && status.f_type == TMPFS_MAGIC;
}

// The kernel starts no program that was built for another machine, nor does
// strace.
void put_emulator_before_program(std::vector<std::string>& words) {
  const auto program =
      std::find_if(words.begin(), words.end(), [](const std::string& word) {
        return word.starts_with(MARLIN_BINARY_DIR);
      });
  if (program != words.end()) words.insert(program, MARLIN_EMULATOR);
}

// The emulator has a last word on a program that a signal ends.
void remove_emulators_line(std::string& log) {
  const auto start = log.rfind("qemu: uncaught target signal ");
  if (start != std::string::npos) log.erase(start);
}

dev_t device_of(const char* path) {
  struct stat status {};
  return ::stat(path, &status) == 0 ? status.st_dev : 0;
}

}  // namespace

bool emulated() { return *MARLIN_EMULATOR != '\0'; }

std::string update(const std::string& version) {
  return downloads + "/" + version;
}

void make_directory(const std::string& path, mode_t mode) {
  if (!fs::is_directory(fs::symlink_status(path))) wipe(path);
  fs::create_directories(path);
  set_mode(path, mode);
}

void make_file(const std::string& path, const std::string& content,
               mode_t mode) {
  if (!fs::is_regular_file(fs::symlink_status(path))) make_room_for(path);
  std::ofstream file(path, std::ios::binary);
  file << content;
  file.close();
  must(file.good(), "write " + path);
  set_mode(path, mode);
}

void make_fifo(const std::string& path) {
  make_room_for(path);
  must(::mkfifo(path.c_str(), 0644) == 0, "make the FIFO " + path);
  ::alarm(240);
}

void make_socket(const std::string& path) {
  make_room_for(path);
  must(::mknod(path.c_str(), S_IFSOCK | 0644, 0) == 0,
       "make the socket " + path);
}

void make_link(const std::string& path, const std::string& target) {
  make_room_for(path);
  must(::symlink(target.c_str(), path.c_str()) == 0, "link " + path);
}

void set_mode(const std::string& path, mode_t mode) {
  must(::chmod(path.c_str(), mode) == 0, "set the mode of " + path);
}

void wipe(const std::string& path) {
  const auto status = fs::symlink_status(path);
  if (fs::is_directory(status)) {
    set_mode(path, 0700);
    empty_directory(path);
  }
  fs::remove(path);
}

void install_system(const std::string& release, const std::string& format) {
  wipe(system_tree);
  make_file(system_tree + "/+VERSION", release + "\n");
  make_file(system_tree + "/America/Los_Angeles", "TZif system LA");
  make_file(system_tree + "/Europe/Paris", "TZif system Paris");
  make_file(system_icu + "/icutzformat.txt", format + "\n");
}

void install_update(const std::string& version, const std::string& schema) {
  const std::string tree = update(version) + "/zoneinfo";
  const std::string release = version.substr(0, version.find('.'));
  make_file(tree + "/+VERSION", release + "\n");
  make_file(tree + "/America/Los_Angeles", "TZif " + version + " LA");
  make_file(tree + "/Europe/Paris", "TZif " + version + " Paris");
  make_file(update(version) + "/icutz/icutz" + schema + ".dat", "ICU");
}

void announce(const std::string& version) {
  make_link(tz_latest, update(version));
}

void install_and_announce(const std::string& version,
                          const std::string& schema) {
  install_update(version, schema);
  announce(version);
}

void install_and_use(const std::string& version, const std::string& schema) {
  install_update(version, schema);
  point_links_at_update(version);
}

void point_links_at_update(const std::string& version) {
  point_zoneinfo_at(update(version) + "/zoneinfo");
  make_link(icutz, update(version) + "/icutz");
  point_localtime_at(default_localtime);
}

void point_links_at_system() {
  point_zoneinfo_at(system_tree);
  wipe(icutz);
  point_localtime_at(default_localtime);
}

void point_zoneinfo_at(const std::string& target) {
  make_link(zoneinfo, target);
}

void point_localtime_at(const std::string& target) {
  make_link(local_time, target);
}

void PrintTo(const entry& shown, std::ostream* out) {
  *out << "mode " << std::oct << shown.mode << std::dec << ", inode "
       << shown.inode << ", changed " << shown.changed << ", \""
       << shown.content.substr(0, 80) << "\"";
}

snapshot look_at(const std::vector<std::string>& paths) {
  snapshot seen;
  for (const auto& path : paths) look_below(path, seen);
  return seen;
}

snapshot look_at_everything() { return look_at({"/var/db", "/usr/share"}); }

std::string listing() {
  std::ostringstream out;
  for (const auto& [path, shown] : look_at_everything()) {
    out << "  " << path << ": ";
    PrintTo(shown, &out);
    out << "\n";
  }
  return out.str();
}

std::string link_at(const std::string& path) {
  return describe(path, S_IFLNK, [&] { return target_of(path); });
}

std::string file_at(const std::string& path) {
  return describe(path, S_IFREG, [&] { return bytes_of(path); });
}

void expect_links_at_system() {
  EXPECT_EQ(link_at(zoneinfo), "/usr/share/zoneinfo.default");
  EXPECT_EQ(link_at(icutz), nothing);
}

void expect_links_at_update(const std::string& version) {
  EXPECT_EQ(link_at(zoneinfo), "/var/db/timezone/tz/" + version + "/zoneinfo");
  EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/" + version + "/icutz");
}

void expect_nothing_changed_by(const std::function<void()>& act) {
  const snapshot before = look_at_everything();
  act();
  EXPECT_EQ(look_at_everything(), before);
}

void expect_made_anew(const std::string& link,
                      const std::function<void()>& activate) {
  activate();
  const entry before = look_at({link}).at(link);
  quietly(activate);
  const entry after = look_at({link}).at(link);
  EXPECT_EQ(after.content, before.content);
  EXPECT_NE(after.inode, before.inode);
  set_mode(timezone_root, 0555);
  printed_by([&] { EXPECT_EQ(thrown_by(activate), EEXIST); });
}

log_lines outcome::lines() const {
  log_lines all;
  std::istringstream in(log);
  for (std::string line; std::getline(in, line);) all.push_back(line);
  return all;
}

outcome run(const std::vector<std::string>& command,
            const std::function<void()>& in_the_child) {
  const int log = new_log();
  std::vector<std::string> words = command;
  if (emulated()) put_emulator_before_program(words);
  std::vector<char*> arguments;
  for (auto& word : words) arguments.push_back(word.data());
  arguments.push_back(nullptr);

  const pid_t child = ::fork();
  must(child >= 0, "fork");
  if (child == 0) {
    ::dup2(log, STDERR_FILENO);
    if (in_the_child) in_the_child();
    // Nothing of this process reaches the program but descriptors 0 to 2.
    ::close_range(3, ~0u, CLOSE_RANGE_CLOEXEC);
    ::execv(arguments[0], arguments.data());
    ::_exit(127);
  }
  int status = 0;
  must(::waitpid(child, &status, 0) == child, "wait for " + command[0]);
  std::string printed = taken_from(log);
  if (emulated() && WIFSIGNALED(status)) remove_emulators_line(printed);
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1,
          WIFSIGNALED(status) ? WTERMSIG(status) : 0, printed};
}

void leave_the_log_unread() {
  int ends[2];
  must(::pipe(ends) == 0, "make a pipe");
  ::dup2(ends[1], STDERR_FILENO);
  ::close(ends[0]);
  ::signal(SIGPIPE, SIG_DFL);
}

void forbid_files_to_grow() {
  const rlimit limit{};
  must(::setrlimit(RLIMIT_FSIZE, &limit) == 0, "limit files");
  ::signal(SIGXFSZ, SIG_DFL);
}

traced_outcome trace(const std::vector<std::string>& options,
                     const std::vector<std::string>& command,
                     const std::function<void()>& in_the_child) {
  const std::string file = "/var/db/trace";
  std::vector<std::string> words = {"/usr/bin/strace", "-qq", "-o", file};
  words.insert(words.end(), {"-E", "ASAN_OPTIONS=detect_leaks=0"});
  words.insert(words.end(), options.begin(), options.end());
  words.insert(words.end(), command.begin(), command.end());
  const outcome ended = run(words, in_the_child);
  EXPECT_EQ(ended.exit_status, 0);
  const outcome traced{0, 0, file_at(file)};
  wipe(file);
  return {ended, traced.lines()};
}

outcome boot() {
  const std::vector<std::string> read_only = {downloads, tz_latest,
                                              "/usr/share"};
  const snapshot before = look_at(read_only);
  outcome result = run({MARLIN_PROGRAM});
  EXPECT_EQ(look_at(read_only), before)
      << "a data set, the announcement or the system partition was changed";
  std::cout << result.log.substr(0, 10'000);
  return result;
}

log_lines printed_by(const std::function<void()>& act) {
  const int standard_error = ::dup(STDERR_FILENO);
  const int log = new_log();
  ::dup2(log, STDERR_FILENO);
  act();
  ::dup2(standard_error, STDERR_FILENO);
  ::close(standard_error);
  return outcome{0, 0, taken_from(log)}.lines();
}

int thrown_by(const std::function<void()>& act) {
  try {
    act();
  } catch (int error) {
    return error;
  }
  ADD_FAILURE() << "no int was thrown";
  return 0;
}

std::string why_not_private() {
  for (const char* path : {"/", "/var/db", "/usr/share"}) {
    if (!is_memory_file_system(path))
      return std::string(path) + " is not a throw-away file system in memory";
  }
  if (device_of("/var/db") == device_of("/") ||
      device_of("/usr/share") == device_of("/") ||
      device_of("/var/db") == device_of("/usr/share"))
    return "/var/db and /usr/share are not file systems of their own";
  if (bytes_of("/proc/self/status").find("CapEff:\t0000000000000000") ==
      std::string::npos)
    return "this process has capabilities, so permissions mean nothing";
  return {};
}

void DeviceTest::SetUp() {
  const std::string reason = why_not_private();
  ASSERT_EQ(reason, "") << "refusing to touch this machine";
  ::umask(022);
  empty_directory("/var/db");
  empty_directory("/usr/share");
  make_directory(downloads);
}

void SoundDeviceTest::SetUp() {
  DeviceTest::SetUp();
  install_system("2023c", "44l");
  point_links_at_system();
}

void DeviceTest::TearDown() {
  ::alarm(0);
  if (HasFailure() && why_not_private().empty())
    std::cout << "The device afterwards:\n" << listing();
}

}  // namespace device
