// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include "tools/install/options.h"

// Does what was asked for, and tells on standard output what it did: the exit
// status. Or throws `failure`, with nothing half done.
int run_job(const options& wanted);
