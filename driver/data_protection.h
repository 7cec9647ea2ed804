// SPDX-License-Identifier: BSD-2-Clause
//
// Makes the time-zone directories readable before the device's first unlock, on
// platforms that encrypt by data-protection class.
#pragma once

// Puts "/var/db/timezone/" and "/var/db/timezone/tz/" into class D.
void relax_data_protection();

// Asks for class D, "no protection", on a directory. open(2), fcntl(2) with
// F_SETPROTECTIONCLASS; nothing on platforms without it. Creates nothing,
// prints nothing, never fails.
void set_protection_class_d(const char* directory);
