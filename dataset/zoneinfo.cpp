// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/zoneinfo.h"

#include <err.h>

#include <utility>

#include "support/first_word.h"
#include "support/fsutil.h"
#include "support/paths.h"

namespace {

std::string tree_of(const std::string& dataset_path) {
  if (dataset_path.empty()) return paths::system_zoneinfo;
  return dataset_path + "/zoneinfo";
}

}  // namespace

mln_zoneinfo::mln_zoneinfo() : mln_zoneinfo(std::string()) {}

mln_zoneinfo::mln_zoneinfo(const std::string& path)
    : mln_dataset_component(path), zoneinfo_path(tree_of(path)) {
  read_version();
}

void mln_zoneinfo::read_version() {
  std::string word = read_first_word(zoneinfo_path + "/+VERSION");
  if (!word.empty()) version_string = std::move(word);
}

std::string mln_zoneinfo::version() const { return version_string; }

bool mln_zoneinfo::compatible_schema(const mln_dataset_component&) const {
  return true;
}

void mln_zoneinfo::activate() const {
  try {
    fsutil::remove(paths::zoneinfo_link);
  } catch (...) {
    // Creating the link is still tried; if that fails, it is thrown.
    ::warn("Unlink of zoneinfo softlink failed");
  }
  fsutil::create_symlink(zoneinfo_path, paths::zoneinfo_link);
}
