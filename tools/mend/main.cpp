// SPDX-License-Identifier: BSD-2-Clause
//
// Run before marlin, on devices that switch it on: if "zoneinfo" and "icutz" do
// not name the same data, as after a loss of power between the two links,
// removes "zoneinfo". marlin then makes both anew, by its own rules. Two to
// four calls on a quiet boot; it may fail, and the boot goes on without it.
#include <err.h>
#include <limits.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <string_view>

#include "support/paths.h"

namespace {

class link_read {
 public:
  explicit link_read(const char* path)
      : length_(::readlink(path, text_, sizeof text_)),
        missing_(length_ < 0 && errno == ENOENT) {}
  bool missing() const { return missing_; }
  // Something that is no link, or cannot be read, is left to marlin.
  bool unclear() const { return length_ < 0 && !missing_; }
  std::string_view text() const {
    return {text_, length_ < 0 ? 0 : static_cast<std::size_t>(length_)};
  }

 private:
  char text_[PATH_MAX];
  ssize_t length_;
  bool missing_;
};

// As marlin understands it, the data set is what is before the last "/", if a
// name stands between the two. Empty if the link names no update.
std::string_view update_of(std::string_view tree) {
  const std::size_t last = tree.rfind('/');
  const bool named = tree.starts_with(paths::download_root) &&
                     last > paths::length(paths::download_root);
  return named ? tree.substr(0, last) : std::string_view();
}

bool mixed(std::string_view tree, std::string_view icu_data) {
  if (tree == paths::system_zoneinfo) return !icu_data.empty();
  const std::string_view set = update_of(tree);
  return !set.empty() && !(icu_data.starts_with(set) &&
                           icu_data.substr(set.size()) == "/icutz");
}

bool mixed(const link_read& tree) {
  const link_read icu_data(paths::icu_link);
  // marlin is about to move a link from where older systems had it, unless it
  // leads nowhere. What it cannot read there it only removes.
  if (icu_data.missing() && ::access(paths::legacy_icu_link, F_OK) == 0)
    return mixed(tree.text(), link_read(paths::legacy_icu_link).text());
  return !icu_data.unclear() && mixed(tree.text(), icu_data.text());
}

}  // namespace

int main() {
  if (!mixed(link_read(paths::zoneinfo_link))) return 0;
  // A lost log must not look like a failure, nor hide one.
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
  if (::unlink(paths::zoneinfo_link) != 0)
    ::err(1, "cannot remove %s, which does not fit %s", paths::zoneinfo_link,
          paths::icu_link);
  ::warnx("%s did not fit %s; marlin makes both anew", paths::zoneinfo_link,
          paths::icu_link);
  return 0;
}
