// SPDX-License-Identifier: BSD-2-Clause
//
// What a device says of itself, as far as an installer has to know it. Reads
// only. Quiet, unlike the boot: what a boot complains about is not an
// installer's.
#pragma once

#include <optional>
#include <set>
#include <string>

#include "support/version.h"

// The version in a text; none in a malformed one, which is older than any.
std::optional<mln_version> version_in(const std::string& text);

// The name of the set in "/var/db/timezone/tz/" that a link's text leads to, or
// into; empty if it leads elsewhere.
std::string set_in(const std::string& link_text);

// The set that each of these links names, if that set is there; otherwise
// empty.
std::string announced_set();
std::string set_in_use();

// The version text of the system partition's data, such as 2024a.1.0.
std::string system_version();
// The ICU schema of the system; empty where there is none.
std::string system_schema();

// Whether a set has ICU data of the system's schema.
bool fits_system(const std::string& set);

// The zone that "localtime" names, such as Europe/Paris, here or where it was
// on older systems; empty for any other link.
std::string zone_of_the_user();

// Names in "/var/db/timezone/tz/" that must stay: one of the links leads into
// each, by its text or by the way that the system resolves it.
std::set<std::string> needed_sets();
