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

// Of what object_of() makes of each.
template <typename Item, typename Make>
json list_of(const std::vector<Item>& items, Make object_of) {
  json list = json::array();
  for (const auto& item : items) list.push_back(object_of(item));
  return list;
}

json object_or_null(const std::optional<dataset_facts>& set) {
  static constexpr std::array states = {
      "readable", "elsewhere", "number_too_large", "walk_failed", "no_memory"};
  if (!set) return {};
  json object{
      {"path", text_or_null(set->path)},
      {"version",
       set->has_version() ? text_or_null(set->version_text) : json()},
      {"schema", text_or_null(set->schema)},
      {"state", states.at(static_cast<std::size_t>(set->ends))},
      {"unreadable", list_of(set->unreadable, [](const flaw& found) {
         return json{{"path", escaped(found.path)}, {"error", found.error}};
       })}};
  if (!set->path.empty()) {
    object["fits_system"] = set->fits_system;
    object["has_several_schemas"] = set->has_several_schemas;
  }
  return object;
}

json object_of(const link_facts& links) {
  json record = object_of(links.record);
  if (links.record.what == entry::kind::file)
    record["text"] =
        links.record.error == 0 ? json(escaped(links.record.text)) : json();
  return {{"in_use", data_in_use(links)},
          {"pair", links.pair.name},
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

}  // namespace

std::string in_json(const report& told) {
  const device_facts& device = told.device;
  json boot{{"ends", told.boot.ends_normally ? "normally" : "abnormally"}};
  if (!told.boot.ends_normally) boot["thrown"] = escaped(told.boot.thrown);
  boot["lines"] = list_of(told.boot.lines, [](const line& said) {
    return json(escaped(said.text));
  });
  boot["steps"] = list_of(told.why.steps, [](const step& done) {
    return json{{"step", done.name},
                {"does", done.does},
                {"reason", done.reason},
                {"text", done.text}};
  });
  boot["after"] = object_of(told.after);
  const json object{
      {"format", 1},
      {"status", static_cast<int>(told.why.is)},
      {"reasons", list_of(told.why.reasons,
                          [](const step& found) {
                            return json{{"subject", found.name},
                                        {"code", found.reason},
                                        {"text", found.text}};
                          })},
      {"now", object_of(device.links)},
      {"system", object_or_null(device.system)},
      {"current", object_or_null(device.current)},
      {"announced", object_or_null(device.update)},
      {"downloads", list_of(device.downloads,
                            [](const download& found) {
                              return json{{"name", escaped(found.name)},
                                          {"needed_by", found.needed_by}};
                            })},
      {"downloads_error", device.downloads_error == 0
                              ? json()
                              : json(std::strerror(device.downloads_error))},
      {"has_more_downloads", device.has_more_downloads},
      {"next_boot", boot},
      {"cannot_know", told.cannot_know}};
  return object.dump(2) + "\n";
}
