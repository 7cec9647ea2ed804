// SPDX-License-Identifier: BSD-2-Clause
//
// Lifts data protection from the time-zone directories, on platforms that have
// data-protection classes: their content is needed before anything else.
#pragma once

#include <string>

// Puts "/var/db/timezone/" and "/var/db/timezone/tz/" into class D.
void relax_data_protection();

// Asks for class D, "no protection", on a directory; does nothing on platforms
// without classes. Creates nothing, prints nothing, never fails. Calls:
// open(2), fcntl(2) with F_SETPROTECTIONCLASS.
void set_protection_class_d(const std::string& directory);
