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

  static const mln_zoneinfo& zoneinfo_of(const mln_dataset& dataset) {
    return dynamic_cast<const mln_zoneinfo&>(*dataset.components.at(0));
  }
  static const mln_icu& icu_of(const mln_dataset& dataset) {
    return dynamic_cast<const mln_icu&>(*dataset.components.at(1));
  }
  static std::string refusal_of(const std::string& path) {
    try {
      mln_dataset dataset(path);
    } catch (const std::invalid_argument& refusal) {
      return refusal.what();
    }
    return "accepted";
  }
};
class DatasetActivate : public Dataset {};
class ResetToSystemPartition : public Dataset {};

TEST_F(Dataset, IsBuiltFromItsPath) {
  install_update("2024a.1.0", "45b");
  const auto expect_built = [](const mln_dataset& built, const char* path,
                               const char* version, const char* tree,
                               const char* icu, const char* schema) {
    EXPECT_EQ(built.path, path);
    EXPECT_EQ(built.version_string, version);
    EXPECT_TRUE(built.version == mln_version(version));
    ASSERT_EQ(built.components.size(), 2u);
    EXPECT_EQ(zoneinfo_of(built).zoneinfo_path, tree);
    EXPECT_EQ(icu_of(built).icu_path, icu);
    EXPECT_EQ(icu_of(built).schema, schema);
  };
  quietly([&] {
    const mln_dataset implied;
    const mln_dataset named("");
    for (const mln_dataset* system : {&implied, &named})
      expect_built(*system, "", "2023c.1.0", "/usr/share/zoneinfo.default",
                   "/usr/share/icu", "44l");
    const mln_dataset update("/var/db/timezone/tz/2024a.1.0");
    expect_built(update, "/var/db/timezone/tz/2024a.1.0", "2024a.1.0",
                 "/var/db/timezone/tz/2024a.1.0/zoneinfo",
                 "/var/db/timezone/tz/2024a.1.0/icutz", "45b");
  });
}

TEST_F(Dataset, OfAnUpdateReadsItsVersionFileButIsNotNamedByIt) {
  install_update("2024a.1.0", "44l");
  make_file(update("2024a.1.0") + "/zoneinfo/+VERSION", "2099z\n");
  const mln_dataset dataset(update("2024a.1.0"));
  EXPECT_EQ(dataset.version_string, "2024a.1.0");
  EXPECT_EQ(zoneinfo_of(dataset).version(), "2099z");
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
      EXPECT_EQ(refusal_of(path), "badpath");
    };
    prints(build, bad_path(path));
  }
}

TEST_F(Dataset, OfAPathThatEndsInNoVersionIsTakenAsItIsWithAnUnsetVersion) {
  for (const std::string name : {"x", "a/b", "2024a.1.0/"}) {
    const std::string path = update(name);
    const auto build = [&] {
      const mln_dataset dataset(path);
      EXPECT_EQ(dataset.path, path);
      EXPECT_EQ(dataset.version_string, name);
      EXPECT_TRUE(dataset.version == mln_version());
      ASSERT_EQ(dataset.components.size(), 2u);
      EXPECT_EQ(zoneinfo_of(dataset).zoneinfo_path, path + "/zoneinfo");
    };
    prints(build, unparsed(name), no_schema_in(path));
  }
}

TEST_F(Dataset, OfASystemAlwaysGetsItsTwoNumbers) {
  for (const std::string release : {"", "2023c.1.0"}) {
    install_system(release, "44l");
    const auto build = [&] {
      errno = EXDEV;
      const mln_dataset system;
      EXPECT_EQ(system.version_string, release + ".1.0");
      EXPECT_TRUE(system.version == mln_version());
    };
    prints(build, unparsed(release + ".1.0", EXDEV));
  }
}

TEST_F(Dataset, IsTheOnlyOwnerOfItsComponents) {
  std::weak_ptr<mln_dataset_component> component;
  {
    const mln_dataset system;
    for (const auto& held : system.components) EXPECT_EQ(held.use_count(), 1);
    component = system.components.back();
  }
  EXPECT_TRUE(component.expired());
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
  const auto slash = [&] {
    return mln_dataset(update("2024a.1.0/")) == before;
  };
  printed_by([&] { EXPECT_FALSE(slash()); });
}

TEST_F(Dataset, IsNewerByItsVersionAlone) {
  install_update("2023c.1.0", "44l");
  install_update("2023c.1.1", "9b");
  const mln_dataset system;
  const mln_dataset equal(update("2023c.1.0"));
  const mln_dataset newer(update("2023c.1.1"));
  EXPECT_TRUE(newer > system);
  EXPECT_FALSE(system > newer);
  EXPECT_FALSE(equal > system);
  EXPECT_FALSE(system > equal);
  // An update's is its path; the system's may have changed with the disk.
  install_system("2023d", "44l");
  make_file(update("2023c.1.1") + "/zoneinfo/+VERSION", "2023d");
  EXPECT_FALSE(mln_dataset(update("2023c.1.1")) > newer);
  EXPECT_TRUE(mln_dataset() > system);
  EXPECT_FALSE(system > mln_dataset());
}

TEST_F(Dataset, IsCompatibleWithItselfAndWithTheSameSchemaOnly) {
  install_update("2024a.1.0", "44l");
  install_update("2024b.1.0", "45l");
  const mln_dataset system;
  const mln_dataset same(update("2024a.1.0"));
  const mln_dataset other(update("2024b.1.0"));
  EXPECT_TRUE(system.compatible_with(system));
  EXPECT_TRUE(same.compatible_with(system));
  EXPECT_FALSE(other.compatible_with(system));
}

TEST_F(Dataset, AsksItsOwnComponents) {
  mln_dataset trees;
  mln_dataset icu_data;
  trees.components = {std::make_shared<mln_zoneinfo>()};
  icu_data.components = {std::make_shared<mln_icu>()};
  EXPECT_TRUE(trees.compatible_with(icu_data));
  printed_by([&] { EXPECT_FALSE(icu_data.compatible_with(trees)); });
}

TEST_F(DatasetActivate, LinksTheZoneinfoTreeThenTheIcuData) {
  install_update("2024a.1.0", "44l");
  quietly([] { mln_dataset(update("2024a.1.0")).activate(); });
  expect_links_at_update("2024a.1.0");
}

TEST_F(DatasetActivate, StopsAtTheFirstComponentThatThrows) {
  install_update("2024a.1.0", "44l");
  const auto fails = [] {
    printed_by([] {
      const mln_dataset update("/var/db/timezone/tz/2024a.1.0");
      EXPECT_EQ(thrown_by([&] { update.activate(); }), EEXIST);
    });
  };
  make_directory(zoneinfo);
  make_link(icutz, "/var/db/old");
  fails();
  EXPECT_EQ(link_at(icutz), "/var/db/old");

  wipe(zoneinfo);
  make_directory(icutz);
  fails();
  EXPECT_EQ(link_at(zoneinfo), "/var/db/timezone/tz/2024a.1.0/zoneinfo");
}

TEST_F(ResetToSystemPartition, LinksTheSystemTreeAndTouchesNothingElse) {
  install_and_use("2024a.1.0", "44l");
  announce("2024a.1.0");
  point_localtime_at("anything");
  quietly(reset_to_system_partition);
  expect_links_at_system();
  EXPECT_EQ(link_at(tz_latest), update("2024a.1.0"));
  EXPECT_EQ(link_at(local_time), "anything");
  EXPECT_EQ(file_at(record), nothing);
}

TEST_F(ResetToSystemPartition, PassesOnWhatActivatingThrows) {
  make_directory(zoneinfo);
  make_link(icutz, "/var/db/old");
  throws(EEXIST, reset_to_system_partition, zoneinfo_stays(EISDIR),
         cannot_link(zoneinfo, system_tree, EEXIST));
  EXPECT_EQ(link_at(icutz), "/var/db/old");
}

TEST_F(ResetToSystemPartition, PassesOnWhatBuildingThrows) {
  install_system("2147483648a", "44l");
  EXPECT_THROW(reset_to_system_partition(), std::out_of_range);
  EXPECT_EQ(link_at(zoneinfo), nothing);
}

}  // namespace
