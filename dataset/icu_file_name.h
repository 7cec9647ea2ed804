// SPDX-License-Identifier: BSD-2-Clause
//
// The grammar of ICU data-file names: icutz44l.dat holds data of schema 44l.
#pragma once

#include <string_view>

// The schema that a file name carries, as a part of `name`; empty when the name
// as a whole, NUL bytes and all, is not an ICU data file's.
std::string_view icu_schema_in(std::string_view name);
