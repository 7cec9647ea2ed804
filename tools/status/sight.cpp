// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/sight.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <cerrno>
#include <cstring>
#include <set>
#include <vector>

#include "support/paths.h"
#include "tools/status/facts.h"

namespace {

void look_at(const std::string& path, sight& seen) {
  std::string& here = seen[path];
  struct stat status {};
  for (const int flags : {AT_SYMLINK_NOFOLLOW, 0}) {
    if (::fstatat(AT_FDCWD, path.c_str(), &status, flags) != 0) {
      here.append("error ").append(std::to_string(errno));
      return;
    }
    here += std::to_string(status.st_mode) + " " +
            std::to_string(S_ISDIR(status.st_mode) ? 0 : status.st_size) + " ";
    if (!S_ISLNK(status.st_mode)) break;
    here += entry_at(path.c_str()).text + " ";
  }
  char list[4096];
  const ssize_t size = S_ISDIR(status.st_mode)
                           ? ::getxattr(path.c_str(), "system.posix_acl_access",
                                        list, sizeof list)
                           : 0;
  if (size > 0) here.append(list, static_cast<std::size_t>(size));
}

void look_into(const std::string& directory, sight& seen) {
  std::vector<std::string> names;
  list_directory(directory, names);
  for (const auto& name : names) {
    seen[directory] += "\n" + name;
    // A name that is listed and hidden does not keep a directory.
    look_at(directory + "/" + name, seen);
  }
}

}  // namespace

sight look_around() {
  sight seen;
  for (const char* path :
       {"/var/db", "/var/db/timezone", "/var/db/timezone/tz", paths::icu_link,
        paths::localtime_link, paths::zoneinfo_link, paths::latest_update_link,
        paths::version_record, paths::legacy_icu_link, paths::obsolete_icu,
        "/usr/share/icu/icutzformat.txt"})
    look_at(path, seen);
  for (const char* path : {paths::localtime_link, paths::obsolete_icu})
    look_into(path, seen);

  const std::string in_use = entry_at(paths::zoneinfo_link).text;
  std::set<std::string> trees = {paths::system_zoneinfo};
  for (const auto& set : {in_use.substr(0, in_use.rfind('/')),
                          entry_at(paths::latest_update_link).text}) {
    if (!set.starts_with(paths::download_root)) continue;
    trees.insert(set + "/zoneinfo");
    look_at(set + "/icutz", seen);
    look_into(set + "/icutz", seen);
  }
  const std::string zone = entry_at(paths::localtime_link).text;
  const auto tree_end = zone.find("/zoneinfo/");
  std::set<std::string> files = {"+VERSION", "America/Los_Angeles"};
  if (tree_end != std::string::npos)
    files.insert(zone.substr(tree_end + std::strlen("/zoneinfo/")));
  for (const auto& tree : trees)
    for (const auto& file : files) look_at(tree + "/" + file, seen);
  return seen;
}
