// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/zoneinfo.h"

#include "tests/device/device.h"

using namespace device;

namespace {

const std::string update_path = "/var/db/timezone/tz/2016a.1.0";

class Zoneinfo : public DeviceTest {};

TEST_F(Zoneinfo, OfAnEmptyPathIsTheSystemTree) {
  install_system("2023c", "44l");
  for (const mln_zoneinfo& tree : {mln_zoneinfo(), mln_zoneinfo("")}) {
    EXPECT_EQ(tree.dataset_path, "");
    EXPECT_EQ(tree.zoneinfo_path, "/usr/share/zoneinfo.default");
    EXPECT_EQ(tree.version_string, "2023c");
    EXPECT_EQ(tree.version(), "2023c");
  }
}

TEST_F(Zoneinfo, OfAnUpdateIsTheTreeInItsDirectory) {
  make_file(update_path + "/zoneinfo/+VERSION", "\n  2016a,x and more\n");
  const mln_zoneinfo tree(update_path);
  EXPECT_EQ(tree.dataset_path, update_path);
  EXPECT_EQ(tree.zoneinfo_path, "/var/db/timezone/tz/2016a.1.0/zoneinfo");
  EXPECT_EQ(tree.version(), "2016a,x");
}

TEST_F(Zoneinfo, MakesALinkThatIsRightAnew) {
  expect_made_anew(zoneinfo, [] { mln_zoneinfo().activate(); });
}

}  // namespace
