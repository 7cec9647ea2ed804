// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/copy.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "tools/install/failure.h"

namespace {

std::string last_name(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

void write_all(int file, std::string_view content, const std::string& path) {
  while (!content.empty()) {
    const ssize_t count = ::write(file, content.data(), content.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail("write", path);
    content.remove_prefix(static_cast<std::size_t>(count));
  }
}

// Explicitly: a umask must not decide about the modes of a data set.
void finish(int file, mode_t mode, const std::string& path) {
  if (::fchmod(file, mode) != 0) fail("set the mode of", path);
  sync(file, path);
}

}  // namespace

copy::copy(int top, std::string path) : top_(top), path_(std::move(path)) {}

int copy::here() const { return open_.empty() ? top_ : open_.back().number(); }

std::string copy::shown(const std::string& path) const {
  return path_ + "/" + path;
}

void copy::enter(const std::string& path) {
  const std::string name = last_name(path);
  if (::mkdirat(here(), name.c_str(), 0700) != 0)
    fail("make the directory", shown(path));
  open_.push_back(open_directory(here(), name, shown(path)));
}

void copy::leave(const std::string& path) {
  finish(here(), 0755, shown(path));
  open_.pop_back();
}

void copy::file(const std::string& path, std::string_view content) {
  const descriptor made(::openat(here(), last_name(path).c_str(),
                                 O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC,
                                 0600));
  if (made.number() < 0) fail("make the file", shown(path));
  write_all(made.number(), content, shown(path));
  finish(made.number(), 0644, shown(path));
}

void copy::name(const std::string& path, const std::string& of) {
  if (::linkat(top_, of.c_str(), here(), last_name(path).c_str(), 0) != 0)
    fail("make the file", shown(path));
}

void copy::link(const std::string& path, const std::string& text) {
  if (::symlinkat(text.c_str(), here(), last_name(path).c_str()) != 0)
    fail("make the link", shown(path));
}

void copy::end() { finish(top_, 0755, path_); }
