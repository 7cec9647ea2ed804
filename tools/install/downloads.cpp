// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/downloads.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <set>
#include <vector>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/install/device_facts.h"
#include "tools/install/failure.h"

namespace {

// Hidden, and no versions: neither a boot nor a person takes them for a set.
constexpr char incoming[] = ".marlin-install.new";
constexpr char outgoing[] = ".marlin-install.old";
constexpr char next_announcement[] = ".marlin-install.tz_latest";
constexpr char announcement[] = "tz_latest";

// Where the integrator has put it: a link is followed.
descriptor open_place(const char* path) {
  descriptor opened(::open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (opened.number() < 0) fail("open", path);
  return opened;
}

std::string path_of(const std::string& name) {
  return paths::download_root + name;
}

void lock(int directory) {
  if (::flock(directory, LOCK_EX | LOCK_NB) == 0) return;
  if (errno != EWOULDBLOCK) fail("lock", paths::download_root);
  throw failure{status::busy,
                "another one is at work on this device; try again later"};
}

}  // namespace

downloads::downloads()
    : links_(open_place(paths::timezone_directory)),
      sets_(open_place(paths::download_root)) {
  lock(sets_.number());
  // What belongs to another user can stay: it stands in the way of nothing but
  // a directory of its own name.
  tidy();
  sync_announcement();
}

void downloads::delete_hidden() {
  for (const char* name : {incoming, outgoing}) {
    const removed gone = remove_entry(sets_.number(), name, path_of(name));
    leftovers_.files += gone.files;
    leftovers_.bytes += gone.bytes;
  }
  remove_entry(links_.number(), next_announcement, next_announcement);
}

std::string downloads::incoming_path() const { return path_of(incoming); }

descriptor downloads::make_incoming() {
  insist_on_own(incoming);
  if (::mkdirat(sets_.number(), incoming, 0700) != 0)
    fail("make the directory", path_of(incoming));
  return open_directory(sets_.number(), incoming, path_of(incoming));
}

void downloads::insist_on_own(const std::string& name) const {
  const auto status = status_of(sets_.number(), name, path_of(name));
  if (status.st_mode != 0 && ::geteuid() != 0 && status.st_uid != ::geteuid())
    refuse(escaped(path_of(name)) +
           " belongs to another user, who has to remove it");
}

void downloads::put_in_place(const std::string& name) {
  if (status_of(sets_.number(), name, path_of(name)).st_mode != 0) {
    insist_on_own(name);
    rename_entry(sets_.number(), name, outgoing, path_of(name));
    replaced_ = name;
  }
  rename_entry(sets_.number(), incoming, name, path_of(incoming));
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
    const std::function<void(const std::string&, const removed&)>& tell) {
  if (leftovers_.files != 0) tell("what an earlier one left", leftovers_);
  const std::set<std::string> needed = needed_sets();
  const listing sets = open_listing(sets_.number(), paths::download_root);
  while (const char* const found =
             next_name(sets.get(), paths::download_root)) {
    const std::string name = found;
    if (needed.contains(name) || !version_in(name)) continue;
    insist_on_own(name);
    // A stop in the middle leaves no half of a set.
    rename_entry(sets_.number(), name, outgoing, path_of(name));
    tell(name, remove_entry(sets_.number(), outgoing, path_of(name)));
  }
  sync(sets_.number(), paths::download_root);
}

void downloads::take_back() noexcept {
  try {
    if (!placed_.empty())
      rename_entry(sets_.number(), placed_, incoming, path_of(placed_));
    if (!replaced_.empty())
      rename_entry(sets_.number(), outgoing, replaced_, path_of(outgoing));
  } catch (...) {
    // The reason for taking it back is what has to be told. A whole set stays,
    // which nothing names.
  }
  tidy();
}

void downloads::tidy() noexcept {
  try {
    delete_hidden();
  } catch (...) {
    // The next one tries again.
  }
}
