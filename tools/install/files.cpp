// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/files.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <string_view>

#include "tools/escaped.h"
#include "tools/install/failure.h"

struct stat status_of(int directory, const std::string& name,
                      const std::string& path) {
  struct stat status {};
  if (::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0)
    return status;
  if (errno != ENOENT) fail("look at", path);
  return {};
}

descriptor open_directory(int parent, const std::string& name,
                          const std::string& path) {
  descriptor opened(::openat(parent, name.c_str(),
                             O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (opened.number() < 0) fail("open", path);
  return opened;
}

listing open_listing(int directory, const std::string& path) {
  // Another description of the same directory, with a position of its own.
  descriptor own = open_directory(directory, ".", path);
  listing opened(::fdopendir(own.number()));
  if (!opened) fail("list", path);
  own.release();
  return opened;
}

const char* next_name(DIR* entries, const std::string& path) {
  for (;;) {
    errno = 0;
    const dirent* const found = ::readdir(entries);
    if (found == nullptr && errno != 0) fail("list", path);
    if (found == nullptr) return nullptr;
    const std::string_view name = found->d_name;
    if (name != "." && name != "..") return found->d_name;
  }
}

std::vector<std::string> names_in(int directory, std::size_t most,
                                  const std::string& path) {
  const listing entries = open_listing(directory, path);
  std::vector<std::string> names;
  while (names.size() < most) {
    const char* const name = next_name(entries.get(), path);
    if (name == nullptr) break;
    names.emplace_back(name);
  }
  std::sort(names.begin(), names.end());
  return names;
}

std::string link_text(int directory, const std::string& name,
                      const std::string& path) {
  char target[PATH_MAX];
  const ssize_t length =
      ::readlinkat(directory, name.c_str(), target, sizeof target);
  if (length >= 0) return {target, static_cast<std::size_t>(length)};
  if (errno != ENOENT && errno != EINVAL) fail("read the link", path);
  return {};
}

std::string read_all(int file, std::size_t most, const std::string& path) {
  std::string text;
  char buffer[1 << 14];
  for (;;) {
    const ssize_t count = ::read(file, buffer, sizeof buffer);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail("read", path);
    const auto size = static_cast<std::size_t>(count);
    text.append(buffer, size);
    if (text.size() > most)
      refuse(escaped(path) + " is larger than " + std::to_string(most >> 20) +
             " MiB");
    // What comes after the end of a file is not of it.
    if (size < sizeof buffer) return text;
  }
}

void sync(int file, const std::string& path) {
  if (::fsync(file) != 0) fail("sync", path);
}

void rename_entry(int directory, const std::string& from, const std::string& to,
                  const std::string& path) {
  if (::renameat(directory, from.c_str(), directory, to.c_str()) != 0)
    fail("rename", path);
}

void exchange_entries(int directory, const std::string& one,
                      const std::string& other, const std::string& path) {
  // Not every C library has a function for it.
  if (::syscall(SYS_renameat2, directory, one.c_str(), directory, other.c_str(),
                RENAME_EXCHANGE) != 0)
    fail("exchange", path);
}
