// SPDX-License-Identifier: BSD-2-Clause
#include "driver/startup.h"

#include <err.h>

#include <cstdio>
#include <string>

#include "dataset/dataset.h"
#include "support/paths.h"

namespace {

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
  reset_to_system_partition();
  return system;
}

void select_dataset() {
  const mln_dataset system;
  const std::string latest = latest_update_path();
  const mln_dataset current(current_path_or_reset());
  const mln_dataset& active = usable_or_reset(current, system);
  if (latest.empty()) return;

  const mln_dataset update(latest);
  // Deliberate: an update has to be newer than the data set that the links
  // named at boot, even if they have just been reset, and of the system's
  // schema; the record then starts from the active data set. So an update that
  // is older than the system's data can follow a reset. Pinned by
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
    // The last resort. If this fails too there is nothing left to fall back
    // to, and the process ends abnormally.
    ::warn("Unable to locate data; resetting to system partition");
    reset_to_system_partition();
  }
}

}  // namespace

void run_startup_pass() {
  relax_data_protection();
  migrate_legacy_icu_link();
  std::remove(paths::obsolete_icu);
  select_dataset_or_reset();
  repair_localtime_link();
}
