// SPDX-License-Identifier: BSD-2-Clause
//
// Reads the release of a zoneinfo tree and the format of the system's ICU data,
// each of which is the first word of a text file.
#pragma once

#include <string>

// The first run of bytes that are not white space (blank, \t, \n, \v, \f, \r)
// in the file at `path`, of whatever length, NUL bytes and all; the rest of the
// file is not looked at. Empty when there is no such word, or no regular file
// that can be opened and read; when reading fails midway, what came before.
// Never blocks on a FIFO or a device, prints nothing, throws only on memory
// exhaustion. open(2), pread(2).
std::string read_first_word(const std::string& path);
