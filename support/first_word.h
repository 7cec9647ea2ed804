// SPDX-License-Identifier: BSD-2-Clause
//
// The first word of a text file, as extraction from a file stream would give
// it, at a fraction of a stream's cost.
#pragma once

#include <string>

// The first run of bytes that are not white space (blank, \t, \n, \v, \f, \r)
// in the file at `path`, of whatever length, NUL bytes and all; the rest of the
// file is not looked at. Empty when there is no such word, or no file that can
// be opened and read; when reading fails or memory runs out midway, what came
// before. A FIFO, a socket or a device counts as a file that cannot be opened;
// see is_special_file(). Prints and throws nothing. open(2), read(2).
std::string read_first_word(const std::string& path);
