// SPDX-License-Identifier: BSD-2-Clause
//
// The one pass of a boot, and the operations of which it consists.
#pragma once

#include "driver/data_protection.h"
#include "driver/dataset_links.h"
#include "driver/legacy_icu_link.h"
#include "driver/localtime_link.h"
#include "driver/version_record.h"

// Makes the links below "/var/db/timezone/" consistent; see main() for the way
// of a boot. What fails while a data set is chosen and linked into place ends
// in a warning and in links to the system partition. Throws only what the last
// resorts throw: the final reset to the system partition (the local-time link
// is then not looked at) and the default local-time link; and std::bad_alloc
// when there is no memory for a fixed path.
void run_startup_pass();
