// SPDX-License-Identifier: BSD-2-Clause
//
// Texts for comparing a hand-written matcher with std::regex: valid ones,
// nearly valid ones, and random bytes.
#pragma once

#include <cstdint>
#include <random>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

class text_generator {
 public:
  // A valid text takes one of the choices of every slot, in order.
  using slots = std::vector<std::vector<std::string>>;
  text_generator(std::uint32_t seed, slots valid)
      : random_(seed), valid_(std::move(valid)) {}

  // A valid text or a heap of pieces, every second time with a few random
  // changes of bytes.
  std::string next() {
    std::string text = below(2) == 0 ? valid_text() : heap();
    if (below(2) == 0) return text;
    for (auto count = below(4); count > 0; --count) change(text);
    return text;
  }

 private:
  std::string valid_text() {
    std::string text;
    for (const auto& choices : valid_) text += choices[below(choices.size())];
    return text;
  }

  std::string heap() {
    std::string text;
    for (auto count = below(7); count > 0; --count) {
      const auto& choices = valid_[below(valid_.size())];
      text += choices[below(choices.size())];
    }
    return text;
  }

  std::size_t below(std::size_t limit) {
    return std::uniform_int_distribution<std::size_t>(0, limit - 1)(random_);
  }

  char byte() {
    // Neighbours of the accepted ranges, then anything, NUL and 255 included.
    constexpr std::string_view near("0123456789az`{/:.lbe\0AZ\n%\xff", 27);
    if (below(2) == 0) return near[below(near.size())];
    return static_cast<char>(static_cast<unsigned char>(below(256)));
  }

  void change(std::string& text) {
    const std::size_t place = below(text.size() + 1);
    switch (below(3)) {
      case 0:
        text.insert(place, 1, byte());
        break;
      case 1:
        if (place < text.size()) text[place] = byte();
        break;
      default:
        if (place < text.size()) text.erase(place, 1);
    }
  }

  std::mt19937 random_;
  slots valid_;
};
