// SPDX-License-Identifier: BSD-2-Clause
#include "tools/status/explanation.h"

#include <algorithm>
#include <cstring>
#include <stdexcept>
#include <string_view>
#include <utility>

#include "tools/escaped.h"
#include "tools/status/failure.h"

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

struct row {
  std::string_view name, does, reason;
  verdict is;
  // "%1" and "%2" are texts of the device, "%e" the text of an error. What is
  // refused stands before it, what a reset leads to behind it.
  std::string_view text;
};

using enum verdict;

constexpr row table[] = {
    {"legacy_icu_link", "nothing", "none", sound, "none"},
    {"legacy_icu_link", "nothing", "dangles", sound,
     "/var/db/icutz leads nowhere and counts as none"},
    {"legacy_icu_link", "nothing", "unreachable", sound,
     "/var/db/icutz cannot be looked at"},
    {"legacy_icu_link", "moved", "no_present_link", changes,
     "/var/db/icutz moves to /var/db/timezone/icutz"},
    {"legacy_icu_link", "removed", "present_link_resolves", changes,
     "/var/db/icutz is removed; /var/db/timezone/icutz is kept"},
    {"legacy_icu_link", "removed", "not_migrated", wrong,
     "/var/db/icutz is removed, but could not move to /var/db/timezone/icutz: "
     "%e"},
    {"legacy_icu_link", "kept", "not_removed", wrong,
     "/var/db/icutz cannot be removed: %e"},

    {"old_icu", "nothing", "none", sound, "none"},
    {"old_icu", "removed", "obsolete", changes, "/var/db/icu is removed"},
    {"old_icu", "nothing", "unreachable", sound,
     "/var/db/icu cannot be looked at"},
    {"old_icu", "kept", "not_removed", wrong, "/var/db/icu cannot be removed"},

    {"current", "read", "system", sound, "zoneinfo names the system partition"},
    {"current", "read", "update", sound, "zoneinfo names the update %1"},
    {"current", "reset", "no_link", changes, "there is no link zoneinfo"},
    {"current", "reset", "bad_target", wrong, "zoneinfo names no data set"},
    {"current", "reset", "changed_by_the_boot", wrong,
     "zoneinfo is reached through a link that the boot has just changed"},
    {"current", "reset", "not_a_link", wrong, "zoneinfo is not a link"},
    {"current", "reset", "unreadable", wrong, "zoneinfo cannot be read"},

    {"usable", "kept", "fits", sound, "it fits the system"},
    {"usable", "reset", "other_schema", wrong, "it has %1, the system has %2"},
    {"usable", "reset", "older_than_system", wrong,
     "it is %1, older than the system's %2"},
    {"usable", "reset", "changed_by_the_boot", wrong,
     "its data is reached through a link that the boot has just changed"},
    {"usable", "reset", "no_version", wrong, "its name %1 is not a version"},

    {"update", "nothing", "none", sound, "none is announced"},
    {"update", "refused", "same_set", sound, "it is in use already"},
    {"update", "refused", "other_schema", wrong, "it has %2"},
    {"update", "refused", "same_version", wrong, "%2 is of the same version"},
    {"update", "refused", "no_version", wrong, "the name is not a version"},
    {"update", "refused", "older", wrong, "%2 is newer"},
    {"update", "refused", "changed_by_the_boot", wrong,
     "its data is reached through a link that the boot has just changed"},
    {"update", "failed", "last_resort", wrong, "%1 cannot be used"},
    {"update", "activated", "newer", changes, "%1 is activated: newer than %2"},

    {"record", "nothing", "no_activation", sound, "no activation"},
    {"record", "written", "activation", changes, "the change is recorded: %1"},
    {"record", "not_written", "not_opened", wrong,
     "the change cannot be recorded"},

    {"last_resort", "nothing", "no_failure", sound, "not needed"},
    {"last_resort", "reset", "links_not_made", wrong,
     "a link cannot be made: %e"},
    {"last_resort", "reset", "announcement_unreadable", wrong,
     "tz_latest cannot be read: %e"},
    {"last_resort", "reset", "announcement_elsewhere", wrong,
     "tz_latest names no place below /var/db/timezone/tz: %1"},
    {"last_resort", "reset", "system_number_too_large", wrong,
     "a number in the system's version is too large"},
    {"last_resort", "reset", "current_number_too_large", wrong,
     "a number in the name of %1 is too large"},
    {"last_resort", "reset", "update_number_too_large", wrong,
     "a number in the name of %1 is too large"},
    {"last_resort", "reset", "walk_failed", wrong,
     "an ICU directory cannot be searched"},

    {"localtime", "kept", "accepted", sound, "the link is kept"},
    {"localtime", "corrected", "former_place", changes,
     "the link is corrected to %1"},
    {"localtime", "reset", "no_link", changes, "there is no link"},
    {"localtime", "reset", "elsewhere", wrong, "the link leads elsewhere"},
    {"localtime", "reset", "zone_unreachable", wrong,
     "the zone in the corrected link cannot be reached"},
    {"localtime", "reset", "not_replaced", wrong,
     "the corrected link cannot be made"},
    {"localtime", "reset", "not_a_link", wrong, "it is not a link"},
    {"localtime", "reset", "unreadable", wrong, "it cannot be read"},
    {"localtime", "failed", "not_made", wrong,
     "the default link cannot be made: %e"},

    {"boot", "found", "abnormal_end", wrong, "it ends abnormally: %1"},
    {"system", "found", "no_version", wrong, "its data has no version"},
    {"system", "found", "no_schema", wrong, "its data has no ICU schema"},
    {"links", "found", "update_without_icu", wrong, "after the boot %1"},
    {"links", "found", "update_with_other_icu", wrong, "after the boot %1"},
    {"links", "found", "system_with_icu", wrong, "after the boot %1"},
    {"links", "found", "not_the_tree", wrong, "after the boot %1"},
    {"links", "found", "no_dataset", wrong, "after the boot %1"},
    {"links", "found", "not_writable", wrong,
     "no boot can write in /var/db/timezone"},
    {"links", "found", "closed", wrong,
     "only root can read what is in use: %1 is closed to others"},
    {"local_zone", "found", "missing", wrong,
     "its file cannot be reached after the boot"},
};

// Why a link is reset; `of_its_target`, if it is one that can be read.
std::string_view flaw_of(const entry& here, std::string_view of_its_target) {
  switch (here.what) {
    case entry::kind::none:
      return "no_link";
    case entry::kind::link:
      return of_its_target;
    case entry::kind::unknown:
      return "unreadable";
    default:
      return "not_a_link";
  }
}

std::string schema_of(const dataset_facts& set) {
  return set.schema.empty() ? "no ICU schema" : "ICU schema " + set.schema;
}

class account {
 public:
  account(const device_facts& device, const rehearsal& boot,
          const link_facts& after)
      : device_(device), boot_(boot), after_(after) {}

  explanation told() {
    legacy_icu_link();
    old_icu();
    select();
    localtime();
    if (!boot_.ends_normally)
      add("boot", "found", "abnormal_end", boot_.thrown);
    state_afterwards();
    if (told_.is == sound && !(after_ == device_.links))
      throw std::logic_error("a change without a reason");
    return std::move(told_);
  }

 private:
  const line* find(std::string_view format) const {
    for (const auto& said : boot_.lines)
      if (said.format == format) return &said;
    return nullptr;
  }
  bool has(std::string_view format) const { return find(format) != nullptr; }

  // The line before the one that tells of a decision; nullptr: none.
  const line* before(std::string_view format) const {
    const line* const said = find(format);
    return said == nullptr || said == boot_.lines.data() ? nullptr : said - 1;
  }
  bool follows(std::string_view format, std::string_view cause) const {
    const line* const said = before(format);
    return said != nullptr && said->format == cause;
  }

  void skip(const std::string& name) {
    told_.steps.push_back(
        {name, "not_reached", "earlier_failure", "not looked at"});
  }

  void add(std::string_view name, std::string_view does,
           std::string_view reason, const std::string& first = {},
           const std::string& second = {}, int error = 0) {
    const row* const found =
        std::find_if(std::begin(table), std::end(table), [&](const row& known) {
          return known.name == name && known.does == does &&
                 known.reason == reason;
        });
    if (found == std::end(table)) throw std::logic_error("no such reason");
    step done{std::string(name), std::string(does), std::string(reason), {}};
    for (std::size_t i = 0; i < found->text.size(); ++i) {
      if (found->text[i] != '%') {
        done.text += found->text[i];
        continue;
      }
      const char what = found->text[++i];
      done.text += what == 'e' ? std::strerror(error)
                               : escaped(what == '1' ? first : second);
    }
    if (does == "refused")
      done.text = escaped(first) + " is refused: " + done.text;
    if (does == "reset" && name == "localtime")
      done.text += ": the default zone is set";
    else if (does == "reset" && name != "last_resort")
      done.text += ": a reset to the system partition";
    told_.is = std::max(told_.is, found->is);
    if (found->is != sound) told_.reasons.push_back(done);
    if (does != "found") told_.steps.push_back(done);
  }

  void legacy_icu_link() {
    const char* const name = "legacy_icu_link";
    if (const line* const said = find(lines::not_removed))
      return add(name, "kept", "not_removed", {}, {}, said->error);
    if (const line* const said = find(lines::not_migrated))
      return add(name, "removed", "not_migrated", {}, {}, said->error);
    if (device_.links.legacy_icutz.what == entry::kind::none)
      return add(name, "nothing", "none");
    if (device_.links.legacy_icutz.what == entry::kind::unknown)
      return add(name, "nothing", "unreachable");
    if (!device_.legacy_resolves) return add(name, "nothing", "dangles");
    if (device_.icutz_resolves)
      return add(name, "removed", "present_link_resolves");
    add(name, "moved", "no_present_link");
  }

  void old_icu() {
    if (device_.links.old_icu.what == entry::kind::none)
      add("old_icu", "nothing", "none");
    else if (device_.links.old_icu.what == entry::kind::unknown)
      add("old_icu", "nothing", "unreachable");
    else if (after_.old_icu.what == entry::kind::none)
      add("old_icu", "removed", "obsolete");
    else
      add("old_icu", "kept", "not_removed");
  }

  // Steps 4 to 8 of a boot. One that fails takes the last resort, and those
  // after it are not reached.
  void select() {
    const bool failed = has(lines::last_resort);
    if (failed) find_cause();
    const bool no_current = failed && (cause_ == "system_number_too_large" ||
                                       cause_ == "announcement_unreadable");
    current(no_current);
    const bool no_check = no_current || (failed && failed_at_current());
    usable(no_check);
    update(no_check || (failed && failed_in_a_reset()), failed);
    record();
    last_resort(failed);
  }

  // Only a reset makes this link; an activation makes others.
  bool failed_in_a_reset() const {
    const line* const last = before(lines::last_resort);
    return last != nullptr &&
           last->text.starts_with(
               "marlin: create_symlink: from /var/db/timezone/zoneinfo to "
               "/usr/share/zoneinfo.default: ");
  }
  bool failed_at_current() const {
    if (has(lines::invalid_links))
      return failed_in_a_reset() && !has(lines::incompatible);
    return device_.current &&
           device_.current->ends != dataset_facts::state::built;
  }

  static bool is_too_large(const std::optional<dataset_facts>& set) {
    return set && set->ends == dataset_facts::state::number_too_large;
  }

  void find_cause() {
    const line none;
    const line* const last = before(lines::last_resort);
    const line& cause = last == nullptr ? none : *last;
    error_ = cause.error;
    if (cause.format == lines::create_failed) {
      cause_ = "links_not_made";
    } else if (cause.format == lines::read_failed) {
      cause_ = "announcement_unreadable";
    } else if (cause.format == lines::bad_path) {
      cause_ = "announcement_elsewhere";
      text_ = device_.links.tz_latest.text;
    } else if (cause.format == lines::walk_failed) {
      cause_ = "walk_failed";
    } else if (device_.system.ends == dataset_facts::state::number_too_large) {
      cause_ = "system_number_too_large";
    } else if (!has(lines::invalid_links) && is_too_large(device_.current)) {
      cause_ = "current_number_too_large";
      text_ = device_.current->path;
    } else if (is_too_large(device_.update)) {
      cause_ = "update_number_too_large";
      text_ = device_.update->path;
    } else {
      throw std::logic_error("a last resort without a reason");
    }
  }

  void current(bool not_reached) {
    if (not_reached) return skip("current");
    if (!has(lines::invalid_links)) {
      const std::string& path = device_.links.current_path.value();
      return add("current", "read", path.empty() ? "system" : "update", path);
    }
    add("current", "reset",
        flaw_of(device_.links.zoneinfo, device_.links.current_path
                                            ? "changed_by_the_boot"
                                            : "bad_target"));
  }

  // The data set that the rest of the boot compares with.
  const dataset_facts& compared() const {
    return has(lines::invalid_links) || !device_.current ? device_.system
                                                         : *device_.current;
  }

  void usable(bool not_reached) {
    const dataset_facts& set = compared();
    if (not_reached) return skip("usable");
    if (!has(lines::incompatible)) return add("usable", "kept", "fits");
    if (!set.fits_system)
      return add("usable", "reset", "other_schema", schema_of(set),
                 schema_of(device_.system));
    if (!set.has_version())
      return add("usable", "reset", "no_version", set.version_text);
    if (!(device_.system.version > set.version))
      return add("usable", "reset", "changed_by_the_boot");
    add("usable", "reset", "older_than_system", set.version_text,
        device_.system.version_text);
  }

  void update(bool not_reached, bool failed) {
    if (not_reached) return skip("update");
    if (failed)
      return add("update", "failed", "last_resort",
                 device_.links.tz_latest.text);
    if (!device_.update && !has(lines::refused))
      return add("update", "nothing", "none");
    const dataset_facts& set = device_.update.value();
    const dataset_facts& in_use = compared();
    if (!has(lines::refused))
      return add("update", "activated", "newer", set.version_text,
                 in_use.has_version() ? in_use.version_text : "no version");
    if (!set.fits_system)
      return add("update", "refused", "other_schema", set.version_text,
                 schema_of(set));
    // Reset in this boot, it is in use no longer.
    if (set.path == in_use.path && !has(lines::incompatible))
      return add("update", "refused", "same_set", set.version_text);
    if (!set.has_version())
      return add("update", "refused", "no_version", set.version_text);
    if (set.version > in_use.version)
      return add("update", "refused", "changed_by_the_boot", set.version_text);
    add("update", "refused",
        set.version == in_use.version ? "same_version" : "older",
        set.version_text, in_use.version_text);
  }

  void record() {
    if (told_.steps.back().does != "activated")
      return add("record", "nothing", "no_activation");
    const dataset_facts& active =
        has(lines::incompatible) ? device_.system : compared();
    const link_facts& before = device_.links;
    if (!after_.recorded ||
        (after_.recorded == before.recorded && after_.record == before.record))
      return add("record", "not_written", "not_opened");
    const std::string text =
        active.version_text + "_" + device_.update->version_text;
    // The layer has space for it, but this process may have less than a boot.
    if (after_.record.what == entry::kind::file && after_.record.error == 0 &&
        after_.record.text != text.substr(0, longest_text))
      throw cannot_tell("a limit on the size of files cuts the record");
    add("record", "written", "activation", text);
  }

  void last_resort(bool failed) {
    if (failed)
      add("last_resort", "reset", cause_, text_, {}, error_);
    else
      add("last_resort", "nothing", "no_failure");
  }

  void localtime() {
    const char* const name = "localtime";
    const bool is_invalid = has(lines::localtime_invalid);
    if (!boot_.ends_normally && !is_invalid) return skip(name);
    if (!boot_.ends_normally)
      return add(name, "failed", "not_made", {}, {}, boot_.lines.back().error);
    if (!is_invalid) {
      if (has(lines::correcting))
        return add(name, "corrected", "former_place", after_.localtime.text);
      return add(name, "kept", "accepted");
    }
    if (follows(lines::localtime_invalid, lines::create_failed))
      return add(name, "reset", "not_replaced");
    if (has(lines::correcting)) return add(name, "reset", "zone_unreachable");
    add(name, "reset", flaw_of(device_.links.localtime, "elsewhere"));
  }

  // What no later boot mends either.
  void state_afterwards() {
    if (device_.system.ends == dataset_facts::state::number_too_large) return;
    if (!device_.system.has_version()) add("system", "found", "no_version");
    if (device_.system.schema.empty()) add("system", "found", "no_schema");
    if (!boot_.ends_normally) return;
    if (!fits(after_.pair))
      add("links", "found", words_for(after_.pair).name,
          words_for(after_.pair).sentence);
    if (!after_.is_writable && device_.has_known_owner)
      add("links", "found", "not_writable");
    if (const std::string closed = closed_part(); !closed.empty())
      add("links", "found", "closed", closed);
    if (!after_.zone_is_file) add("local_zone", "found", "missing");
  }

  const device_facts& device_;
  const rehearsal& boot_;
  const link_facts& after_;
  explanation told_{};
  std::string cause_{};
  std::string text_{};
  int error_ = 0;
};

}  // namespace

std::string step::sentence() const {
  std::string words = name;
  std::replace(words.begin(), words.end(), '_', ' ');
  return words + ": " + text;
}

explanation explain(const device_facts& device, const rehearsal& boot,
                    const link_facts& after) {
  return account(device, boot, after).told();
}
