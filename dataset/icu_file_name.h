// SPDX-License-Identifier: BSD-2-Clause
//
// The grammar of ICU data-file names: icutz44l.dat holds data of schema 44l.
#pragma once

#include <string_view>

// The schema in a file name, as a part of `name`; empty when the whole of the
// name, including any NUL bytes, is not the name of an ICU data file.
std::string_view icu_schema_in(std::string_view name);
