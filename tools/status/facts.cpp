// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/facts.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <map>
#include <memory>
#include <new>
#include <set>
#include <stdexcept>
#include <utility>

#include "dataset/dataset.h"
#include "dataset/icu_file_name.h"
#include "driver/dataset_links.h"
#include "support/fsutil.h"
#include "support/paths.h"
#include "support/special_file.h"
#include "tools/descriptor.h"
#include "tools/escaped.h"
#include "tools/status/rehearsal.h"
#include "tools/status/sight.h"

namespace {

constexpr std::size_t longest_word = 65536;  // of a version or a schema

// Of what a path leads to; of nothing, all zero.
struct stat status_of(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) status = {};
  return status;
}

entry record_at(const char* path) {
  entry record = entry_at(path);
  if (record.what != entry::kind::file) return record;
  const descriptor file(::open(path, O_RDONLY | O_CLOEXEC));
  char text[longest_text];
  const ssize_t length =
      file.number() < 0 ? -1 : ::read(file.number(), text, sizeof text);
  if (length < 0) record.error = errno;
  if (length > 0) record.text.assign(text, static_cast<std::size_t>(length));
  return record;
}

link_pair pair_of(const link_facts& links) {
  static constexpr char one[] = "zoneinfo and icutz name the same data";
  if (!links.current_path) return {};
  const std::string& path = *links.current_path;
  const std::string icu = path + "/icutz";
  const bool has_icu = links.icutz.what != entry::kind::none;
  if (path.empty() && !has_icu) return {"system", one, true};
  if (path.empty())
    return {"system_with_icu",
            "zoneinfo names the system partition, but there is a link icutz"};
  if (links.zoneinfo.text != path + "/zoneinfo")
    return {"not_the_tree",
            "zoneinfo leads into an update, but not to its tree"};
  if (!has_icu)
    return {"update_without_icu",
            "zoneinfo names an update, but there is no link icutz"};
  const struct stat there = status_of(paths::icu_link);
  const struct stat ours = status_of(icu);
  if (links.icutz.text == icu ||
      (S_ISDIR(ours.st_mode) && there.st_dev == ours.st_dev &&
       there.st_ino == ours.st_ino))
    return {"update", one, true};
  return {"update_with_other_icu",
          "icutz does not name the ICU data of zoneinfo's update"};
}

// The links that need a download, and their names.
constexpr std::pair<const char*, const char*> needing[] = {
    {"zoneinfo", paths::zoneinfo_link},
    {"icutz", paths::icu_link},
    {"tz_latest", paths::latest_update_link},
    {"/var/db/icutz", paths::legacy_icu_link},
};

// The name that stands in a path behind a directory; "." if there is none.
std::string name_behind(const std::string& directory, const std::string& path) {
  if (!path.starts_with(directory)) return ".";
  return path.substr(directory.size(),
                     path.find('/', directory.size()) - directory.size());
}

void list_downloads(device_facts& device, sight& seen) {
  const std::string root = paths::download_root;
  const std::string real_root = seen.follow(root).real + "/";
  std::vector<std::string> names;
  device.downloads_error = list_directory(root, names);
  device.has_more_downloads = names.size() > most_names;
  if (device.downloads_error == 0 && ::access(root.c_str(), X_OK) != 0)
    device.downloads_error = errno;
  std::map<std::string, std::vector<std::string>> sets;
  for (const auto& name : names)
    if (S_ISDIR(status_of(root + name).st_mode)) sets[name];

  for (const auto& [label, link] : needing) {
    const std::string text = target_of(link);
    if (text.empty()) continue;
    // By its text, or by where it leads; what is in a directory needs that.
    const std::set<std::string> needed = {
        name_behind(root, text),
        name_behind(real_root, seen.follow(link).real)};
    for (const auto& name : needed)
      if (!name.empty() && name != "." && name != ".." &&
          S_ISDIR(status_of(root + name).st_mode))
        sets[name].emplace_back(label);
  }
  for (const bool is_needed : {true, false})
    for (const auto& [name, needed_by] : sets)
      if (needed_by.empty() != is_needed)
        device.downloads.emplace_back(name, needed_by);
}

void expect_file(dataset_facts& facts, const std::string& path) {
  errno = 0;
  if (S_ISREG(status_of(path).st_mode) && ::access(path.c_str(), R_OK) == 0)
    return;
  facts.unreadable.push_back(
      {path, errno == 0 ? "Not a file" : std::strerror(errno)});
}

void note_unreadable(dataset_facts& facts) {
  if (facts.path.empty()) {
    expect_file(facts, std::string(paths::system_zoneinfo) + "/+VERSION");
    expect_file(facts, std::string(paths::system_icu) + "/icutzformat.txt");
    return;
  }
  expect_file(facts, facts.path + "/zoneinfo/+VERSION");
  std::vector<std::string> names;
  const std::string icu = facts.path + "/icutz";
  if (const int error = list_directory(icu, names); error != 0)
    facts.unreadable.push_back({icu, std::strerror(error)});
  std::set<std::string> schemas;
  for (const auto& name : names) {
    const std::string schema(icu_schema_in(name));
    if (schema.empty()) continue;
    // As a boot finds one: what others may not read does not count.
    const std::string path = icu + "/" + name;
    struct stat status {};
    if (::lstat(path.c_str(), &status) != 0)
      facts.unreadable.push_back({path, std::strerror(errno)});
    else if (!S_ISREG(status.st_mode))
      facts.unreadable.push_back({path, "Not a file"});
    else if ((status.st_mode & S_IROTH) == 0)
      facts.unreadable.push_back({path, "Others may not read it"});
    else
      schemas.insert(schema);
  }
  facts.has_several_schemas = schemas.size() > 1;
}

// Building it tells; what is kept afterwards is short, and the `system`.
dataset_facts facts_of(const std::string& path,
                       std::unique_ptr<const mln_dataset>& system) {
  dataset_facts facts;
  facts.path = path;
  take_lines();
  errno = 0;
  try {
    auto built = std::make_unique<const mln_dataset>(path);
    facts.version_text = built->version_string.substr(0, longest_word);
    facts.version = built->version;
    for (const auto& component : built->components)
      if (const auto* icu = dynamic_cast<const mln_icu*>(component.get()))
        facts.schema = icu->schema.substr(0, longest_word);
    facts.fits_system =
        path.empty() || (system && built->compatible_with(*system));
    if (path.empty()) system = std::move(built);
  } catch (const std::invalid_argument&) {
    facts.ends = dataset_facts::state::bad_path;
  } catch (const std::out_of_range&) {
    facts.ends = dataset_facts::state::number_too_large;
  } catch (int) {
    facts.ends = dataset_facts::state::walk_failed;
  }
  // A walk that gets no memory looks like one that finds nothing.
  take_lines();
  if (facts.ends != dataset_facts::state::bad_path) note_unreadable(facts);
  return facts;
}

}  // namespace

std::string target_of(const char* link) {
  char target[longest_text];
  const ssize_t length = ::readlink(link, target, sizeof target);
  return {target, static_cast<std::size_t>(std::max<ssize_t>(length, 0))};
}

entry entry_at(const char* path) {
  const std::string target = target_of(path);
  if (!target.empty()) return {entry::kind::link, target};
  struct stat status {};
  if (errno == ENOENT) return {};
  if (::lstat(path, &status) != 0) return {entry::kind::unknown, {}, errno};
  if (S_ISREG(status.st_mode)) return {entry::kind::file};
  if (S_ISDIR(status.st_mode)) return {entry::kind::directory};
  return {entry::kind::special};
}

int list_directory(const std::string& path, std::vector<std::string>& names) {
  const std::unique_ptr<DIR, int (*)(DIR*)> directory(::opendir(path.c_str()),
                                                      &::closedir);
  if (!directory) return errno;
  while (names.size() <= most_names) {
    errno = 0;
    const dirent* const item = ::readdir(directory.get());
    if (item == nullptr) return errno;
    const std::string name = item->d_name;
    if (name != "." && name != "..") names.push_back(name);
  }
  return 0;
}

bool opens_record() {
  return !is_special_file(paths::version_record) &&
         descriptor(::open(paths::version_record,
                           O_WRONLY | O_CREAT | O_CLOEXEC, 0666))
                 .number() >= 0;
}

std::string closed_part(sight& seen) {
  for (const char* path :
       {paths::zoneinfo_link, paths::localtime_link, paths::icu_link})
    if (seen.follow(path).closed) return path;
  return {};
}

link_facts read_links() {
  link_facts links;
  links.zoneinfo = entry_at(paths::zoneinfo_link);
  links.icutz = entry_at(paths::icu_link);
  links.localtime = entry_at(paths::localtime_link);
  links.tz_latest = entry_at(paths::latest_update_link);
  links.record = record_at(paths::version_record);
  links.legacy_icutz = entry_at(paths::legacy_icu_link);
  links.old_icu = entry_at(paths::obsolete_icu);
  links.zone_is_file = S_ISREG(status_of(paths::localtime_link).st_mode);
  try {
    links.current_path = current_dataset_path();
  } catch (int) {
  }
  links.pair = pair_of(links);
  return links;
}

dataset_facts read_system() {
  std::unique_ptr<const mln_dataset> system;
  return facts_of({}, system);
}

device_facts read_device(sight& seen) {
  device_facts device;
  device.links = read_links();
  device.legacy_resolves = fsutil::exists(paths::legacy_icu_link);
  device.icutz_resolves = fsutil::exists(paths::icu_link);
  std::unique_ptr<const mln_dataset> system;
  device.system = facts_of({}, system);
  if (refusals() != 0) throw std::bad_alloc();
  if (device.links.current_path)
    device.current = device.links.current_path->empty()
                         ? device.system
                         : facts_of(*device.links.current_path, system);
  // As much of the target as a boot reads.
  if (const std::string& latest = device.links.tz_latest.text; !latest.empty())
    device.update = facts_of(latest.substr(0, 1024), system);
  device.refusals = refusals();
  list_downloads(device, seen);
  return device;
}

std::string kind_of(const entry& here) {
  static constexpr std::array names = {"none",      "link",    "file",
                                       "directory", "special", "unknown"};
  return names.at(static_cast<std::size_t>(here.what));
}

std::string schema_of(const dataset_facts& set) {
  return set.schema.empty() ? "no ICU schema"
                            : "ICU schema " + escaped(set.schema);
}

std::string zone_of(const link_facts& links) {
  const std::string tree = std::string(paths::zoneinfo_link) + "/";
  if (!links.localtime.text.starts_with(tree)) return {};
  return links.localtime.text.substr(tree.size());
}
