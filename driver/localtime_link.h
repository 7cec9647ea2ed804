// SPDX-License-Identifier: BSD-2-Clause
#pragma once

// Keeps "/var/db/timezone/localtime" pointing into the tree that
// "/var/db/timezone/zoneinfo" leads to. A link whose text begins with that path
// is kept. One into "/usr/share/zoneinfo", where it pointed on older systems,
// is rewritten to the same zone if that can be reached. Any other is replaced
// by one to "/var/db/timezone/zoneinfo/America/Los_Angeles", whether or not
// that exists. Prints "Correcting localtime link to TARGET" and
// "localtime link invalid; resetting to America/Los_Angeles". Throws only when
// that last resort fails: what fsutil::create_symlink() throws, or
// std::bad_alloc when there is no memory for its paths.
void repair_localtime_link();
