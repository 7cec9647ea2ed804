// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/checks.h"

#include "support/paths.h"
#include "support/version_grammar.h"
#include "tools/escaped.h"
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

void check_age(const mln_version& version) {
  check_newer(version, system_version(), "the system's");
  // What the next boot will refuse is no reason to stay with it.
  if (fits_system(announced_set()))
    check_newer(version, announced_set(), "announced");
  check_newer(version, set_in_use(), "in use");
}

}  // namespace

void check_version(const std::string& name, bool any_age) {
  const auto version = version_in(name);
  if (!version) refuse("its name is no version such as 2024a.1.0");
  if (!any_age) check_age(*version);
  // No set ever changes.
  if (needed_sets().contains(name))
    refuse(
        "a set of this version is in use or announced; give other data "
        "another");
}

void check_contents(const std::string& name, const contents& update) {
  if (update.release != release_in(name))
    refuse("zoneinfo/+VERSION says " + escaped(update.release.substr(0, 40)) +
           ", another release than its name");
  const std::string schema = system_schema();
  if (update.schema != schema)
    refuse("its ICU schema is " + escaped(update.schema) + ", the system's " +
           (schema.empty() ? "is missing" : "is " + escaped(schema)));
  const std::string zone = zone_of_the_user();
  if (!zone.empty() && !update.zones.contains(zone))
    refuse("it lacks the zone that the device is set to, " + escaped(zone));
}
