// SPDX-License-Identifier: BSD-2-Clause
//
// Whether an update fits the device that it is for. Each function throws
// `failure` when it does not.
#pragma once

#include <string>

#include "tools/install/contents.h"

// That the name is a version, and newer than the system partition's data and
// than the sets that are announced and in use; if not, throws with
// status::not_newer. `any_age` leaves out the comparison. Returns whether the
// device names this set already, and has it no more, or damaged: such a set may
// be as old as it is.
bool check_version(const std::string& name, bool any_age);

// That the release in a copy is that of its name, that its schema is the
// system's, and that it has the zone of the user. `files` are its files.
void check_contents(const std::string& name, const std::string& copy,
                    const file_names& files);
