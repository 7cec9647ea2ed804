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
#include "tools/status/rehearsal.h"
#include "tools/status/sight.h"

namespace {

constexpr std::size_t longest_word = 65536;  // of a version or a schema
// How an owner appears whom this user namespace does not have.
constexpr uid_t nobody = 65534;

unsigned refused = 0;
bool walk_was_refused = false;

bool is_directory(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

bool is_same_directory(const std::string& left, const std::string& right) {
  struct stat one {
  }, other{};
  return ::stat(left.c_str(), &one) == 0 &&
         ::stat(right.c_str(), &other) == 0 && S_ISDIR(one.st_mode) &&
         one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

bool is_regular(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

entry record_at(const char* path) {
  entry record = entry_at(path);
  if (record.what != entry::kind::file) return record;
  const int file = ::open(path, O_RDONLY | O_CLOEXEC);
  if (file < 0) {
    record.error = errno;
    return record;
  }
  char text[longest_text];
  const ssize_t length = ::read(file, text, sizeof text);
  if (length < 0) record.error = errno;
  ::close(file);
  if (length > 0) record.text.assign(text, static_cast<std::size_t>(length));
  return record;
}

link_pair pair_of(const link_facts& links) {
  if (!links.current_path) return {};
  const std::string& path = *links.current_path;
  const std::string icu = path + "/icutz";
  const bool has_icu = links.icutz.what != entry::kind::none;
  const link_pair one{path.empty() ? "system" : "update",
                      "zoneinfo and icutz name the same data", true};
  if (path.empty() && has_icu)
    return {"system_with_icu",
            "zoneinfo names the system partition, but there is a link icutz"};
  if (path.empty()) return one;
  if (links.zoneinfo.text != path + "/zoneinfo")
    return {"not_the_tree",
            "zoneinfo leads into an update, but not to its tree"};
  if (!has_icu)
    return {"update_without_icu",
            "zoneinfo names an update, but there is no link icutz"};
  if (links.icutz.text == icu || is_same_directory(paths::icu_link, icu))
    return one;
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

void list_downloads(device_facts& device, sight& seen) {
  std::vector<std::string> names;
  device.downloads_error = list_directory(paths::download_root, names);
  device.has_more_downloads = names.size() > most_names;
  std::map<std::string, std::vector<std::string>> sets;
  for (const auto& name : names)
    if (is_directory(paths::download_root + name)) sets[name];

  const std::string real_root = seen.follow(paths::download_root).real + "/";
  for (const auto& [label, link] : needing) {
    // By its text, or by where it leads; what is in a directory needs that.
    const std::string text = target_of(link);
    const std::string real = text.empty() ? text : seen.follow(link).real;
    for (const auto& [target, root] :
         {std::pair<std::string, std::string>(text, paths::download_root),
          {real, real_root}}) {
      if (!target.starts_with(root)) continue;
      const std::string name = target.substr(
          root.size(), target.find('/', root.size()) - root.size());
      if (name.empty() || name == "." || name == ".." ||
          (!sets.contains(name) && !is_directory(paths::download_root + name)))
        continue;
      auto& needed_by = sets[name];
      if (needed_by.empty() || needed_by.back() != label)
        needed_by.emplace_back(label);
    }
  }
  for (const bool is_needed : {true, false})
    for (const auto& [name, needed_by] : sets)
      if (needed_by.empty() != is_needed)
        device.downloads.push_back({name, needed_by});
}

void expect_file(dataset_facts& facts, const std::string& path) {
  errno = 0;
  if (is_regular(path) && ::access(path.c_str(), R_OK) == 0) return;
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

std::string icu_schema_of(const mln_dataset& built) {
  for (const auto& component : built.components)
    if (const auto* icu = dynamic_cast<const mln_icu*>(component.get()))
      return icu->schema.substr(0, longest_word);
  return {};
}

// Building it tells; what is kept afterwards is short, and the `system`.
dataset_facts facts_of(const std::string& path,
                       std::unique_ptr<const mln_dataset>& system) {
  dataset_facts facts;
  facts.path = path;
  const unsigned before = refused;
  errno = 0;
  walk_was_refused = false;
  try {
    auto built = std::make_unique<const mln_dataset>(path);
    facts.version_text = built->version_string.substr(0, longest_word);
    facts.version = built->version;
    facts.schema = icu_schema_of(*built);
    facts.fits_system =
        path.empty() || (system && built->compatible_with(*system));
    if (path.empty()) system = std::move(built);
  } catch (const std::invalid_argument&) {
    facts.ends = dataset_facts::state::bad_path;
  } catch (const std::out_of_range&) {
    facts.ends = dataset_facts::state::number_too_large;
  } catch (int) {
    facts.ends = dataset_facts::state::walk_failed;
  } catch (const std::bad_alloc&) {
    facts.ends = dataset_facts::state::no_memory;
  }
  facts.word_is_cut = refused != before;
  if (walk_was_refused) facts.ends = dataset_facts::state::no_memory;
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

void count_refusals() {
  std::set_new_handler([] {
    ++refused;
    throw std::bad_alloc();
  });
}

unsigned refusals() { return refused; }

std::string closed_part() {
  sight seen;
  for (const char* path :
       {"/var/db/timezone", paths::localtime_link, paths::icu_link})
    if (seen.follow(path).closed) return path;
  return {};
}

void note_rights(device_facts& device, sight& seen) {
  std::vector<std::string> parts = {
      "/var/db/timezone", paths::system_zoneinfo,
      std::string(paths::system_zoneinfo) + "/+VERSION", paths::system_icu,
      std::string(paths::system_icu) + "/icutzformat.txt"};
  const std::string& zone = device.links.localtime.text;
  parts.push_back(zone.substr(0, zone.rfind('/')));
  for (const auto* set : {&device.current, &device.update})
    if (*set && !(*set)->path.empty())
      for (const char* part : {"", "/zoneinfo", "/zoneinfo/+VERSION", "/icutz"})
        parts.push_back((*set)->path + part);
  // The boot's user may be any of the three.
  constexpr mode_t open_to_all = 0555;
  for (const auto& part : parts)
    if (const auto owner =
            seen.follow(part, open_to_all, open_to_all & 0444).closed) {
      device.has_closed_part = true;
      if (*owner == nobody && device.foreign_part.empty())
        device.foreign_part = part;
    }
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
  struct stat record {};
  if (links.record.what != entry::kind::none &&
      ::stat(paths::version_record, &record) == 0 && S_ISREG(record.st_mode))
    links.recorded =
        record.st_mtim.tv_sec * 1'000'000'000LL + record.st_mtim.tv_nsec;
  links.is_writable = ::access("/var/db/timezone", W_OK | X_OK) == 0;
  links.zone_is_file = is_regular(paths::localtime_link);
  try {
    links.current_path = current_dataset_path();
  } catch (int) {
  }
  links.pair = pair_of(links);
  return links;
}

device_facts read_device(sight& seen) {
  // A walk that gets no memory looks like one that finds nothing.
  take_lines([](const line& said) {
    if (said.error == ENOMEM) walk_was_refused = true;
  });
  device_facts device;
  device.links = read_links();
  device.legacy_resolves = fsutil::exists(paths::legacy_icu_link);
  device.icutz_resolves = fsutil::exists(paths::icu_link);
  std::unique_ptr<const mln_dataset> system;
  device.system = facts_of({}, system);
  if (device.links.current_path)
    device.current = facts_of(*device.links.current_path, system);
  if (device.links.tz_latest.what == entry::kind::link)
    device.update = facts_of(latest_update_path(), system);
  list_downloads(device, seen);
  take_lines(nullptr);
  return device;
}

std::string kind_of(const entry& here) {
  static constexpr std::array names = {"none",      "link",    "file",
                                       "directory", "special", "unknown"};
  return names.at(static_cast<std::size_t>(here.what));
}

std::string data_in_use(const link_facts& links) {
  if (!links.current_path) return "none";
  return links.current_path->empty() ? "system" : "update";
}

std::string zone_of(const link_facts& links) {
  const std::string tree = std::string(paths::zoneinfo_link) + "/";
  if (!links.localtime.text.starts_with(tree)) return {};
  return links.localtime.text.substr(tree.size());
}
