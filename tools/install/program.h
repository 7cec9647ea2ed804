// SPDX-License-Identifier: BSD-2-Clause
#pragma once

#include <string>
#include <vector>

// Runs another program without a shell, found by PATH unless its name has a
// "/", and waits for its end: the exit status, or 128 and the number of the
// signal that ended it. With `output` it runs in `directory`, and `output` is
// what it printed. Throws `failure` if it cannot be run.
int run_program(std::vector<std::string> words, int directory = -1,
                std::string* output = nullptr);
