# SPDX-License-Identifier: BSD-2-Clause
#
# Every warning that is on, for g++ and clang++ alike. Off on purpose:
#   -Weffc++              asks for member initialisers where a default will do
#   -Wpadded, -Winline    speak of layout and of what the optimiser did
#   -Wsuggest-attribute   advice for a library with callers elsewhere
add_library(marlin_warnings INTERFACE)
target_compile_options(
  marlin_warnings
  INTERFACE
    -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wsign-conversion
    -Wdouble-promotion -Wold-style-cast -Wcast-align -Wcast-qual -Wformat=2
    -Wformat-security -Wimplicit-fallthrough -Wnon-virtual-dtor
    -Wnull-dereference -Woverloaded-virtual -Wundef -Wunused -Wvla -Wextra-semi
    -Wzero-as-null-pointer-constant
    $<$<CXX_COMPILER_ID:GNU>:-Wduplicated-branches>
    $<$<CXX_COMPILER_ID:GNU>:-Wduplicated-cond>
    $<$<CXX_COMPILER_ID:GNU>:-Wlogical-op>
    $<$<CXX_COMPILER_ID:GNU>:-Wuseless-cast>
    $<$<CXX_COMPILER_ID:Clang>:-Wshadow-all>
    $<$<CXX_COMPILER_ID:Clang>:-Wthread-safety>
    $<$<BOOL:${MARLIN_WERROR}>:-Werror>)
