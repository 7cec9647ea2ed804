# SPDX-License-Identifier: BSD-2-Clause
#
# Toolchain: from any Debian machine to an arm64 device with a Linux kernel.
set(CMAKE_SYSTEM_PROCESSOR aarch64)
set(triplet aarch64-linux-gnu)
set(emulator qemu-aarch64)
include(${CMAKE_CURRENT_LIST_DIR}/cross.cmake)
