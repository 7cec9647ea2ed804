// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/jobs.h"

#include <fcntl.h>

#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <set>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/install/checks.h"
#include "tools/install/contents.h"
#include "tools/install/device_facts.h"
#include "tools/install/downloads.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"
#include "tools/install/program.h"

namespace {

struct update {
  descriptor directory;
  std::string name;  // its version
};

// The last part of the path, which a "." or a ".." at its end does not tell.
std::string name_of(std::string path) {
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
  std::string name = path.substr(path.rfind('/') + 1);
  if (name.empty()) return path;
  if (name != "." && name != "..") return name;
  const std::unique_ptr<char, decltype(&std::free)> whole(
      ::realpath(path.c_str(), nullptr), &std::free);
  return whole ? name_of(whole.get()) : name;
}

update open_update(std::string path) {
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
  return {open_directory(AT_FDCWD, path, path), name_of(path)};
}

const char* word_for(condition is) {
  switch (is) {
    case condition::whole:
      return "whole";
    case condition::damaged:
      return "damaged";
    case condition::unlisted:
      return "without a manifest";
    case condition::unreadable:
      return "unreadable";
    case condition::lost:
      break;
  }
  return "lost";
}

// What is checked is the copy: nobody else can change that.
descriptor checked_copy(downloads& place, const update& given,
                        const std::string& verifier) {
  descriptor copy = place.make_incoming();
  const std::string path = place.incoming_path();
  const auto files = files_in(given.directory.number(), copy.number(), path);
  check_manifest(copy.number(), files);
  check_contents(given.name, path, files);
  if (verifier.empty()) return copy;
  if (const int ended = run_program({verifier, path}); ended != 0)
    refuse(escaped(verifier) + " refuses it, with status " +
           std::to_string(ended));
  return copy;
}

// Puts before and after a line what it is about.
[[noreturn]] void rethrow(failure& told, const std::string& name,
                          const char* after) {
  told.line = escaped(name) + ": " + told.line + after;
  throw;
}

// What the device names already needs no announcement.
enum class placed { announced, named_before, only_checked };

placed put(downloads& place, const update& given, const options& wanted) {
  const bool is_named = check_version(given.name, wanted.force);
  const descriptor copy = checked_copy(place, given, wanted.verifier);
  if (wanted.what == job::check) {
    if (!place.take_back()) refuse("the copy cannot be deleted");
    return placed::only_checked;
  }
  place.put_in_place(copy, given.name);
  if (is_named) return placed::named_before;
  place.announce(given.name);
  return placed::announced;
}

int install(const options& wanted) {
  const update given = open_update(wanted.directory);
  const char* const name = given.name.c_str();
  downloads place;
  placed done{};
  try {
    done = put(place, given, wanted);
  } catch (failure& told) {
    rethrow(told, name,
            place.take_back()
                ? "; nothing was changed"
                : "; something of marlin-install's is left below "
                  "/var/db/timezone/, which the next run tries to delete");
  } catch (...) {
    place.take_back();
    throw;
  }
  if (done == placed::only_checked)
    return std::printf("%s can be installed\n", name), status::done;
  try {
    if (done == placed::announced) place.sync_announcement();
  } catch (failure& told) {
    rethrow(told, name,
            "; it is announced, but a loss of power may undo that: run this "
            "again");
  }
  place.tidy();
  std::printf(done == placed::announced
                  ? "%s is announced; the next boot decides\n"
                  : "%s is whole again, in its place\n",
              name);
  return status::done;
}

// A text of the device, escaped, and once more as JSON has it.
std::string quoted(const std::string& text) {
  std::string shown = "\"";
  for (const char letter : escaped(text)) {
    if (letter == '\\' || letter == '"') shown += '\\';
    shown += letter;
  }
  return shown + '"';
}

// All sets, and those that a link names and that are not there.
int audit(bool json) {
  std::set<std::string> sets = needed_sets();
  const std::set<std::string> needed = sets;
  const descriptor place = open_sets();
  const listing entries = open_listing(place.number(), paths::download_root);
  while (const char* const name =
             next_name(entries.get(), paths::download_root)) {
    if (version_in(name)) sets.insert(name);
  }
  bool all_whole = true;
  const char* before = "";
  if (json) std::printf("{\"sets\": [");
  for (const auto& set : sets) {
    const verdict found = condition_of(set);
    const char* const is = word_for(found.is);
    all_whole = all_whole && found.is == condition::whole;
    const bool stays = needed.contains(set);
    if (json)
      std::printf("%s\n  {\"name\": %s, \"condition\": \"%s\", \"needed\": %s}",
                  before, quoted(set).c_str(), is, stays ? "true" : "false");
    else
      std::printf("%s: %s%s%s%s\n", escaped(set).c_str(), is,
                  found.why.empty() ? "" : ", ", found.why.c_str(),
                  stays ? "; in use or announced" : "");
    before = ",";
  }
  if (json) std::puts("\n]}");
  return all_whole ? status::done : status::failed;
}

void tell_of_removal(const std::string& name, const removed* gone) {
  if (gone == nullptr)
    std::printf(
        "kept %s: it is newer than what is in use; --force --prune "
        "removes it\n",
        name.c_str());
  else
    std::printf("removed %s: %" PRIu64 " files, %" PRIu64 " kB\n", name.c_str(),
                gone->files, gone->bytes / 1000);
}

void settle(downloads place) {
  const std::string set = announced_set();
  if (!is_installed(set) || !is_in_use(set)) {
    std::puts("nothing to settle");
    return;
  }
  // The announcement goes last: if this is stopped, the next one goes on. But
  // what belongs to another account stays for ever.
  try {
    place.prune(false, tell_of_removal);
  } catch (const refusal&) {
    place.withdraw();
    throw;
  }
  place.withdraw();
  std::printf("%s is in use and no longer announced\n", set.c_str());
}

}  // namespace

int run_job(const options& wanted) {
  switch (wanted.what) {
    case job::install:
    case job::check:
      return install(wanted);
    case job::audit:
      return audit(wanted.json);
    case job::settle:
      settle({});
      break;
    case job::withdraw:
      std::puts(downloads().withdraw() ? "nothing is announced any more"
                                       : "nothing was announced");
      break;
    case job::prune:
      downloads().prune(wanted.force, tell_of_removal);
      break;
    case job::help:
      std::fputs(usage, stdout);
      break;
    case job::version:
      std::puts("marlin-install " MARLIN_VERSION);
      break;
  }
  return status::done;
}
