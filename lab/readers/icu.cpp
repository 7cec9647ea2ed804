// SPDX-License-Identifier: BSD-2-Clause
// usage: icu SECONDS [ZONE]
//
// What a program with ICU shows at a moment, counted from 1970: the clock in a
// zone, or in the one that ICU finds for itself; the zone's name; the release
// of the data. With "-" for SECONDS each line of standard input is a moment, so
// that one process can be asked again.

#include <unicode/timezone.h>

#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>

static void show(double seconds, const char* zone_name) {
  std::unique_ptr<icu::TimeZone> zone(
      zone_name != nullptr ? icu::TimeZone::createTimeZone(zone_name)
                           : icu::TimeZone::createDefault());
  icu::UnicodeString id;
  std::string name;
  zone->getID(id).toUTF8String(name);
  UErrorCode error = U_ZERO_ERROR;
  int32_t raw = 0;
  int32_t summer = 0;
  zone->getOffset(seconds * 1000, 0, raw, summer, error);
  const char* release = icu::TimeZone::getTZDataVersion(error);
  if (U_FAILURE(error) != 0) {
    std::fprintf(stderr, "icu: %s\n", u_errorName(error));
    std::exit(1);
  }
  const int offset = (raw + summer) / 60000;
  const int clock = (static_cast<int>(seconds / 60) + offset) % 1440;
  std::printf("%02d:%02d %+03d:%02d %s %s\n", clock / 60, clock % 60,
              offset / 60, std::abs(offset % 60), name.c_str(), release);
  std::fflush(stdout);
}

int main(int argc, char** argv) {
  if (argc < 2 || argc > 3) {
    std::fputs("icu: a moment is expected, and perhaps a zone\n", stderr);
    return 2;
  }
  const char* zone = argc == 3 ? argv[2] : nullptr;
  if (std::string(argv[1]) != "-") {
    show(std::atof(argv[1]), zone);
    return 0;
  }
  for (std::string line; std::getline(std::cin, line);) {
    show(std::atof(line.c_str()), zone);
  }
}
