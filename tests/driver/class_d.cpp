// SPDX-License-Identifier: BSD-2-Clause
// Asks for class D for the directory that its argument names.
#include "driver/data_protection.h"

int main(int, char** arguments) { set_protection_class_d(arguments[1]); }
