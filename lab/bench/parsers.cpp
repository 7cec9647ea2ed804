// SPDX-License-Identifier: BSD-2-Clause
//
// The two grammars, as marlin matches them and as std::regex does: nanoseconds
// an operation. "parsers --repeat NAME NUMBER" only repeats one operation, so
// that its instructions can be counted from outside.
#include <benchmark/benchmark.h>

#include <cstdlib>
#include <cstring>
#include <iostream>
#include <regex>
#include <string>

#include "dataset/icu_file_name.h"
#include "support/version.h"
#include "support/version_grammar.h"

namespace {

constexpr char version_pattern[] =
    R"re(([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?)re";
constexpr char icu_pattern[] = R"re(icutz([0-9]+[lbe])\.dat)re";

const std::string version_text = "2024a.1.0";
const std::string near_version = "2024a.1.0.";
const std::string icu_name = "icutz44l.dat";
const std::string near_icu_name = "icutz44x.dat";
const std::string other_name = "zoneinfo64.res";

void match_version(const std::string& text) {
  auto groups = match_version_text(text);
  benchmark::DoNotOptimize(groups);
}

void match_version_by_regex(const std::string& text, const std::regex& regex) {
  std::smatch groups;
  bool matches = std::regex_match(text, groups, regex);
  benchmark::DoNotOptimize(matches);
}

const std::regex& ready_version_regex() {
  static const std::regex regex(version_pattern);
  return regex;
}

void match_icu(const std::string& name) {
  auto schema = icu_schema_in(name);
  benchmark::DoNotOptimize(schema);
}

void match_icu_by_regex(const std::string& name) {
  static const std::regex regex(icu_pattern);
  std::smatch groups;
  bool matches = std::regex_match(name, groups, regex);
  benchmark::DoNotOptimize(matches);
}

struct operation {
  const char* name;
  void (*run)();
};

const operation operations[] = {
    {"version/match", [] { match_version(version_text); }},
    {"version/match/near_miss", [] { match_version(near_version); }},
    {"version/parse",
     [] {
       mln_version version(version_text);
       benchmark::DoNotOptimize(version);
     }},
    {"version/std_regex/compiled_each_time",
     [] { match_version_by_regex(version_text, std::regex(version_pattern)); }},
    {"version/std_regex/ready",
     [] { match_version_by_regex(version_text, ready_version_regex()); }},
    {"version/std_regex/ready/near_miss",
     [] { match_version_by_regex(near_version, ready_version_regex()); }},
    {"icu/match", [] { match_icu(icu_name); }},
    {"icu/match/near_miss", [] { match_icu(near_icu_name); }},
    {"icu/match/other_file", [] { match_icu(other_name); }},
    {"icu/std_regex/ready", [] { match_icu_by_regex(icu_name); }},
    {"icu/std_regex/ready/near_miss",
     [] { match_icu_by_regex(near_icu_name); }},
    {"icu/std_regex/ready/other_file", [] { match_icu_by_regex(other_name); }},
};

int repeat(const char* name, long number) {
  for (const auto& operation : operations) {
    if (std::strcmp(operation.name, name) != 0) continue;
    for (long i = 0; i < number; ++i) operation.run();
    return 0;
  }
  std::cerr << "parsers: no operation " << name << '\n';
  return 2;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc == 4 && std::strcmp(argv[1], "--repeat") == 0)
    return repeat(argv[2], std::strtol(argv[3], nullptr, 10));

  for (const auto& operation : operations)
    benchmark::RegisterBenchmark(
        operation.name, [run = operation.run](benchmark::State& state) {
          for (auto _ : state) run();
        });
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 2;
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
