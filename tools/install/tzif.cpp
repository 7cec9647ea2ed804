// SPDX-License-Identifier: BSD-2-Clause
#include "tools/install/tzif.h"

#include <cstddef>
#include <cstdint>

namespace {

constexpr std::size_t header_size = 44;

std::uint32_t number_at(std::string_view text, std::size_t at) {
  std::uint32_t number = 0;
  for (std::size_t i = 0; i < 4; ++i)
    number = number << 8 | static_cast<unsigned char>(text[at + i]);
  return number;
}

std::int64_t time_at(std::string_view text, std::size_t at, std::size_t size) {
  const auto high = static_cast<std::int32_t>(number_at(text, at));
  if (size == 4) return high;
  return std::int64_t{high} * (std::int64_t{1} << 32) + number_at(text, at + 4);
}

struct counts {
  std::size_t universal, standard, leaps, times, types, letters;
};

counts counts_in(std::string_view header) {
  return {number_at(header, 20), number_at(header, 24), number_at(header, 28),
          number_at(header, 32), number_at(header, 36), number_at(header, 40)};
}

// What follows a header; `time_size` is 4 or 8. No sum of six 32-bit counts,
// each times 12 at most, exceeds 64 bits.
std::uint64_t size_of(const counts& in, std::size_t time_size) {
  static_assert(sizeof(std::size_t) >= 4);
  return std::uint64_t{in.times} * (time_size + 1) +
         std::uint64_t{in.types} * 6 + in.letters +
         std::uint64_t{in.leaps} * (time_size + 4) + in.standard + in.universal;
}

bool one_for_each_type_or_none(std::size_t count, const counts& in) {
  return count == 0 || count == in.types;
}

bool in_order(std::string_view block, std::size_t count, std::size_t step,
              std::size_t time_size) {
  for (std::size_t i = 1; i < count; ++i) {
    if (time_at(block, (i - 1) * step, time_size) >=
        time_at(block, i * step, time_size))
      return false;
  }
  return true;
}

bool all_below(std::string_view bytes, std::size_t limit) {
  for (const char byte : bytes) {
    if (static_cast<unsigned char>(byte) >= limit) return false;
  }
  return true;
}

const char* flaw_of_types(std::string_view types, std::string_view letters) {
  for (std::size_t at = 0; at < types.size(); at += 6) {
    const auto abbreviation = static_cast<unsigned char>(types[at + 5]);
    if (number_at(types, at) == 0x80000000u ||
        !all_below(types.substr(at + 4, 1), 2))
      return "has a type of local time that cannot be";
    if (abbreviation >= letters.size() ||
        letters.find('\0', abbreviation) == std::string_view::npos)
      return "has a type of local time without an abbreviation";
  }
  return nullptr;
}

const char* flaw_of_block(std::string_view block, const counts& in,
                          std::size_t time_size) {
  if (!in_order(block, in.times, time_size, time_size))
    return "has times that are not in order";
  block.remove_prefix(in.times * time_size);
  if (!all_below(block.substr(0, in.times), in.types))
    return "has a time of a type that it lacks";
  block.remove_prefix(in.times);
  const std::string_view types = block.substr(0, in.types * 6);
  block.remove_prefix(types.size());
  if (const char* const flaw =
          flaw_of_types(types, block.substr(0, in.letters)))
    return flaw;
  block.remove_prefix(in.letters);
  if (!in_order(block, in.leaps, time_size + 4, time_size))
    return "has leap seconds that are not in order";
  block.remove_prefix(in.leaps * (time_size + 4));
  if (!all_below(block, 2)) return "has an indicator that is neither 0 nor 1";
  return nullptr;
}

// Takes a header and what belongs to it off the front of `rest`.
const char* take_block(std::string_view& rest, char version,
                       std::size_t time_size) {
  if (!rest.starts_with("TZif")) return "is not a TZif file";
  if (rest.size() < header_size) return "is cut short";
  if (rest[4] != version) return "has two versions";
  const counts in = counts_in(rest);
  if (in.types == 0 || in.types > 256 || in.letters == 0 ||
      !one_for_each_type_or_none(in.standard, in) ||
      !one_for_each_type_or_none(in.universal, in))
    return "has counts that do not fit each other";
  rest.remove_prefix(header_size);
  const std::uint64_t size = size_of(in, time_size);
  if (rest.size() < size) return "is cut short";
  const auto length = static_cast<std::size_t>(size);
  const char* const flaw = flaw_of_block(rest.substr(0, length), in, time_size);
  rest.remove_prefix(length);
  return flaw;
}

// A TZ string between two newlines, possibly empty.
bool is_footer(std::string_view rest) {
  if (rest.size() < 2 || rest.front() != '\n' || rest.back() != '\n')
    return false;
  for (const char byte : rest.substr(1, rest.size() - 2)) {
    if (byte < ' ' || byte > '~') return false;
  }
  return true;
}

}  // namespace

const char* tzif_flaw(std::string_view content) {
  if (!content.starts_with("TZif")) return "is not a TZif file";
  if (content.size() < header_size) return "is cut short";
  const char version = content[4];
  if (version != '\0' && (version < '2' || version > '4'))
    return "is of a version that is not known";
  if (const char* const flaw = take_block(content, version, 4)) return flaw;
  if (version == '\0') return content.empty() ? nullptr : "has more at its end";
  if (const char* const flaw = take_block(content, version, 8)) return flaw;
  return is_footer(content) ? nullptr : "has no footer, or more after it";
}
