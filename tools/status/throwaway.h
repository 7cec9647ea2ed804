// SPDX-License-Identifier: BSD-2-Clause
//
// A device on which a boot leaves no trace.
#pragma once

#include <string>

#include "tools/status/sight.h"

struct place {
  bool is_running_system = false;
  bool has_all_users = false;  // in no user namespace with fewer
  // The first part that a boot changes and that is another user's; whether the
  // links' directory is; whether that is of the owner of "/", who may write it.
  std::string foreign_part{};
  bool has_foreign_links = false;
  bool owner_may_change_links = false;
  sight seen{};  // of the device
};

// Moves this process, for good, into mount namespaces of its own in which
// `root` is "/": nothing outside can be reached by any path, every file system
// is read only, and a layer in memory lies over "/var/db" and every file system
// mounted below it, except "/var/db/timezone/tz", as under the boot unit.
// Without the privileges of root it first enters a user namespace in which this
// user is root. Throws cannot_tell with the call that failed, or with what the
// layers do not show as it is. Calls: unshare(2), open_tree(2), move_mount(2),
// mount_setattr(2), fsopen(2) for overlayfs, chroot(2).
place enter_throwaway_device(const std::string& root);
