// SPDX-License-Identifier: BSD-2-Clause
#include "driver/startup.h"

#include <err.h>

#include <cstdio>
#include <string>

#include "dataset/dataset.h"
#include "support/paths.h"

namespace {

// The C library's remove(3), so that a failure is not reported and an empty
// directory goes too.
void remove_obsolete_icu() { std::remove(paths::obsolete_icu); }

std::string current_path_or_reset() {
  try {
    return current_dataset_path();
  } catch (...) {
    // The boot goes on with the system partition as the current data set.
    ::warn("Invalid current symlinks; resetting to system partition");
    reset_to_system_partition();
    return {};
  }
}

bool is_usable(const mln_dataset& current, const mln_dataset& system) {
  return current.compatible_with(system) && !(system > current);
}

const mln_dataset& usable_or_reset(const mln_dataset& current,
                                   const mln_dataset& system) {
  if (is_usable(current, system)) return current;
  ::warn("Symlink points at data incompatible with installed system");
  // Not system.activate(), although the links would be the same: every reset
  // reads the system's data anew, so that the log repeats, after the reason,
  // what is wrong with that data. See
  // StartupPass.ReadsTheSystemsDataAnewForAReset.
  reset_to_system_partition();
  return system;
}

void select_dataset() {
  const mln_dataset system;
  // Before the current links, though it is needed only after them: a
  // "tz_latest" that cannot be read then leads to one reset, not to two, and to
  // no line about the current links. See
  // StartupPass.ReadsTheAnnouncementBeforeTheCurrentLinks.
  const std::string latest = latest_update_path();
  const mln_dataset current(current_path_or_reset());
  const mln_dataset& active = usable_or_reset(current, system);
  if (latest.empty()) return;

  const mln_dataset update(latest);
  // Deliberate: an update has to be newer than the data set that the links
  // named at boot, even if they have just been reset, because its installer
  // could compare it only with that; the record starts from the active data
  // set. Therefore an update that is older than the system's data can follow a
  // reset. Pinned by
  // StartupPass.StillComparesWithTheOldCurrentSetAfterAReset and
  // StartupPass.RecordsTheSystemVersionFirstAfterAReset.
  if (update.compatible_with(system) && update > current) {
    update.activate();
    record_version_change(active.version_string, update.version_string);
  } else {
    ::warn("New update not compatible or older version: %s vs. %s",
           update.version_string.c_str(), current.version_string.c_str());
  }
}

void select_dataset_or_reset() {
  try {
    select_dataset();
  } catch (...) {
    // The last resort. If this fails too, there is nothing left to fall back to
    // and the process ends abnormally.
    ::warn("Unable to locate data; resetting to system partition");
    reset_to_system_partition();
  }
}

}  // namespace

// A boot, in order:
//  1. Data protection is lifted from the two time-zone directories.
//  2. The legacy link "/var/db/icutz" moves to "/var/db/timezone/icutz".
//  3. "/var/db/icu" is deleted.
//  4. The system partition's data set is read, then the link "tz_latest".
//  5. "zoneinfo" is read, and reset to the system partition if it names no data
//     set. The data set that it then names is read.
//  6. It is also reset if that data set is older than the system's or has
//     another ICU schema.
//  7. The update that "tz_latest" names is linked into place and recorded if it
//     is strictly newer than the data set read in step 5 and has the system's
//     ICU schema.
//  8. An unhandled failure in steps 4 to 7 resets the links to the system
//     partition; a failure to write the record is ignored.
//  9. "localtime" is repaired.
void run_startup_pass() {
  relax_data_protection();
  migrate_legacy_icu_link();
  remove_obsolete_icu();
  select_dataset_or_reset();
  repair_localtime_link();
}
