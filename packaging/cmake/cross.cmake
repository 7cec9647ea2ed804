# SPDX-License-Identifier: BSD-2-Clause
#
# What the toolchain files beside this have in common: `triplet` is Debian's name for
# the target, `emulator` runs its programs. Packages: the compiler, qemu-user and, for
# the tests, googletest.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_C_COMPILER ${triplet}-gcc)
set(CMAKE_CXX_COMPILER ${triplet}-g++)

# Programs of the build machine, never its libraries, headers or packages.
set(CMAKE_FIND_ROOT_PATH /usr/${triplet})
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

# Everything is static: so is what ships, and a program that looks for no
# library needs none on a device or below the emulator.
set(CMAKE_EXE_LINKER_FLAGS_INIT -static)

# One word, and its whole path: tests put it before programs that they start.
find_program(MARLIN_QEMU_USER ${emulator})
mark_as_advanced(MARLIN_QEMU_USER)
if(MARLIN_QEMU_USER)
  set(CMAKE_CROSSCOMPILING_EMULATOR ${MARLIN_QEMU_USER})
endif()
