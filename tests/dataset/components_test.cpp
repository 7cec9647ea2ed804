// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/components.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <string>
#include <type_traits>

namespace {

std::vector<std::string> asked;
int destroyed = 0;

// Notes which component asks which, and gives its answer: yes, no or an
// exception for '!'.
class scripted_component final : public mln_dataset_component {
 public:
  scripted_component() = default;
  scripted_component(const std::string& name, char answer)
      : mln_dataset_component(name), answer_(answer) {}
  ~scripted_component() { ++destroyed; }
  bool compatible_schema(const mln_dataset_component& other) const override {
    asked.push_back(dataset_path + other.dataset_path);
    if (answer_ == '!') throw std::runtime_error("asked");
    return answer_ == 'y';
  }
  void activate() const override {}

 private:
  char answer_ = 'y';
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
  void SetUp() override { asked.clear(); }
  using questions = std::vector<std::string>;
};

TEST_F(CompatibleComponents, AreListsOfOneLengthWithNoRefusal) {
  EXPECT_TRUE(compatible_components(list("yyy", 'a'), list("nnn", 'x')));
  EXPECT_EQ(asked, (questions{"ax", "by", "cz"}));
  EXPECT_TRUE(compatible_components({}, {}));
}

TEST_F(CompatibleComponents, AreAskedAlsoAboutThemselves) {
  const component_list same = list("yn", 'a');
  EXPECT_FALSE(compatible_components(same, same));
  EXPECT_EQ(asked, (questions{"aa", "bb"}));
}

TEST_F(CompatibleComponents, StopAtTheFirstRefusal) {
  EXPECT_FALSE(compatible_components(list("yny", 'a'), list("yyy", 'x')));
  EXPECT_FALSE(compatible_components(list("yyn", 'c'), list("yyy", 'x')));
  EXPECT_EQ(asked, (questions{"ax", "by", "cx", "dy", "ez"}));
}

TEST_F(CompatibleComponents, AreNotListsOfDifferentLengths) {
  EXPECT_FALSE(compatible_components(list("", 'a'), list("y", 'x')));
  EXPECT_FALSE(compatible_components(list("y", 'a'), list("", 'x')));
  EXPECT_EQ(asked, questions{});
  EXPECT_FALSE(compatible_components(list("y", 'a'), list("yy", 'x')));
  EXPECT_FALSE(compatible_components(list("yyy", 'b'), list("y", 'y')));
  EXPECT_EQ(asked, (questions{"ax", "by"}));
}

TEST_F(CompatibleComponents, PassOnWhatAComponentThrows) {
  EXPECT_THROW(compatible_components(list("!", 'a'), list("y", 'x')),
               std::runtime_error);
}

TEST(ComponentOwnership, OfADefaultComponentIsTheSystemPartitions) {
  EXPECT_EQ(scripted_component().dataset_path, "");
}

TEST(ComponentOwnership, CannotBeDeletedThroughTheBase) {
  static_assert(!std::is_destructible_v<mln_dataset_component>);
  static_assert(!std::has_virtual_destructor_v<mln_dataset_component>);
  static_assert(std::is_destructible_v<mln_zoneinfo>);
  static_assert(std::is_destructible_v<mln_icu>);
  static_assert(std::is_final_v<mln_zoneinfo> && std::is_final_v<mln_icu>);
}

TEST(ComponentOwnership, DestroysTheConcreteType) {
  destroyed = 0;
  list("y", 'a');
  EXPECT_EQ(destroyed, 1);
}

}  // namespace
