// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/throwaway.h"

#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <linux/openat2.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <tuple>
#include <utility>
#include <vector>

#include "support/paths.h"
#include "tools/descriptor.h"
#include "tools/escaped.h"
#include "tools/status/mounts.h"

namespace {

constexpr char writable[] = "/var/db";
constexpr char no_overlay[] = "an overlay cannot be had here";
constexpr char downloads[] = "/var/db/timezone/tz";

[[noreturn]] void fail(const std::string& what) {
  const int error = errno;
  throw cannot_tell(what + ": " + std::strerror(error));
}

void must(long result, const std::string& what) {
  if (result < 0) fail(what);
}

descriptor open_directory(const std::string& path) {
  descriptor opened(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  must(opened.number(), escaped(path));
  return opened;
}

void write_file(const char* path, const std::string& text) {
  const descriptor file(::open(path, O_WRONLY | O_CLOEXEC));
  must(file.number(), path);
  must(::write(file.number(), text.data(), text.size()), path);
}

void map_to_root(const char* file, unsigned id) {
  write_file(file, "0 " + std::to_string(id) + " 1\n");
}

void enter_namespaces() {
  const unsigned user = ::geteuid();
  const unsigned group = ::getegid();
  if (::unshare(CLONE_NEWNS) == 0) return;
  if (errno != EPERM) fail("unshare");
  must(::unshare(CLONE_NEWUSER | CLONE_NEWNS),
       "this user may not have namespaces");
  write_file("/proc/self/setgroups", "deny");
  map_to_root("/proc/self/uid_map", user);
  map_to_root("/proc/self/gid_map", group);
}

void set_attributes(int tree, unsigned flags, unsigned long attributes,
                    unsigned long cleared = 0) {
  mount_attr wanted{};
  wanted.attr_set = attributes;
  wanted.attr_clr = cleared;
  must(::mount_setattr(tree, "", AT_EMPTY_PATH | flags, &wanted, sizeof wanted),
       "mount_setattr");
}

// Read only with all that is mounted below, without updates of access times
// where the system lets them be switched off.
void protect(int tree) {
  set_attributes(tree, AT_RECURSIVE, MOUNT_ATTR_RDONLY);
  try {
    set_attributes(tree, AT_RECURSIVE, MOUNT_ATTR_NOATIME, MOUNT_ATTR__ATIME);
  } catch (const cannot_tell&) {
  }
}

// A writable layer over the directory in which this process is. The layer's own
// place is the directory `layer` of the root that this process has, so that no
// name of the device's becomes part of a list of options.
descriptor make_layer(const std::string& layer) {
  const std::string upper = layer + "/upper";
  const std::string work = layer + "/work";
  must(::mkdir(layer.c_str(), 0700), "mkdir");
  must(::mkdir(upper.c_str(), 0755), "mkdir");
  must(::mkdir(work.c_str(), 0755), "mkdir");
  // The layer's own root gives the merged directory its owner and mode.
  struct stat status {};
  must(::stat(".", &status), "stat");
  // Owners that this user cannot stand in for are noticed when the facts are
  // read.
  if (::chown(upper.c_str(), status.st_uid, status.st_gid) != 0 &&
      errno != EINVAL && errno != EPERM)
    fail("chown");
  must(::chmod(upper.c_str(), status.st_mode & 07777), "chmod");

  const descriptor options(::fsopen("overlay", FSOPEN_CLOEXEC));
  must(options.number(), no_overlay);
  const auto set = [&](const char* key, const char* value) {
    must(::fsconfig(options.number(),
                    value == nullptr ? FSCONFIG_SET_FLAG : FSCONFIG_SET_STRING,
                    key, value, 0),
         no_overlay);
  };
  set("lowerdir", ".");
  set("upperdir", upper.c_str());
  set("workdir", work.c_str());
  // Ordinary users may not set the attributes of the other kind.
  set("userxattr", nullptr);
  must(::fsconfig(options.number(), FSCONFIG_CMD_CREATE, nullptr, nullptr, 0),
       no_overlay);
  descriptor mounted(::fsmount(options.number(), FSMOUNT_CLOEXEC, 0));
  must(mounted.number(), no_overlay);
  return mounted;
}

// Inside `root`, whatever links say.
descriptor open_inside(int root, const std::string& path, std::uint64_t flags) {
  open_how how{};
  how.flags = O_PATH | O_CLOEXEC | flags;
  how.resolve = RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS;
  return descriptor(static_cast<int>(
      ::syscall(SYS_openat2, root, path.c_str(), &how, sizeof how)));
}

// A directory of the kernel's about this process, which stays in reach when the
// root is another.
class process {
 public:
  process() : directory_(open_directory("/proc")) {}

  std::string path_of(const descriptor& opened) const {
    char path[4096];
    const std::string link = "self/fd/" + std::to_string(opened.number());
    const ssize_t length =
        ::readlinkat(directory_.number(), link.c_str(), path, sizeof path);
    must(length, "readlink");
    return std::string(path, static_cast<std::size_t>(length));
  }

  std::string text_of(const char* name) const {
    const descriptor file(
        ::openat(directory_.number(), name, O_RDONLY | O_CLOEXEC));
    must(file.number(), name);
    std::string text;
    char buffer[4096];
    ssize_t count = 0;
    while ((count = ::read(file.number(), buffer, sizeof buffer)) > 0)
      text.append(buffer, static_cast<std::size_t>(count));
    must(count, name);
    return text;
  }

 private:
  descriptor directory_;
};

descriptor clone_tree(int directory, unsigned flags) {
  descriptor tree(
      ::open_tree(directory, "",
                  AT_EMPTY_PATH | OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC | flags));
  must(tree.number(), "open_tree");
  return tree;
}

void attach(const descriptor& tree, int target) {
  must(::move_mount(tree.number(), "", target, "",
                    MOVE_MOUNT_F_EMPTY_PATH | MOVE_MOUNT_T_EMPTY_PATH),
       "move_mount");
}

// The layers over "/var/db" and what is mounted below. All paths here are seen
// from the base, in which the device is "/root". `original` is the device as it
// was, if what is read only there is to stay so, otherwise -1.
class layers {
 public:
  layers(int root, const process& self, int original)
      : root_(root), self_(self), original_(original) {}

  void lay() {
    const descriptor base = open_inside(root_, writable, O_DIRECTORY);
    // Without the directory there is nothing that a boot could write to.
    if (base.number() < 0) return;
    insist_on_no_marks();
    const std::string top = self_.path_of(base);
    // Without the layer, in which a file of an update could be such a mark.
    const descriptor kept = open_inside(root_, downloads, O_DIRECTORY);

    std::vector<std::pair<std::string, descriptor>> mounted;
    for (const auto& place : mounts_below(self_.text_of("self/mountinfo"), top))
      mounted.emplace_back(place, open_inside(root_, inside(place), 0));
    over(base, base.number(), inside(top));
    for (const auto& [place, lower] : mounted) {
      const descriptor target = open_inside(root_, inside(place), 0);
      if (lower.number() < 0 || target.number() < 0) continue;
      if (!is_directory(lower))
        attach(clone_tree(lower.number(), 0), target.number());
      else
        over(lower, target.number(), inside(place));
    }
    protect_downloads(kept);
  }

 private:
  // A file system with layers marks an entry that is deleted by such a device.
  void insist_on_no_marks() const {
    for (const char* path :
         {"/var/db/timezone", paths::icu_link, paths::localtime_link,
          paths::zoneinfo_link, paths::latest_update_link,
          paths::version_record, paths::legacy_icu_link, paths::obsolete_icu,
          downloads}) {
      struct stat status {};
      const descriptor here = open_inside(root_, path, O_NOFOLLOW);
      if (::fstat(here.number(), &status) == 0 && S_ISCHR(status.st_mode) &&
          status.st_rdev == 0)
        throw cannot_tell(
            std::string(path) +
            " is a device with the number 0, which no layer can show");
    }
  }

  static std::string inside(const std::string& place) {
    return place.substr(std::strlen("/root"));
  }

  static bool is_directory(const descriptor& opened) {
    struct stat status {};
    return ::fstat(opened.number(), &status) == 0 && S_ISDIR(status.st_mode);
  }

  bool is_read_only(const std::string& place) const {
    if (original_ < 0) return false;
    const descriptor before = open_inside(original_, place, 0);
    struct statvfs status {};
    must(::fstatvfs(before.number(), &status), "statvfs");
    return (status.f_flag & ST_RDONLY) != 0;
  }

  void over(const descriptor& lower, int target, const std::string& place) {
    must(::fchdir(lower.number()), "chdir");
    const descriptor layer =
        make_layer(std::string("/").append(std::to_string(count_++)));
    must(::chdir("/"), "chdir");
    if (is_read_only(place))
      set_attributes(layer.number(), 0, MOUNT_ATTR_RDONLY);
    attach(layer, target);
  }

  void protect_downloads(const descriptor& kept) const {
    const descriptor tz = open_inside(root_, downloads, O_DIRECTORY);
    if (kept.number() < 0 || tz.number() < 0) return;
    const descriptor copy = clone_tree(kept.number(), AT_RECURSIVE);
    set_attributes(copy.number(), AT_RECURSIVE, MOUNT_ATTR_RDONLY);
    attach(copy, tz.number());
  }

  int root_;
  const process& self_;
  int original_;
  int count_ = 0;
};

}  // namespace

place enter_throwaway_device(const std::string& root) {
  place here;
  enter_namespaces();
  must(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr), "mount");
  const descriptor device = open_directory(root);
  const process self;
  here.has_all_users =
      self.text_of("self/uid_map").find("4294967295") != std::string::npos;
  here.is_running_system = self.path_of(device) == "/";

  // Taken before anything is covered.
  const descriptor tree = clone_tree(device.number(), AT_RECURSIVE);
  protect(tree.number());
  // A base of our own. Where it lies does not matter: this process sees nothing
  // else from then on, and no other process sees it.
  must(::mount("base", "/proc", "tmpfs", 0, "mode=0755"), "tmpfs");
  must(::chdir("/proc"), "chdir");
  must(::chroot("."), "chroot");
  must(::mkdir("/root", 0700), "mkdir");
  attach(tree, open_directory("/root").number());
  const descriptor inside = open_directory("/root");
  layers(inside.number(), self, here.is_running_system ? device.number() : -1)
      .lay();
  must(::fchdir(inside.number()), escaped(root));
  must(::chroot("."), "chroot");
  must(::chdir("/"), "chdir");
  return here;
}

void end_with_parent() { ::prctl(PR_SET_PDEATHSIG, SIGKILL); }

void become_the_boot() {
  // Not allowed where this user is not really root, and needless there.
  ::setgroups(0, nullptr);
  std::ignore = ::setresgid(0, 0, 0);
  const rlimit none{0, 0};
  must(::setrlimit(RLIMIT_CORE, &none), "setrlimit");
  ::umask(022);
  must(::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0), "no_new_privs");
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  const __user_cap_data_struct no_capability[2] = {};
  must(::syscall(SYS_capset, &header, no_capability), "capset");
}

void limit_memory() {
#if !defined(__SANITIZE_ADDRESS__)
  // Sanitizers reserve terabytes of addresses.
  rlimit limit{};
  must(::getrlimit(RLIMIT_AS, &limit), "getrlimit");
  limit.rlim_max = std::min<rlim_t>(limit.rlim_max, most_memory);
  limit.rlim_cur = std::min(limit.rlim_cur, limit.rlim_max);
  must(::setrlimit(RLIMIT_AS, &limit), "setrlimit");
#endif
}

void limit_time() {
  const itimerval timer{{}, {0, most_milliseconds * 1000}};
  must(::setitimer(ITIMER_PROF, &timer, nullptr), "setitimer");
}

std::string why_ended(int status) {
  if (!WIFSIGNALED(status)) return "ended without a reason";
  if (WTERMSIG(status) == SIGPROF)
    return "it takes more than " + std::to_string(most_milliseconds) +
           " ms of processor time";
  return std::string("ended by ") + ::strsignal(WTERMSIG(status));
}
