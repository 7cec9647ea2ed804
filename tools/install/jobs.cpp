// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/jobs.h"

#include <fcntl.h>

#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <memory>

#include "tools/escaped.h"
#include "tools/install/checks.h"
#include "tools/install/contents.h"
#include "tools/install/copy.h"
#include "tools/install/downloads.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"
#include "tools/install/progress.h"

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

// Runs a part of a job, and puts before and after its line what it is about.
template <typename Part>
auto about(const std::string& before, const char* after, Part part) {
  try {
    return part();
  } catch (failure& told) {
    told.line = before + told.line + after;
    throw;
  }
}

contents check(const update& given, bool force) {
  return about(escaped(given.name) + ": ", "; nothing was changed", [&] {
    check_version(given.name, force);
    receiver nobody;
    const contents found = examine(given.directory.number(), nobody);
    check_contents(given.name, found);
    return found;
  });
}

class told_copy final : public receiver {
 public:
  told_copy(int top, const std::string& path, std::size_t entries)
      : copy_(top, path), progress_(entries) {}
  void enter(const std::string& path) override { copy_.enter(path); }
  void leave(const std::string& path) override { copy_.leave(path); }
  void file(const std::string& path, std::string_view content) override {
    copy_.file(path, content);
    progress_.step();
  }
  void name(const std::string& path, const std::string& of) override {
    copy_.name(path, of);
    progress_.step();
  }
  void link(const std::string& path, const std::string& text) override {
    copy_.link(path, text);
    progress_.step();
  }
  void end() override { copy_.end(); }

 private:
  copy copy_;
  progress progress_;
};

// Checks again what it copies: the update may have changed since it was
// checked.
void copy_into(downloads& to, const update& given, const contents& checked) {
  const descriptor incoming = to.make_incoming();
  told_copy copier(incoming.number(), to.incoming_path(), checked.entries);
  const contents copied = examine(given.directory.number(), copier);
  check_contents(given.name, copied);
  if (copied != checked) refuse("it was changed meanwhile");
}

void install(const update& given, bool force) {
  downloads place;
  const contents found = check(given, force);
  about(escaped(given.name) + ": ", "; nothing was changed", [&] {
    try {
      copy_into(place, given, found);
      place.put_in_place(given.name);
      place.announce(given.name);
    } catch (...) {
      place.take_back();
      throw;
    }
  });
  about(escaped(given.name) + ": ",
        "; it is announced, but a loss of power may undo that: run this again",
        [&] { place.sync_announcement(); });
  place.tidy();
  std::printf("%s is announced; the next boot decides\n", given.name.c_str());
}

void tell_of_removal(const std::string& name, const removed& gone) {
  std::printf("removed %s: %" PRIu64 " files, %" PRIu64 " kB\n",
              escaped(name).c_str(), gone.files, gone.bytes / 1000);
}

}  // namespace

void run_job(const options& wanted) {
  switch (wanted.what) {
    case job::install:
      return install(open_update(wanted.directory), wanted.force);
    case job::check: {
      const update given = open_update(wanted.directory);
      check(given, wanted.force);
      std::printf("%s can be installed\n", given.name.c_str());
      return;
    }
    case job::withdraw:
      std::puts(downloads().withdraw() ? "nothing is announced any more"
                                       : "nothing was announced");
      return;
    case job::prune:
      return downloads().prune(tell_of_removal);
    case job::help:
      std::fputs(usage, stdout);
      return;
    case job::version:
      std::puts("marlin-install " MARLIN_VERSION);
      return;
  }
}
