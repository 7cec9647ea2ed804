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

// The data-set directory in the target of a "zoneinfo" link: for a target below
// "/var/db/timezone/tz/" all before its last "/", which must stand behind at
// least one more byte, be it a "/"; for exactly "/usr/share/zoneinfo.default"
// the empty text. Prints "Bad zoneinfo link TARGET" and throws
// fsutil::link_rejected for any other target.
std::string dataset_path_from_link(const std::string& target);
