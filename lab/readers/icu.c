// SPDX-License-Identifier: BSD-2-Clause
// usage: icu [ZONE]
//
// What a program with ICU shows at each moment of standard input, counted in
// seconds from 1970: the clock in a zone, or in the one that ICU finds for
// itself; the zone's name; the release of the data. Each moment asks anew.
//
// Built with ICU's library alone, whose version is MAJOR: its headers and
// static libraries, for six functions, would be the largest download of the
// demonstration.

#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>

#define JOINED(name, version) name##_##version
#define VERSIONED(name, version) JOINED(name, version)
#define ICU(name) VERSIONED(name, MAJOR)

void* ICU(ucal_open)(const uint16_t* zone, int32_t length, const char* locale,
                     int32_t type, int32_t* error);
void ICU(ucal_setMillis)(void* calendar, double moment, int32_t* error);
int32_t ICU(ucal_get)(void* calendar, int32_t field, int32_t* error);
int32_t ICU(ucal_getTimeZoneID)(void* calendar, uint16_t* name, int32_t size,
                                int32_t* error);
const char* ICU(ucal_getTZDataVersion)(int32_t* error);
void ICU(ucal_close)(void* calendar);

enum { ZONE_OFFSET = 15, DST_OFFSET = 16, SIZE = 200 };

static void show(long seconds, const char* zone) {
  int32_t error = 0;
  uint16_t name[SIZE] = {0};
  for (int i = 0; zone != NULL && i < SIZE - 1 && zone[i] != 0; i++) {
    name[i] = (unsigned char)zone[i];
  }
  void* calendar =
      ICU(ucal_open)(zone == NULL ? NULL : name, -1, NULL, 0, &error);
  ICU(ucal_setMillis)(calendar, seconds * 1000.0, &error);
  const int minutes = (ICU(ucal_get)(calendar, ZONE_OFFSET, &error) +
                       ICU(ucal_get)(calendar, DST_OFFSET, &error)) /
                      60000;
  const int length = ICU(ucal_getTimeZoneID)(calendar, name, SIZE, &error);
  const char* release = ICU(ucal_getTZDataVersion)(&error);
  if (error > 0) {
    fprintf(stderr, "icu: error %d\n", (int)error);
    exit(1);
  }
  const long clock = (seconds / 60 + minutes) % 1440;
  printf("%02ld:%02ld %+03d:%02d ", clock / 60, clock % 60, minutes / 60,
         abs(minutes % 60));
  for (int i = 0; i < length; i++) putchar(name[i]);
  printf(" %s\n", release);
  fflush(stdout);
  ICU(ucal_close)(calendar);
}

int main(int argc, char** argv) {
  char line[SIZE];
  while (fgets(line, sizeof line, stdin) != NULL) {
    show(atol(line), argc > 1 ? argv[1] : NULL);
  }
}
