// SPDX-License-Identifier: BSD-2-Clause
#pragma once

// Moves the ICU link from its legacy place, "/var/db/icutz", to
// "/var/db/timezone/icutz", its text unchanged. If a link that resolves is
// there already, that link is kept. Then the legacy link is deleted. A legacy
// link that dangles counts as absent and stays. Prints "Could not migrate
// /var/db/icutz to /var/db/timezone/icutz" and "Could not remove
// /var/db/icutz"; throws only when there is no memory for its own two paths.
void migrate_legacy_icu_link();
