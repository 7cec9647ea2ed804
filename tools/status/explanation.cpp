// SPDX-License-Identifier: BSD-2-Clause
#include <algorithm>
#include <cstring>
#include <stdexcept>
#include <string_view>
#include <utility>

#include "tools/escaped.h"
#include "tools/status/failure.h"
#include "tools/status/report.h"

namespace {

// The lines that tell of a decision; each is printed in one place of the boot.
namespace lines {
constexpr std::string_view not_migrated =
    "Could not migrate /var/db/icutz to /var/db/timezone/icutz";
constexpr std::string_view not_removed = "Could not remove /var/db/icutz";
constexpr std::string_view invalid_links =
    "Invalid current symlinks; resetting to system partition";
constexpr std::string_view incompatible =
    "Symlink points at data incompatible with installed system";
constexpr std::string_view refused =
    "New update not compatible or older version: %s vs. %s";
constexpr std::string_view last_resort =
    "Unable to locate data; resetting to system partition";
constexpr std::string_view correcting = "Correcting localtime link to %s";
constexpr std::string_view localtime_invalid =
    "localtime link invalid; resetting to %s";
// These are printed by what fails below a decision.
constexpr std::string_view read_failed = "read_symlink: %s";
constexpr std::string_view create_failed = "create_symlink: from %s to %s";
constexpr std::string_view bad_path =
    "mln_dataset::create_components: bad path %s";
constexpr std::string_view walk_failed =
    "tz_icu::initialize: fts_open of %s failed, %s";
}  // namespace lines

// Only a reset makes this link; an activation makes others.
constexpr char of_a_reset[] =
    "marlin: create_symlink: from /var/db/timezone/zoneinfo to "
    "/usr/share/zoneinfo.default: ";

const std::string behind_a_changed_link =
    " is reached through a link that the boot has just changed";

using enum verdict;
using kind = entry::kind;

bool is_too_large(const dataset_facts& set) {
  return set.ends == dataset_facts::state::number_too_large;
}

class account {
 public:
  explicit account(const report& of) : of_(of) {}

  explanation told() {
    legacy_icu_link();
    old_icu();
    select();
    localtime();
    if (!boot_.ends_normally)
      found("boot", "abnormal_end",
            "it ends abnormally: " + escaped(boot_.thrown));
    state_afterwards();
    if (told_.is != wrong && (told_.is == sound) != (after_ == device_.links))
      throw std::logic_error("a change without a reason, or without effect");
    return std::move(told_);
  }

 private:
  const line* find(std::string_view format) const {
    for (const auto& said : boot_.lines)
      if (said.format == format) return &said;
    return nullptr;
  }
  bool has(std::string_view format) const { return find(format) != nullptr; }

  // The line before the one that tells of a decision; an empty one: none.
  line before(std::string_view format) const {
    const line* const said = find(format);
    return said == nullptr || said == boot_.lines.data() ? line() : said[-1];
  }

  // Of the step `name_`. In texts, those of the device are escaped.
  void add(const char* does, const std::string& reason, verdict is,
           const std::string& text) {
    told_.steps.push_back({name_, does, reason, text});
    told_.is = std::max(told_.is, is);
    if (is != sound) told_.reasons.push_back(told_.steps.back());
  }
  void reset(const char* reason, const std::string& text,
             verdict is = verdict::wrong) {
    add("reset", reason, is, text + ": a reset to the system partition");
  }
  void refuse(const char* reason, const std::string& text,
              verdict is = verdict::wrong) {
    add("refused", reason, is,
        escaped(device_.update->version_text) + " is refused: " + text);
  }
  void skip() { add("not_reached", "earlier_failure", sound, "not looked at"); }

  // Beside the steps.
  void found(const char* subject, std::string_view reason,
             const std::string& text) {
    told_.is = wrong;
    told_.reasons.push_back({subject, "found", std::string(reason), text});
  }

  void legacy_icu_link() {
    name_ = "legacy_icu_link";
    if (const line* const said = find(lines::not_removed))
      add("kept", "not_removed", wrong,
          std::string("/var/db/icutz cannot be removed: ") +
              std::strerror(said->error));
    else if (const line* const reason = find(lines::not_migrated))
      add("removed", "not_migrated", wrong,
          std::string("/var/db/icutz is removed, but could not move to "
                      "/var/db/timezone/icutz: ") +
              std::strerror(reason->error));
    else if (device_.links.legacy_icutz.what == kind::none)
      add("nothing", "none", sound, "none");
    else if (device_.links.legacy_icutz.what == kind::unknown)
      add("nothing", "unreachable", sound, "/var/db/icutz cannot be looked at");
    else if (!device_.legacy_resolves)
      add("nothing", "dangles", sound,
          "/var/db/icutz leads nowhere and counts as none");
    else if (device_.icutz_resolves)
      add("removed", "present_link_resolves", changes,
          "/var/db/icutz is removed; /var/db/timezone/icutz is kept");
    else
      add("moved", "no_present_link", changes,
          "/var/db/icutz moves to /var/db/timezone/icutz");
  }

  void old_icu() {
    name_ = "old_icu";
    if (device_.links.old_icu.what == kind::none)
      add("nothing", "none", sound, "none");
    else if (device_.links.old_icu.what == kind::unknown)
      add("nothing", "unreachable", sound, "/var/db/icu cannot be looked at");
    else if (after_.old_icu.what == kind::none)
      add("removed", "obsolete", changes, "/var/db/icu is removed");
    else
      add("kept", "not_removed", wrong, "/var/db/icu cannot be removed");
  }

  // Steps 4 to 8 of a boot. One that fails takes the last resort, and those
  // after it are not reached.
  void select() {
    const bool failed = has(lines::last_resort);
    const auto [code, text] =
        failed ? cause_of_failure() : cause{"no_failure", "not needed"};
    const int steps_reached =
        code == "system_number_too_large" || code == "announcement_unreadable"
            ? 0
        : failed && failed_at_current() ? 1
        : failed && failed_in_a_reset() ? 2
                                        : 3;
    name_ = "current";
    steps_reached < 1 ? skip() : current();
    name_ = "usable";
    steps_reached < 2 ? skip() : usable();
    name_ = "update";
    steps_reached < 3 ? skip() : update();
    record();
    name_ = "last_resort";
    add(failed ? "reset" : "nothing", code, failed ? wrong : sound, text);
  }

  bool failed_in_a_reset() const {
    return before(lines::last_resort).text.starts_with(of_a_reset);
  }
  bool failed_at_current() const {
    if (has(lines::invalid_links))
      return failed_in_a_reset() && !has(lines::incompatible);
    return device_.current &&
           device_.current->ends != dataset_facts::state::built;
  }

  struct cause {
    std::string code{};
    std::string text{};
  };
  cause cause_of_failure() const {
    const line said = before(lines::last_resort);
    const std::string error = std::strerror(said.error);
    const auto& current = device_.current;
    if (said.format == lines::create_failed)
      return {"links_not_made", "a link cannot be made: " + error};
    if (said.format == lines::read_failed)
      return {"announcement_unreadable", "tz_latest cannot be read: " + error};
    if (said.format == lines::bad_path)
      return {"announcement_elsewhere",
              "tz_latest names no place below /var/db/timezone/tz: " +
                  escaped(device_.links.tz_latest.text)};
    if (said.format == lines::walk_failed)
      return {"walk_failed", "an ICU directory cannot be searched"};
    if (is_too_large(device_.system))
      return {"system_number_too_large",
              "a number in the system's version is too large"};
    const bool is_current =
        !has(lines::invalid_links) && current && is_too_large(*current);
    const auto& set = is_current ? current : device_.update;
    if (!set || !is_too_large(*set))
      throw std::logic_error("a last resort without a reason");
    return {is_current ? "current_number_too_large" : "update_number_too_large",
            "a number in the name of " + escaped(set->path) + " is too large"};
  }

  void current() {
    if (!has(lines::invalid_links)) {
      const std::string& path = device_.links.current_path.value();
      return path.empty() ? add("read", "system", sound,
                                "zoneinfo names the system partition")
                          : add("read", "update", sound,
                                "zoneinfo names the update " + escaped(path));
    }
    const kind what = device_.links.zoneinfo.what;
    if (what == kind::none)
      reset("no_link", "there is no link zoneinfo", changes);
    else if (what == kind::unknown)
      reset("unreadable", "zoneinfo cannot be read");
    else if (what != kind::link)
      reset("not_a_link", "zoneinfo is not a link");
    else if (device_.links.current_path)
      reset("changed_by_the_boot", "zoneinfo" + behind_a_changed_link);
    else
      reset("bad_target", "zoneinfo names no data set");
  }

  // The data set that the rest of the boot compares with.
  const dataset_facts& compared() const {
    return has(lines::invalid_links) || !device_.current ? device_.system
                                                         : *device_.current;
  }

  void usable() {
    const dataset_facts& set = compared();
    const std::string version = escaped(set.version_text);
    if (!has(lines::incompatible))
      add("kept", "fits", sound, "it fits the system");
    else if (!set.fits_system)
      reset("other_schema", "it has " + schema_of(set) + ", the system has " +
                                schema_of(device_.system));
    else if (!set.has_version())
      reset("no_version", "its name " + version + " is not a version");
    else if (!(device_.system.version > set.version))
      reset("changed_by_the_boot", "its data" + behind_a_changed_link);
    else
      reset("older_than_system", "it is " + version +
                                     ", older than the system's " +
                                     escaped(device_.system.version_text));
  }

  void update() {
    if (has(lines::last_resort))
      return add("failed", "last_resort", wrong,
                 escaped(device_.links.tz_latest.text) + " cannot be used");
    if (!device_.update && !has(lines::refused))
      return add("nothing", "none", sound, "none is announced");
    const dataset_facts& set = device_.update.value();
    const dataset_facts& in_use = compared();
    const std::string other = escaped(in_use.version_text);
    if (!has(lines::refused))
      add("activated", "newer", changes,
          escaped(set.version_text) + " is activated: newer than " +
              (in_use.has_version() ? other : "no version"));
    else if (!set.fits_system)
      refuse("other_schema", "it has " + schema_of(set));
    // Reset in this boot, it is in use no longer.
    else if (set.path == in_use.path && !has(lines::incompatible))
      refuse("same_set", "it is in use already", sound);
    else if (!set.has_version())
      refuse("no_version", "the name is not a version");
    else if (set.version > in_use.version)
      refuse("changed_by_the_boot", "its data" + behind_a_changed_link);
    else if (set.version == in_use.version)
      refuse("same_version", other + " is of the same version");
    else
      refuse("older", other + " is newer");
  }

  void record() {
    const bool is_due = told_.steps.back().does == "activated";
    name_ = "record";
    if (!is_due) return add("nothing", "no_activation", sound, "no activation");
    const dataset_facts& active =
        has(lines::incompatible) ? device_.system : compared();
    if (after_.record.what == kind::none ||
        (!opens_record() && after_.record == device_.links.record))
      return add("not_written", "not_opened", wrong,
                 "the change cannot be recorded");
    const std::string text =
        active.version_text + "_" + device_.update->version_text;
    // The layer has space for it, but this process may have less than a boot.
    if (after_.record.what == kind::file && after_.record.error == 0 &&
        after_.record.text != text.substr(0, longest_text))
      throw cannot_tell("a limit on the size of files cuts the record");
    add("written", "activation", changes,
        "the change is recorded: " + escaped(text));
  }

  void localtime() {
    name_ = "localtime";
    const bool is_corrected = has(lines::correcting);
    if (!has(lines::localtime_invalid)) {
      if (!boot_.ends_normally) return skip();
      if (!is_corrected)
        return add("kept", "accepted", sound, "the link is kept");
      return add("corrected", "former_place", changes,
                 "the link is corrected to " + escaped(after_.localtime.text));
    }
    if (!boot_.ends_normally)
      return add("failed", "not_made", wrong,
                 std::string("the default link cannot be made: ") +
                     std::strerror(boot_.lines.back().error));
    const kind what = device_.links.localtime.what;
    const auto [code, text] =
        before(lines::localtime_invalid).format == lines::create_failed
            ? cause{"not_replaced", "the corrected link cannot be made"}
        : is_corrected
            ? cause{"zone_unreachable",
                    "the zone in the corrected link cannot be reached"}
        : what == kind::none    ? cause{"no_link", "there is no link"}
        : what == kind::link    ? cause{"elsewhere", "the link leads elsewhere"}
        : what == kind::unknown ? cause{"unreadable", "it cannot be read"}
                                : cause{"not_a_link", "it is not a link"};
    add("reset", code, what == kind::none ? changes : wrong,
        text + ": the default zone is set");
  }

  // What no later boot mends either.
  void state_afterwards() {
    if (is_too_large(device_.system)) return;
    if (!device_.system.has_version() || !of_.system_after.has_version())
      found("system", "no_version", "its data has no version");
    if (device_.system.schema.empty() || of_.system_after.schema.empty())
      found("system", "no_schema", "its data has no ICU schema");
    if (!boot_.ends_normally) return;
    if (const auto& [name, sentence, fits] = after_.pair; !fits)
      found("links", name, std::string("after the boot ").append(sentence));
    if (!boot_.may_change_links)
      found("links", "not_writable", "no boot can write in /var/db/timezone");
    if (!boot_.closed_part.empty())
      found("links", "closed",
            "only root can read what is in use: " + boot_.closed_part +
                " is closed to others");
    if (!after_.zone_is_file)
      found("local_zone", "missing",
            "its file cannot be reached after the boot");
  }

  const report& of_;
  const device_facts& device_ = of_.device;
  const rehearsal& boot_ = of_.boot;
  const link_facts& after_ = of_.after;
  const char* name_ = "";
  explanation told_{};
};

}  // namespace

std::string step::sentence() const {
  std::string words = name;
  std::replace(words.begin(), words.end(), '_', ' ');
  return words + ": " + text;
}

explanation explain(const report& told) { return account(told).told(); }
