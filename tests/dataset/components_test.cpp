// SPDX-License-Identifier: BSD-2-Clause
#include "dataset/components.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <string>
#include <type_traits>

#include "dataset/icu.h"
#include "dataset/zoneinfo.h"

namespace {

std::vector<std::string> asked;

// Notes which component asks which.
class scripted_component final : public mln_dataset_component {
 public:
  scripted_component(const std::string& name, bool answer)
      : mln_dataset_component(name), answer_(answer) {}
  bool compatible_schema(const mln_dataset_component& other) const override {
    asked.push_back(dataset_path + other.dataset_path);
    return answer_;
  }
  void activate() const override {}

 private:
  bool answer_;
};

class throwing_component final : public mln_dataset_component {
 public:
  bool compatible_schema(const mln_dataset_component&) const override {
    throw std::runtime_error("asked");
  }
  void activate() const override {}
};

// Components named a, b, c...; each answers as its position in `answers` says.
component_list list(const std::string& answers, char first_name) {
  component_list components;
  for (const char answer : answers) {
    components.push_back(std::make_shared<scripted_component>(
        std::string(1, first_name++), answer == 'y'));
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
}

TEST_F(CompatibleComponents, StopAtTheFirstRefusal) {
  EXPECT_FALSE(compatible_components(list("yny", 'a'), list("yyy", 'x')));
  EXPECT_EQ(asked, (questions{"ax", "by"}));
}

TEST_F(CompatibleComponents, CountARefusalAtTheLastPosition) {
  EXPECT_FALSE(compatible_components(list("yyn", 'a'), list("yyy", 'x')));
  EXPECT_EQ(asked, (questions{"ax", "by", "cz"}));
}

TEST_F(CompatibleComponents, AreNotListsOfDifferentLengths) {
  EXPECT_FALSE(compatible_components(list("", 'a'), list("y", 'x')));
  EXPECT_FALSE(compatible_components(list("y", 'a'), list("", 'x')));
  EXPECT_EQ(asked, questions{});
  EXPECT_FALSE(compatible_components(list("y", 'a'), list("yy", 'x')));
  EXPECT_FALSE(compatible_components(list("yyy", 'b'), list("y", 'y')));
  EXPECT_EQ(asked, (questions{"ax", "by"}));
}

TEST_F(CompatibleComponents, AreTwoEmptyLists) {
  EXPECT_TRUE(compatible_components({}, {}));
}

TEST_F(CompatibleComponents, PassOnWhatAComponentThrows) {
  const component_list throwing = {std::make_shared<throwing_component>()};
  EXPECT_THROW(compatible_components(throwing, list("y", 'x')),
               std::runtime_error);
}

TEST(ComponentOwnership, OfADefaultComponentIsTheSystemPartitions) {
  EXPECT_EQ(throwing_component().dataset_path, "");
}

TEST(ComponentOwnership, CannotBeDeletedThroughTheBase) {
  static_assert(!std::is_destructible_v<mln_dataset_component>);
  static_assert(!std::has_virtual_destructor_v<mln_dataset_component>);
  static_assert(std::is_destructible_v<mln_zoneinfo>);
  static_assert(std::is_destructible_v<mln_icu>);
  static_assert(std::is_final_v<mln_zoneinfo> && std::is_final_v<mln_icu>);
}

TEST(ComponentOwnership, DestroysTheConcreteType) {
  struct counted final : mln_dataset_component {
    explicit counted(int& deaths) : deaths_(deaths) {}
    ~counted() { ++deaths_; }
    bool compatible_schema(const mln_dataset_component&) const override {
      return true;
    }
    void activate() const override {}
    int& deaths_;
  };
  int deaths = 0;
  { const component_list held = {std::make_shared<counted>(deaths)}; }
  EXPECT_EQ(deaths, 1);
}

}  // namespace
