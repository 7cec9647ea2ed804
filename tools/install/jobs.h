// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include "tools/install/options.h"

// Does what was asked for, and tells on standard output what it did; or throws
// `failure`, with nothing half done.
void run_job(const options& wanted);
