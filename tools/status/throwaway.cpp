// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/throwaway.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <mntent.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
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
constexpr char no_overlay[] = "no overlay can be made here";
constexpr char ask_outside[] =
    "; run this as root, and from outside of a container or chroot, with "
    "--root";

descriptor open_directory(const std::string& path) {
  descriptor opened(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  must(opened.number(), escaped(path));
  return opened;
}

// Inside `root`, whatever links say; none if there is nothing.
descriptor open_inside(int root, const std::string& path,
                       std::uint64_t flags = 0) {
  open_how how{};
  how.flags = O_PATH | O_CLOEXEC | flags;
  how.resolve = RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS;
  for (int attempts = 0;; ++attempts) {
    const auto opened = static_cast<int>(
        ::syscall(SYS_openat2, root, path.c_str(), &how, sizeof how));
    // While anything is renamed anywhere, links cannot be kept inside.
    if (opened < 0 && errno == EAGAIN && attempts < 1000) continue;
    if (opened < 0 && errno != ENOENT && errno != ENOTDIR && errno != ELOOP)
      must(opened, escaped(path), ask_outside);
    return descriptor(opened);
  }
}

void write_file(const char* path, const std::string& text) {
  const descriptor file(::open(path, O_WRONLY | O_CLOEXEC));
  must(file.number(), path);
  must(::write(file.number(), text.data(), text.size()), path);
}

void enter_namespaces() {
  const unsigned user = ::geteuid();
  const unsigned group = ::getegid();
  if (::unshare(CLONE_NEWNS) == 0) return;
  must(errno == EPERM ? 0 : -1, "unshare", ask_outside);
  must(::unshare(CLONE_NEWUSER | CLONE_NEWNS),
       "this user may not have namespaces", ask_outside);
  write_file("/proc/self/setgroups", "deny");
  write_file("/proc/self/uid_map", "0 " + std::to_string(user) + " 1\n");
  write_file("/proc/self/gid_map", "0 " + std::to_string(group) + " 1\n");
}

std::optional<uid_t> owner_of(int root, const char* path) {
  const descriptor opened = open_inside(root, path);
  struct stat status {};
  if (opened.number() < 0) return std::nullopt;
  must(::fstat(opened.number(), &status), "stat");
  return status.st_uid;
}

// Before namespaces, in which all other users look like one.
bool has_one_owner(const std::string& root) {
  try {
    const descriptor device = open_directory(root);
    return owner_of(device.number(), "/") == owner_of(device.number(), links);
  } catch (const cannot_tell&) {
    return false;
  }
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
  process() : directory_(open_directory("/proc")) {}

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
    const descriptor file = open("self/uid_map");
    char text[4096];
    const ssize_t length = ::read(file.number(), text, sizeof text);
    must(length, "uid_map");
    return std::string(text, static_cast<std::size_t>(length))
               .find("4294967295") != std::string::npos;
  }

  // Where something is mounted below a directory, parents first.
  std::set<std::string> mounts_below(const std::string& directory) const {
    descriptor file = open("self/mounts");
    const std::unique_ptr<std::FILE, int (*)(std::FILE*)> list(
        ::fdopen(file.release(), "r"), &std::fclose);
    if (!list) must(-1, "mounts");
    std::set<std::string> places;
    std::vector<char> line(65536);
    mntent mounted{};
    while (::getmntent_r(list.get(), &mounted, line.data(),
                         static_cast<int>(line.size())) != nullptr) {
      std::string place = mounted.mnt_dir;
      if (place.starts_with(directory + "/")) places.insert(std::move(place));
    }
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

  descriptor directory_;
};

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

// The layers over "/var/db" and what is mounted below. All paths here are seen
// from the base, in which the device is "/root".
class layers {
 public:
  // Finds what has to be covered, before everything becomes read only.
  layers(const descriptor& root, const process& self, const place& here)
      : root_(root), self_(self), here_(here) {
    const descriptor base = open_inside(root_.number(), writable, O_DIRECTORY);
    // Without the directory there is nothing that a boot could write to.
    if (base.number() < 0) return;
    const std::string top = self_.path_of(base);
    std::set<std::string> places = self_.mounts_below(top);
    places.insert(top);
    for (const auto& place : places) find(place.substr(std::strlen("/root")));
    // Without the layer, which shows some files of an update as missing.
    kept_ = open_inside(root_.number(), downloads, O_DIRECTORY);
  }

  void lay() const {
    for (const auto& one : found_) {
      const descriptor target = open_inside(root_.number(), one.path);
      if (target.number() >= 0) cover(one, target);
    }
    const descriptor tz = open_inside(root_.number(), downloads, O_DIRECTORY);
    if (kept_.number() < 0 || tz.number() < 0) return;
    const descriptor copy = clone_tree(kept_, AT_RECURSIVE);
    set_attributes(copy.number(), AT_RECURSIVE, MOUNT_ATTR_RDONLY);
    attach(copy, tz);
  }

 private:
  struct covered {
    std::string path;
    descriptor place;
    bool is_read_only;  // as the running system has it
  };

  void find(const std::string& path) {
    descriptor place = open_inside(root_.number(), path);
    if (place.number() < 0) return;
    struct statvfs status {};
    must(::fstatvfs(place.number(), &status), "statvfs");
    found_.push_back(
        {path, std::move(place),
         here_.is_running_system && (status.f_flag & ST_RDONLY) != 0});
  }

  void cover(const covered& below, const descriptor& target) const {
    struct stat status {};
    must(::fstat(below.place.number(), &status), "stat");
    const std::string name = std::to_string(&below - found_.data());
    const descriptor cover =
        S_ISDIR(status.st_mode)   ? layer(below.place, name, status)
        : S_ISREG(status.st_mode) ? copy(below.place, name, status)
                                  : clone_tree(below.place);
    if (below.is_read_only)
      set_attributes(cover.number(), 0, MOUNT_ATTR_RDONLY);
    attach(cover, target);
  }

  // What a boot sees of the cover is what it sees of the device.
  void resemble(const std::string& path, const struct stat& status) const {
    // Owners whom this user cannot stand in for are in `here_`.
    if (::chown(path.c_str(), status.st_uid, status.st_gid) != 0 &&
        (here_.has_all_users || errno != EINVAL))
      must(-1, "chown");
    must(::chmod(path.c_str(), status.st_mode & 07777), "chmod");
    const timespec times[] = {status.st_atim, status.st_mtim};
    must(::utimensat(AT_FDCWD, path.c_str(), times, 0), "utimensat");
  }

  // A writable layer over a directory. Its own place is a directory of the
  // base, so that no name of the device's becomes part of a list of options.
  descriptor layer(const descriptor& lower, const std::string& name,
                   const struct stat& status) const {
    const std::string upper = "/" + name + "/upper";
    const std::string work = "/" + name + "/work";
    for (const auto& path : {"/" + name, upper, work})
      must(::mkdir(path.c_str(), 0700), "mkdir");
    // The layer's own root gives the merged directory its owner and mode.
    resemble(upper, status);
    const descriptor options(::fsopen("overlay", FSOPEN_CLOEXEC));
    must(options.number(), no_overlay, ask_outside);
    const auto configure = [&](unsigned command, const char* key,
                               const char* value) {
      must(::fsconfig(options.number(), command, key, value, 0), no_overlay,
           ask_outside);
    };
    must(::fchdir(lower.number()), "chdir");
    configure(FSCONFIG_SET_STRING, "lowerdir", ".");
    configure(FSCONFIG_SET_STRING, "upperdir", upper.c_str());
    configure(FSCONFIG_SET_STRING, "workdir", work.c_str());
    // Ordinary users may not set the attributes of the other kind.
    configure(FSCONFIG_SET_FLAG, "userxattr", nullptr);
    configure(FSCONFIG_CMD_CREATE, nullptr, nullptr);
    descriptor mounted(::fsmount(options.number(), FSMOUNT_CLOEXEC, 0));
    must(mounted.number(), no_overlay, ask_outside);
    must(::chdir("/"), "chdir");
    return mounted;
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

  const descriptor& root_;
  const process& self_;
  const place& here_;
  std::vector<covered> found_{};  // parents first
  descriptor kept_{};
};

// What this user cannot stand in for: in a layer, it cannot be changed.
void note_foreign_parts(place& here) {
  for (const char* path : {"/", writable, links, paths::version_record}) {
    struct stat status {};
    if (::stat(path, &status) != 0) continue;
    const bool is_foreign =
        status.st_uid != 0 || status.st_gid != 0 ||
        ::getxattr(path, "system.posix_acl_access", nullptr, 0) > 0;
    if (is_foreign && here.foreign_part.empty()) here.foreign_part = path;
    if (path == links) here.has_foreign_links = status.st_uid != 0;
  }
}

void insist_on_a_device(const std::string& root) {
  struct stat status {};
  for (const char* path : {writable, paths::system_zoneinfo})
    if (::lstat(path, &status) == 0) return;
  throw cannot_tell(escaped(root) + " is not a device: it has neither " +
                    writable + " nor " + paths::system_zoneinfo);
}

// Attributes and numbers of the device's own mean something to overlayfs, and
// what is covered loses its access list.
void insist_on_the_same(const sight& before, const sight& after) {
  const auto [one, other] =
      std::mismatch(before.begin(), before.end(), after.begin(), after.end());
  if (one == before.end() && other == after.end()) return;
  throw cannot_tell(escaped(one == before.end() ? other->first : one->first) +
                    " looks different in an overlay; is it being changed, or "
                    "has it an access "
                    "list, an overlay attribute or the device number 0?");
}

}  // namespace

place enter_throwaway_device(const std::string& root) {
  place here;
  here.has_one_owner = has_one_owner(root);
  enter_namespaces();
  must(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr), "mount",
       ask_outside);
  const descriptor device = open_directory(root);
  const process self;
  here.has_all_users = self.has_all_users();
  here.is_running_system = self.path_of(device) == "/";

  // Taken before anything is covered.
  const descriptor tree = clone_tree(device, AT_RECURSIVE);
  // A base of our own. Where it lies does not matter: this process sees nothing
  // else from then on, and no other process sees it.
  must(::mount("base", "/proc", "tmpfs", 0, "mode=0755,size=64m"), "tmpfs",
       ask_outside);
  const descriptor base = open_directory("/proc");
  enter(base);
  must(::mkdir("/root", 0700), "mkdir");
  attach(tree, open_directory("/root"));
  const descriptor inside = open_directory("/root");
  const layers covers(inside, self, here);
  set_attributes(inside.number(), AT_RECURSIVE, MOUNT_ATTR_RDONLY);

  enter(inside);
  insist_on_a_device(root);
  note_foreign_parts(here);
  const sight before = look_around();
  enter(base);
  covers.lay();
  enter(inside);
  insist_on_the_same(before, look_around());
  return here;
}
