// SPDX-License-Identifier: BSD-2-Clause
//
// The program from outside: five headers bring every operation and field, under
// the names and with the types, order and slots that others build upon.
#include "dataset/components.h"
#include "dataset/dataset.h"
#include "driver/startup.h"
#include "support/fsutil.h"
#include "support/version.h"

// The device of the tests, and nothing else of this project.
#include "tests/device/device.h"

#include <cstring>
#include <stdexcept>
#include <type_traits>

using namespace device;

namespace {

class Interface : public SoundDeviceTest {
 protected:
  void SetUp() override {
    SoundDeviceTest::SetUp();
    install_update("2024a.1.0", "44l");
  }
};

// Where members stand, in the order of their addresses.
template <typename... Members>
bool stand_in_order(const Members&... members) {
  const void* const places[] = {&members...};
  return std::is_sorted(std::begin(places), std::end(places));
}

// The slot of a virtual operation, as the common C++ ABI for the processors
// that this is built for stores it.
template <typename Operation>
std::ptrdiff_t slot_of(Operation operation) {
  std::ptrdiff_t offset = 0;
  std::memcpy(&offset, &operation, sizeof offset);
  return offset / static_cast<std::ptrdiff_t>(sizeof(void*));
}

TEST_F(Interface, OfTheFileSystem) {
  const std::string path = "/var/db/timezone/link";
  static_assert(std::is_same_v<decltype(fsutil::remove(path)), bool>);
  static_assert(std::is_same_v<decltype(fsutil::exists(path)), bool>);
  static_assert(
      std::is_same_v<decltype(fsutil::read_symlink(path)), std::string>);
  EXPECT_EQ(fsutil::create_symlink("/usr/share", path), 0);
}

TEST_F(Interface, OfVersions) {
  mln_version version("2024a.1.0");
  version.parse("2025b.2");
  static_assert(std::is_same_v<decltype(version.year), std::int32_t>);
  static_assert(std::is_same_v<decltype(version.letters), std::string>);
  static_assert(std::is_same_v<decltype(version.major), std::int32_t>);
  static_assert(std::is_same_v<decltype(version.minor), std::int32_t>);
  static_assert(!std::is_polymorphic_v<mln_version>);
  static_assert(std::is_copy_constructible_v<mln_version> &&
                std::is_copy_assignable_v<mln_version>);
  EXPECT_TRUE(stand_in_order(version.year, version.letters, version.major,
                             version.minor));
  EXPECT_TRUE(version > mln_version());
  EXPECT_TRUE(version == mln_version("2025b.2"));
}

template <typename T>
concept has_another_comparison = requires(T left, T right) {
  left != right;
}
|| requires(T left, T right) { left < right; }
|| requires(T left, T right) { left <= right; }
|| requires(T left, T right) { left >= right; };

TEST_F(Interface, OfVersionsHasTwoComparisonsOnly) {
  static_assert(!has_another_comparison<mln_version>);
  static_assert(has_another_comparison<std::string>);
}

TEST_F(Interface, OfComponents) {
  static_assert(std::is_abstract_v<mln_dataset_component>);
  // One pointer, to the table of virtual operations, and the fields.
  static_assert(sizeof(mln_zoneinfo) ==
                sizeof(void*) + 3 * sizeof(std::string));
  static_assert(sizeof(mln_icu) == sizeof(void*) + 3 * sizeof(std::string));

  mln_zoneinfo tree("/var/db/timezone/tz/2024a.1.0");
  static_assert(std::is_same_v<decltype(tree.version()), std::string>);
  EXPECT_TRUE(stand_in_order(tree.dataset_path, tree.zoneinfo_path,
                             tree.version_string));
  EXPECT_EQ(tree.version(), "2024a");
  mln_icu icu("/var/db/timezone/tz/2024a.1.0");
  EXPECT_TRUE(stand_in_order(icu.dataset_path, icu.schema, icu.icu_path));
}

struct without_activate : mln_dataset_component {
  bool compatible_schema(const mln_dataset_component&) const override {
    return true;
  }

 protected:
  ~without_activate() = default;
};
struct without_compatible_schema : mln_dataset_component {
  void activate() const override {}

 protected:
  ~without_compatible_schema() = default;
};
struct with_a_third : mln_dataset_component {
  virtual void third() const = 0;

 protected:
  ~with_a_third() = default;
};

TEST_F(Interface, OfTheVirtualOperationsIsPureAndHasSlotsInTheirOrder) {
  static_assert(std::is_abstract_v<without_activate>);
  static_assert(std::is_abstract_v<without_compatible_schema>);
  EXPECT_EQ(slot_of(&with_a_third::third), 2) << "there are more than two";
  EXPECT_EQ(slot_of(&mln_dataset_component::compatible_schema), 0);
  EXPECT_EQ(slot_of(&mln_dataset_component::activate), 1);
  EXPECT_GT(slot_of(&mln_zoneinfo::version), 99) << "an address, not a slot";
}

// A second reading leaves what a first one found where now there is nothing.
TEST_F(Interface, OfReadingKeepsWhatWasFound) {
  mln_zoneinfo tree;
  mln_icu system;
  mln_icu icu(update("2024a.1.0"));
  wipe(system_tree);
  wipe(system_icu);
  wipe(update("2024a.1.0") + "/icutz");
  quietly([&] {
    tree.read_version();
    system.initialize();
    icu.initialize();
  });
  EXPECT_EQ(tree.version_string, "2023c");
  EXPECT_EQ(system.schema, "44l");
  EXPECT_EQ(icu.schema, "44l");
}

TEST_F(Interface, OfDataSets) {
  static_assert(!std::is_polymorphic_v<mln_dataset>);
  static_assert(!std::is_copy_constructible_v<mln_dataset> &&
                !std::is_copy_assignable_v<mln_dataset>);
  const mln_dataset system;
  const mln_dataset update("/var/db/timezone/tz/2024a.1.0");
  EXPECT_TRUE(stand_in_order(update.version, update.version_string, update.path,
                             update.components));
  static_assert(std::is_same_v<decltype(update.version), mln_version>);
  EXPECT_TRUE(update > system && !(update == system));
  EXPECT_TRUE(update.compatible_with(system));
  const std::shared_ptr<mln_dataset_component>& first =
      update.components.front();
  EXPECT_NE(first, nullptr);
  update.activate();
  reset_to_system_partition();
  expect_links_at_system();

  mln_dataset again;
  again.create_components();
  EXPECT_EQ(again.components.size(), 4u);
}

TEST_F(Interface, OfTheDriver) {
  void (*const steps[])() = {relax_data_protection, migrate_legacy_icu_link,
                             repair_localtime_link, run_startup_pass};
  EXPECT_EQ(std::size(steps), 4u);
  set_protection_class_d(std::string("/var/db/timezone/"));
  announce("2024a.1.0");
  EXPECT_EQ(latest_update_path(), update("2024a.1.0"));
  EXPECT_EQ(current_dataset_path(), "");
  EXPECT_EQ(dataset_path_from_link(system_tree), "");
}

}  // namespace
