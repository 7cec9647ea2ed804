// SPDX-License-Identifier: BSD-2-Clause
//
// The first word of a file, against the standard library's formatted
// extraction. The first three bytes of an input are a number and a byte that
// is repeated so often before the rest, so that small inputs reach the ends of
// buffers.
#include "support/first_word.h"

#include <sys/mman.h>
#include <unistd.h>

#include <fstream>

#include "tests/fuzz/property.h"

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < 3) return 0;
  const std::size_t times = (data[0] + 256u * data[1]) % 9000u;
  std::string content(times, static_cast<char>(data[2]));
  content += text_of(data + 3, size - 3);

  static const int file = ::memfd_create("content", MFD_CLOEXEC);
  static const std::string path = "/proc/self/fd/" + std::to_string(file);
  expect(::ftruncate(file, 0) == 0 &&
             ::pwrite(file, content.data(), content.size(), 0) ==
                 static_cast<ssize_t>(content.size()),
         "the file can be written");

  std::string expected;
  std::ifstream(path) >> expected;
  expect(read_first_word(path) == expected, "the word is the library's");
  return 0;
}
