// SPDX-License-Identifier: BSD-2-Clause
//
// What marlin-status tells, with any text of a device in every place, in rows
// of any width. The first byte of an input is the width.
#include <algorithm>
#include <nlohmann/json.hpp>
#include <sstream>

#include "tests/fuzz/property.h"
#include "tools/escaped.h"
#include "tools/status/report.h"

namespace {

report with(const std::string& text) {
  report told;
  link_facts& links = told.device.links;
  for (entry* here :
       {&links.zoneinfo, &links.icutz, &links.localtime, &links.tz_latest})
    *here = {entry::kind::link, text};
  links.record = {entry::kind::file, text};
  links.current_path = text;
  dataset_facts& system = told.device.system;
  system.path = system.version_text = system.schema = text;
  system.version.year = 1;
  system.unreadable = {{text, "not there"}};
  told.device.current = told.device.update = system;
  told.device.downloads = {{text, {"zoneinfo"}}};
  told.boot.lines = {{"%s", text, 0}};
  told.boot.thrown = text;
  told.after = links;
  return told;
}

// A terminal shows it, or begins a line.
bool is_plain(const std::string& text) {
  return std::all_of(text.begin(), text.end(), [](char letter) {
    return letter == '\n' || (letter >= ' ' && letter <= '~');
  });
}

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const unsigned width = data[0];
  const std::string text(text_of(data + 1, size - 1));
  const report told = with(text);

  const std::string rows = in_rows(told, {width, false});
  expect(is_plain(rows), "rows are plain");
  // A label and as much again is the least.
  const std::size_t most = std::max(width, 24u);
  std::istringstream lines(rows);
  for (std::string line; std::getline(lines, line);)
    expect(width == 0 || line.size() <= most, "rows fit");

  const std::string object = in_json(told);
  expect(is_plain(object), "JSON is plain");
  const auto read = nlohmann::json::parse(object);
  expect(read["now"]["record"]["text"] == escaped(text), "JSON tells the text");
  return 0;
}
