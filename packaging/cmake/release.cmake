# SPDX-License-Identifier: BSD-2-Clause
#
# What a Release build of the program and its libraries has beyond CMake's own
# flags, as far as the compiler and the linker know it. Builds for amd64, arm64 and
# armhf are tested; on any other processor the program gets the part of the hardening
# that the compiler offers there.
include(CheckCXXCompilerFlag)
include(CheckLinkerFlag)

# Adds the options that are known, to "compile" or to "link".
function(marlin_options step target)
  foreach(option IN LISTS ARGN)
    string(MAKE_C_IDENTIFIER "MARLIN_${step}_KNOWS${option}" known)
    if(step STREQUAL compile)
      check_cxx_compiler_flag(${option} ${known})
    else()
      check_linker_flag(CXX ${option} ${known})
    endif()
    if(${known})
      cmake_language(CALL target_${step}_options ${target}
                     INTERFACE $<$<CONFIG:Release>:${option}>)
    endif()
  endforeach()
endfunction()

# Functions that nothing calls are left out.
add_library(marlin_release INTERFACE)
marlin_options(compile marlin_release -ffunction-sections -fdata-sections)
marlin_options(link marlin_release -Wl,--gc-sections)

# A static program at a random address would have to relocate itself at every
# start, for nearly as much as the whole boot costs; see docs/decisions.md. Whether
# a dynamic one is at a random address is left to the compiler.
if(MARLIN_STATIC)
  marlin_options(compile marlin_release -fno-pie)
  marlin_options(link marlin_release -no-pie)
endif()

# What each of these costs is in docs/decisions.md.
add_library(marlin_hardening INTERFACE)
if(MARLIN_HARDENING)
  marlin_options(compile marlin_hardening -fstack-protector-strong
                 -fstack-clash-protection)
  # No -fcf-protection and no -mbranch-protection: a program has either only if
  # every object in it does, and the C library's start files and its static
  # library are built without.
  # Some compilers define the second themselves, perhaps as another number.
  target_compile_options(
    marlin_hardening INTERFACE $<$<CONFIG:Release>:-D_GLIBCXX_ASSERTIONS>
                               $<$<CONFIG:Release>:-U_FORTIFY_SOURCE>
                               $<$<CONFIG:Release>:-D_FORTIFY_SOURCE=2>)
  # Constants are in no executable page, on processors too whose linkers would
  # put them there.
  marlin_options(link marlin_hardening -Wl,-z,relro -Wl,-z,now -Wl,-z,separate-code)
endif()
