// SPDX-License-Identifier: BSD-2-Clause
#include <sys/statvfs.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <new>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/status/failure.h"
#include "tools/status/report.h"
#include "tools/status/throwaway.h"

namespace {

constexpr char links_directory[] = "/var/db/timezone";

std::vector<std::string> unknown(const report& told, bool is_running_system) {
  std::vector<std::string> texts;
  for (const auto* set : {&told.device.current, &told.device.update})
    if (!is_running_system && *set && (*set)->has_several_schemas)
      texts = {"which ICU data file comes first on the device's file system"};
  if (!(told.after == told.device.links))
    texts.emplace_back("whether there is space for the links");
  if (!is_running_system)
    texts.emplace_back("what the device mounts over this tree");
  return texts;
}

// This user is the device's root only as far as the device is this user's. What
// is sound for somebody with the rights of everybody is sound. A layer fails
// with a group that this namespace lacks, where the device does not.
void insist_on_rights(const report& told, place& here) {
  std::string foreign;
  for (const char* path :
       {"/", "/var/db", links_directory, paths::version_record}) {
    const sight::place& part = here.seen.follow(path).end;
    if (foreign.empty() && part.error == 0 &&
        (part.owner != 0 || part.group != 0 ||
         ::getxattr(path, "system.posix_acl_access", nullptr, 0) > 0 ||
         ::getxattr(path, "system.posix_acl_default", nullptr, 0) > 0))
      foreign = path;
  }
  // For all three kinds of users, because the boot's may be any.
  bool has_closed_part = false;
  for (const auto& part : here.seen.look_around())
    if (const auto owner = here.seen.follow(part, 0555, 0444).closed) {
      has_closed_part = true;
      if (*owner == nobody && foreign.empty()) foreign = part;
    }
  if (!foreign.empty() && (told.why.is != verdict::sound || has_closed_part ||
                           !here.owner_may_change_links))
    throw cannot_tell(escaped(foreign) +
                      " belongs to another user or group, or has an access "
                      "list; run this as root");
}

bool is_mended_by_a_removal(const report& told) {
  return told.after == told.device.links && !told.after.pair.fits &&
         ::unlink(paths::zoneinfo_link) == 0 && rehearse_boot().ends_normally &&
         read_links().pair.fits;
}

}  // namespace

report examine(const std::string& root) {
  limit_time();
  place here = enter_throwaway_device(root);
  become_the_boot();
  // It may be another user's, and a boot has no capabilities.
  must(::access("/", X_OK), escaped(root), "; let everybody search it");
  limit_memory();
  report told;
  struct statvfs mounted {};
  told.device = read_device(here.seen);
  told.boot = rehearse_boot();
  told.after = read_links();
  sight afterwards;
  const bool is_same = told.after == told.device.links;
  told.boot.closed_part = closed_part(is_same ? here.seen : afterwards);
  told.system_after = is_same ? told.device.system : read_system();
  // The boot is refused what was refused before, and no more.
  if (refusals() > 2 * told.device.refusals) throw std::bad_alloc();
  // Whether another's owner may write there is insisted on below.
  if (!here.has_all_users && here.seen.follow(links_directory).end.owner != 0)
    told.boot.may_change_links = ::statvfs(links_directory, &mounted) == 0 &&
                                 (mounted.f_flag & ST_RDONLY) == 0;
  told.why = explain(told);
  if (!here.has_all_users) insist_on_rights(told, here);
  told.cannot_know = unknown(told, here.is_running_system);
  told.is_mended_by_a_removal = is_mended_by_a_removal(told);
  return told;
}
