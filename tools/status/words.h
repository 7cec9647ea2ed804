// SPDX-License-Identifier: BSD-2-Clause
//
// The words in which facts are told, the same for people and for programs.
#pragma once

#include <string>

#include "tools/status/facts.h"

// "none", "link", "directory" and so on.
std::string kind_of(const entry& here);

// Which data is in use: "system", "update", or "none" when "zoneinfo" names no
// data set.
std::string data_in_use(const link_facts& links);

// A name for how the links fit, such as "update_without_icu".
std::string name_of(link_pair pair);

// The zone that "localtime" names, below the active tree; empty: none.
std::string zone_of(const link_facts& links);
