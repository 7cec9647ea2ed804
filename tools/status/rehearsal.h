// SPDX-License-Identifier: BSD-2-Clause
//
// One boot, run by the boot program's own code in this process, a child.
#pragma once

#include <string>
#include <vector>

// This process ends when its parent does. Throws cannot_tell.
void end_with_parent();

// Gives this process what the boot unit gives marlin: no capability, no new
// privileges, no core file. Throws cannot_tell.
void become_the_boot();

// Bounds for a hostile device: what this process may have of addresses, and
// from now on of processor time, after which the kernel ends it.
inline constexpr unsigned long most_memory = 48ul << 20;
void limit_memory();
void limit_time();

// How often memory was refused to this process.
unsigned refusals();

// Why a child that had these bounds was ended, from what wait(2) tells.
std::string why_ended(int status);

// A warning, taken whole where the program hands it to warn(3): no text inside
// one can look like another.
struct line {
  std::string format;  // as the program gives it, such as "read_symlink: %s"
  std::string text;    // as it is printed, without the newline
  int error = 0;       // the errno whose text the line ends with
};

// The warnings of this process since the last call. This program has its own
// warn(3) for it, which prints nothing and leaves errno alone. Throws
// std::bad_alloc if the kernel had no memory for what was warned of.
std::vector<line> take_lines();

struct rehearsal {
  std::vector<line> lines{};
  bool ends_normally = false;
  std::string thrown{};           // otherwise: what was thrown, in words
  bool may_change_links = false;  // afterwards, in their directory
  std::string closed_part{};      // afterwards, of what readers need
};

// Runs run_startup_pass() on the device that this process sees as "/". Throws
// what take_lines() throws.
rehearsal rehearse_boot();
