// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/throwaway.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <set>
#include <utility>
#include <vector>

#include "support/paths.h"
#include "tools/descriptor.h"
#include "tools/escaped.h"
#include "tools/status/failure.h"
#include "tools/status/sight.h"

namespace {

constexpr char writable[] = "/var/db";
constexpr char in_base[] = "/root";  // the device, as long as it is not "/"
constexpr unsigned long nosymfollow = 0x2000;  // has no name for programs
constexpr char ask_outside[] =
    "; run this as root, and from outside of a container or chroot, with "
    "--root";

descriptor place_at(const std::string& path, int flags = O_PATH) {
  descriptor opened(::open(path.c_str(), flags | O_NOFOLLOW | O_CLOEXEC));
  must(opened.number(), escaped(path));
  return opened;
}

// Attributes and numbers of the device's own mean something to overlayfs, and
// what is covered loses its access list and its other paths.
[[noreturn]] void refuse_layer(const std::string& path) {
  throw cannot_tell(
      escaped(path) +
      " looks different in an overlay; is it being changed, or has it an "
      "access list, an overlay attribute, the device number 0, nosymfollow or "
      "a second path?");
}

void make_read_only(const descriptor& tree, unsigned flags = 0) {
  mount_attr wanted{};
  wanted.attr_set = MOUNT_ATTR_RDONLY;
  must(::mount_setattr(tree.number(), "", AT_EMPTY_PATH | flags, &wanted,
                       sizeof wanted),
       "mount_setattr");
}

void enter(const descriptor& root) {
  must(::fchdir(root.number()), "chdir");
  must(::chroot("."), "chroot", ask_outside);
}

std::string text_of(const char* path) {
  const descriptor file = place_at(path, O_RDONLY);
  std::string text;
  char part[4096];
  for (ssize_t length = 1; length != 0;) {
    must(length = ::read(file.number(), part, sizeof part), path);
    text.append(part, static_cast<std::size_t>(length));
  }
  return text;
}

// Where something is mounted below a directory, as seen from there. By hand,
// because getmntent(3) would be a tenth of this program.
std::set<std::string> mounts_below(const std::string& directory) {
  std::set<std::string> places;
  const std::string mounts = text_of("/proc/self/mounts");
  for (auto at = mounts.find(' '); at != std::string::npos;
       at = mounts.find(' ', mounts.find('\n', at))) {
    std::string path = mounts.substr(at + 1, mounts.find(' ', at + 1) - at - 1);
    // Spaces and the like stand there as octal numbers.
    for (std::size_t i = 0; (i = path.find('\\', i)) != std::string::npos; ++i)
      path.replace(
          i, 4, 1,
          static_cast<char>(std::stoi(path.substr(i + 1, 3), nullptr, 8)));
    if (path.starts_with(directory + "/"))
      places.insert(path.substr(directory.size()));
  }
  return places;
}

void enter_namespaces(const std::string& root, place& here) {
  const std::pair<const char*, std::string> ids[] = {
      {"/proc/self/setgroups", "deny"},
      {"/proc/self/uid_map", "0 " + std::to_string(::geteuid()) + " 1\n"},
      {"/proc/self/gid_map", "0 " + std::to_string(::getegid()) + " 1\n"}};
  const bool may_mount = ::unshare(CLONE_NEWNS) == 0;
  must(may_mount || errno == EPERM ? 0 : -1, "unshare", ask_outside);
  here.has_all_users = may_mount;
  for (const char* map : {"/proc/self/uid_map", "/proc/self/gid_map"})
    here.has_all_users &= may_mount && text_of(map).ends_with("4294967295\n");
  if (!here.has_all_users) {
    // Before namespaces, in which all other users look like one.
    sight outside(root);
    const auto& directory = outside.follow(paths::timezone_directory).end;
    here.owner_may_change_links =
        directory.owner == outside.follow("/").end.owner &&
        directory.owner != nobody && (directory.mode & S_IWUSR) != 0;
  }
  if (may_mount) return;
  must(::unshare(CLONE_NEWUSER | CLONE_NEWNS),
       "this user may not have namespaces", ask_outside);
  for (const auto& [path, text] : ids) {
    const descriptor file(::open(path, O_WRONLY | O_CLOEXEC));
    must(file.number(), path);
    must(::write(file.number(), text.data(), text.size()), path);
  }
}

descriptor clone_tree(const descriptor& place, unsigned flags = 0) {
  descriptor tree(
      ::open_tree(place.number(), "",
                  AT_EMPTY_PATH | OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC | flags));
  must(tree.number(), "open_tree", ask_outside);
  return tree;
}

void attach(const descriptor& tree, const descriptor& target) {
  must(::move_mount(tree.number(), "", target.number(), "",
                    MOVE_MOUNT_F_EMPTY_PATH | MOVE_MOUNT_T_EMPTY_PATH),
       "move_mount");
}

// What a boot sees of a cover is what it sees of the device.
void resemble(const std::string& path, const struct statx& status,
              const place& here) {
  // Owners whom this user cannot stand in for are in what was seen.
  if (::chown(path.c_str(), status.stx_uid, status.stx_gid) != 0 &&
      (here.has_all_users || errno != EINVAL))
    must(-1, "chown");
  must(::chmod(path.c_str(), status.stx_mode & 07777), "chmod");
}

// Made in the base, and the directory is the current one, so that no name of
// the device's becomes part of a list of options.
descriptor layer_over(const descriptor& lower, const std::string& name,
                      const struct statx& status, const place& here) {
  const std::string upper = name + "/upper";
  const std::string work = name + "/work";
  for (const auto& path : {name, upper, work})
    must(::mkdir(path.c_str(), 0700), "mkdir");
  // The layer's own root gives the merged directory its owner and mode.
  resemble(upper, status, here);
  must(::fchdir(lower.number()), "chdir", ask_outside);
  // Ordinary users may not set the attributes of the other kind.
  const std::string options =
      "userxattr,lowerdir=.,upperdir=" + upper + ",workdir=" + work;
  must(::mount("overlay", name.c_str(), "overlay", 0, options.c_str()),
       "no overlay can be made here", ask_outside);
  return place_at(name);
}

// Of a file that is mounted by itself, which can have no layer.
descriptor copy_of(const std::string& path, const std::string& name,
                   const struct statx& status, const place& here) {
  const descriptor from(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  must(from.number(), "a file that is mounted by itself");
  const descriptor to(::creat(name.c_str(), 0600));
  ssize_t count = 1;
  while (count > 0)
    count = ::sendfile(to.number(), from.number(), nullptr, 1 << 20);
  must(count, "a file that is mounted by itself");
  resemble(name, status, here);
  return clone_tree(to);
}

// For the topmost place or a file system of its own; none if a mount hides it.
descriptor cover_for(const std::string& path, const std::string& name,
                     bool is_top, const place& here, const descriptor& device) {
  const descriptor below(::openat(device.number(), ("." + path).c_str(),
                                  O_PATH | O_NOFOLLOW | O_CLOEXEC));
  struct statx status {};
  const int seen =
      ::statx(below.number(), "", AT_EMPTY_PATH, STATX_BASIC_STATS, &status);
  if (!is_top && (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) == 0)
    return descriptor();
  must(seen, "statx");
  struct statvfs mounted {};
  must(::fstatvfs(below.number(), &mounted), "statvfs");
  if ((mounted.f_flag & nosymfollow) != 0 ||
      ::getxattr((in_base + path).c_str(), "system.posix_acl_access", nullptr,
                 0) > 0)
    refuse_layer(path);
  descriptor cover =
      S_ISDIR(status.stx_mode)   ? layer_over(below, name, status, here)
      : S_ISREG(status.stx_mode) ? copy_of(in_base + path, name, status, here)
                                 : clone_tree(below);
  if (here.is_running_system && (mounted.f_flag & ST_RDONLY) != 0)
    make_read_only(cover);
  return cover;
}

// What is to lie over "/var/db" and over what is mounted below, by real paths
// of the device, outer ones first.
std::vector<std::pair<std::string, descriptor>> make_covers(
    std::set<std::string> mounts, place& here, const descriptor& device) {
  std::vector<std::pair<std::string, descriptor>> covers;
  const auto& [real, top, closed] = here.seen.follow(writable);
  // Without the directory there is nothing that a boot could write to.
  if (!S_ISDIR(top.mode)) return covers;
  mounts.insert(real);
  for (const auto& path : mounts) {
    if (path != real && !path.starts_with(real + "/")) continue;
    const std::string name = std::to_string(covers.size());
    descriptor cover = cover_for(path, "/" + name, path == real, here, device);
    if (cover.number() >= 0) covers.emplace_back(path, std::move(cover));
  }

  const sight::way updates = here.seen.follow(paths::download_root);
  const std::string& kept = updates.real;
  // What a unit may write stays so if all around it is only to be read. The
  // layer would show some files of an update as missing.
  if (S_ISDIR(updates.end.mode) && !kept.empty() &&
      !real.starts_with(kept + "/"))
    covers.emplace_back(kept,
                        clone_tree(place_at(in_base + kept), AT_RECURSIVE));
  return covers;
}

}  // namespace

place enter_throwaway_device(const std::string& root) {
  place here;
  enter_namespaces(root, here);
  must(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr), "mount",
       ask_outside);
  char outside[PATH_MAX];
  must(::realpath((root + "/.").c_str(), outside) == nullptr ? -1 : 0,
       escaped(root));
  here.is_running_system = std::strcmp(outside, "/") == 0;
  const auto mounts = mounts_below(here.is_running_system ? "" : outside);

  // Taken before anything is covered; to read in it is no access to the device.
  const descriptor device = place_at(root + "/.");
  const descriptor tree = clone_tree(device, AT_RECURSIVE);
  make_read_only(tree, AT_RECURSIVE);
  // A base that only this process sees, and from then on nothing else.
  must(::mount("base", "/proc", "tmpfs", 0, "mode=0755,size=64m"), "tmpfs",
       ask_outside);
  enter(place_at("/proc"));
  must(::mkdir(in_base, 0700), "mkdir");
  attach(tree, place_at(in_base));
  here.seen = sight(in_base);
  const auto covers = make_covers(mounts, here, device);

  if (here.seen.at(writable).error != 0 &&
      here.seen.at(paths::system_zoneinfo).error != 0)
    throw cannot_tell(escaped(root) + " is not a device: it has neither " +
                      writable + " nor " + paths::system_zoneinfo);
  here.seen.look_around();
  for (const auto& [path, cover] : covers)
    attach(cover, place_at(in_base + path));
  sight covered(in_base);
  covered.look_around();
  if (const auto path = here.seen.first_difference(covered))
    refuse_layer(*path);
  enter(tree);
  here.seen.enter();
  return here;
}
