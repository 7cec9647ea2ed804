// SPDX-License-Identifier: BSD-2-Clause
//
// What the process that asks may do and take, and why it was ended.
#pragma once

#include <string>

// This process, a child, ends when its parent does. Throws cannot_tell.
void end_with_parent();

// Gives this process what the boot unit gives marlin: no capability, no new
// privileges, no core file. Throws cannot_tell.
void become_the_boot();

// Bounds for a hostile device: what this process may have of addresses, and
// from now on of processor time, after which the kernel ends it.
inline constexpr unsigned long most_memory = 48ul << 20;
inline constexpr unsigned most_milliseconds = 600;
void limit_memory();
void limit_time();

// Why a child that had these bounds was ended, from what wait(2) tells.
std::string why_ended(int status);
