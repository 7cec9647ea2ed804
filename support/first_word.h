// SPDX-License-Identifier: BSD-2-Clause
//
// The first word of a text file, as extraction from a file stream would give
// it, at a fraction of a stream's cost.
#pragma once

#include <string>

// The first run of bytes that are not white space (blank, \t, \n, \v, \f, \r)
// in the file at `path`: "2024a" in one that begins with "\n 2024a of May". It
// may be of any length and include NUL bytes; the rest of the file is not
// looked at. Empty when there is no such word, or when the file cannot be
// opened or read; if reading fails or memory runs out later, the part before
// that. A FIFO or a device is never opened. Prints and throws nothing. Calls:
// stat(2), open(2), read(2).
std::string read_first_word(const std::string& path);
