// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/throwaway.h"

#include <fcntl.h>
#include <mntent.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <memory>
#include <optional>
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
constexpr char links[] = "/var/db/timezone";
constexpr char downloads[] = "/var/db/timezone/tz";
constexpr char in_base[] = "/root";  // the device, as long as it is not "/"
constexpr char access_list[] = "system.posix_acl_access";
constexpr char ask_outside[] =
    "; run this as root, and from outside of a container or chroot, with "
    "--root";

descriptor open_directory(const std::string& path) {
  descriptor opened(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  must(opened.number(), escaped(path));
  return opened;
}

descriptor place_at(const std::string& path) {
  return descriptor(::open(path.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
}

void write_file(const char* path, const std::string& text) {
  const descriptor file(::open(path, O_WRONLY | O_CLOEXEC));
  must(file.number(), path);
  must(::write(file.number(), text.data(), text.size()), path);
}

// Before namespaces, in which all other users look like one.
bool owner_may_change_links(const std::string& root) {
  sight outside(root);
  const std::string real = outside.follow(links).real;
  if (real.empty()) return false;
  const sight::place& directory = outside.at(real);
  return directory.owner == outside.at("/.").owner &&
         (directory.mode & S_IWUSR) != 0;
}

// Attributes and numbers of the device's own mean something to overlayfs, and
// what is covered loses its access list.
[[noreturn]] void refuse_layer(const std::string& path) {
  throw cannot_tell(escaped(path) +
                    " looks different in an overlay; is it being changed, or "
                    "has it an access "
                    "list, an overlay attribute or the device number 0?");
}

void set_attributes(int tree, unsigned flags, unsigned long attributes) {
  mount_attr wanted{};
  wanted.attr_set = attributes;
  must(::mount_setattr(tree, "", AT_EMPTY_PATH | flags, &wanted, sizeof wanted),
       "mount_setattr");
}

void enter(const descriptor& root) {
  must(::fchdir(root.number()), "chdir");
  must(::chroot("."), "chroot", ask_outside);
}

// The kernel's files about this process, also when the root is another.
class process {
 public:
  std::string path_of(const descriptor& opened) const {
    char path[4096];
    const ssize_t length = ::readlinkat(
        directory_.number(), name_of(opened).c_str(), path, sizeof path);
    must(length, "readlink");
    return std::string(path, static_cast<std::size_t>(length));
  }

  // For reading what was opened as a place only.
  descriptor reopened(const descriptor& opened) const {
    return open(name_of(opened));
  }

  bool has_all_users() const {
    char text[4096] = {};
    must(::read(open("self/uid_map").number(), text, sizeof text - 1),
         "uid_map");
    return std::strstr(text, "4294967295") != nullptr;
  }

  // Where something is mounted below a directory, parents first.
  std::set<std::string> mounts_below(const std::string& directory) const {
    descriptor file = open("self/mounts");
    const std::unique_ptr<std::FILE, int (*)(std::FILE*)> list(
        ::fdopen(file.release(), "r"), &std::fclose);
    if (!list) must(-1, "mounts");
    std::set<std::string> places;
    static char line[65536];
    mntent mounted{};
    while (::getmntent_r(list.get(), &mounted, line, sizeof line) != nullptr)
      if (std::string(mounted.mnt_dir).starts_with(directory + "/"))
        places.insert(mounted.mnt_dir);
    if (std::ferror(list.get()) != 0) must(-1, "mounts");
    return places;
  }

 private:
  static std::string name_of(const descriptor& opened) {
    return "self/fd/" + std::to_string(opened.number());
  }
  descriptor open(const std::string& name) const {
    descriptor file(
        ::openat(directory_.number(), name.c_str(), O_RDONLY | O_CLOEXEC));
    must(file.number(), name);
    return file;
  }

  descriptor directory_ = open_directory("/proc");
};

void enter_namespaces(const std::string& root, const process& self,
                      place& here) {
  const unsigned user = ::geteuid();
  const unsigned group = ::getegid();
  const bool may_mount = ::unshare(CLONE_NEWNS) == 0;
  must(may_mount || errno == EPERM ? 0 : -1, "unshare", ask_outside);
  here.has_all_users = may_mount && self.has_all_users();
  if (!here.has_all_users)
    here.owner_may_change_links = owner_may_change_links(root);
  if (may_mount) return;
  must(::unshare(CLONE_NEWUSER | CLONE_NEWNS),
       "this user may not have namespaces", ask_outside);
  write_file("/proc/self/setgroups", "deny");
  write_file("/proc/self/uid_map", "0 " + std::to_string(user) + " 1\n");
  write_file("/proc/self/gid_map", "0 " + std::to_string(group) + " 1\n");
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

// The layers over "/var/db" and what is mounted below. All paths here are real
// ones, seen from the base.
class layers {
 public:
  // Finds what has to be covered, before everything becomes read only.
  layers(const process& self, const place& here, sight& seen)
      : self_(self), here_(here) {
    const std::string real = seen.follow(writable).real;
    // Without the directory there is nothing that a boot could write to.
    if (real.empty() || !S_ISDIR(seen.at(real).mode)) return;
    top_ = in_base + real;
    std::set<std::string> places = self_.mounts_below(top_);
    places.insert(top_);
    for (const auto& place : places) find(place);
    const std::string kept = seen.follow(downloads).real;
    // What a unit may write stays so if all around it is only to be read.
    if (kept.empty() || !S_ISDIR(seen.at(kept).mode) ||
        real.starts_with(kept == "/" ? kept : kept + "/"))
      return;
    kept_path_ = in_base + kept;
    // Without the layer, which shows some files of an update as missing.
    kept_ = place_at(kept_path_);
  }

  void lay() {
    for (const auto& one : found_) cover(one);
    const descriptor tz = place_at(kept_path_);
    if (kept_.number() < 0 || tz.number() < 0) return;
    const descriptor copy = clone_tree(kept_, AT_RECURSIVE);
    set_attributes(copy.number(), AT_RECURSIVE, MOUNT_ATTR_RDONLY);
    attach(copy, tz);
  }

  // Whether a path of the device leads through a layer.
  bool hide(const std::string& path) const {
    const auto is_in = [](const std::string& inner, const std::string& outer) {
      return !outer.empty() && (inner + "/").starts_with(outer + "/");
    };
    return is_in(in_base + path, top_) &&
           !(is_in(in_base + path, kept_path_) && is_in(kept_path_, top_));
  }

 private:
  struct covered {
    std::string path;
    descriptor place;
    bool is_read_only;  // as the running system has it
  };

  void find(const std::string& path) {
    descriptor place = place_at(path);
    if (place.number() < 0) return;
    if (::getxattr(path.c_str(), access_list, nullptr, 0) > 0)
      refuse_layer(path.substr(std::strlen(in_base)));
    struct statvfs status {};
    if (here_.is_running_system)
      must(::fstatvfs(place.number(), &status), "statvfs");
    found_.push_back(
        {path, std::move(place), (status.f_flag & ST_RDONLY) != 0});
  }

  void cover(const covered& below) const {
    struct stat status {};
    must(::fstat(below.place.number(), &status), "stat");
    const std::string name =
        std::string("/").append(std::to_string(&below - found_.data()));
    if (S_ISDIR(status.st_mode)) return layer(below, name, status);
    const descriptor cover = S_ISREG(status.st_mode)
                                 ? copy(below.place, name, status)
                                 : clone_tree(below.place);
    if (below.is_read_only)
      set_attributes(cover.number(), 0, MOUNT_ATTR_RDONLY);
    const descriptor target = place_at(below.path);
    if (target.number() >= 0) attach(cover, target);
  }

  // What a boot sees of the cover is what it sees of the device.
  void resemble(const std::string& path, const struct stat& status) const {
    // Owners whom this user cannot stand in for are in `here_`.
    if (::chown(path.c_str(), status.st_uid, status.st_gid) != 0 &&
        (here_.has_all_users || errno != EINVAL))
      must(-1, "chown");
    must(::chmod(path.c_str(), status.st_mode & 07777), "chmod");
  }

  // A writable layer over a directory. Its own place is a directory of the
  // base, and the other is the current one, so that no name of the device's
  // becomes part of a list of options.
  void layer(const covered& below, const std::string& name,
             const struct stat& status) const {
    const std::string upper = name + "/upper";
    const std::string work = name + "/work";
    for (const auto& path : {name, upper, work})
      must(::mkdir(path.c_str(), 0700), "mkdir");
    // The layer's own root gives the merged directory its owner and mode.
    resemble(upper, status);
    must(::fchdir(below.place.number()), "chdir");
    // Ordinary users may not set the attributes of the other kind.
    const std::string options =
        "userxattr,lowerdir=.,upperdir=" + upper + ",workdir=" + work;
    must(::mount("overlay", below.path.c_str(), "overlay",
                 below.is_read_only ? MS_RDONLY : 0, options.c_str()),
         "no overlay can be made here", ask_outside);
  }

  // Of a file that is mounted by itself, which can have no layer.
  descriptor copy(const descriptor& lower, const std::string& name,
                  const struct stat& status) const {
    const descriptor from = self_.reopened(lower);
    const descriptor to(
        ::open(name.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    must(to.number(), "open");
    ssize_t count = 0;
    while ((count = ::sendfile(to.number(), from.number(), nullptr, 1 << 20)) >
           0) {
    }
    must(count, "a file that is mounted by itself");
    resemble(name, status);
    return clone_tree(to);
  }

  const process& self_;
  const place& here_;
  std::vector<covered> found_{};  // parents first
  std::string top_{};
  descriptor kept_{};
  std::string kept_path_{};
};

// What this user cannot stand in for: in a layer, it cannot be changed.
void note_foreign_parts(place& here, sight& seen) {
  for (const char* path : {"/", writable, links, paths::version_record}) {
    const sight::way found = seen.follow(path);
    if (found.real.empty()) continue;
    const std::string real = in_base + found.real;
    struct stat status {};
    must(::lstat(real.c_str(), &status), "stat");
    if (here.foreign_part.empty() &&
        (status.st_uid != 0 || status.st_gid != 0 ||
         ::getxattr(real.c_str(), access_list, nullptr, 0) > 0))
      here.foreign_part = path;
    if (path == links) here.has_foreign_links = status.st_uid != 0;
  }
}

}  // namespace

place enter_throwaway_device(const std::string& root) {
  place here;
  const process self;
  enter_namespaces(root, self, here);
  must(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr), "mount",
       ask_outside);
  const descriptor device = open_directory(root);
  here.is_running_system = self.path_of(device) == "/";

  // Taken before anything is covered.
  const descriptor tree = clone_tree(device, AT_RECURSIVE);
  // A base of our own. Where it lies does not matter: this process sees nothing
  // else from then on, and no other process sees it.
  must(::mount("base", "/proc", "tmpfs", 0, "mode=0755,size=64m"), "tmpfs",
       ask_outside);
  const descriptor base = open_directory("/proc");
  enter(base);
  must(::mkdir(in_base, 0700), "mkdir");
  attach(tree, open_directory(in_base));
  sight before(in_base);
  layers covers(self, here, before);
  set_attributes(tree.number(), AT_RECURSIVE, MOUNT_ATTR_RDONLY);

  if (before.at(writable).error != 0 &&
      before.at(paths::system_zoneinfo).error != 0)
    throw cannot_tell(escaped(root) + " is not a device: it has neither " +
                      writable + " nor " + paths::system_zoneinfo);
  if (!here.has_all_users) note_foreign_parts(here, before);
  before.look_around();
  covers.lay();
  here.seen = before;
  here.seen.forget([&](const auto& path) { return covers.hide(path); });
  here.seen.look_around();
  if (const auto path = before.first_difference(here.seen)) refuse_layer(*path);
  enter(tree);
  here.seen.enter();
  return here;
}
