// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/facts.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <functional>
#include <memory>
#include <new>
#include <stdexcept>
#include <utility>

#include "dataset/dataset.h"
#include "dataset/icu_file_name.h"
#include "driver/dataset_links.h"
#include "support/fsutil.h"
#include "support/paths.h"
#include "tools/status/line.h"

namespace {

constexpr std::size_t longest_text = 4096;   // of a link or a record
constexpr std::size_t longest_word = 65536;  // of a version or a schema
constexpr std::size_t most_names = 10000;
// How an owner appears whom this user namespace does not have.
constexpr uid_t nobody = 65534;

unsigned refusals = 0;
bool walk_was_refused = false;

void note_refusal() {
  ++refusals;
  throw std::bad_alloc();
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

entry entry_at(const char* path) {
  struct stat status {};
  if (::lstat(path, &status) != 0) {
    if (errno == ENOENT) return {};
    return {entry::kind::unknown, {}, errno};
  }
  if (S_ISREG(status.st_mode)) return {entry::kind::file};
  if (S_ISDIR(status.st_mode)) return {entry::kind::directory};
  if (!S_ISLNK(status.st_mode)) return {entry::kind::special};
  char target[longest_text];
  const ssize_t length = ::readlink(path, target, sizeof target);
  if (length < 0) return {entry::kind::unknown, {}, errno};
  return {entry::kind::link, {target, static_cast<std::size_t>(length)}};
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
  ::close(file);
  if (length > 0) record.text.assign(text, static_cast<std::size_t>(length));
  return record;
}

link_pair pair_of(const link_facts& links) {
  if (!links.current_path) return link_pair::no_dataset;
  const std::string& path = *links.current_path;
  const bool has_icu = links.icutz.what != entry::kind::none;
  if (path.empty())
    return has_icu ? link_pair::system_with_icu : link_pair::system;
  if (links.zoneinfo.text != path + "/zoneinfo") return link_pair::not_the_tree;
  if (!has_icu) return link_pair::update_without_icu;
  const std::string icu = path + "/icutz";
  return links.icutz.text == icu || is_same_directory(paths::icu_link, icu)
             ? link_pair::update
             : link_pair::update_with_other_icu;
}

// As a boot finds one: links, and what others may not read, do not count.
bool is_icu_data(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode) &&
         (status.st_mode & S_IROTH) != 0;
}

// The names in a directory, as it lists them, no more than anybody reads.
int list(const std::string& path, std::vector<std::string>& names) {
  DIR* const directory = ::opendir(path.c_str());
  if (directory == nullptr) return errno;
  while (const dirent* const item = ::readdir(directory)) {
    const std::string name = item->d_name;
    if (name != "." && name != "..") names.push_back(name);
    if (names.size() == most_names) break;
  }
  ::closedir(directory);
  return 0;
}

// By its text or by where it leads; what is in a directory needs that.
bool needs(const char* link, const std::string& set) {
  const entry here = entry_at(link);
  if (here.what != entry::kind::link) return false;
  if (here.text == set || here.text.starts_with(set + "/")) return true;
  return is_same_directory(link, set) ||
         is_same_directory(std::string(link) + "/..", set);
}

void list_downloads(device_facts& device) {
  std::vector<std::string> names;
  device.downloads_error = list(paths::download_root, names);
  device.has_more_downloads = names.size() == most_names;
  for (const auto& name : names) {
    const std::string set = paths::download_root + name;
    if (!is_same_directory(set, set)) continue;
    download found{name, {}};
    for (const auto& [label, link] :
         {std::pair{"zoneinfo", paths::zoneinfo_link},
          std::pair{"icutz", paths::icu_link},
          std::pair{"tz_latest", paths::latest_update_link},
          std::pair{"/var/db/icutz", paths::legacy_icu_link}})
      if (needs(link, set)) found.needed_by.emplace_back(label);
    device.downloads.push_back(found);
  }
  std::sort(device.downloads.begin(), device.downloads.end(),
            [](const download& left, const download& right) {
              if (left.needed_by.empty() != right.needed_by.empty())
                return right.needed_by.empty();
              return left.name < right.name;
            });
}

// Notes whose the parts are that a boot reads or changes. Whose those are that
// it only reads does not matter where everybody may read them.
void note_rights(device_facts& device) {
  const auto look_at = [&](const std::string& part, bool is_changed) {
    struct stat status {};
    if (::stat(part.c_str(), &status) != 0) return;
    const mode_t for_all = S_ISDIR(status.st_mode) ? 0555 : 0444;
    const bool is_closed = (status.st_mode & for_all) != for_all;
    device.has_closed_part = device.has_closed_part || is_closed;
    if (status.st_uid == nobody && (is_changed || is_closed) &&
        device.foreign_part.empty())
      device.foreign_part = part;
  };
  const auto look_at_update = [&](const std::string& path) {
    look_at(path, false);
    for (const char* entry : paths::update_entries)
      look_at(path + "/" + entry, false);
    look_at(path + "/zoneinfo/+VERSION", false);
  };
  // The owner of "/" is the device's root.
  for (const char* part :
       {"/", "/var/db", "/var/db/timezone", paths::version_record})
    look_at(part, true);
  const std::string& zone = device.links.localtime.text;
  for (const std::string& part :
       {std::string("/usr"), std::string("/usr/share"),
        std::string(paths::system_zoneinfo),
        std::string(paths::system_zoneinfo) + "/+VERSION",
        std::string(paths::system_icu),
        std::string(paths::system_icu) + "/icutzformat.txt",
        std::string("/var"), std::string(paths::download_root),
        zone.substr(0, zone.rfind('/'))})
    look_at(part, false);
  for (const auto* set : {&device.current, &device.update})
    if (*set && !(*set)->path.empty()) look_at_update((*set)->path);
}

void expect_file(dataset_facts& facts, const std::string& path) {
  if (is_regular(path) && ::access(path.c_str(), R_OK) == 0) return;
  facts.unreadable.push_back(
      path + ": " +
      (is_regular(path) || errno != 0 ? std::strerror(errno) : "not a file"));
}

void note_unreadable(dataset_facts& facts) {
  errno = 0;
  if (facts.path.empty()) {
    expect_file(facts, std::string(paths::system_zoneinfo) + "/+VERSION");
    errno = 0;
    expect_file(facts, std::string(paths::system_icu) + "/icutzformat.txt");
    return;
  }
  expect_file(facts, facts.path + "/zoneinfo/+VERSION");
  std::vector<std::string> names;
  const std::string icu = facts.path + "/icutz";
  if (const int error = list(icu, names); error != 0)
    facts.unreadable.push_back(icu + ": " + std::strerror(error));
  std::vector<std::string> schemas;
  for (const auto& name : names) {
    const std::string schema(icu_schema_in(name));
    if (!schema.empty() && is_icu_data(icu + "/" + name))
      schemas.push_back(schema);
  }
  facts.has_several_schemas =
      std::adjacent_find(schemas.begin(), schemas.end(),
                         std::not_equal_to<>()) != schemas.end();
}

std::string icu_schema_of(const mln_dataset& built) {
  for (const auto& component : built.components)
    if (const auto* icu = dynamic_cast<const mln_icu*>(component.get()))
      return icu->schema.substr(0, longest_word);
  return {};
}

// Building it tells; what is kept afterwards is short.
dataset_facts facts_of(const std::string& path, const mln_dataset* system) {
  dataset_facts facts;
  facts.path = path;
  const unsigned before = refusals;
  errno = 0;
  walk_was_refused = false;
  try {
    const mln_dataset built(path);
    facts.version_text = built.version_string.substr(0, longest_word);
    facts.version = built.version;
    facts.schema = icu_schema_of(built);
    facts.fits_system =
        path.empty() || (system != nullptr && built.compatible_with(*system));
  } catch (const std::invalid_argument&) {
    facts.ends = dataset_facts::state::bad_path;
  } catch (const std::out_of_range&) {
    facts.ends = dataset_facts::state::number_too_large;
  } catch (int) {
    facts.ends = dataset_facts::state::walk_failed;
  } catch (const std::bad_alloc&) {
    facts.ends = dataset_facts::state::no_memory;
  }
  facts.word_is_cut = refusals != before;
  if (walk_was_refused) facts.ends = dataset_facts::state::no_memory;
  if (facts.ends != dataset_facts::state::bad_path) note_unreadable(facts);
  return facts;
}

}  // namespace

link_facts read_links() {
  link_facts links;
  links.zoneinfo = entry_at(paths::zoneinfo_link);
  links.icutz = entry_at(paths::icu_link);
  links.localtime = entry_at(paths::localtime_link);
  links.tz_latest = entry_at(paths::latest_update_link);
  links.record = record_at(paths::version_record);
  links.legacy_icutz = entry_at(paths::legacy_icu_link);
  links.old_icu = entry_at(paths::obsolete_icu);
  links.is_recordable = is_regular(paths::version_record) &&
                        ::access(paths::version_record, W_OK) == 0;
  links.zone_is_file = is_regular(paths::localtime_link);
  try {
    links.current_path = current_dataset_path();
  } catch (int) {
  }
  links.pair = pair_of(links);
  return links;
}

device_facts read_device() {
  std::set_new_handler(note_refusal);
  // A walk that gets no memory looks like one that finds nothing.
  take_lines([](const line& said) {
    if (said.error == ENOMEM) walk_was_refused = true;
  });
  device_facts device;
  device.links = read_links();
  device.legacy_resolves = fsutil::exists(paths::legacy_icu_link);
  device.icutz_resolves = fsutil::exists(paths::icu_link);
  std::unique_ptr<mln_dataset> system;
  device.system = facts_of({}, nullptr);
  if (device.system.ends == dataset_facts::state::built)
    system = std::make_unique<mln_dataset>();
  if (device.links.current_path)
    device.current = facts_of(*device.links.current_path, system.get());
  if (device.links.tz_latest.what == entry::kind::link)
    device.update = facts_of(latest_update_path(), system.get());
  list_downloads(device);
  note_rights(device);
  take_lines(nullptr);
  return device;
}
