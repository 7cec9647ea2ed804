// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/dataset.h"

#include <cerrno>
#include <stdexcept>

#include "tests/device/device.h"

using namespace device;

namespace {

class Dataset : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_system("2023c", "44l");
  }
};

// An update reads its version file, but is not named by it.
TEST_F(Dataset, IsBuiltFromItsPath) {
  install_update("2024a.1.0", "45b");
  make_file(update("2024a.1.0") + "/zoneinfo/+VERSION", "2099z\n");
  const auto expect_built = [](const mln_dataset& built,
                               const std::string& path, const char* version,
                               const char* release, const char* schema) {
    EXPECT_EQ(built.path, path);
    EXPECT_EQ(built.version_string, version);
    EXPECT_TRUE(built.version == mln_version(version));
    ASSERT_EQ(built.components.size(), 2u);
    const auto& tree = dynamic_cast<const mln_zoneinfo&>(*built.components[0]);
    const auto& icu = dynamic_cast<const mln_icu&>(*built.components[1]);
    EXPECT_EQ(tree.version(), release);
    EXPECT_EQ(icu.schema, schema);
  };
  quietly([&] {
    expect_built(mln_dataset(), "", "2023c.1.0", "2023c", "44l");
    expect_built(mln_dataset(""), "", "2023c.1.0", "2023c", "44l");
    const std::string path = "/var/db/timezone/tz/2024a.1.0";
    expect_built(mln_dataset(path), path, "2024a.1.0", "2099z", "45b");
  });
}

// The line ends in the error of reading the version file before.
TEST_F(Dataset, OfAPathOutsideTheDownloadRootIsRefused) {
  for (const std::string path :
       {"/", "x", "tz/2024a.1.0", "var/db/timezone/tz/2024a.1.0",
        "/var/db/timezone/tz", "/var/db/timezone/tz/",
        "/var/db/timezone/tz2/2024a.1.0", "/var/db/Timezone/tz/2024a.1.0",
        "/VAR/db/timezone/tz/2024a.1.0", "//var/db/timezone/tz/2024a.1.0",
        "/usr/share/zoneinfo.default", "/var/db/timezone/tz.2024a.1.0",
        "/var/db/timezone/zoneinfo/%s%n"}) {
    const auto build = [&] {
      errno = 0;
      try {
        mln_dataset dataset(path);
        ADD_FAILURE() << "accepted";
      } catch (const std::invalid_argument& refusal) {
        EXPECT_STREQ(refusal.what(), "badpath");
      }
    };
    prints(build, bad_path(path));
  }
}

TEST_F(Dataset, IsEqualByItsPathAloneEvenIfTheDiskChanged) {
  for (const std::string version : {"2024a.1.0", "2024a.1.00", "2024a.01.0"})
    install_update(version, "44l");
  const mln_dataset system;
  const mln_dataset before(update("2024a.1.0"));
  install_system("2024a", "45l");
  install_update("2024a.1.0", "45l");
  EXPECT_TRUE(system == mln_dataset());
  EXPECT_TRUE(before == mln_dataset(update("2024a.1.0")));
  EXPECT_FALSE(before == system);
  // Of the same version and length, and of the same tree.
  const mln_dataset left(update("2024a.1.00"));
  const mln_dataset right(update("2024a.01.0"));
  EXPECT_FALSE(left == right || left > right || right > left);
}

TEST_F(Dataset, IsNewerByItsVersionAlone) {
  install_update("2023c.1.1", "9b");
  const mln_dataset system;
  const mln_dataset newer(update("2023c.1.1"));
  EXPECT_TRUE(newer > system);
  EXPECT_FALSE(system > newer);
  // An update's is its path; the system's may have changed with the disk.
  install_system("2023d", "44l");
  make_file(update("2023c.1.1") + "/zoneinfo/+VERSION", "2023d");
  EXPECT_FALSE(mln_dataset(update("2023c.1.1")) > newer);
  EXPECT_TRUE(mln_dataset() > system);
  EXPECT_FALSE(system > mln_dataset());
}

TEST_F(Dataset, AsksItsOwnComponents) {
  mln_dataset trees;
  mln_dataset icu_data;
  trees.components = {std::make_shared<mln_zoneinfo>()};
  icu_data.components = {std::make_shared<mln_icu>()};
  EXPECT_TRUE(trees.compatible_with(icu_data));
  printed_by([&] { EXPECT_FALSE(icu_data.compatible_with(trees)); });
}

TEST_F(Dataset, OfTheSystemIsActivatedUpToTheFirstFailure) {
  make_directory(zoneinfo);
  make_link(icutz, "/var/db/old");
  throws(EEXIST, reset_to_system_partition, zoneinfo_stays(EISDIR),
         cannot_link(zoneinfo, system_tree, EEXIST));
  EXPECT_EQ(link_at(icutz), "/var/db/old");
}

}  // namespace
