// SPDX-License-Identifier: BSD-2-Clause
//
// The one pass of a boot: the order of its steps, and the choice of the data
// set. The local time and the legacy ICU link have fallbacks of their own.
#pragma once

#include "driver/data_protection.h"
#include "driver/dataset_links.h"
#include "driver/legacy_icu_link.h"
#include "driver/localtime_link.h"
#include "driver/version_record.h"

// Makes the links below "/var/db/timezone/" consistent, in the nine steps that
// startup.cpp lists. If a data set cannot be chosen or linked into place,
// prints a warning and links the system partition. Throws only when a last
// resort fails: the final reset (the local time is then not looked at), or the
// default local-time link; or std::bad_alloc when there is no memory for a
// fixed path.
void run_startup_pass();
