// SPDX-License-Identifier: BSD-2-Clause
#include <algorithm>
#include <cstring>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/status/report.h"

namespace {

constexpr std::size_t label_width = 12;
constexpr std::size_t most_downloads = 20;

std::string plain(const entry& here) {
  const std::string error = std::strerror(here.error);
  if (here.what == entry::kind::none) return "none";
  if (here.what == entry::kind::link) return "-> " + escaped(here.text);
  if (here.what == entry::kind::unknown) return "(" + error + ")";
  if (here.what == entry::kind::special)
    return "(a FIFO, a socket or a device)";
  return "(a " + kind_of(here) + (here.error == 0 ? ")" : ": " + error + ")");
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
         ", " + schema_of(set);
}

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
  explicit rows(const look& wanted) : look_(wanted) {}

  // A label stands before the first of its rows.
  void add(const std::string& label, const std::string& text) {
    std::string shown = label == last_ ? "" : label;
    shown.resize(label_width, ' ');
    if (look_.has_colour) shown = "\033[1m" + shown + "\033[0m";
    text_ += shown + wrapped(text, look_.width) + "\n";
    last_ = label;
  }
  void add_flaws(const std::string& label, const dataset_facts& set) {
    for (const auto& [path, error] : set.unreadable)
      add(label, escaped(path) + ": " + error);
  }
  std::string text() const { return text_; }

 private:
  look look_;
  std::string last_{};
  std::string text_{};
};

void add_data(rows& shown, const report& told) {
  const link_facts& links = told.device.links;
  const auto& current = told.device.current;
  if (!current) {
    shown.add("in use", links.zoneinfo.what == entry::kind::none
                            ? "none: there is no link zoneinfo"
                            : "none: zoneinfo names no data set");
  } else if (current->path.empty()) {
    shown.add("in use", "the system partition's");
  } else {
    shown.add("in use", "the update " + version_and_schema(*current));
    shown.add("in use", plain(links.zoneinfo));
    shown.add_flaws("in use", *current);
  }
  shown.add("system", version_and_schema(told.device.system));
  shown.add_flaws("system", told.device.system);
}

void add_links(rows& shown, const report& told) {
  const link_facts& links = told.device.links;
  shown.add("links", std::string(links.pair.sentence));
  if (!links.pair.fits) {
    shown.add("links", "zoneinfo " + plain(links.zoneinfo));
    shown.add("links", "icutz " + plain(links.icutz));
  }
  if (told.is_mended_by_a_removal)
    shown.add(
        "links",
        "To mend it remove /var/db/timezone/zoneinfo: the next boot then "
        "links the system partition, or the announced update if it fits.");

  shown.add("announced", plain(links.tz_latest));
  if (told.device.update &&
      told.device.update->ends != dataset_facts::state::bad_path) {
    shown.add("announced", version_and_schema(*told.device.update));
    shown.add_flaws("announced", *told.device.update);
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

void add_downloads(rows& shown, const device_facts& device) {
  const std::size_t count = device.downloads.size();
  for (std::size_t i = 0; i < std::min(count, most_downloads); ++i) {
    const auto& [name, needed_by] = device.downloads[i];
    std::string links;
    for (const auto& link : needed_by)
      links += (links.empty() ? ", for " : ", ") + link;
    shown.add("downloads",
              quoted(name) + (links.empty() ? ", which no link needs" : links));
  }
  if (count > most_downloads)
    shown.add("downloads", std::to_string(count - most_downloads) + " more");
  if (device.has_more_downloads)
    shown.add("downloads",
              "only " + std::to_string(most_names) + " entries were looked at");
  else if (device.downloads_error != 0)
    shown.add("downloads",
              plain({entry::kind::unknown, {}, device.downloads_error}));
  else if (count == 0)
    shown.add("downloads", "none");
}

}  // namespace

std::string in_reasons(const report& told) {
  std::string text;
  for (const auto& reason : told.why.reasons) text += reason.sentence() + "\n";
  return text;
}

std::string in_rows(const report& told, const look& wanted) {
  rows shown(wanted);
  add_data(shown, told);
  add_links(shown, told);
  add_downloads(shown, told.device);
  for (const auto& done : told.why.steps)
    if (done.does != "nothing") shown.add("next boot", done.sentence());
  for (const auto& said : told.boot.lines)
    shown.add("it prints", escaped(said.text));
  for (const auto& text : told.cannot_know) shown.add("unknown", text);
  shown.add("status", told.why.is == verdict::sound
                          ? "sound: the next boot changes nothing"
                      : told.why.is == verdict::changes
                          ? "the next boot changes something"
                          : "something is wrong");
  for (const auto& reason : told.why.reasons)
    shown.add("status", reason.sentence());
  return shown.text();
}
