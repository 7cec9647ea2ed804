// SPDX-License-Identifier: BSD-2-Clause
//
// What is in the directory of a set, entry by entry, and what its manifest says
// of it. An update is hostile until it has passed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>

// More than any update needs: a tree with all its variants has 2,000 entries,
// three levels and less than 4 MB.
namespace limits {

inline constexpr std::size_t entries = 8192;
inline constexpr std::size_t depth = 8;  // of directories in one another
inline constexpr std::uint64_t file_bytes = 4u << 20;
inline constexpr std::uint64_t bytes = 32u << 20;

}  // namespace limits

inline constexpr char manifest_name[] = "SHA256SUMS";

// Walks through a set, and throws `refusal` at the first thing that a sound one
// cannot have; the bytes of files are not looked at. Nothing but directories
// and regular files is ever opened, no link is followed, and all is bounded by
// the limits. What takes the place of a file in between is opened without
// waiting, and passes only with the bytes that the manifest has.
//
// Everything is made anew in `copy`, if there is one: an empty directory that
// nobody else can enter. Directories get the mode 755, files 644. `where` is
// what lines call it. Returns the paths of all files except "SHA256SUMS" and
// its signatures, sorted by their bytes, each with the first name of the file.
using file_names = std::map<std::string, std::string>;
file_names files_in(int set, int copy = -1, const std::string& where = {});

// Throws `refusal` unless "SHA256SUMS" in a set has exactly the bytes that
// sha256sum(1) prints of these files, which it reads.
void check_manifest(int set, const file_names& files);

// Whether a set on the device is whole. `why` is for one that is damaged, or
// that a failed call keeps from being looked at.
enum class condition { whole, damaged, unlisted, lost, unreadable };
struct verdict {
  condition is;
  std::string why;
};
verdict condition_of(const std::string& set);
