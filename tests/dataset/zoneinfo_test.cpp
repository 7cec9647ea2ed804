// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/zoneinfo.h"

#include <cerrno>

#include "dataset/icu.h"
#include "tests/device/device.h"

using namespace device;

namespace {

const std::string update_path = "/var/db/timezone/tz/2016a.1.0";

class Zoneinfo : public DeviceTest {};
class ZoneinfoActivate : public DeviceTest {};

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

TEST_F(Zoneinfo, WithoutAVersionFileIsQuietlyWithoutAVersion) {
  EXPECT_EQ(quietly([] { return mln_zoneinfo().version(); }), "");
}

TEST_F(Zoneinfo, KeepsTheVersionThatItFirstRead) {
  install_system("2023c", "44l");
  const mln_zoneinfo tree;
  install_system("2024a", "44l");
  EXPECT_EQ(tree.version(), "2023c");
}

TEST_F(Zoneinfo, IsCompatibleWithEveryComponent) {
  install_system("2023c", "44l");
  EXPECT_TRUE(mln_zoneinfo().compatible_schema(mln_zoneinfo(update_path)));
  EXPECT_TRUE(mln_zoneinfo().compatible_schema(mln_icu()));
}

TEST_F(ZoneinfoActivate, LinksItsTreeEvenIfItDoesNotExist) {
  quietly([] { mln_zoneinfo().activate(); });
  EXPECT_EQ(link_at(zoneinfo), "/usr/share/zoneinfo.default");
  quietly([] { mln_zoneinfo(update_path).activate(); });
  EXPECT_EQ(link_at(zoneinfo), "/var/db/timezone/tz/2016a.1.0/zoneinfo");
}

TEST_F(ZoneinfoActivate, MakesALinkThatIsRightAnew) {
  expect_made_anew(zoneinfo, [] { mln_zoneinfo().activate(); });
}

TEST_F(ZoneinfoActivate, OverADirectoryReportsBothFailuresAndThrows) {
  make_directory(zoneinfo);
  throws(
      EEXIST, [] { mln_zoneinfo().activate(); }, zoneinfo_stays(EISDIR),
      cannot_link(zoneinfo, system_tree, EEXIST));
}

}  // namespace
