// SPDX-License-Identifier: BSD-2-Clause
//
// What can be seen of a device.
#pragma once

#include <sys/types.h>

#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>

// How an owner appears whom this user namespace does not have.
inline constexpr uid_t nobody = 65534;

// Follows paths as the kernel does, and looks at each place only once. Opens
// nothing but directories. Throws std::bad_alloc only.
class sight {
 public:
  // Of a device that is not "/" yet, and from when on it is.
  explicit sight(std::string root = {}) : root_(std::move(root)) {}
  void enter() { root_.clear(); }

  struct place {
    mode_t mode = 0;
    off_t size = 0;  // not of a directory
    int error = 0;
    std::string target{};  // a link's; of what has more paths, the first one
    std::string names{};   // in a directory whose names count
    uid_t owner = 0;
    gid_t group = 0;

    // Whoever the owners are.
    bool operator==(const place& other) const;
  };
  static const place nothing;

  struct way {
    std::string real{};             // where it leads; "/" is empty
    const place& end = nothing;     // what is there
    std::optional<uid_t> closed{};  // whose a part without a mode is, if any
  };
  // Directories on the way and at its end, except "/", have to have one mode, a
  // file at the end the other. Of closed parts one that is not root's counts.
  way follow(std::string path, mode_t of_directories = 01, mode_t of_file = 04);

  // Looks at each place that a boot uses, as it stands there and where it
  // leads. Returns the paths of those that it reads.
  std::set<std::string> look_around();

  std::optional<std::string> first_difference(const sight& other) const;

  const place& at(const std::string& path);  // what stands there itself

 private:
  place& look(const std::string& real);

  std::string root_;
  std::map<std::string, place> seen_{};  // "" is the root
  std::map<std::pair<dev_t, ino_t>, std::string> first_{};
};
