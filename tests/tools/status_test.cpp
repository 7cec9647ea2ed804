// SPDX-License-Identifier: BSD-2-Clause
//
// The parts of marlin-status that need no device. What it says of devices is
// compared with real boots elsewhere.
#include <gmock/gmock.h>

#include <nlohmann/json.hpp>

#include "tools/status/report.h"

namespace {

using testing::AllOf;
using testing::AnyOf;
using testing::Each;
using testing::Ge;
using testing::HasSubstr;
using testing::Le;

std::string all_bytes() {
  std::string bytes;
  for (int byte = 1; byte < 256; ++byte) bytes += static_cast<char>(byte);
  return bytes;
}

// A report in which every text of the device is hostile.
report hostile() {
  report told;
  told.device.links.zoneinfo = {entry::kind::link, all_bytes()};
  told.device.links.localtime = {entry::kind::link, all_bytes()};
  told.device.links.tz_latest = {entry::kind::link, all_bytes()};
  told.device.links.record = {entry::kind::file, all_bytes()};
  told.device.system.version_text = all_bytes();
  told.device.system.version.year = 1;
  told.device.system.schema = all_bytes();
  told.device.system.unreadable = {{all_bytes(), "not there"}};
  told.device.update = told.device.system;
  told.device.update->path = all_bytes();
  told.device.downloads = {{all_bytes(), {"zoneinfo"}}};
  told.boot.lines = {{"%s", all_bytes(), 0}};
  told.after = told.device.links;
  return told;
}

// A terminal shows it, or begins a line.
const auto plain_byte = AnyOf('\n', AllOf(Ge(' '), Le('~')));

TEST(Json, HoldsAnyBytes) {
  const std::string text = in_json(hostile());
  const auto object = nlohmann::json::parse(text);
  EXPECT_THAT(object["now"]["zoneinfo"]["target"].get<std::string>(),
              HasSubstr("\\x0a"));
  EXPECT_THAT(text, Each(plain_byte));
}

TEST(Rows, HoldNoByteThatATerminalObeys) {
  EXPECT_THAT(in_rows(hostile(), {}), Each(plain_byte));
}

TEST(Rows, TellAMissingLinkFromOneThatReadsSo) {
  report told;
  told.device.links.tz_latest = {entry::kind::link, "none"};
  EXPECT_THAT(in_rows(told, {}), HasSubstr("announced   -> none\n"));
  told.device.links.tz_latest = {};
  EXPECT_THAT(in_rows(told, {}), HasSubstr("announced   none\n"));
  told.device.links.tz_latest = {entry::kind::directory};
  EXPECT_THAT(in_rows(told, {}), HasSubstr("announced   (a directory)\n"));
}

TEST(Zone, IsWhatFollowsTheTree) {
  link_facts links;
  const auto zone_in = [&](const std::string& target) {
    links.localtime = {entry::kind::link, target};
    return zone_of(links);
  };
  EXPECT_EQ(zone_in("/var/db/timezone/zoneinfo/Europe/Paris"), "Europe/Paris");
  EXPECT_EQ(zone_in("/var/db/timezone/zoneinfox"), "");
  EXPECT_EQ(zone_in("/var/db/timezone/zoneinfo"), "");
}

TEST(Rows, TellANameFromWhatIsSaidOfIt) {
  report told;
  told.device.downloads = {{"x\", for \"y", {}}};
  told.device.links.record = {entry::kind::file, "none"};
  EXPECT_THAT(in_rows(told, {}),
              HasSubstr("downloads   \"x\\x22, for \\x22y\", which no link "
                        "needs\n"));
  EXPECT_THAT(in_rows(told, {}), HasSubstr("record      \"none\"\n"));
}

}  // namespace
