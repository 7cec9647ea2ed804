// SPDX-License-Identifier: BSD-2-Clause
//
// Every request for memory that a boot makes is refused in turn, with an
// exception of any type. Each reaches the handler that it has to reach, and
// finds everything freed that was built by then.
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <new>
#include <set>
#include <utility>

#include "dataset/components.h"
#include "dataset/icu.h"
#include "driver/localtime_link.h"
#include "driver/startup.h"
#include "support/first_word.h"
#include "tests/device/device.h"

using namespace device;

namespace {

int granted = 0;  // how many requests for memory are granted first
int denied = 0;   // how many are denied after them
std::function<void()> deny;
std::size_t greatest_granted = SIZE_MAX;

// What is allocated: now, and at the request that follows on a denied one.
long live = 0;
long live_after_denial = 0;
bool was_denied = false;

// The data sets that were compared, receivers and arguments in turn: the
// letters of an update's release, "-" for the system's.
std::string compared;

char letter_of(const mln_dataset_component& component) {
  const std::string& path = component.dataset_path;
  return path.empty() ? '-' : path[path.find('.') - 1];
}

}  // namespace

void* operator new(std::size_t size) {
  if (std::exchange(was_denied, false)) live_after_denial = live;
  if (size > greatest_granted) denied = 1;
  if (granted > 0) {
    --granted;
  } else if (denied > 0) {
    --denied;
    was_denied = true;
    errno = ENOMEM;
    deny();
  }
  ++live;
  if (void* const memory = std::malloc(size)) return memory;
  throw std::bad_alloc();
}
// Without it a sanitizer brings its own, which has its own deletion.
void* operator new(std::size_t size, const std::nothrow_t&) noexcept try {
  return operator new(size);
} catch (...) {
  return nullptr;
}
void operator delete(void* memory) noexcept {
  if (memory != nullptr) --live;
  std::free(memory);
}
void operator delete(void* memory, std::size_t) noexcept {
  operator delete(memory);
}

// Stands in for the library's. It requests memory, so that it throws as well.
bool compatible_components(const component_list& receivers,
                           const component_list& others) {
  operator delete(operator new(1));
  compared += letter_of(*receivers[1]);
  compared += letter_of(*others[1]);
  return receivers[1]->compatible_schema(*others[1]);
}

namespace {

class Exceptions : public DeviceTest {
 protected:
  void SetUp() override {
    DeviceTest::SetUp();
    deny = [] { throw std::bad_alloc(); };
    greatest_granted = SIZE_MAX;
    install_system("2023c", "44l");
    install_update("2022a.1.0", "45l");
    install_and_announce("2024a.1.0", "44l");
    make_directory("/var/db/a-name-that-needs-memory");
  }

  // Grants so many requests of an act, and denies the next ones.
  static void denying(const std::function<void()>& act, int first, int then) {
    granted = first;
    denied = then;
    act();
    granted = denied = 0;
  }

  struct ending {
    log_lines printed;
    bool was_denied;  // there was one more request
    bool left_the_pass;
    bool had_freed_all;  // when the next request came
  };
  static ending boot_denied_after(int requests) {
    ending end{};
    long live_at_start = 0;
    compared.clear();
    const auto boot = [&] {
      try {
        run_startup_pass();
      } catch (...) {
        end.left_the_pass = true;
      }
      end.was_denied = denied == 0;
    };
    end.printed = printed_by([&] {
      live_at_start = live;
      denying(boot, requests, 1);
      EXPECT_EQ(live, live_at_start);
    });
    end.had_freed_all = live_after_denial == live_at_start;
    return end;
  }
};

struct of_no_known_type {};

const std::map<std::string, std::function<void()>> exceptions = {
    {"a number", [] { throw 5; }},
    {"no memory", [] { throw std::bad_alloc(); }},
    {"a type of its own", [] { throw of_no_known_type(); }}};

// The line of each handler, and whether all is freed by then.
const std::map<log_lines, bool> handlers = {
    {not_migrated(ENOMEM), false},
    {invalid_links(ENOMEM), false},
    {zoneinfo_not_unlinked(ENOMEM), false},
    {icu_not_unlinked(ENOMEM), false},
    {unable_to_locate(ENOMEM), true},
    {resetting_localtime(ENOMEM), true}};

// In use is an update that is reset in the same boot, or no data set.
TEST_F(Exceptions, OfAnyTypeReachTheirHandlersWithEverythingFreed) {
  for (const auto& in_use : {update("2022a.1.0") + "/zoneinfo", update("x")}) {
    for (const auto& [type, act] : exceptions) {
      deny = act;
      std::set<log_lines> reached;
      for (int requests = 0;; ++requests) {
        SCOPED_TRACE(in_use + ", " + type + " after " +
                     std::to_string(requests) + " requests");
        point_zoneinfo_at(in_use);
        wipe(icutz);
        make_link(legacy_icutz, "/var/db/a-name-that-needs-memory");
        point_localtime_at("/usr/share/zoneinfo/America/Los_Angeles");
        const ending end = boot_denied_after(requests);
        if (!end.was_denied) break;

        // The migration's own paths are made before the first handler.
        EXPECT_EQ(end.left_the_pass, requests == 0);
        if (requests == 0) {
          EXPECT_EQ(end.printed, lines());
          EXPECT_NE(link_at(legacy_icutz), nothing);
          continue;
        }
        const auto line = std::find_if(
            end.printed.begin(), end.printed.end(), [](const auto& printed) {
              return printed.ends_with(std::strerror(ENOMEM)) &&
                     printed.find("fts_open") == std::string::npos;
            });
        ASSERT_NE(line, end.printed.end()) << "nobody tells of it";
        const auto handler = handlers.find({*line});
        ASSERT_NE(handler, handlers.end()) << *line;
        EXPECT_TRUE(end.had_freed_all || !handler->second);
        reached.insert(handler->first);
      }
      EXPECT_EQ(reached.size(), handlers.size());
    }
  }
}

TEST_F(Exceptions, ThatAFallbackMeetsItselfLeaveThePass) {
  point_localtime_at("/usr/share/zoneinfo/Europe/Paris");
  const auto fails = [](const auto& act, int first, const log_lines& line) {
    prints(
        [&] {
          denying([&] { EXPECT_THROW(act(), std::bad_alloc); }, first, 1000);
        },
        line);
  };
  fails(run_startup_pass, 1, unable_to_locate(ENOMEM));
  fails(repair_localtime_link, 0, resetting_localtime(ENOMEM));
}

// A C library may crash where a walk cannot have its last piece of memory, so
// as much as it takes is requested before.
TEST_F(Exceptions, AreThoseOfAWalkThatCouldNotHaveItsMemory) {
  const std::string path = update("2024a.1.0");
  const auto start = [&] { mln_icu{path}; };
  greatest_granted = 16383;
  throws(ENOMEM, start,
         failure("tz_icu::initialize: fts_open of " + path + "/icutz failed, " +
                     std::strerror(ENOMEM),
                 ENOMEM));
  greatest_granted = 16384;
  prints(start);
}

// What was read before stays: the first 4096 bytes are there when room for
// those behind them is denied.
TEST_F(Exceptions, CutAFirstWordWhereMemoryEnds) {
  const std::string path = "/usr/share/file";
  make_file(path, std::string(4096, 'x') + std::string(4096, 'y'));
  for (const int first : {0, 1}) {
    std::string word = "unread";
    denying(
        [&] {
          word = read_first_word(path);
          EXPECT_EQ(denied, 0);
        },
        first, 1);
    EXPECT_EQ(word, first == 0 ? "" : std::string(4096, 'x'));
  }
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

}  // namespace
