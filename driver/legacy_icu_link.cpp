// SPDX-License-Identifier: BSD-2-Clause
#include "driver/legacy_icu_link.h"

#include <err.h>

#include <string>

#include "support/fsutil.h"
#include "support/paths.h"

void migrate_legacy_icu_link() {
  const std::string legacy = paths::legacy_icu_link;
  const std::string present = paths::icu_link;

  if (fsutil::exists(legacy) && !fsutil::exists(present)) {
    try {
      fsutil::create_symlink(fsutil::read_symlink(legacy), present);
    } catch (...) {
      // Deliberate: the legacy link is not kept for another try at the next
      // boot, because nothing reads it any more. Pinned by
      // LegacyIcuMigration.RemovesTheLegacyLinkAlsoWhenMigrationFailed.
      ::warn("Could not migrate /var/db/icutz to /var/db/timezone/icutz");
    }
  }
  if (fsutil::exists(legacy)) {
    try {
      fsutil::remove(legacy);
    } catch (...) {
      // The boot goes on; the next one tries again.
      ::warn("Could not remove /var/db/icutz");
    }
  }
}
