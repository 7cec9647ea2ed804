// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/sight.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <tuple>
#include <vector>

#include "support/paths.h"
#include "tools/status/facts.h"

const sight::place sight::nothing{.error = ENOENT};

sight::way sight::follow(std::string rest, mode_t of_directories,
                         mode_t of_file) {
  std::optional<uid_t> closed;
  std::string here;
  for (int links = 0; links <= 40;) {
    const place& at = look(here);
    const auto start = rest.find_first_not_of('/');
    if (!S_ISDIR(at.mode) && !rest.empty()) return {};
    const mode_t needed = S_ISDIR(at.mode) ? of_directories : of_file;
    if (!here.empty() && !closed.value_or(0) && (at.mode & needed) != needed)
      closed = at.owner;
    if (start == std::string::npos) return {here, at, closed};
    rest.erase(0, start);
    const std::string name = rest.substr(0, rest.find('/'));
    rest.erase(0, name.size());
    if (name == "..") here.erase(std::min(here.rfind('/'), here.size()));
    if (name == "." || name == "..") continue;
    const place& next = look(here + "/" + name);
    // What this process may not look at is there too.
    if (next.error == EACCES) return {{}, nothing, closed.value_or(at.owner)};
    if (next.error != 0) return {};
    if (!S_ISLNK(next.mode)) {
      here += "/" + name;
    } else {
      ++links;
      if (next.target.starts_with('/')) here.clear();
      rest.insert(0, next.target);
    }
  }
  return {};
}

bool sight::place::operator==(const place& other) const {
  return std::tie(mode, size, error, target, names) ==
         std::tie(other.mode, other.size, other.error, other.target,
                  other.names);
}

sight::place& sight::look(const std::string& real) {
  const auto [found, is_new] = seen_.try_emplace(real);
  place& here = found->second;
  struct stat status {};
  if (!is_new) return here;
  const std::string path = root_ + real;
  if (::lstat(path.empty() ? "/" : path.c_str(), &status) != 0)
    here.error = errno;
  here.mode = status.st_mode;
  here.owner = status.st_uid;
  here.group = status.st_gid;
  if (!S_ISDIR(here.mode)) here.size = status.st_size;
  if (S_ISDIR(here.mode) || status.st_nlink > 1)
    here.target =
        first_.try_emplace({status.st_dev, status.st_ino}, real).first->second;
  if (S_ISLNK(here.mode)) here.target = ::target_of(path.c_str());
  return here;
}

const sight::place& sight::at(const std::string& path) {
  const auto name = path.rfind('/');
  const way parent = follow(path.substr(0, name));
  return S_ISDIR(parent.end.mode) ? look(parent.real + path.substr(name))
                                  : nothing;
}

std::set<std::string> sight::look_around() {
  follow(paths::download_root);
  std::set<std::string> places = {
      paths::icu_link,        paths::version_record,
      paths::legacy_icu_link, "/usr/share/icu/icutzformat.txt",
      paths::localtime_link,  paths::obsolete_icu};
  const std::string in_use = at(paths::zoneinfo_link).target;
  std::set<std::string> trees = {paths::zoneinfo_link, paths::system_zoneinfo};
  for (const auto& set : {in_use.substr(0, in_use.rfind('/')),
                          at(paths::latest_update_link).target}) {
    if (!set.starts_with(paths::download_root)) continue;
    trees.insert(set + "/zoneinfo");
    places.insert(set + "/icutz");
  }
  const std::string zone = at(paths::localtime_link).target;
  const auto tree_end = zone.find("/zoneinfo/");
  std::set<std::string> files = {"+VERSION", "America/Los_Angeles"};
  if (tree_end != std::string::npos)
    files.insert(zone.substr(tree_end + std::strlen("/zoneinfo/")));
  for (const auto& tree : trees)
    for (const auto& file : files) places.insert(tree + "/" + file);
  for (const auto& path : places) {
    const auto& [real, end, closed] = follow(path);
    std::vector<std::string> names;
    if (S_ISDIR(end.mode) && end.names.empty())
      list_directory(root_ + real, names);
    for (const auto& name : names) {
      look(real).names += name + "/";
      // A name that is listed and hidden does not keep a directory.
      look(real + "/" + name);
    }
  }
  return places;
}

std::optional<std::string> sight::first_difference(const sight& other) const {
  const auto [one, another] = std::mismatch(
      seen_.begin(), seen_.end(), other.seen_.begin(), other.seen_.end());
  if (one != seen_.end()) return one->first;
  if (another != other.seen_.end()) return another->first;
  return std::nullopt;
}
