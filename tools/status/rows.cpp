// SPDX-License-Identifier: BSD-2-Clause
#include <algorithm>
#include <cstring>
#include <utility>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/status/report.h"

namespace {

constexpr std::size_t label_width = 12;
constexpr std::size_t most_downloads = 20;

std::string error_text(int error) {
  return std::string("(") + std::strerror(error) + ")";
}

std::string plain(const entry& here) {
  switch (here.what) {
    case entry::kind::link:
      return "-> " + escaped(here.text);
    case entry::kind::unknown:
      return error_text(here.error);
    case entry::kind::none:
      return "none";
    case entry::kind::special:
      return "(a FIFO, a socket or a device)";
    default:
      return "(a " + kind_of(here) +
             (here.error == 0
                  ? ")"
                  : ": " + std::string(std::strerror(here.error)) + ")");
  }
}

// What is between quotes is a text of the device, and only that.
std::string quoted(const std::string& text) {
  std::string shown = escaped(text);
  for (std::size_t at = 0; (at = shown.find('"', at)) != std::string::npos;)
    shown.replace(at, 1, "\\x22");
  return '"' + shown + '"';
}

std::string version_and_schema(const dataset_facts& set) {
  if (set.ends == dataset_facts::state::number_too_large)
    return "a number in its version is too large";
  return (set.has_version() ? escaped(set.version_text)
                            : std::string("no version")) +
         (set.schema.empty() ? std::string(", no ICU schema")
                             : ", ICU schema " + escaped(set.schema));
}

// Breaks at blanks where it can.
std::string wrapped(std::string text, std::size_t columns) {
  const std::size_t width = std::max(columns, 2 * label_width) - label_width;
  std::string lines;
  while (columns > 0 && text.size() > width) {
    std::size_t end = text.rfind(' ', width);
    if (end == std::string::npos || end == 0) end = width;
    lines += text.substr(0, end) + "\n" + std::string(label_width, ' ');
    text.erase(0, end + (text[end] == ' ' ? 1 : 0));
  }
  return lines + text;
}

class rows {
 public:
  void add(const std::string& label, const std::string& text) {
    rows_.emplace_back(label, text);
  }
  void add_all(const char* label, const std::vector<std::string>& texts) {
    for (const auto& text : texts) add(std::exchange(label, ""), text);
  }
  std::string shown(const look& wanted) const {
    std::string lines;
    for (auto [label, text] : rows_) {
      label.resize(label_width, ' ');
      if (wanted.has_colour) label = "\033[1m" + label + "\033[0m";
      lines += label + wrapped(text, wanted.width) + "\n";
    }
    return lines;
  }

 private:
  std::vector<std::pair<std::string, std::string>> rows_{};
};

void add_flaws(rows& shown, const dataset_facts& set) {
  for (const auto& [path, error] : set.unreadable)
    shown.add("", escaped(path) + ": " + error);
}

void add_data(rows& shown, const report& told) {
  const link_facts& links = told.device.links;
  if (!told.device.current)
    shown.add("in use", links.zoneinfo.what == entry::kind::none
                            ? "none: there is no link zoneinfo"
                            : "none: zoneinfo names no data set");
  else if (links.current_path->empty())
    shown.add("in use", "the system partition's");
  else
    shown.add("in use",
              "the update " + version_and_schema(*told.device.current));
  if (told.device.current && !told.device.current->path.empty()) {
    shown.add("", plain(links.zoneinfo));
    add_flaws(shown, *told.device.current);
  }
  shown.add("system", version_and_schema(told.device.system));
  add_flaws(shown, told.device.system);
}

void add_links(rows& shown, const report& told) {
  const link_facts& links = told.device.links;
  shown.add("links", std::string(links.pair.sentence));
  if (!links.pair.fits) {
    shown.add("", "zoneinfo " + plain(links.zoneinfo));
    shown.add("", "icutz " + plain(links.icutz));
  }
  if (told.is_mended_by_a_removal)
    shown.add(
        "",
        "To mend it remove /var/db/timezone/zoneinfo: the next boot then "
        "links the system partition, or the announced update if it fits.");

  shown.add("announced", plain(links.tz_latest));
  if (told.device.update &&
      told.device.update->ends != dataset_facts::state::bad_path) {
    shown.add("", version_and_schema(*told.device.update));
    add_flaws(shown, *told.device.update);
  }

  const std::string zone = zone_of(links);
  shown.add("local zone",
            (zone.empty() ? plain(links.localtime) : quoted(zone)) +
                (links.zone_is_file ? "" : ", which leads to no file"));
  const bool is_read =
      links.record.what == entry::kind::file && links.record.error == 0;
  shown.add("record",
            is_read ? quoted(links.record.text) : plain(links.record));
}

void add_downloads(rows& shown, const report& told) {
  const char* label = "downloads";
  const auto& found = told.device.downloads;
  for (std::size_t i = 0; i < found.size() && i < most_downloads; ++i) {
    std::string links;
    for (const auto& link : found[i].needed_by)
      links += (links.empty() ? ", for " : ", ") + link;
    shown.add(label, quoted(found[i].name) +
                         (links.empty() ? ", which no link needs" : links));
    label = "";
  }
  if (found.size() > most_downloads)
    shown.add("", std::to_string(found.size() - most_downloads) + " more");
  if (told.device.has_more_downloads)
    shown.add(label,
              "only " + std::to_string(most_names) + " entries were looked at");
  else if (told.device.downloads_error != 0)
    shown.add(label, error_text(told.device.downloads_error));
  else if (found.empty())
    shown.add(label, "none");
}

void add_boot(rows& shown, const report& told) {
  std::vector<std::string> steps;
  for (const auto& done : told.why.steps)
    if (done.does != "nothing") steps.push_back(done.sentence());
  std::vector<std::string> lines;
  for (const auto& said : told.boot.lines) lines.push_back(escaped(said.text));
  shown.add_all("next boot", steps);
  shown.add_all("it prints", lines);
  shown.add_all("unknown", told.cannot_know);
}

}  // namespace

std::string in_reasons(const report& told) {
  std::string text;
  for (const auto& reason : told.why.reasons) text += reason.sentence() + "\n";
  return text;
}

std::string in_rows(const report& told, const look& wanted) {
  rows shown;
  add_data(shown, told);
  add_links(shown, told);
  add_downloads(shown, told);
  add_boot(shown, told);
  shown.add("status", told.why.is == verdict::sound
                          ? "sound: the next boot changes nothing"
                      : told.why.is == verdict::changes
                          ? "the next boot changes something"
                          : "something is wrong");
  for (const auto& reason : told.why.reasons) shown.add("", reason.sentence());
  return shown.shown(wanted);
}
