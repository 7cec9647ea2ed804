// SPDX-License-Identifier: BSD-2-Clause
//
// What is in the directory of an update, entry by entry, with all checks that
// need nothing of the device. The update is hostile until it has passed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <set>
#include <string>
#include <string_view>

// More than any update needs: a tree with all its variants has 2,000 entries,
// three levels and less than 4 MB.
namespace limits {

inline constexpr std::size_t entries = 8192;
inline constexpr std::size_t depth = 8;  // of directories in one another
inline constexpr std::size_t file_bytes = 4u << 20;
inline constexpr std::uint64_t bytes = 32u << 20;

}  // namespace limits

// Is told of everything that has passed its check, in the order in which it can
// be made anew: exactly the bytes that were checked. Paths are relative to the
// update. This one does nothing.
class receiver {
 public:
  virtual ~receiver() = default;
  virtual void enter(const std::string& /*path*/) {}
  virtual void leave(const std::string& /*path*/) {}
  virtual void file(const std::string& /*path*/, std::string_view /*content*/) {
  }
  // Another name of a file that was received before.
  virtual void name(const std::string& /*path*/, const std::string& /*of*/) {}
  virtual void link(const std::string& /*path*/, const std::string& /*text*/) {}
  virtual void end() {}
};

struct contents {
  std::string release;          // the first word of "+VERSION"
  std::string schema;           // in the name of the ICU data file
  std::set<std::string> zones;  // such as Europe/Paris; links are zones, too
  std::size_t entries = 0;
  std::uint64_t bytes = 0;
  friend bool operator==(const contents&, const contents&) = default;
};

// Walks through an update, `directory`, and throws `failure` at the first thing
// that a sound one cannot have. Nothing but directories and regular files is
// ever opened, no link is followed, and what is read and remembered is bounded
// by the limits. If a FIFO takes the place of a file in between, it is opened
// without waiting, and refused.
contents examine(int directory, receiver& to);
