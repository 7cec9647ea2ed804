// SPDX-License-Identifier: BSD-2-Clause
//
// "/var/db/timezone/tz/" and "tz_latest", and every change that is made to
// them. Each is in an order in which a loss of power at any instant leaves the
// old or the new announcement, of a set that is whole and on the disk.
#pragma once

#include <functional>
#include <string>

#include "tools/descriptor.h"
#include "tools/install/removal.h"

// Opens the directory of the sets to look at them. As root refuses one in which
// another account could exchange a file for what never ends.
descriptor open_sets();

class downloads {
 public:
  // Opens both directories, refuses those in which another account could
  // exchange what is written there, and locks the first against others of this
  // class; throws `failure` with status::busy if one has the lock. Then deletes
  // what an earlier one left that was stopped, as far as that can be done, and
  // syncs what it may have announced.
  downloads();

  // Makes the hidden directory that a new set is written into, and opens it.
  descriptor make_incoming();
  std::string incoming_path() const;

  // Writes what is in it to the disk and gives it its name. A set of that name
  // is exchanged for it in one step, unless it belongs to another account,
  // which alone could delete it.
  void put_in_place(const descriptor& incoming, const std::string& name);

  // Makes "tz_latest" name a set. Until sync_announcement() has returned, a
  // loss of power may undo that.
  void announce(const std::string& name);
  void sync_announcement() const;

  // Removes "tz_latest". Whether it was there.
  bool withdraw();

  // Deletes every set that nothing needs, and what an earlier one had left, and
  // tells of each. A set that a later boot could take is kept, with nothing
  // removed, except by `force`. Throws `refusal` at the end for one that
  // belongs to another account.
  void prune(bool force, const std::function<void(const std::string& name,
                                                  const removed* gone)>& tell);

  // Takes back all that was done before the announcement. Whether that could be
  // done; if not, the next one deletes what is left.
  bool take_back() noexcept;

  // Deletes what is hidden, in both directories. Whether that could be done.
  bool tidy() noexcept;

 private:
  void delete_hidden();
  void insist_on_own(const std::string& name) const;

  descriptor links_;
  descriptor sets_;
  removed leftovers_{};     // of an earlier one
  std::string placed_{};    // by put_in_place()
  bool exchanged_ = false;  // for a set that was there
};
