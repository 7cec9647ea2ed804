// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/downloads.h"

#include <fcntl.h>
#include <pwd.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <memory>
#include <set>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/install/device_facts.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"

namespace {

// Hidden, and no versions: neither a boot nor a person takes them for a set.
constexpr char hidden[] = ".marlin-install.new";
constexpr char next_announcement[] = ".marlin-install.tz_latest";
constexpr char announcement[] = "tz_latest";

std::string path_of(const std::string& name) {
  return paths::download_root + name;
}

// Without the C library's other ways to ask, which a static program cannot go.
std::string account(uid_t number) {
  const std::unique_ptr<std::FILE, int (*)(std::FILE*)> accounts(
      std::fopen("/etc/passwd", "re"), &std::fclose);
  while (const passwd* const each =
             accounts ? ::fgetpwent(accounts.get()) : nullptr) {
    if (each->pw_uid == number) return escaped(each->pw_name);
  }
  return std::to_string(number);
}

// Where the integrator has put it: a link is followed.
descriptor open_place(const char* path) {
  descriptor opened(::open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (opened.number() < 0) fail("open", path);
  return opened;
}

// Whoever owns a directory can exchange what is in it at any moment: also a set
// that was checked for one that was not.
void refuse_others(int directory, const std::string& path, bool root_will_do) {
  struct stat status {};
  if (::fstat(directory, &status) != 0) fail("look at", path);
  if (status.st_uid != ::geteuid() && !(root_will_do && status.st_uid == 0)) {
    const std::string owner = account(status.st_uid);
    refuse(path + " belongs to " + owner +
           "; run this as that account, as in \"runuser -u " + owner +
           " -- marlin-install ...\"");
  }
}

void lock(int directory) {
  if (::flock(directory, LOCK_EX | LOCK_NB) == 0) return;
  if (errno != EWOULDBLOCK) fail("lock", paths::download_root);
  throw failure{status::busy,
                "another marlin-install is running; try again later"};
}

}  // namespace

descriptor open_sets() {
  descriptor opened = open_place(paths::download_root);
  if (::geteuid() == 0)
    refuse_others(opened.number(), paths::download_root, false);
  return opened;
}

downloads::downloads()
    : links_(open_place(paths::timezone_directory)),
      sets_(open_place(paths::download_root)) {
  refuse_others(links_.number(), paths::timezone_directory, true);
  refuse_others(sets_.number(), paths::download_root, false);
  if ((status_of(sets_.number(), ".", paths::download_root).st_mode & 022) != 0)
    refuse(std::string(paths::download_root) +
           " can be written by others than its owner; give it the mode 755");
  lock(sets_.number());
  // What belongs to another account can stay: it stands in the way of nothing
  // but a directory of its own name.
  tidy();
  sync_announcement();
}

void downloads::delete_hidden() {
  const removed gone = remove_entry(sets_.number(), hidden, path_of(hidden));
  leftovers_.files += gone.files;
  leftovers_.bytes += gone.bytes;
  // On a read-only file system unlink(2) fails even where nothing stands.
  const struct stat left =
      status_of(links_.number(), next_announcement, next_announcement);
  if (left.st_mode == 0) return;
  // Never a directory: that would be somebody else's.
  if (::unlinkat(links_.number(), next_announcement, 0) != 0)
    fail("remove", next_announcement);
}

std::string downloads::incoming_path() const { return path_of(hidden); }

descriptor downloads::make_incoming() {
  insist_on_own(hidden);
  if (::mkdirat(sets_.number(), hidden, 0700) != 0)
    fail("make the directory", path_of(hidden));
  descriptor made = open_directory(sets_.number(), hidden, path_of(hidden));
  refuse_others(made.number(), path_of(hidden), false);
  return made;
}

void downloads::insist_on_own(const std::string& name) const {
  const auto status = status_of(sets_.number(), name, path_of(name));
  if (status.st_mode != 0 && ::geteuid() != 0 && status.st_uid != ::geteuid())
    refuse(escaped(path_of(name)) +
           " belongs to another account, which has to remove it");
}

void downloads::put_in_place(const descriptor& incoming,
                             const std::string& name) {
  if (::fchmod(incoming.number(), 0755) != 0)
    fail("set the mode of", path_of(hidden));
  // One call for all files; each with fsync(2) takes many times as long.
  if (::syncfs(incoming.number()) != 0) fail("sync", path_of(hidden));
  exchanged_ = status_of(sets_.number(), name, path_of(name)).st_mode != 0;
  if (exchanged_) {
    insist_on_own(name);
    exchange_entries(sets_.number(), hidden, name, path_of(name));
  } else {
    rename_entry(sets_.number(), hidden, name, path_of(hidden));
  }
  placed_ = name;
  sync(sets_.number(), paths::download_root);
}

void downloads::announce(const std::string& name) {
  if (::symlinkat(path_of(name).c_str(), links_.number(), next_announcement) !=
      0)
    fail("make the link",
         std::string(paths::timezone_directory) + next_announcement);
  rename_entry(links_.number(), next_announcement, announcement,
               paths::latest_update_link);
}

void downloads::sync_announcement() const {
  sync(links_.number(), paths::timezone_directory);
}

bool downloads::withdraw() {
  const char* const path = paths::latest_update_link;
  if (status_of(links_.number(), announcement, path).st_mode == 0) return false;
  if (::unlinkat(links_.number(), announcement, 0) != 0) fail("remove", path);
  sync_announcement();
  return true;
}

void downloads::prune(
    bool force,
    const std::function<void(const std::string&, const removed*)>& tell) {
  if (leftovers_.files != 0) tell("what an earlier one left", &leftovers_);
  const std::set<std::string> needed = needed_sets();
  std::string foreign;
  const listing sets = open_listing(sets_.number(), paths::download_root);
  while (const char* const found =
             next_name(sets.get(), paths::download_root)) {
    const std::string name = found;
    // What a link of that name leads to is not known to be nobody's.
    if (needed.contains(name) || !version_in(name) ||
        S_ISLNK(status_of(sets_.number(), name, path_of(name)).st_mode))
      continue;
    if (!force && a_boot_could_take(name)) {
      tell(name, nullptr);
      continue;
    }
    try {
      insist_on_own(name);
    } catch (const refusal&) {
      foreign = name;
      continue;
    }
    // A stop in the middle leaves no half of a set.
    rename_entry(sets_.number(), name, hidden, path_of(name));
    const removed gone = remove_entry(sets_.number(), hidden, path_of(name));
    tell(name, &gone);
  }
  sync(sets_.number(), paths::download_root);
  if (!foreign.empty()) insist_on_own(foreign);
}

bool downloads::take_back() noexcept {
  try {
    if (!placed_.empty() && exchanged_)
      exchange_entries(sets_.number(), placed_, hidden, path_of(placed_));
    else if (!placed_.empty())
      rename_entry(sets_.number(), placed_, hidden, path_of(placed_));
  } catch (...) {
    // The reason for taking it back is what has to be told. A whole set stays,
    // which nothing names.
    tidy();
    return false;
  }
  return tidy();
}

bool downloads::tidy() noexcept {
  try {
    delete_hidden();
    return true;
  } catch (...) {
    // The next one tries again.
    return false;
  }
}
