// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/dataset.h"

#include <err.h>

#include <memory>
#include <stdexcept>
#include <utility>

#include "support/paths.h"

mln_dataset::mln_dataset() : mln_dataset(std::string()) {}

mln_dataset::mln_dataset(std::string dataset_path)
    : path(std::move(dataset_path)) {
  create_components();
}

// The order is visible from outside: the tree's "+VERSION" is read before the
// path is examined, and the version is parsed before the ICU data is read.
void mln_dataset::create_components() {
  const auto zoneinfo = std::make_shared<mln_zoneinfo>(path);
  if (path.empty()) {
    version_string = zoneinfo->version() + ".1.0";
  } else if (path.starts_with(paths::download_root) &&
             path.size() > paths::length(paths::download_root)) {
    version_string = path.substr(paths::length(paths::download_root));
  } else {
    ::warn("mln_dataset::create_components: bad path %s", path.c_str());
    throw std::invalid_argument("badpath");
  }
  version.parse(version_string);
  components.reserve(2);
  components.push_back(zoneinfo);
  components.push_back(std::make_shared<mln_icu>(path));
}

bool mln_dataset::compatible_with(const mln_dataset& other) const {
  return compatible_components(components, other.components);
}

void mln_dataset::activate() const {
  for (const auto& component : components) component->activate();
}

bool operator==(const mln_dataset& left, const mln_dataset& right) {
  return left.path == right.path;
}

bool operator>(const mln_dataset& left, const mln_dataset& right) {
  return left.version > right.version;
}

void reset_to_system_partition() { mln_dataset().activate(); }
