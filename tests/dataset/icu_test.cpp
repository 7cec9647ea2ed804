// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu.h"

#include <unistd.h>

#include <cerrno>
#include <functional>

#include "dataset/zoneinfo.h"
#include "tests/device/device.h"

using namespace device;

namespace {

const std::string update_path = "/var/db/timezone/tz/2024a.1.0";
const std::string icu_directory = update_path + "/icutz";
const std::string data_file = icu_directory + "/icutz44l.dat";

class IcuSchema : public DeviceTest {
 protected:
  static std::string of_update() { return mln_icu(update_path).schema; }
};
class IcuCompatibility : public DeviceTest {};
class IcuActivate : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    install_update("2024a.1.0", "44l");
  }
  static void activate() { mln_icu(update_path).activate(); }
};

TEST_F(IcuSchema, OfTheSystemIsTheFirstWordOfItsFormatFileInAnyForm) {
  for (const std::string word : {"44l", "any%thing", "44L", "icutz44l.dat"}) {
    make_file(system_icu + "/icutzformat.txt", "\n " + word + " 45l\n");
    for (const mln_icu& icu : {mln_icu(), mln_icu("")}) {
      EXPECT_EQ(icu.dataset_path, "");
      EXPECT_EQ(icu.icu_path, "/usr/share/icu");
      EXPECT_EQ(icu.schema, word);
    }
  }
}

TEST_F(IcuSchema, OfASystemWithoutAFormatFileIsQuietlyEmpty) {
  make_file(system_icu + "/icutz44l.dat");
  EXPECT_EQ(quietly([] { return mln_icu().schema; }), "");
}

// The path is taken as it is given.
TEST_F(IcuSchema, OfAnUpdateStandsInTheNameOfItsDataFile) {
  make_file(data_file);
  for (const auto& path : {update_path, update_path + "/"})
    quietly([&] {
      const mln_icu icu(path);
      EXPECT_EQ(icu.dataset_path, path);
      EXPECT_EQ(icu.icu_path, path + "/icutz");
      EXPECT_EQ(icu.schema, "44l");
    });
}

TEST_F(IcuSchema, IsTakenFromAnyFileThatOthersMayReadAlsoIfItIsHardLinked) {
  make_file(data_file);
  ASSERT_EQ(::link(data_file.c_str(), "/var/db/timezone/tz/data"), 0);
  for (const mode_t mode : {0004u, 0005u, 0006u, 07604u, 07777u}) {
    set_mode(data_file, mode);
    EXPECT_EQ(of_update(), "44l") << std::oct << mode;
  }
}

TEST_F(IcuSchema, IsFoundThroughALinkToTheIcuDirectory) {
  make_file("/var/db/elsewhere/icutz44l.dat");
  make_link(icu_directory, "/var/db/elsewhere");
  EXPECT_EQ(of_update(), "44l");
}

TEST_F(IcuSchema, LeavesTheWorkingDirectoryAlone) {
  make_file(data_file);
  make_file(icu_directory + "/below/x");
  ASSERT_EQ(::chdir("/usr/share"), 0);
  EXPECT_EQ(of_update(), "44l");
  char after[100];
  EXPECT_STREQ(::getcwd(after, sizeof after), "/usr/share");
}

// What may be in the place of an update's ICU data without being any.
TEST_F(IcuSchema, IsNotFoundInWhatOnlyLooksLikeData) {
  const std::string elsewhere = "/var/db/timezone/icutz44l.dat";
  make_file(elsewhere);
  const std::pair<const char*, std::function<void()>> useless[] = {
      {"no directory", [] {}},
      {"an empty directory", [] { make_directory(icu_directory); }},
      {"a file for a directory", [] { make_file(icu_directory); }},
      {"a link to a data file for a directory",
       [&] { make_link(icu_directory, elsewhere); }},
      {"a dangling link for a directory",
       [] { make_link(icu_directory, "/var/db/gone"); }},
      {"a directory that may not be read",
       [] { make_file(data_file), set_mode(icu_directory, 0311); }},
      {"a directory that may not be searched",
       [] { make_file(data_file), set_mode(icu_directory, 0644); }},
      {"a format file", [] { make_file(icu_directory + "/icutzformat.txt"); }},
      {"a subdirectory",
       [] { make_file(icu_directory + "/below/icutz44l.dat"); }},
      {"a link to a data file", [&] { make_link(data_file, elsewhere); }},
      {"a directory for a data file", [] { make_directory(data_file); }},
      {"a FIFO for a data file", [] { make_fifo(data_file); }},
      {"a file that others may not read",
       [] { make_file(data_file, "", 0770); }},
  };
  for (const auto& [name, make] : useless) {
    SCOPED_TRACE(name);
    wipe(update_path);
    make_directory(update_path);
    make();
    prints([] { EXPECT_EQ(of_update(), ""); }, no_schema_in(update_path));
  }
}

TEST_F(IcuCompatibility, AsksForTheSameSchemaByteForByte) {
  std::vector<mln_icu> all;
  // Only the system can have these two.
  for (const auto& format : {std::string("44L"), std::string("44l\0x", 5)}) {
    install_system("2023c", format);
    all.emplace_back();
  }
  for (const char* schema : {"44l", "44b", "044l", "4l"}) {
    install_update(schema, schema);
    all.emplace_back(update(schema));
  }
  printed_by([&] { all.emplace_back(update("none")); });
  wipe(system_icu);
  all.emplace_back();
  for (const auto& left : all)
    for (const auto& right : all)
      EXPECT_EQ(left.compatible_schema(right), left.schema == right.schema)
          << left.schema << ", " << right.schema;
}

TEST_F(IcuCompatibility, WithAnotherClassIsReportedAndRefused) {
  prints([] { EXPECT_FALSE(mln_icu().compatible_schema(mln_zoneinfo())); },
         failure("mln_icu::compatible_schema: could not dynamic_cast other "
                 "component",
                 ENOENT));
}

TEST_F(IcuActivate, LinksAnUpdatesDirectory) {
  make_link(icutz, "/var/db/old");
  make_link(legacy_icutz, "/var/db/older");
  quietly(activate);
  EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/2024a.1.0/icutz");
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(IcuActivate, MakesALinkThatIsRightAnew) {
  expect_made_anew(icutz, activate);
}

TEST_F(IcuActivate, CreatesNoLinkForTheSystemPartition) {
  make_link(icutz, "/var/db/old");
  make_link(legacy_icutz, "/var/db/older");
  quietly([] { mln_icu().activate(); });
  EXPECT_EQ(link_at(icutz), nothing);
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(IcuActivate, OverADirectoryLeavesTheLegacyLinkAndThrowsForAnUpdate) {
  make_directory(icutz);
  make_link(legacy_icutz, "/var/db/older");
  throws(EEXIST, activate, icu_link_stays(icutz, EISDIR),
         cannot_link(icutz, "/var/db/timezone/tz/2024a.1.0/icutz", EEXIST));
  prints([] { mln_icu().activate(); }, icu_link_stays(icutz, EISDIR));
  EXPECT_EQ(link_at(legacy_icutz), "/var/db/older");
}

TEST_F(IcuActivate, WithALegacyDirectoryStillLinks) {
  make_link(icutz, "/var/db/old");
  make_directory(legacy_icutz);
  prints(activate, icu_link_stays(legacy_icutz, EISDIR));
  EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/2024a.1.0/icutz");
}

}  // namespace
