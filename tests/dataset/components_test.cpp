// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/components.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <string>
#include <type_traits>

namespace {

std::vector<std::string> asked;

// Notes which component asks which, and gives its answer: yes, no or an
// exception for '!'.
class scripted_component final : public mln_dataset_component {
 public:
  scripted_component(const std::string& name, char answer)
      : mln_dataset_component(name), answer_(answer) {}
  bool compatible_schema(const mln_dataset_component& other) const override {
    asked.push_back(dataset_path + other.dataset_path);
    if (answer_ == '!') throw std::runtime_error("asked");
    return answer_ == 'y';
  }
  void activate() const override {}

 private:
  char answer_;
};

// Components named a, b, c...; each answers as its position in `answers` says.
component_list list(const std::string& answers, char first_name) {
  component_list components;
  for (const char answer : answers) {
    components.push_back(std::make_shared<scripted_component>(
        std::string(1, first_name++), answer));
  }
  return components;
}

struct CompatibleComponents : public testing::Test {
  // Expects the result for receivers a, b, c... and others x, y, z, and which
  // of them meet.
  static void expect(bool compatible, const std::string& receivers,
                     const std::string& others,
                     const std::vector<std::string>& questions) {
    asked.clear();
    EXPECT_EQ(compatible_components(list(receivers, 'a'), list(others, 'x')),
              compatible);
    EXPECT_EQ(asked, questions) << receivers << ", " << others;
  }
};

TEST_F(CompatibleComponents, AreListsOfOneLengthWithNoRefusal) {
  expect(true, "yyy", "nnn", {"ax", "by", "cz"});
  expect(true, "", "", {});
}

TEST_F(CompatibleComponents, AreAskedAlsoAboutThemselves) {
  asked.clear();
  const component_list same = list("yn", 'a');
  EXPECT_FALSE(compatible_components(same, same));
  EXPECT_EQ(asked, (std::vector<std::string>{"aa", "bb"}));
}

TEST_F(CompatibleComponents, StopAtTheFirstRefusalOrTheEndOfOneList) {
  expect(false, "yny", "yyy", {"ax", "by"});
  expect(false, "yyn", "yyy", {"ax", "by", "cz"});
  expect(false, "", "y", {});
  expect(false, "y", "", {});
  expect(false, "y", "yy", {"ax"});
  expect(false, "yyy", "y", {"ax"});
}

TEST_F(CompatibleComponents, PassOnWhatAComponentThrows) {
  EXPECT_THROW(expect(true, "!", "y", {}), std::runtime_error);
}

TEST(ComponentOwnership, CannotBeDeletedThroughTheBase) {
  static_assert(!std::is_destructible_v<mln_dataset_component>);
  static_assert(!std::has_virtual_destructor_v<mln_dataset_component>);
  static_assert(std::is_destructible_v<mln_zoneinfo>);
  static_assert(std::is_destructible_v<mln_icu>);
  static_assert(std::is_final_v<mln_zoneinfo> && std::is_final_v<mln_icu>);
}

}  // namespace
