// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu.h"

#include <err.h>
#include <fts.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <new>
#include <utility>

#include "dataset/icu_file_name.h"
#include "support/first_word.h"
#include "support/fsutil.h"
#include "support/paths.h"

namespace {

std::string directory_of(const std::string& dataset_path) {
  if (dataset_path.empty()) return paths::system_icu;
  return dataset_path + "/icutz";
}

struct close_walk {
  void operator()(FTS* walk) const { ::fts_close(walk); }
};
using walk_pointer = std::unique_ptr<FTS, close_walk>;

// Follows the directory itself if it is a link, but no link inside it. Without
// a comparison function the entries come as the directory lists them.
walk_pointer open_walk(std::string& directory) {
  // Some C libraries crash where there is no memory for the root's entry. So
  // enough for two long paths and all else is had before, and given back.
  if (void* const enough = ::operator new(16384, std::nothrow))
    ::operator delete(enough);
  else
    return {};
  char* const roots[] = {directory.data(), nullptr};
  return walk_pointer(
      ::fts_open(roots, FTS_COMFOLLOW | FTS_PHYSICAL | FTS_XDEV, nullptr));
}

// Whether an entry may be a data file at all. An empty name needs no test here:
// the grammar of names refuses it.
bool is_direct_file_that_others_may_read(const FTSENT& entry) {
  return entry.fts_errno == 0 && entry.fts_level == 1 &&
         entry.fts_info == FTS_F && (entry.fts_statp->st_mode & S_IROTH) != 0;
}

// The schema of the first data file, in the order of the walk.
std::string first_schema(FTS& walk) {
  while (FTSENT* const entry = ::fts_read(&walk)) {
    if (is_direct_file_that_others_may_read(*entry)) {
      const auto schema = icu_schema_in({entry->fts_name, entry->fts_namelen});
      if (!schema.empty()) return std::string(schema);
    }
    // Nothing below a subdirectory counts, so none is worth walking through.
    if (entry->fts_info == FTS_D && entry->fts_level > 0)
      ::fts_set(&walk, entry, FTS_SKIP);
  }
  return {};
}

// Returns with the walk closed, because closing may set the errno that a line
// afterwards ends with. See IcuWalk.IsClosedBeforeAMissingSchemaIsReported.
std::string schema_of_update(std::string& directory) {
  const auto walk = open_walk(directory);
  if (!walk) {
    // Deliberate: the prefix is not the class's name, and the error text stands
    // twice, because warn(3) appends it again. Both belong to the line that
    // people search logs for. Pinned by
    // IcuWalk.ThatCannotBeStartedIsReportedAndThrown.
    ::warn("tz_icu::initialize: fts_open of %s failed, %s", directory.c_str(),
           std::strerror(errno));
    throw errno;
  }
  return first_schema(*walk);
}

}  // namespace

mln_icu::mln_icu() : mln_icu(std::string()) {}

mln_icu::mln_icu(const std::string& path)
    : mln_dataset_component(path), icu_path(directory_of(path)) {
  initialize();
}

void mln_icu::initialize() {
  if (dataset_path.empty()) {
    std::string word = read_first_word(icu_path + "/icutzformat.txt");
    if (!word.empty()) schema = std::move(word);
    return;
  }
  // Read also when a schema is known, which stays: closing a walk that was
  // never read leaks in some C libraries.
  std::string found = schema_of_update(icu_path);
  if (schema.empty()) schema = std::move(found);
  if (schema.empty())
    ::warn("No ICU schema found for %s", dataset_path.c_str());
}

bool mln_icu::compatible_schema(const mln_dataset_component& other) const {
  const auto* const other_icu = dynamic_cast<const mln_icu*>(&other);
  if (other_icu == nullptr) {
    ::warn(
        "mln_icu::compatible_schema: could not dynamic_cast other component");
    return false;
  }
  return schema == other_icu->schema;
}

void mln_icu::activate() const {
  try {
    fsutil::remove(paths::icu_link);
    fsutil::remove(paths::legacy_icu_link);
  } catch (...) {
    // Creating the link is still tried; if that fails, it is thrown.
    ::warn("unlink of ICU softlink failed");
  }
  // Deliberate: the system partition's ICU data, unlike its zoneinfo tree, gets
  // no link, because it is used in its own place and a link means an update.
  // Pinned by IcuActivate.CreatesNoLinkForTheSystemPartition.
  if (dataset_path.empty()) return;
  fsutil::create_symlink(icu_path, paths::icu_link);
}
