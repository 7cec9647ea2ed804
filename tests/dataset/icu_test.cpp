// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/icu.h"

#include <unistd.h>

#include <cerrno>

#include "dataset/zoneinfo.h"
#include "tests/device/device.h"

using namespace device;

namespace {

const std::string update_path = "/var/db/timezone/tz/2024a.1.0";
const std::string icu_directory = update_path + "/icutz";

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
};

const auto no_schema_found =
    failure("No ICU schema found for /var/db/timezone/tz/2024a.1.0", 0);

TEST_F(IcuSchema, OfTheSystemIsTheFirstWordOfItsFormatFile) {
  make_file(system_icu + "/icutzformat.txt", "\n 44l and more\n");
  for (const mln_icu& icu : {mln_icu(), mln_icu("")}) {
    EXPECT_EQ(icu.dataset_path, "");
    EXPECT_EQ(icu.icu_path, "/usr/share/icu");
    EXPECT_EQ(icu.schema, "44l");
  }
}

TEST_F(IcuSchema, OfTheSystemIsNotCheckedForItsForm) {
  for (const std::string word : {"any%thing", "44L", "#44l", "icutz44l.dat"}) {
    make_file(system_icu + "/icutzformat.txt", word + " 44l");
    EXPECT_EQ(mln_icu().schema, word);
  }
}

TEST_F(IcuSchema, OfTheSystemIgnoresDataFiles) {
  make_file(system_icu + "/icutz44l.dat");
  EXPECT_EQ(mln_icu().schema, "");
}

TEST_F(IcuSchema, OfASystemWithoutAFormatFileIsQuietlyEmpty) {
  EXPECT_THAT(printed_by([] { EXPECT_EQ(mln_icu().schema, ""); }), no_lines());
  make_file(system_icu + "/icutzformat.txt", "\n");
  EXPECT_THAT(printed_by([] { EXPECT_EQ(mln_icu().schema, ""); }), no_lines());
  make_file(system_icu + "/icutzformat.txt", "44l", 0);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(mln_icu().schema, ""); }), no_lines());
}

TEST_F(IcuSchema, OfAnUpdateStandsInTheNameOfItsDataFile) {
  make_file(icu_directory + "/icutz44l.dat");
  EXPECT_THAT(printed_by([] {
                const mln_icu icu(update_path);
                EXPECT_EQ(icu.dataset_path, update_path);
                EXPECT_EQ(icu.icu_path, update_path + "/icutz");
                EXPECT_EQ(icu.schema, "44l");
              }),
              no_lines());
}

TEST_F(IcuSchema, OfAnUpdateKeepsLeadingZeros) {
  make_file(icu_directory + "/icutz044l.dat");
  EXPECT_EQ(of_update(), "044l");
}

TEST_F(IcuSchema, OfAnUpdateIgnoresAFormatFile) {
  make_file(icu_directory + "/icutzformat.txt", "44l");
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, ComesFromTheFirstDataFileInTheOrderOfTheDirectory) {
  // Whichever comes first when the directory lists itself, it is not sorted:
  // with both orders of creation the first listed must win.
  for (const auto& [first, second] :
       {std::pair("44l", "45l"), std::pair("45l", "44l")}) {
    wipe(icu_directory);
    make_file(icu_directory + "/icutz" + first + ".dat");
    make_file(icu_directory + "/icutz" + second + ".dat");
    const auto listed = run(
        {"/usr/bin/sh", "-c", "ls -U " + icu_directory + " | head -n 1 >&2"});
    EXPECT_THAT(printed_by([&] {
                  EXPECT_EQ("icutz" + of_update() + ".dat\n", listed.log);
                }),
                no_lines());
  }
}

TEST_F(IcuSchema, IsFoundBehindEntriesThatDoNotCount) {
  make_directory(icu_directory + "/icutz40l.dat");
  make_link(icu_directory + "/icutz41l.dat", "/usr/share/icu/icutz41l.dat");
  make_file(icu_directory + "/icutz42l.dat", "", 0640);
  make_file(icu_directory + "/icutz43x.dat");
  make_fifo(icu_directory + "/icutz45l.dat");
  make_file(icu_directory + "/icutz44l.dat");
  EXPECT_EQ(of_update(), "44l");
}

TEST_F(IcuSchema, IsNotTakenFromNamesThatOnlyLookLikeIt) {
  for (const char* name : {"icutz44L.dat", "icutzl.dat", "icutz44x.dat",
                           "xicutz44l.dat", "icutz44l.dat.bak"})
    make_file(icu_directory + "/" + name);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, IsNotTakenFromASubdirectory) {
  make_file(icu_directory + "/below/icutz44l.dat");
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, IsNotTakenFromALinkToADataFile) {
  make_file(icu_directory + "/below/icutz44l.dat");
  make_link(icu_directory + "/icutz44l.dat", "below/icutz44l.dat");
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, IsNotTakenFromADirectoryWithADataFilesName) {
  make_directory(icu_directory + "/icutz44l.dat");
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, IsTakenOnlyFromAFileThatOthersMayRead) {
  make_file(icu_directory + "/icutz44l.dat", "", 0770);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
  set_mode(icu_directory + "/icutz44l.dat", 0004);
  EXPECT_EQ(of_update(), "44l");
}

TEST_F(IcuSchema, IsTakenFromAHardLinkedFileAndFromOneWithSpecialBits) {
  make_file("/var/db/timezone/tz/data");
  make_directory(icu_directory);
  ASSERT_EQ(::link("/var/db/timezone/tz/data",
                   (icu_directory + "/icutz44l.dat").c_str()),
            0);
  EXPECT_EQ(of_update(), "44l");
  for (const mode_t mode : {07604u, 07777u, 0005u, 0006u}) {
    set_mode(icu_directory + "/icutz44l.dat", mode);
    EXPECT_EQ(of_update(), "44l") << std::oct << mode;
  }
}

TEST_F(IcuSchema, IsTakenFromAnEmptyFileAndFromOneThatItsOwnerMayNotRead) {
  make_file(icu_directory + "/icutz44l.dat", "", 0004);
  EXPECT_EQ(of_update(), "44l");
}

TEST_F(IcuSchema, IsLookedForInThePathAsItIsGiven) {
  make_file(icu_directory + "/icutz44l.dat");
  const mln_icu icu(update_path + "/");
  EXPECT_EQ(icu.dataset_path, update_path + "/");
  EXPECT_EQ(icu.icu_path, update_path + "//icutz");
  EXPECT_EQ(icu.schema, "44l");
}

TEST_F(IcuSchema, OfAnUpdateWithoutAnIcuDirectoryIsEmpty) {
  make_directory(update_path);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, OfAnUpdateWithAnEmptyIcuDirectoryIsEmpty) {
  make_directory(icu_directory);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, OfAnUpdateWithAFileForAnIcuDirectoryIsEmpty) {
  make_file(icu_directory);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, OfALinkToADataFileForAnIcuDirectoryIsEmpty) {
  make_file("/var/db/timezone/icutz44l.dat");
  make_directory(update_path);
  make_link(icu_directory, "/var/db/timezone/icutz44l.dat");
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, OfAnIcuDirectoryThatMayNotBeReadIsEmpty) {
  make_file(icu_directory + "/icutz44l.dat");
  set_mode(icu_directory, 0311);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, OfAnIcuDirectoryThatMayNotBeSearchedIsEmpty) {
  make_file(icu_directory + "/icutz44l.dat");
  set_mode(icu_directory, 0644);
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, IsFoundThroughALinkToTheIcuDirectory) {
  make_file("/var/db/elsewhere/icutz44l.dat");
  make_directory(update_path);
  make_link(icu_directory, "/var/db/elsewhere");
  EXPECT_EQ(of_update(), "44l");
}

TEST_F(IcuSchema, IsEmptyBehindADanglingLink) {
  make_directory(update_path);
  make_link(icu_directory, "/var/db/gone");
  EXPECT_THAT(printed_by([] { EXPECT_EQ(of_update(), ""); }),
              lines(no_schema_found));
}

TEST_F(IcuSchema, IsFoundBesideASubdirectoryThatMayNotBeEntered) {
  make_directory(icu_directory + "/shut", 0);
  make_file(icu_directory + "/icutz44l.dat");
  EXPECT_EQ(of_update(), "44l");
}

TEST_F(IcuSchema, LeavesTheWorkingDirectoryAlone) {
  make_file(icu_directory + "/icutz44l.dat");
  make_file(icu_directory + "/below/x");
  ASSERT_EQ(::chdir("/usr/share"), 0);
  EXPECT_EQ(of_update(), "44l");
  char after[100];
  EXPECT_STREQ(::getcwd(after, sizeof after), "/usr/share");
}

TEST_F(IcuCompatibility, AsksForTheSameSchema) {
  install_system("2023c", "44l");
  install_update("2024a.1.0", "44l");
  install_update("2024b.1.0", "44b");
  EXPECT_TRUE(mln_icu().compatible_schema(mln_icu(update("2024a.1.0"))));
  EXPECT_TRUE(mln_icu(update("2024a.1.0")).compatible_schema(mln_icu()));
  EXPECT_FALSE(mln_icu().compatible_schema(mln_icu(update("2024b.1.0"))));
  EXPECT_FALSE(mln_icu(update("2024b.1.0")).compatible_schema(mln_icu()));
}

TEST_F(IcuCompatibility, ComparesSchemasByteForByte) {
  install_update("2024a.1.0", "044l");
  install_update("2024b.1.0", "44l");
  install_update("2024c.1.0", "4l");
  const mln_icu zero(update("2024a.1.0"));
  const mln_icu plain(update("2024b.1.0"));
  const mln_icu less(update("2024c.1.0"));
  EXPECT_FALSE(zero.compatible_schema(plain));
  EXPECT_FALSE(plain.compatible_schema(less));
  EXPECT_FALSE(less.compatible_schema(plain));
}

TEST_F(IcuCompatibility, ComparesBehindANulByteToo) {
  install_system("2023c", std::string("44l\0x", 5));
  install_update("2024a.1.0", "44l");
  EXPECT_FALSE(mln_icu(update("2024a.1.0")).compatible_schema(mln_icu()));
}

TEST_F(IcuCompatibility, GoesByTheSchemaThatWasFirstRead) {
  install_system("2023c", "44l");
  install_update("2024a.1.0", "44l");
  const mln_icu system;
  const mln_icu update(update_path);
  wipe(icu_directory);
  make_file(icu_directory + "/icutz45l.dat");
  EXPECT_TRUE(update.compatible_schema(system));
  make_file(system_icu + "/icutzformat.txt", "46l");
  EXPECT_TRUE(update.compatible_schema(system));
}

TEST_F(IcuCompatibility, HoldsBetweenTwoEmptySchemas) {
  printed_by([] {
    EXPECT_TRUE(mln_icu(update("2024a.1.0")).compatible_schema(mln_icu()));
  });
}

TEST_F(IcuCompatibility, WithAnotherClassIsReportedAndRefused) {
  EXPECT_THAT(printed_by([] {
                EXPECT_FALSE(mln_icu().compatible_schema(mln_zoneinfo()));
              }),
              lines(failure("mln_icu::compatible_schema: could not "
                            "dynamic_cast other component",
                            ENOENT)));
}

TEST_F(IcuActivate, LinksAnUpdatesDirectory) {
  make_link(icutz, "/var/db/old");
  make_link(legacy_icutz, "/var/db/older");
  EXPECT_THAT(printed_by([] { mln_icu(update_path).activate(); }), no_lines());
  EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/2024a.1.0/icutz");
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(IcuActivate, CreatesAMissingLinkQuietly) {
  EXPECT_THAT(printed_by([] { mln_icu(update_path).activate(); }), no_lines());
  EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/2024a.1.0/icutz");
}

TEST_F(IcuActivate, MakesALinkThatIsRightAnew) {
  const mln_icu icu(update_path);
  icu.activate();
  const auto before = look_at({icutz});
  icu.activate();
  const auto after = look_at({icutz});
  EXPECT_EQ(after.at(icutz).content, before.at(icutz).content);
  EXPECT_NE(after.at(icutz).inode, before.at(icutz).inode);

  set_mode(timezone_root, 0555);
  printed_by([&] { EXPECT_EQ(thrown_by([&] { icu.activate(); }), EEXIST); });
}

TEST_F(IcuActivate, CanBeRepeated) {
  const mln_icu icu(update_path);
  EXPECT_THAT(printed_by([&] {
                icu.activate();
                icu.activate();
              }),
              no_lines());
  EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/2024a.1.0/icutz");
}

TEST_F(IcuActivate, CreatesNoLinkForTheSystemPartition) {
  make_link(icutz, "/var/db/old");
  make_link(legacy_icutz, "/var/db/older");
  EXPECT_THAT(printed_by([] { mln_icu().activate(); }), no_lines());
  EXPECT_EQ(link_at(icutz), nothing);
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(IcuActivate, OverADirectoryLeavesTheLegacyLinkReportsAndThrows) {
  make_directory(icutz);
  make_link(legacy_icutz, "/var/db/older");
  EXPECT_THAT(
      printed_by([] {
        EXPECT_EQ(thrown_by([] { mln_icu(update_path).activate(); }), EEXIST);
      }),
      lines(failure("remove: could not remove /var/db/timezone/icutz", EISDIR),
            failure("unlink of ICU softlink failed", EISDIR),
            failure("create_symlink: from /var/db/timezone/icutz to "
                    "/var/db/timezone/tz/2024a.1.0/icutz",
                    EEXIST)));
  EXPECT_EQ(link_at(legacy_icutz), "/var/db/older");
}

TEST_F(IcuActivate, OfTheSystemOverADirectoryOnlyReports) {
  make_directory(icutz);
  EXPECT_THAT(
      printed_by([] { mln_icu().activate(); }),
      lines(failure("remove: could not remove /var/db/timezone/icutz", EISDIR),
            failure("unlink of ICU softlink failed", EISDIR)));
}

TEST_F(IcuActivate, WithALegacyDirectoryStillLinks) {
  make_link(icutz, "/var/db/old");
  make_directory(legacy_icutz);
  EXPECT_THAT(printed_by([] { mln_icu(update_path).activate(); }),
              lines(failure("remove: could not remove /var/db/icutz", EISDIR),
                    failure("unlink of ICU softlink failed", EISDIR)));
  EXPECT_EQ(link_at(icutz), "/var/db/timezone/tz/2024a.1.0/icutz");
}

TEST_F(IcuActivate, ThrowsTheErrorOfALinkThatCannotBeCreated) {
  const mln_icu icu(update_path);
  wipe(timezone_root);
  EXPECT_THAT(printed_by([&] {
                EXPECT_EQ(thrown_by([&] { icu.activate(); }), ENOENT);
              }),
              lines(failure("create_symlink: from /var/db/timezone/icutz to "
                            "/var/db/timezone/tz/2024a.1.0/icutz",
                            ENOENT)));
}

}  // namespace
