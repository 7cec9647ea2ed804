# SPDX-License-Identifier: BSD-2-Clause
#
# Toolchain: from any Debian machine to a 32-bit ARM device with a Linux kernel, with
# times and sizes of 64 bits.
set(CMAKE_SYSTEM_PROCESSOR arm)
set(triplet arm-linux-gnueabihf)
set(emulator qemu-arm)
include(${CMAKE_CURRENT_LIST_DIR}/cross.cmake)
add_compile_definitions(_FILE_OFFSET_BITS=64 _TIME_BITS=64)
add_compile_options(-Wno-psabi)  # which only tells of compilers before GCC 7
