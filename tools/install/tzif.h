// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string_view>

// What is wrong with the content of a zone file, in a few words, as in "is cut
// short"; nullptr when it is a TZif file, version 1 to 4, as RFC 8536 has it:
// headers whose counts fit each other and the length, types and abbreviations
// that exist, times in order, and a footer. Prints and throws nothing.
const char* tzif_flaw(std::string_view content);
