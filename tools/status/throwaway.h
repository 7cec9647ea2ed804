// SPDX-License-Identifier: BSD-2-Clause
//
// A device on which a boot leaves no trace.
#pragma once

#include <stdexcept>
#include <string>

// Why something cannot be told here, in a few words for a person.
struct cannot_tell : std::runtime_error {
  using std::runtime_error::runtime_error;
};

// Moves this process, for good, into mount namespaces of its own in which
// `root` is "/": nothing outside can be reached by any path, every file system
// is read only, and a layer in memory lies over "/var/db" and every file system
// mounted below it, except "/var/db/timezone/tz", as under the boot unit.
// Without the privileges of root it first enters a user namespace in which this
// user is root. Throws cannot_tell with the call that failed. unshare(2),
// open_tree(2), move_mount(2), mount_setattr(2), fsopen(2) for overlayfs,
// chroot(2).
struct place {
  bool is_running_system = false;  // `root` is this system's
  bool has_all_users = false;      // and is in no user namespace with fewer
};
place enter_throwaway_device(const std::string& root);

// This process, a child, ends when its parent does. prctl(2).
void end_with_parent();

// Gives this process what the boot unit gives marlin: no capability, no new
// privileges, no core file. Throws cannot_tell.
void become_the_boot();

// Bounds for a hostile device: what this process may have of addresses, its
// children too, and of processor time, after which the kernel ends it.
inline constexpr unsigned long most_memory = 48ul << 20;
inline constexpr unsigned most_milliseconds = 600;
void limit_memory();
void limit_time();

// Why a child that had these bounds was ended, from what wait(2) tells.
std::string why_ended(int status);
