// SPDX-License-Identifier: BSD-2-Clause
#include <array>
#include <cstring>
#include <nlohmann/json.hpp>

#include "tools/escaped.h"
#include "tools/status/report.h"

namespace {

using json = nlohmann::ordered_json;

json text_or_null(const std::string& text) {
  return text.empty() ? json() : json(escaped(text));
}

json object_of(const entry& here) {
  json object{{"kind", kind_of(here)}};
  if (here.what == entry::kind::link) object["target"] = escaped(here.text);
  if (here.what == entry::kind::unknown)
    object["error"] = std::strerror(here.error);
  return object;
}

json version_of(const dataset_facts& set) {
  return set.has_version() ? text_or_null(set.version_text) : json();
}

std::string name_of(dataset_facts::state ends) {
  static constexpr std::array names = {
      "readable", "elsewhere", "number_too_large", "walk_failed", "no_memory"};
  return names.at(static_cast<std::size_t>(ends));
}

json object_of(const dataset_facts& set) {
  json unreadable = json::array();
  for (const auto& [path, error] : set.unreadable)
    unreadable.push_back({{"path", escaped(path)}, {"error", error}});
  json object{{"path", text_or_null(set.path)},
              {"version", version_of(set)},
              {"schema", text_or_null(set.schema)},
              {"state", name_of(set.ends)},
              {"unreadable", unreadable}};
  if (!set.path.empty()) {
    object["fits_system"] = set.fits_system;
    object["has_several_schemas"] = set.has_several_schemas;
  }
  return object;
}

json object_or_null(const std::optional<dataset_facts>& set) {
  return set ? object_of(*set) : json();
}

json object_of(const link_facts& links) {
  json record = object_of(links.record);
  if (links.record.what == entry::kind::file)
    record["text"] =
        links.record.error == 0 ? json(escaped(links.record.text)) : json();
  return {{"in_use", data_in_use(links)},
          {"pair", words_for(links.pair).name},
          {"zoneinfo", object_of(links.zoneinfo)},
          {"icutz", object_of(links.icutz)},
          {"localtime", object_of(links.localtime)},
          {"zone", text_or_null(zone_of(links))},
          {"zone_is_file", links.zone_is_file},
          {"tz_latest", object_of(links.tz_latest)},
          {"record", record},
          {"legacy_icutz", object_of(links.legacy_icutz)},
          {"old_icu", object_of(links.old_icu)}};
}

json object_of(const rehearsal& boot) {
  json lines = json::array();
  for (const auto& said : boot.lines) lines.push_back(escaped(said.text));
  json object{{"ends", boot.ends_normally ? "normally" : "abnormally"}};
  if (!boot.ends_normally) object["thrown"] = escaped(boot.thrown);
  object["lines"] = lines;
  return object;
}

}  // namespace

std::string in_json(const report& told) {
  json object{{"format", 1}};
  object["status"] = static_cast<int>(told.why.is);
  json reasons = json::array();
  for (const auto& found : told.why.reasons)
    reasons.push_back({{"subject", found.name},
                       {"code", found.reason},
                       {"text", found.text}});
  object["reasons"] = reasons;
  object["now"] = object_of(told.device.links);
  object["system"] = object_of(told.device.system);
  object["current"] = object_or_null(told.device.current);
  object["announced"] = object_or_null(told.device.update);
  json downloads = json::array();
  for (const auto& found : told.device.downloads)
    downloads.push_back(
        {{"name", escaped(found.name)}, {"needed_by", found.needed_by}});
  object["downloads"] = downloads;
  object["downloads_error"] =
      told.device.downloads_error == 0
          ? json()
          : json(std::strerror(told.device.downloads_error));
  object["has_more_downloads"] = told.device.has_more_downloads;

  json boot = object_of(told.boot);
  json steps = json::array();
  for (const auto& done : told.why.steps)
    steps.push_back({{"step", done.name},
                     {"does", done.does},
                     {"reason", done.reason},
                     {"text", done.text}});
  boot["steps"] = steps;
  boot["after"] = object_of(told.after);
  object["next_boot"] = boot;
  object["cannot_know"] = told.cannot_know;
  return object.dump(2) + "\n";
}
