// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/checks.h"

#include <string_view>

#include "dataset/icu_file_name.h"
#include "support/first_word.h"
#include "support/version_grammar.h"
#include "tools/escaped.h"
#include "tools/install/contents.h"
#include "tools/install/device_facts.h"
#include "tools/install/failure.h"

namespace {

void check_newer(const mln_version& version, const std::string& other,
                 const char* what_it_is) {
  const auto than = version_in(other);
  if (!than || version > *than) return;
  throw failure{status::not_newer, "it is not newer than " + escaped(other) +
                                       ", which is " + what_it_is};
}

std::string release_in(const std::string& name) {
  const auto groups = match_version_text(name);
  return groups ? std::string(groups->year) + std::string(groups->letters) : "";
}

// The schema in the name of the only ICU data file.
std::string schema_in(const file_names& files) {
  std::string schema;
  for (const auto& [name, first] : files) {
    const std::string_view path = name;
    if (!path.starts_with("icutz/")) continue;
    const auto found = icu_schema_in(path.substr(6));
    if (found.empty()) continue;
    if (!schema.empty()) refuse("icutz holds more than one file icutzNNx.dat");
    schema = found;
  }
  if (schema.empty()) refuse("icutz holds no file icutzNNx.dat");
  return schema;
}

}  // namespace

bool check_version(const std::string& name, bool any_age) {
  const auto version = version_in(name);
  if (!version) refuse("its name is not a version such as 2024a.1.0");
  const std::string announced = announced_set(), in_use = set_in_use();
  const bool needed = needed_sets().contains(name);
  const verdict found =
      needed ? condition_of(name) : verdict{condition::whole, {}};
  if (found.is == condition::unreadable && !any_age)
    refuse(
        "a set of this version is in use or announced, and cannot be checked, "
        "so that only --force replaces it: " +
        found.why);
  const bool broken = found.is != condition::whole;
  if (!any_age && !(broken && name == in_use)) {
    check_newer(*version, system_version(), "the system's");
    // What the next boot will refuse is no reason to stay with it.
    if (!(broken && name == announced) && fits_system(announced))
      check_newer(*version, announced, "announced");
    if (is_installed(in_use)) check_newer(*version, in_use, "in use");
  }
  // No set ever changes.
  if (needed && !broken)
    refuse(
        "a set of this version is in use or announced; give other data "
        "another");
  return broken && (name == in_use || name == announced);
}

void check_contents(const std::string& name, const std::string& copy,
                    const file_names& files) {
  const std::string release = read_first_word(copy + "/zoneinfo/+VERSION");
  if (release.empty()) refuse("zoneinfo/+VERSION names no release");
  if (release != release_in(name))
    refuse("zoneinfo/+VERSION says " + escaped(release.substr(0, 40)) +
           ", another release than its name");
  const std::string schema = schema_in(files), system = system_schema();
  if (schema != system)
    refuse("its ICU schema is " + escaped(schema) + ", the system's is " +
           (system.empty() ? "missing" : escaped(system)));
  const std::string zone = zone_of_the_user();
  if (!zone.empty() && !is_file(copy + "/zoneinfo/" + zone))
    refuse("it lacks the zone that the device is set to, " + escaped(zone));
}
