// SPDX-License-Identifier: BSD-2-Clause
//
// "/var/db/timezone/tz/" and "tz_latest", and every change that is made to
// them. Each is in an order in which a loss of power at any instant leaves the
// old or the new announcement, of a set that is whole and on the disk.
#pragma once

#include <functional>
#include <string>

#include "tools/install/files.h"
#include "tools/install/removal.h"

class downloads {
 public:
  // Opens both directories and locks the first against others of this class;
  // throws `failure` with status::busy if one has the lock. Then deletes what
  // an earlier one left that was stopped, as far as that can be done, and syncs
  // what it may have announced.
  downloads();

  // Makes the hidden directory that a new set is written into, and opens it.
  descriptor make_incoming();
  std::string incoming_path() const;

  // Gives the hidden directory its name. A set of that name is replaced, unless
  // it belongs to another user, who alone could delete it.
  void put_in_place(const std::string& name);

  // Makes "tz_latest" name a set. Until sync_announcement() has returned, a
  // loss of power may undo that.
  void announce(const std::string& name);
  void sync_announcement() const;

  // Removes "tz_latest". Whether it was there.
  bool withdraw();

  // Deletes every set that nothing needs, and tells of each, and of what an
  // earlier one had left. Stops at one that
  // belongs to another user.
  void prune(const std::function<void(const std::string& name,
                                      const removed& gone)>& tell);

  // Takes back all that was done before the announcement, as far as that can be
  // done; the next one deletes what is left.
  void take_back() noexcept;

  // Deletes what is hidden, in both directories, as far as that can be done.
  void tidy() noexcept;

 private:
  void delete_hidden();
  void insist_on_own(const std::string& name) const;

  descriptor links_{};
  descriptor sets_{};
  removed leftovers_{};     // of an earlier one
  std::string placed_{};    // by put_in_place()
  std::string replaced_{};  // hidden by it
};
