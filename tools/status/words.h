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

// How the links fit: a name, such as "update_without_icu", and a sentence.
struct pair_words {
  const char* name;
  const char* sentence;
};
pair_words words_for(link_pair pair);
bool fits(link_pair pair);

// The zone that "localtime" names, below the active tree; empty: none.
std::string zone_of(const link_facts& links);
