// SPDX-License-Identifier: BSD-2-Clause
//
// What every fuzz target needs: bytes in, properties out.
#pragma once

#include <errno.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <utility>

// What an engine, or the replay of its seeds, calls with one input.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data,
                                      std::size_t size);

inline std::string_view text_of(const std::uint8_t* data, std::size_t size) {
  return {reinterpret_cast<const char*>(data), size};
}

// Ends the process when a property does not hold.
inline void expect(bool holds, const char* property) {
  if (holds) return;
  std::fprintf(stderr, "property broken: %s\n", property);
  std::abort();
}

// What `act` prints with warn(3), which goes nowhere else. The stream is
// replaced, not the descriptor, because an engine reports on that.
template <typename Act>
std::string printed_by(const Act& act) {
  char* bytes = nullptr;
  std::size_t size = 0;
  std::FILE* const log = ::open_memstream(&bytes, &size);
  std::FILE* const standard_error = std::exchange(stderr, log);
  errno = 0;
  act();
  stderr = standard_error;
  std::fclose(log);
  const std::string printed(bytes, size);
  std::free(bytes);
  return printed;
}

// The line of warn(3) with this message, which goes up to its first NUL, where
// no call has failed.
inline std::string warning(const std::string& message) {
  return std::string(program_invocation_short_name) + ": " + message.c_str() +
         ": " + std::strerror(0) + "\n";
}
