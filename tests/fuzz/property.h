// SPDX-License-Identifier: BSD-2-Clause
//
// What every fuzz target needs: bytes in, properties out.
#pragma once

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

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
  std::FILE* const standard_error = stderr;
  stderr = log;
  act();
  stderr = standard_error;
  std::fclose(log);
  const std::string printed(bytes, size);
  std::free(bytes);
  return printed;
}

// Whether `printed` is one line of warn(3) with this message, as far as its
// first NUL goes, whatever the error text; what follows the line is cut off.
inline bool take_warning(std::string& printed, const std::string& message) {
  const std::string start =
      std::string(": ") + message.c_str() + std::string(": ");
  const std::size_t name = printed.find(start);
  if (name == std::string::npos || printed.find_first_of(":\n") != name)
    return false;
  const std::size_t end = printed.find('\n', name + start.size());
  if (end == std::string::npos) return false;
  printed.erase(0, end + 1);
  return true;
}
