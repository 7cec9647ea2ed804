// SPDX-License-Identifier: BSD-2-Clause
//
// A device on which a boot leaves no trace.
#pragma once

#include <string>

#include "tools/status/sight.h"

struct place {
  bool is_running_system = false;
  bool has_all_users = false;  // in no user namespace with fewer
  // Whether the links' directory is of the owner of "/", who may write there.
  bool owner_may_change_links = false;
  sight seen{};  // of the device, as it is without the layers
};

// Moves this process, for good, into mount namespaces of its own in which
// `root` is "/": nothing outside can be reached by any path, every file system
// is read only, and a layer in memory lies over "/var/db" and every file system
// mounted below it, except "/var/db/timezone/tz", as under the boot unit.
// Without the privileges of root it first enters a user namespace in which this
// user is root. Throws cannot_tell with the call that failed, or with what the
// layers do not show as it is.
place enter_throwaway_device(const std::string& root);
