// SPDX-License-Identifier: BSD-2-Clause
//
// Handlers take every exception, not only the numbers of failed calls: here the
// next request for memory is refused.
#include <cstdlib>
#include <new>

#include "dataset/icu.h"
#include "dataset/zoneinfo.h"
#include "driver/legacy_icu_link.h"
#include "driver/localtime_link.h"
#include "driver/startup.h"
#include "driver/version_record.h"
#include "support/first_word.h"
#include "support/fsutil.h"
#include "tests/device/device.h"

using namespace device;
using ::testing::Contains;
using ::testing::EndsWith;
using ::testing::Matches;

namespace {
int accepted = 0;  // how many requests for memory are granted first
int refusals = 0;  // how many are refused after them
}  // namespace

void* operator new(std::size_t size) {
  if (accepted > 0) {
    --accepted;
  } else if (refusals > 0) {
    --refusals;
    throw std::bad_alloc();
  }
  if (void* const memory = std::malloc(size)) return memory;
  throw std::bad_alloc();
}
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }

namespace {

class WithoutMemory : public DeviceTest {
 protected:
  // The lines that `act` prints when so many of its requests are granted and
  // the next one is refused, or as many as that.
  static std::vector<std::string> printed_by_refused(
      const std::function<void()>& act, int granted = 0, int refused = 1) {
    return printed_by([&] {
      accepted = granted;
      refusals = refused;
      act();
      accepted = refusals = 0;
    });
  }
};

TEST_F(WithoutMemory, ZoneinfoActivationGoesOn) {
  const mln_zoneinfo tree;
  EXPECT_THAT(printed_by_refused([&] { tree.activate(); }),
              lines(failure("Unlink of zoneinfo softlink failed", any_error)));
  EXPECT_EQ(link_at(zoneinfo), system_tree);
}

TEST_F(WithoutMemory, IcuActivationGoesOn) {
  install_update("2024a.1.0", "44l");
  const mln_icu icu(update("2024a.1.0"));
  EXPECT_THAT(printed_by_refused([&] { icu.activate(); }),
              lines(failure("unlink of ICU softlink failed", any_error)));
  EXPECT_EQ(link_at(icutz), update("2024a.1.0") + "/icutz");
}

// What was read before the refusal stays: the first 4096 bytes are there when
// room for those behind them is refused.
TEST_F(WithoutMemory, AFirstWordIsCutWhereMemoryEnds) {
  const std::string path = "/usr/share/file";
  make_file(path, std::string(4096, 'x') + std::string(4096, 'y'));
  accepted = 1;
  refusals = 1;
  const std::string word = read_first_word(path);
  EXPECT_EQ(refusals, 0);
  EXPECT_EQ(word, std::string(4096, 'x'));

  refusals = 1;
  EXPECT_EQ(read_first_word(path), "");
  EXPECT_EQ(refusals, 0);
}

TEST_F(WithoutMemory, TheLegacyLinkIsRemovedAndNotMigrated) {
  const std::string target = "/var/db/a-name-that-needs-memory";
  make_directory(target);
  make_link(legacy_icutz, target);
  // The second request: the first is for the present link's path.
  EXPECT_THAT(printed_by_refused(migrate_legacy_icu_link, 1),
              lines(not_migrated(any_error)));
  EXPECT_EQ(link_at(icutz), nothing);
  EXPECT_EQ(link_at(legacy_icutz), nothing);
}

TEST_F(WithoutMemory, TheMigrationEndsWhenItsOwnPathsDoNotFit) {
  make_link(legacy_icutz, "/var/db");
  EXPECT_THAT(printed_by_refused([] {
                EXPECT_THROW(migrate_legacy_icu_link(), std::bad_alloc);
              }),
              no_lines());
  EXPECT_EQ(link_at(legacy_icutz), "/var/db");
}

TEST_F(WithoutMemory, TheRecordIsLeftAloneAndItsCallerTold) {
  make_file(record, "2022a.1.0_2023c.1.0");
  const std::string from = "2023c.1.0";
  const std::string to = "2024abcdefghi.1.0";
  EXPECT_THAT(printed_by_refused([&] {
                EXPECT_THROW(record_version_change(from, to), std::bad_alloc);
              }),
              no_lines());
  EXPECT_EQ(file_at(record), "2022a.1.0_2023c.1.0");
}

TEST_F(WithoutMemory, AShortLinkIsReadAllTheSame) {
  const std::string path = "/var/db/timezone/link";
  make_link(path, "target");
  refusals = 1;
  const std::string target = fsutil::read_symlink(path);
  EXPECT_EQ(refusals, 1);
  refusals = 0;
  EXPECT_EQ(target, "target");
}

// Every single request of a boot that activates an update is refused in turn.
TEST_F(WithoutMemory, ABootActivatesTheUpdateOrResetsTheLinks) {
  install_system("2023c", "44l");
  install_and_announce("2024a.1.0", "44l");
  std::map<std::string, int> ends;
  for (bool refused = true; refused;) {
    const int granted = ends["activation"] + ends["reset"] + ends["exception"];
    SCOPED_TRACE("after " + std::to_string(granted) + " requests");
    wipe(record);
    point_links_at_system();
    std::string end = "activation";
    const auto printed = printed_by_refused(
        [&] {
          try {
            run_startup_pass();
          } catch (const std::bad_alloc&) {
            end = "exception";
          }
          refused = refusals == 0;
        },
        granted);
    if (Matches(Contains(unable_to_locate(any_error)))(printed)) {
      EXPECT_EQ(end, "activation") << "the last resort failed";
      end = "reset";
    }
    ++ends[end];
    // The migration's own paths are made before the first handler, and those of
    // the local time after the activation. Nobody catches the first.
    EXPECT_TRUE(granted > 0 || end == "exception");
    if (link_at(zoneinfo) == system_tree)
      expect_links_at_system();
    else
      expect_links_at_update("2024a.1.0");
    EXPECT_EQ(file_at(record) == nothing, link_at(icutz) == nothing);
    EXPECT_EQ(link_at(local_time), default_localtime);
  }
  EXPECT_GT(ends["activation"], 1);
  EXPECT_GT(ends["reset"], 10);
}

TEST_F(WithoutMemory, TheLocalTimeIsReset) {
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  EXPECT_THAT(printed_by_refused(repair_localtime_link),
              lines(resetting_localtime(any_error)));
  EXPECT_EQ(link_at(local_time), default_localtime);
}

TEST_F(WithoutMemory, AFallbackThatIsRefusedItsOwnEndsThePass) {
  EXPECT_THAT(
      printed_by_refused(
          [] { EXPECT_THROW(run_startup_pass(), std::bad_alloc); }, 1, 1000),
      lines(unable_to_locate(any_error)));
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  EXPECT_THAT(
      printed_by_refused(
          [] { EXPECT_THROW(repair_localtime_link(), std::bad_alloc); }, 0, 2),
      lines(resetting_localtime(any_error)));
}

}  // namespace
