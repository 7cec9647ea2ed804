// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/contents.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <map>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/install/failure.h"
#include "tools/install/files.h"
#include "tools/install/program.h"

namespace {

bool is_plain_name(std::string_view name) {
  return std::all_of(name.begin(), name.end(), [](char byte) {
    return (byte >= '0' && byte <= '9') || (byte >= 'A' && byte <= 'Z') ||
           (byte >= 'a' && byte <= 'z') || byte == '.' || byte == '_' ||
           byte == '+' || byte == '-';
  });
}

bool is_of_manifest(const std::string& path) {
  return path == manifest_name || path.starts_with("SHA256SUMS.");
}

const char* kind_of(mode_t mode) {
  if (S_ISLNK(mode)) return "a link";
  if (S_ISFIFO(mode)) return "a FIFO";
  if (S_ISSOCK(mode)) return "a socket";
  if (S_ISBLK(mode) || S_ISCHR(mode)) return "a device";
  if (S_ISDIR(mode)) return "a directory";
  return mode == 0 ? "missing" : "a file";
}

void check_mode(const std::string& path, mode_t mode) {
  const mode_t wanted = S_ISDIR(mode) ? 0555 : 0444;
  if ((mode & wanted) != wanted)
    refuse(escaped(path) + " cannot be read by all");
  if ((mode & S_IWOTH) != 0) refuse(escaped(path) + " can be written by all");
  if (S_ISREG(mode) && (mode & (S_ISUID | S_ISGID | S_ISVTX)) != 0)
    refuse(escaped(path) +
           " has the set-user-ID, the set-group-ID or the sticky bit");
}

std::string content_of(int parent, const std::string& name,
                       const std::string& path) {
  const descriptor file(
      ::openat(parent, name.c_str(),
               O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  if (file.number() < 0) fail("open", path);
  return read_all(file.number(), limits::file_bytes, path);
}

// Explicitly: neither a umask nor an access list decides about the modes of a
// set.
void set_mode(int file, mode_t mode, const std::string& path) {
  if (::fchmod(file, mode) != 0) fail("set the mode of", path);
}

class walk {
 public:
  walk(int copy, const std::string& where) : copy_(copy), where_(where) {}

  file_names through(int set) {
    check_mode("the update", status_of(set, ".", "the update").st_mode);
    for (const auto& name : names_in(set, limits::entries, "the update")) {
      if (std::ranges::count(paths::update_entries, name) == 0 &&
          !is_of_manifest(name))
        refuse(escaped(name) + " does not belong in an update");
      // Another component's, which an older update lacks.
      if (name != "icutz" && name != "zoneinfo") entry(set, name, name, 0);
    }
    for (const std::string name : {"icutz", "zoneinfo"}) {
      const mode_t mode = status_of(set, name, name).st_mode;
      if (!S_ISDIR(mode))
        refuse(name + " is " + kind_of(mode) + ", not a directory");
      enter(set, name, mode, 1);
    }
    return std::move(files_);
  }

 private:
  std::string shown(const std::string& path) const {
    return where_ + "/" + path;
  }

  void enter(int parent, const std::string& path, mode_t mode,
             std::size_t depth) {
    check_mode(path, mode);
    if (depth > limits::depth)
      refuse(escaped(path) + " is deeper than a zone can be");
    const descriptor directory =
        open_directory(parent, path.substr(path.rfind('/') + 1), path);
    if (copy_ >= 0) {
      if (::mkdirat(copy_, path.c_str(), 0700) != 0)
        fail("make the directory", shown(path));
      set_mode(open_directory(copy_, path, shown(path)).number(), 0755,
               shown(path));
    }
    const auto files = files_.size();
    for (const auto& name :
         names_in(directory.number(), limits::entries + 1, path))
      entry(directory.number(), name, path + "/" + name, depth);
    // The manifest does not list it.
    if (depth > 1 && files_.size() == files)
      refuse(escaped(path) + " has no file");
  }

  void entry(int parent, const std::string& name, const std::string& path,
             std::size_t depth) {
    if (++entries_ > limits::entries)
      refuse("it has more than " + std::to_string(limits::entries) +
             " entries");
    if (!is_plain_name(name))
      refuse(escaped(path) + " has a name that no zone has");
    const struct stat status = status_of(parent, name, path);
    if (S_ISDIR(status.st_mode) && !is_of_manifest(path) &&
        !path.starts_with("icutz/"))
      return enter(parent, path, status.st_mode, depth + 1);
    if (!S_ISREG(status.st_mode))
      refuse(escaped(path) + " is " + kind_of(status.st_mode));
    check_mode(path, status.st_mode);
    const bool listed = !is_of_manifest(path);
    const auto [first, is_new] =
        names_.emplace(std::tuple(listed, status.st_dev, status.st_ino), path);
    if (listed) files_.emplace(path, first->second);
    if (copy_ < 0) return;
    if (is_new)
      write(content_of(parent, name, path), path);
    else if (::linkat(copy_, first->second.c_str(), copy_, path.c_str(), 0) !=
             0)
      fail("make the file", shown(path));
  }

  void write(std::string_view content, const std::string& path) {
    if ((bytes_ += content.size()) > limits::bytes)
      refuse("it is larger than " + std::to_string(limits::bytes >> 20) +
             " MiB");
    const descriptor to(::openat(
        copy_, path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    if (to.number() < 0) fail("make the file", shown(path));
    while (!content.empty()) {
      const ssize_t count =
          ::write(to.number(), content.data(), content.size());
      if (count < 0 && errno == EINTR) continue;
      if (count < 0) fail("write", shown(path));
      content.remove_prefix(static_cast<std::size_t>(count));
    }
    set_mode(to.number(), 0644, shown(path));
  }

  int copy_;
  const std::string& where_;
  file_names files_{};
  std::size_t entries_ = 0;
  std::uint64_t bytes_ = 0;
  // The first name of each file: rules compilers give zones that are alike one
  // file. Apart from them those that the manifest does not list.
  std::map<std::tuple<bool, dev_t, ino_t>, std::string> names_{};
};

// A hash, two blanks, a path: what sha256sum(1) prints of one file.
constexpr std::size_t before_path = 66;

std::string_view first_line(std::string_view text) {
  return text.substr(0, std::min(text.find('\n'), text.size() - 1) + 1);
}

std::string_view path_in(std::string_view line) {
  line.remove_prefix(std::min(before_path, line.size()));
  return line.substr(0, line.find('\n'));
}

// What sha256sum(1) would print of all names, asked for one of each file.
std::string sums_of(int set, const file_names& files) {
  std::vector<std::string> words{"sha256sum"};
  for (const auto& [path, first] : files)
    if (path == first) words.push_back(path);
  // Without a file it would read standard input.
  if (words.size() == 1) refuse("it has no files");
  std::string printed;
  if (const int status = run_program(words, set, &printed); status != 0)
    throw failure{status::failed,
                  "sha256sum ended with status " + std::to_string(status)};
  std::map<std::string_view, std::string_view> sums;
  for (std::string_view rest = printed; !rest.empty();
       rest.remove_prefix(first_line(rest).size()))
    sums.emplace(path_in(rest), rest.substr(0, before_path));
  std::string text;
  for (const auto& [path, first] : files)
    text.append(sums[first]).append(path).append("\n");
  return text;
}

}  // namespace

file_names files_in(int set, int copy, const std::string& where) {
  return walk(copy, where).through(set);
}

void check_manifest(int set, const file_names& files) {
  if (status_of(set, manifest_name, manifest_name).st_mode == 0)
    refuse("it has no SHA256SUMS");
  const std::string text = content_of(set, manifest_name, manifest_name),
                    printed = sums_of(set, files);
  std::string_view wanted = text, found = printed;
  while (!found.empty() && wanted.starts_with(first_line(found))) {
    wanted.remove_prefix(first_line(found).size());
    found.remove_prefix(first_line(found).size());
  }
  if (wanted.empty() && found.empty()) return;
  const auto listed = path_in(wanted), path = path_in(found);
  if (found.empty() || (!wanted.empty() && listed < path))
    refuse("SHA256SUMS lists what is missing, \"" +
           escaped(listed.substr(0, 100)) + "\"");
  refuse(escaped(path) + (listed == path ? " is not as SHA256SUMS has it"
                                         : " is not in SHA256SUMS"));
}

verdict condition_of(const std::string& set) {
  const std::string path = paths::download_root + set;
  try {
    const descriptor opened(
        ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (opened.number() < 0 && errno == ENOENT) return {condition::lost, {}};
    if (opened.number() < 0 && (errno == ENOTDIR || errno == ELOOP))
      refuse("it is not a directory");
    if (opened.number() < 0) fail("open", path);
    if (status_of(opened.number(), manifest_name, path).st_mode == 0)
      return {condition::unlisted, {}};
    check_manifest(opened.number(), files_in(opened.number()));
    return {condition::whole, {}};
  } catch (const refusal& told) {
    return {condition::damaged, told.line};
  } catch (const failure& told) {
    return {condition::unreadable, told.line};
  }
}
