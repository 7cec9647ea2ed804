# SPDX-License-Identifier: BSD-2-Clause
#
# Toolchain: from any Debian machine to an arm64 device with a Linux kernel.
# Packages: g++-aarch64-linux-gnu, qemu-user and, for the tests, googletest.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR aarch64)

set(CMAKE_C_COMPILER aarch64-linux-gnu-gcc)
set(CMAKE_CXX_COMPILER aarch64-linux-gnu-g++)

# Programs of the build machine, never its libraries, headers or packages.
set(CMAKE_FIND_ROOT_PATH /usr/aarch64-linux-gnu)
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

# Everything is static: so is what ships, and a program that looks for no
# library needs none on a device or below the emulator.
set(CMAKE_EXE_LINKER_FLAGS_INIT -static)

# One word, and its whole path: tests put it before programs that they start.
find_program(MARLIN_QEMU_USER qemu-aarch64)
mark_as_advanced(MARLIN_QEMU_USER)
if(MARLIN_QEMU_USER)
  set(CMAKE_CROSSCOMPILING_EMULATOR ${MARLIN_QEMU_USER})
endif()
