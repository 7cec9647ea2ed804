// SPDX-License-Identifier: BSD-2-Clause
//
// Reads from the links which data sets are announced and current at boot, as
// texts that an mln_dataset can be built from. Changes nothing on the device.
#pragma once

#include <string>

// The target of "/var/db/timezone/tz_latest", unchecked; empty when there is no
// such link. Throws what fsutil::read_symlink() throws.
std::string latest_update_path();

// The directory of the data set that "/var/db/timezone/zoneinfo" names; empty
// for the system partition. Throws what fsutil::read_symlink() and
// dataset_path_from_link() throw.
std::string current_dataset_path();

// The data-set directory in the target of a "zoneinfo" link:
// "/var/db/timezone/tz/2024a.1.0" for "/var/db/timezone/tz/2024a.1.0/zoneinfo".
// For a target that begins with "/var/db/timezone/tz/" it is everything before
// the last "/"; at least one byte, possibly "/", must separate it from the
// prefix. For exactly "/usr/share/zoneinfo.default" it is the empty text. For
// any other target prints "Bad zoneinfo link TARGET" and throws link_rejected.
std::string dataset_path_from_link(const std::string& target);
