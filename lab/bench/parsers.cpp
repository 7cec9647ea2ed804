// SPDX-License-Identifier: BSD-2-Clause
//
// The two grammars, as marlin matches them and as std::regex does: nanoseconds
// an operation. "parsers --repeat NAME NUMBER" only repeats one operation, so
// that its instructions can be counted from outside.
#include <benchmark/benchmark.h>

#include <cstdlib>
#include <regex>
#include <string>
#include <utility>

#include "dataset/icu_file_name.h"
#include "support/version.h"
#include "support/version_grammar.h"

namespace {

constexpr char version_pattern[] =
    R"re(([0-9]+)([a-z]+)(?:\.([0-9]+))?(?:\.([0-9]+))?)re";
const std::regex version_regex(version_pattern);
const std::regex icu_regex(R"re(icutz([0-9]+[lbe])\.dat)re");

const std::string version_text = "2024a.1.0";
const std::string near_version = "2024a.1.0.";
const std::string icu_name = "icutz44l.dat";
const std::string near_icu_name = "icutz44x.dat";
const std::string other_name = "zoneinfo64.res";

// Has the compiler compute a result that nobody looks at.
template <typename Result>
void use(const Result& result) {
  benchmark::DoNotOptimize(result);
}

void match_by_regex(const std::string& text, const std::regex& regex) {
  std::smatch groups;
  use(std::regex_match(text, groups, regex));
}

const std::pair<std::string, void (*)()> operations[] = {
    {"version/match", [] { use(match_version_text(version_text)); }},
    {"version/match/near_miss", [] { use(match_version_text(near_version)); }},
    {"version/parse", [] { use(mln_version(version_text)); }},
    {"version/std_regex/compiled_each_time",
     [] { match_by_regex(version_text, std::regex(version_pattern)); }},
    {"version/std_regex/ready",
     [] { match_by_regex(version_text, version_regex); }},
    {"version/std_regex/ready/near_miss",
     [] { match_by_regex(near_version, version_regex); }},
    {"icu/match", [] { use(icu_schema_in(icu_name)); }},
    {"icu/match/near_miss", [] { use(icu_schema_in(near_icu_name)); }},
    {"icu/match/other_file", [] { use(icu_schema_in(other_name)); }},
    {"icu/std_regex/ready", [] { match_by_regex(icu_name, icu_regex); }},
    {"icu/std_regex/ready/near_miss",
     [] { match_by_regex(near_icu_name, icu_regex); }},
    {"icu/std_regex/ready/other_file",
     [] { match_by_regex(other_name, icu_regex); }},
};

void repeat(const std::string& wanted, long number) {
  for (const auto& [name, run] : operations)
    if (name == wanted)
      for (long i = 0; i < number; ++i) run();
}

}  // namespace

int main(int argc, char** argv) {
  if (argc == 4 && argv[1] == std::string("--repeat")) {
    repeat(argv[2], std::strtol(argv[3], nullptr, 10));
    return 0;
  }

  for (const auto& [name, run] : operations)
    benchmark::RegisterBenchmark(name.c_str(),
                                 [run = run](benchmark::State& state) {
                                   for (auto _ : state) run();
                                 });
  benchmark::Initialize(&argc, argv);
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
