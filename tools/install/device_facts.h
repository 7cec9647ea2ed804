// SPDX-License-Identifier: BSD-2-Clause
//
// What a device says of itself, as far as an installer has to know it. Reads
// only, by the boot's own classes where it has one.
#pragma once

#include <optional>
#include <set>
#include <string>

#include "support/version.h"

// The version in a text; none in a malformed one, which is older than any.
std::optional<mln_version> version_in(const std::string& text);

// The name of the set in "/var/db/timezone/tz/" that the text of each of these
// links leads to, or into; empty if it leads elsewhere.
std::string announced_set();
std::string set_in_use();

// Whether both links name the data of a set as a boot writes them.
bool is_in_use(const std::string& set);

// The three below throw if two looks at what they read differ.

// The version text of the system partition's data, such as 2024a.1.0.
std::string system_version();
// The ICU schema of the system; empty where there is none.
std::string system_schema();

// Whether there is such a set, of any kind.
bool is_installed(const std::string& set);

// Whether a set is there and has ICU data of the system's schema.
bool fits_system(const std::string& set);

// Whether a set that fits is newer than the data in use.
bool a_boot_could_take(const std::string& set);

// Whether a regular file is at a path, perhaps by way of links.
bool is_file(const std::string& path);

// The zone that "localtime" names, such as Europe/Paris, here or where it was
// on older systems, if the device can read it now; otherwise empty.
std::string zone_of_the_user();

// Names in "/var/db/timezone/tz/" that must stay: one of the links leads into
// each, by its text or by the way that the system resolves it.
std::set<std::string> needed_sets();
