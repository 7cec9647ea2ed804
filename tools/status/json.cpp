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

json entry_in_json(const entry& here) {
  json object{{"kind", kind_of(here)}};
  if (here.what == entry::kind::link) object["target"] = escaped(here.text);
  if (here.what == entry::kind::unknown)
    object["error"] = std::strerror(here.error);
  return object;
}

json set_in_json(const std::optional<dataset_facts>& set) {
  static constexpr std::array states = {"readable", "elsewhere",
                                        "number_too_large", "walk_failed"};
  if (!set) return {};
  json object{{"path", text_or_null(set->path)},
              {"version",
               set->has_version() ? text_or_null(set->version_text) : json()},
              {"schema", text_or_null(set->schema)},
              {"state", states.at(static_cast<std::size_t>(set->ends))},
              {"unreadable", json::array()}};
  for (const auto& [path, error] : set->unreadable)
    object["unreadable"].push_back({{"path", escaped(path)}, {"error", error}});
  if (!set->path.empty()) {
    object["fits_system"] = set->fits_system;
    object["has_several_schemas"] = set->has_several_schemas;
  }
  return object;
}

json links_in_json(const link_facts& links) {
  const auto& path = links.current_path;
  json record = entry_in_json(links.record);
  if (links.record.what == entry::kind::file)
    record["text"] =
        links.record.error == 0 ? json(escaped(links.record.text)) : json();
  return {{"in_use", !path           ? "none"
                     : path->empty() ? "system"
                                     : "update"},
          {"pair", links.pair.name},
          {"zoneinfo", entry_in_json(links.zoneinfo)},
          {"icutz", entry_in_json(links.icutz)},
          {"localtime", entry_in_json(links.localtime)},
          {"zone", text_or_null(zone_of(links))},
          {"zone_is_file", links.zone_is_file},
          {"tz_latest", entry_in_json(links.tz_latest)},
          {"record", record},
          {"legacy_icutz", entry_in_json(links.legacy_icutz)},
          {"old_icu", entry_in_json(links.old_icu)}};
}

}  // namespace

std::string in_json(const report& told) {
  const device_facts& device = told.device;
  json reasons = json::array();
  for (const auto& [subject, does, code, text] : told.why.reasons)
    reasons.push_back({{"subject", subject}, {"code", code}, {"text", text}});
  json downloads = json::array();
  for (const auto& [name, needed_by] : device.downloads)
    downloads.push_back({{"name", escaped(name)}, {"needed_by", needed_by}});
  json boot{{"ends", told.boot.ends_normally ? "normally" : "abnormally"}};
  if (!told.boot.ends_normally) boot["thrown"] = escaped(told.boot.thrown);
  boot["lines"] = json::array();
  for (const auto& said : told.boot.lines)
    boot["lines"].push_back(escaped(said.text));
  boot["steps"] = json::array();
  for (const auto& [name, does, reason, text] : told.why.steps)
    boot["steps"].push_back(
        {{"step", name}, {"does", does}, {"reason", reason}, {"text", text}});
  boot["after"] = links_in_json(told.after);
  const json object{
      {"format", 1},
      {"status", static_cast<int>(told.why.is)},
      {"reasons", reasons},
      {"now", links_in_json(device.links)},
      {"system", set_in_json(device.system)},
      {"current", set_in_json(device.current)},
      {"announced", set_in_json(device.update)},
      {"downloads", downloads},
      {"downloads_error", device.downloads_error == 0
                              ? json()
                              : json(std::strerror(device.downloads_error))},
      {"has_more_downloads", device.has_more_downloads},
      {"next_boot", boot},
      {"cannot_know", told.cannot_know}};
  return object.dump(2) + "\n";
}
