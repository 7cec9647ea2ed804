// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/contents.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <iterator>
#include <map>
#include <memory>
#include <utility>

#include "dataset/icu_file_name.h"
#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"
#include "tools/install/path_text.h"
#include "tools/install/tzif.h"

namespace {

constexpr std::string_view tree = "zoneinfo/";

// Tables that come with the rules and are no zones.
bool is_table(std::string_view path) {
  static constexpr std::array<std::string_view, 3> endings{".tab", ".zi",
                                                           ".list"};
  if (path == "zoneinfo/+VERSION" || path == "zoneinfo/leapseconds")
    return true;
  return path.rfind('/') == tree.size() - 1 &&
         std::any_of(endings.begin(), endings.end(),
                     [&](auto ending) { return path.ends_with(ending); });
}

bool is_plain_name(std::string_view name) {
  return std::all_of(name.begin(), name.end(), [](char byte) {
    return (byte >= '0' && byte <= '9') || (byte >= 'A' && byte <= 'Z') ||
           (byte >= 'a' && byte <= 'z') || byte == '.' || byte == '_' ||
           byte == '+' || byte == '-';
  });
}

const char* kind_of(mode_t mode) {
  if (S_ISLNK(mode)) return "a link";
  if (S_ISFIFO(mode)) return "a FIFO";
  if (S_ISSOCK(mode)) return "a socket";
  if (S_ISBLK(mode) || S_ISCHR(mode)) return "a device";
  if (S_ISDIR(mode)) return "a directory";
  return mode == 0 ? "gone" : "a file";
}

void check_mode(const std::string& path, mode_t mode) {
  const mode_t wanted = S_ISDIR(mode) ? 0555 : 0444;
  if ((mode & wanted) != wanted)
    refuse(escaped(path) + " cannot be read by all");
  if ((mode & S_IWOTH) != 0) refuse(escaped(path) + " can be written by all");
  if (S_ISREG(mode) && (mode & (S_ISUID | S_ISGID | S_ISVTX)) != 0)
    refuse(escaped(path) + " runs as somebody else");
}

// In the name of a file of ICU data; otherwise empty.
std::string_view icu_schema_of(std::string_view path) {
  constexpr std::string_view directory = "icutz/";
  if (!path.starts_with(directory)) return {};
  return icu_schema_in(path.substr(directory.size()));
}

// ICU's header: its size, a magic number, and from byte 8 the byte order and
// the character set of the data. The letter of the schema says both.
void check_icu(const std::string& path, std::string_view content, char letter) {
  if (content.size() < 32 || !content.substr(2).starts_with("\xda\x27"))
    refuse(escaped(path) + " is not a file of ICU data");
  const bool big = content[8] != 0;
  const bool ebcdic = content[9] != 0;
  if (big != (letter != 'l') || ebcdic != (letter == 'e'))
    refuse(escaped(path) + " has another byte order than its name says");
}

std::string first_word(std::string_view text) {
  static constexpr std::string_view blanks = " \t\n\v\f\r";
  const auto start = std::min(text.find_first_not_of(blanks), text.size());
  text.remove_prefix(start);
  return std::string(text.substr(0, text.find_first_of(blanks)));
}

class walk {
 public:
  explicit walk(receiver& to) : to_(to) {}

  contents all_of(int directory) {
    check_mode("the update", status_of(directory, ".", "the update").st_mode);
    const auto names =
        names_in(directory, std::size(paths::update_entries) + 1, "the update");
    for (const auto& name : names) {
      if (std::ranges::count(paths::update_entries, name) == 0)
        refuse(escaped(name) + " does not belong in an update");
    }
    enter(directory, "icutz", 1);
    enter(directory, "zoneinfo", 1);
    // Another component's, which an older update lacks.
    for (const auto& name : names) {
      if (name != "icutz" && name != "zoneinfo")
        entry(directory, name, name, 0);
    }
    if (found_.schema.empty()) refuse("icutz holds no file icutzNNx.dat");
    if (found_.release.empty()) refuse("zoneinfo/+VERSION names no release");
    for (const auto& [path, target] : links_) {
      if (!found_.zones.contains(target.substr(tree.size())))
        refuse(escaped(path) + " is a link that does not lead to a zone");
    }
    for (const auto& [path, target] : links_)
      found_.zones.insert(path.substr(tree.size()));
    if (found_.zones.empty()) refuse("zoneinfo holds no zone");
    to_.end();
    return std::move(found_);
  }

 private:
  void enter(int parent, const std::string& path, std::size_t depth) {
    const std::string name = path.substr(path.rfind('/') + 1);
    const mode_t mode = status_of(parent, name, path).st_mode;
    if (!S_ISDIR(mode))
      refuse(escaped(path) + " is " + kind_of(mode) + ", not a directory");
    check_mode(path, mode);
    if (depth > limits::depth)
      refuse(escaped(path) + " is deeper than a zone can be");
    const descriptor directory = open_directory(parent, name, path);
    to_.enter(path);
    for (const auto& below :
         names_in(directory.number(), limits::entries + 1, path))
      entry(directory.number(), below, path + "/" + below, depth);
    to_.leave(path);
  }

  void entry(int parent, const std::string& name, const std::string& path,
             std::size_t depth) {
    if (++found_.entries > limits::entries)
      refuse("it has more than " + std::to_string(limits::entries) +
             " entries");
    if (!is_plain_name(name)) refuse(escaped(path) + " is no name for a zone");
    const struct stat status = status_of(parent, name, path);
    const bool in_tree = path.starts_with(tree);
    if (S_ISREG(status.st_mode)) {
      file(parent, name, path, status);
    } else if (S_ISLNK(status.st_mode) && in_tree) {
      link(parent, name, path);
    } else if (S_ISDIR(status.st_mode) && (in_tree || depth == 0)) {
      enter(parent, path, depth + 1);
    } else {
      refuse(escaped(path) + " is " + kind_of(status.st_mode));
    }
  }

  void file(int parent, const std::string& name, const std::string& path,
            const struct stat& status) {
    check_mode(path, status.st_mode);
    const std::pair identity(status.st_dev, status.st_ino);
    const bool zone = path.starts_with(tree) && !is_table(path);
    if (const auto before = names_.find(identity);
        zone && before != names_.end()) {
      to_.name(path, before->second);
    } else {
      read(parent, name, path, identity);
      check_content(path, zone);
      to_.file(path, content_);
      if (zone) names_.emplace(identity, path);
    }
    if (zone) found_.zones.insert(path.substr(tree.size()));
  }

  void check_content(const std::string& path, bool zone) {
    if (zone) {
      if (const char* const flaw = tzif_flaw(content_))
        refuse(escaped(path) + " " + flaw);
    } else if (path == "zoneinfo/+VERSION") {
      found_.release = first_word(content_);
    } else if (const auto schema = icu_schema_of(path); !schema.empty()) {
      if (!found_.schema.empty())
        refuse("icutz holds more than one file icutzNNx.dat");
      found_.schema = schema;
      check_icu(path, content_, schema.back());
    }
  }

  void read(int parent, const std::string& name, const std::string& path,
            std::pair<dev_t, ino_t> identity) {
    const descriptor file(
        ::openat(parent, name.c_str(),
                 O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (file.number() < 0) fail("open", path);
    struct stat status {};
    if (::fstat(file.number(), &status) != 0) fail("look at", path);
    if (!S_ISREG(status.st_mode) ||
        std::pair(status.st_dev, status.st_ino) != identity)
      refuse(escaped(path) + " was replaced meanwhile");
    constexpr std::size_t most = limits::file_bytes + 1;
    std::size_t length = 0;
    while (length < most) {
      const ssize_t count =
          ::read(file.number(), buffer_.get() + length, most - length);
      if (count < 0 && errno == EINTR) continue;
      if (count < 0) fail("read", path);
      if (count == 0) break;
      length += static_cast<std::size_t>(count);
    }
    if (length > limits::file_bytes)
      refuse(escaped(path) + " is larger than " +
             std::to_string(limits::file_bytes >> 20) + " MiB");
    content_ = {buffer_.get(), length};
    found_.bytes += length;
    if (found_.bytes > limits::bytes)
      refuse("it is larger than " + std::to_string(limits::bytes >> 20) +
             " MiB");
  }

  void link(int parent, const std::string& name, const std::string& path) {
    const std::string text = link_text(parent, name, path);
    const std::string target = joined(path.substr(0, path.rfind('/')), text);
    if (text.empty() || text.front() == '/' || !target.starts_with(tree))
      refuse(escaped(path) + " is a link that leads out, to " + escaped(text));
    links_.emplace(path, target);
    to_.link(path, text);
  }

  receiver& to_;
  contents found_{};
  // Of the file that is looked at, and the room for it.
  std::string_view content_{};
  std::unique_ptr<char[]> buffer_ =
      std::make_unique_for_overwrite<char[]>(limits::file_bytes + 1);
  std::map<std::string, std::string> links_{};  // what each leads to
  // The first name of each zone file: rules compilers make links of zones that
  // are alike.
  std::map<std::pair<dev_t, ino_t>, std::string> names_{};
};

}  // namespace

contents examine(int directory, receiver& to) {
  return walk(to).all_of(directory);
}
