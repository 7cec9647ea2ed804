// SPDX-License-Identifier: BSD-2-Clause
#include <cstring>

#include "support/paths.h"
#include "tools/escaped.h"
#include "tools/status/report.h"
#include "tools/status/words.h"

namespace {

constexpr std::size_t label_width = 12;
constexpr std::size_t most_downloads = 20;

std::string plain(const entry& here) {
  switch (here.what) {
    case entry::kind::link:
      return "-> " + escaped(here.text);
    case entry::kind::unknown:
      return std::string("(").append(std::strerror(here.error)).append(")");
    case entry::kind::none:
      return "none";
    case entry::kind::special:
      return "(a FIFO, a socket or a device)";
    default:
      return std::string("(a ").append(kind_of(here)).append(")");
  }
}

std::string version_and_schema(const dataset_facts& set) {
  return (set.has_version() ? escaped(set.version_text) : "no version") + ", " +
         (set.schema.empty() ? "no ICU schema"
                             : "ICU schema " + escaped(set.schema));
}

const char* sentence_of(link_pair pair) {
  switch (pair) {
    case link_pair::system:
    case link_pair::update:
      return "zoneinfo and icutz name the same data";
    case link_pair::update_without_icu:
      return "zoneinfo names an update, but there is no link icutz";
    case link_pair::update_with_other_icu:
      return "icutz does not name the ICU data of zoneinfo's update";
    case link_pair::system_with_icu:
      return "zoneinfo names the system partition, but there is a link icutz";
    case link_pair::not_the_tree:
      return "zoneinfo leads into an update, but not to its tree";
    case link_pair::no_dataset:
      break;
  }
  return "zoneinfo names no data set";
}

// Breaks at blanks where it can.
std::string wrapped(std::string text, std::size_t width) {
  std::string lines;
  while (width > 0 && text.size() > width) {
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

  void add(std::string label, const std::string& text) {
    label.resize(label_width, ' ');
    const std::size_t width = look_.width == 0 ? 0
                              : look_.width > 2 * label_width
                                  ? look_.width - label_width
                                  : label_width;
    text_ += bold(label) + wrapped(text, width) + "\n";
  }
  std::string text() const { return text_; }

 private:
  std::string bold(const std::string& label) const {
    return look_.has_colour ? "\033[1m" + label + "\033[0m" : label;
  }

  look look_;
  std::string text_{};
};

void add_data(rows& shown, const report& told) {
  const link_facts& links = told.device.links;
  if (!told.device.current)
    shown.add("in use", "none: zoneinfo " + plain(links.zoneinfo));
  else if (links.current_path->empty())
    shown.add("in use", "the system partition's");
  else
    shown.add("in use",
              "the update " + version_and_schema(*told.device.current));
  if (told.device.current && !links.current_path->empty())
    shown.add("", escaped(links.zoneinfo.text));
  shown.add("system", version_and_schema(told.device.system));
  for (const auto& file : told.device.system.unreadable)
    shown.add("", escaped(file));
  if (told.device.current && !told.device.current->path.empty())
    for (const auto& file : told.device.current->unreadable)
      shown.add("", escaped(file));
}

void add_links(rows& shown, const report& told) {
  const link_facts& links = told.device.links;
  shown.add("links", sentence_of(links.pair));
  if (links.pair != link_pair::system && links.pair != link_pair::update) {
    shown.add("", "zoneinfo " + plain(links.zoneinfo));
    shown.add("", "icutz " + plain(links.icutz));
    if (links.pair != link_pair::no_dataset)
      shown.add("",
                "Remove /var/db/timezone/zoneinfo: the next boot then makes "
                "both anew.");
  }
  if (!told.device.update)
    shown.add("announced", plain(links.tz_latest));
  else if (told.device.update->ends == dataset_facts::state::built)
    shown.add("announced", version_and_schema(*told.device.update));
  else
    shown.add("announced", plain(links.tz_latest));
  if (told.device.update)
    for (const auto& file : told.device.update->unreadable)
      shown.add("", escaped(file));

  const std::string zone = zone_of(links);
  shown.add("local zone",
            (zone.empty() ? plain(links.localtime) : escaped(zone)) +
                (links.zone_is_file ? "" : ", which cannot be reached"));
  shown.add("record", links.record.what == entry::kind::file
                          ? escaped(links.record.text)
                          : plain(links.record));
}

void add_downloads(rows& shown, const report& told) {
  const char* label = "downloads";
  const auto& names = told.device.downloads;
  for (std::size_t i = 0; i < names.size() && i < most_downloads; ++i) {
    const std::string needed = needed_by(told.device.links, names[i]);
    shown.add(label,
              escaped(names[i]) + (needed.empty() ? ", which no link needs"
                                                  : ", for " + needed));
    label = "";
  }
  if (names.size() > most_downloads)
    shown.add("", std::to_string(names.size() - most_downloads) + " more");
  if (names.empty())
    shown.add(label, told.device.downloads_error == 0
                         ? "none"
                         : std::string("none: ") +
                               std::strerror(told.device.downloads_error));
}

void add_boot(rows& shown, const report& told) {
  const char* label = "next boot";
  for (const auto& done : told.why.steps) {
    if (done.does == "nothing") continue;
    std::string name = done.name;
    for (char& letter : name)
      if (letter == '_') letter = ' ';
    shown.add(label, name + ": " + done.text);
    label = "";
  }
  label = "it prints";
  for (const auto& said : told.boot.lines) {
    shown.add(label, escaped(said.text));
    label = "";
  }
  label = "unknown";
  for (const auto& text : told.cannot_know) {
    shown.add(label, text);
    label = "";
  }
}

}  // namespace

std::string in_reasons(const report& told) {
  std::string text;
  for (const auto& reason : told.why.reasons) text += reason + "\n";
  return text;
}

std::string in_rows(const report& told, const look& wanted) {
  rows shown(wanted);
  add_data(shown, told);
  add_links(shown, told);
  add_downloads(shown, told);
  add_boot(shown, told);
  switch (told.why.is) {
    case verdict::sound:
      shown.add("status", "sound: the next boot changes nothing");
      break;
    case verdict::changes:
      shown.add("status", "the next boot changes something");
      break;
    case verdict::wrong:
      shown.add("status", "something is wrong");
      break;
  }
  for (const auto& reason : told.why.reasons) shown.add("", reason);
  return shown.text();
}
