// SPDX-License-Identifier: BSD-2-Clause
//
// An exception of any type, from anything that the pass calls, ends as it has
// to: handled in place while the current links are resolved, otherwise in the
// last resort. This program's own functions stand in for those of the
// libraries; each does its job, except where it is told to throw.
#include <array>
#include <cerrno>
#include <cstdlib>
#include <functional>
#include <map>
#include <new>
#include <stdexcept>

#include "dataset/dataset.h"
#include "driver/dataset_links.h"
#include "driver/startup.h"
#include "driver/version_record.h"
#include "support/first_word.h"
#include "support/version_grammar.h"
#include "tests/device/device.h"

using namespace device;
using ::testing::Contains;
using ::testing::Matches;
using ::testing::Not;

namespace {

struct of_no_known_type {};

const std::map<std::string, std::function<void()>> exceptions = {
    {"int", [] { throw 5; }},
    {"long", [] { throw 5l; }},
    {"bad_alloc", [] { throw std::bad_alloc(); }},
    {"out_of_range", [] { throw std::out_of_range("too great"); }},
    {"invalid_argument", [] { throw std::invalid_argument("badpath"); }},
    {"a class of its own", [] { throw of_no_known_type(); }},
};

// Which call of which function is to throw, and what.
std::string thrower;
int countdown = 0;
std::function<void()> raise;

// The data sets that were compared, receivers and arguments in turn: the
// letters of an update's release, "-" for the system's.
std::string compared;

char letter_of(const mln_dataset_component& component) {
  const std::string& path = component.dataset_path;
  return path.empty() ? '-' : path[path.find('.') - 1];
}

// What is allocated: now, at each reading of a word, and when the local time is
// repaired.
long live = 0;
long live_at_start = 0;
std::array<long, 16> live_at_word{};
std::size_t words = 0;
long live_at_repair = 0;

void called(const std::string& function) {
  if (function == thrower && --countdown == 0) raise();
}

}  // namespace

void* operator new(std::size_t size) {
  ++live;
  if (void* const memory = std::malloc(size)) return memory;
  throw std::bad_alloc();
}
void operator delete(void* memory) noexcept {
  if (memory != nullptr) --live;
  std::free(memory);
}
void operator delete(void* memory, std::size_t) noexcept {
  operator delete(memory);
}

void repair_localtime_link() {
  live_at_repair = live;
  make_link(local_time, default_localtime);
}

std::string read_first_word(const std::string& path) {
  live_at_word.at(words++ % live_at_word.size()) = live;
  called("read_first_word");
  std::string word = file_at(path);
  word.resize(std::min(word.find('\n'), word.size()));
  return word;
}

std::optional<mln_version_groups> match_version_text(std::string_view text) {
  called("match_version_text");
  return mln_version_groups{text.substr(0, 4), text.substr(4, 1), "1", "0"};
}

bool compatible_components(const component_list& receivers,
                           const component_list& others) {
  called("compatible_components");
  compared += letter_of(*receivers[1]);
  compared += letter_of(*others[1]);
  return receivers[1]->compatible_schema(*others[1]);
}

std::string latest_update_path() {
  called("latest_update_path");
  return link_at(tz_latest);
}

std::string current_dataset_path() {
  called("current_dataset_path");
  const std::string target = link_at(zoneinfo);
  if (target == update("none") + "/zoneinfo") throw -1;
  return target == system_tree ? "" : target.substr(0, target.rfind('/'));
}

void record_version_change(const std::string& from, const std::string& to) {
  called("record_version_change");
  make_file(record, from + "_" + to);
}

namespace {

// An announced update; in use is the system's data, or an update that no longer
// fits and is reset in the same boot.
class Exceptions : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    thrower.clear();
    install_system("2023c", "44l");
    install_update("2022a.1.0", "45l");
    install_and_announce("2024a.1.0", "44l");
  }

  // Boots as often as `function` is called, each time with another call that
  // throws, once for each type. Gives the number of its calls.
  template <typename Expected>
  static int sweep(const std::string& function, const std::string& in_use,
                   Expected expected) {
    for (int calls = 0;; ++calls) {
      for (const auto& [type, act] : exceptions) {
        SCOPED_TRACE(function + ", call " + std::to_string(calls + 1) +
                     ", throws " + type);
        wipe(record);
        in_use.empty() ? point_links_at_system()
                       : point_links_at_update(in_use);
        wipe(local_time);
        thrower = function;
        countdown = calls + 1;
        raise = act;
        const auto printed = printed_by(run_startup_pass);
        if (countdown > 0) return calls;
        expected(printed);
        // The boot went on to its end.
        EXPECT_EQ(link_at(local_time), default_localtime);
      }
    }
  }

  static void expect_last_resort(const std::vector<std::string>& printed) {
    EXPECT_THAT(printed, Contains(unable_to_locate(any_error)));
    expect_links_at_system();
    EXPECT_EQ(file_at(record), nothing);
  }
  static void expect_reset_and_activation(
      const std::vector<std::string>& printed) {
    EXPECT_THAT(printed, Contains(invalid_links(any_error)));
    EXPECT_THAT(printed, Not(Contains(unable_to_locate(any_error))));
    expect_links_at_update("2024a.1.0");
    EXPECT_EQ(file_at(record), "2023c.1.0_2024a.1.0");
  }
};

TEST_F(Exceptions, FromTheCurrentLinksResetThemAndTheBootGoesOn) {
  EXPECT_EQ(
      sweep("current_dataset_path", "2022a.1.0", expect_reset_and_activation),
      1);
}

TEST_F(Exceptions, FromAnythingElseTakeTheLastResort) {
  const auto calls = [](const std::string& function,
                        const std::string& in_use) {
    return sweep(function, in_use, expect_last_resort);
  };
  EXPECT_EQ(calls("latest_update_path", "2022a.1.0"), 1);
  // The words of the system's set, of the current one, the update's, and before
  // it those of a reset.
  EXPECT_EQ(calls("read_first_word", ""), 5);
  EXPECT_EQ(calls("read_first_word", "2022a.1.0"), 6);
  // Also an update that is in use and announced is read as both.
  EXPECT_EQ(calls("read_first_word", "2024a.1.0"), 4);
  // Those of a reset and then of the system's set, for a link that is rejected.
  EXPECT_EQ(calls("read_first_word", "none"), 7);
  EXPECT_EQ(calls("match_version_text", ""), 3);
  EXPECT_EQ(calls("match_version_text", "2022a.1.0"), 4);
  EXPECT_EQ(calls("compatible_components", ""), 2);
  EXPECT_EQ(calls("compatible_components", "2022a.1.0"), 2);
  EXPECT_EQ(calls("record_version_change", ""), 1);
  EXPECT_EQ(calls("record_version_change", "2022a.1.0"), 1);
}

// The components of the set in question are asked about the system's, never the
// other way around, and never about those of the set in use; they are asked
// also where the version alone is reason enough to refuse the set.
TEST_F(Exceptions, AskTheSetInQuestionAboutTheSystems) {
  install_and_use("2023d.1.0", "44l");
  for (const char* announced : {"2022a.1.0", "2024a.1.0"}) {
    announce(announced);
    compared.clear();
    printed_by(run_startup_pass);
    EXPECT_EQ(compared, "d-a-");
  }
}

// The last resort holds no more than a reset of its own does, and the repair of
// the local time nothing: all that the pass has built is gone by then.
TEST_F(Exceptions, FindEverythingDiscardedBeforeTheLastResortAndTheRepair) {
  words = 0;
  live_at_start = live;
  reset_to_system_partition();
  const long of_a_reset = live_at_word[0] - live_at_start;
  thrower = "record_version_change";
  countdown = 1;
  raise = [] { throw of_no_known_type(); };
  printed_by([] {
    words = 0;
    live_at_start = live;
    run_startup_pass();
  });
  // A reset reads two words; here they are the last two.
  EXPECT_EQ(live_at_word.at(words - 2) - live_at_start, of_a_reset);
  EXPECT_EQ(live_at_repair, live_at_start);
  EXPECT_GT(live_at_word.at(4) - live_at_start, of_a_reset) << "the update's";

  thrower.clear();
  live_at_start = live;
  run_startup_pass();
  EXPECT_EQ(live_at_repair, live_at_start) << "after an activation";
}

// With "zoneinfo" in the way every activation fails, that of a reset as well.
TEST_F(Exceptions, FromAResetTakeTheLastResortAndFromThatLeaveThePass) {
  make_directory(zoneinfo);
  for (const std::string function :
       {"latest_update_path", "current_dataset_path"}) {
    for (const auto& [type, act] : exceptions) {
      SCOPED_TRACE(function + " throws " + type);
      thrower = function;
      countdown = 1;
      raise = act;
      const auto printed =
          printed_by([] { EXPECT_EQ(thrown_by(run_startup_pass), EEXIST); });
      EXPECT_EQ(Matches(Contains(invalid_links(any_error)))(printed),
                function == "current_dataset_path");
      EXPECT_THAT(printed, Contains(unable_to_locate(any_error)));
      EXPECT_EQ(link_at(local_time), nothing);
    }
  }
}

}  // namespace
