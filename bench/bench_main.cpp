// SPDX-License-Identifier: Apache-2.0
// Runs the benchmarks with Google Benchmark; or, under callgrind, with --counts [ROW]: each piece of our own work some
// times, and then a dump of what was executed, named after the row and the number of times.
#include <cpuid.h>
#include <valgrind/callgrind.h>

#include <chrono>
#include <cstdio>

#include "bench_support.h"

namespace {

// What counts depend on beside the code.
void printEnvironment() {
  unsigned a = 0;
  unsigned b = 0;
  unsigned c = 0;
  unsigned d = 0;
  const bool hasSse41 = __get_cpuid(1, &a, &b, &c, &d) != 0 && (c & bit_SSE4_1) != 0;
  const bool hasSha = __get_cpuid_count(7, 0, &a, &b, &c, &d) != 0 && (b & bit_SHA) != 0;
  std::printf("compiler %s, %s SSE4.1, %s SHA extensions\n", __VERSION__, hasSse41 ? "with" : "without",
              hasSha ? "with" : "without");
}

void countOne(const std::string& row, const std::function<void()>& work) {
  using Clock = std::chrono::steady_clock;
  const auto start = Clock::now();
  work();
  const bool isLong = Clock::now() - start > std::chrono::milliseconds(500);
  const int runs = isLong ? 1 : 32;               // masking draws, so that one run says little
  for (int i = 0; i < 2 && !isLong; ++i) work();  // what is made at the first use
  const std::string title = row + " " + std::to_string(runs);
  CALLGRIND_ZERO_STATS;
  for (int i = 0; i < runs; ++i) work();
  CALLGRIND_DUMP_STATS_AT(title.c_str());
}

void countAll(const std::string& only) {
  const std::string suffix = "/ours";
  for (const bench::Counted& counted : bench::countedWorks()) {
    const size_t slash = counted.name.find('/');
    const std::string row = counted.name.substr(0, slash);
    if (counted.name.substr(slash) == suffix && (only.empty() || only == row)) countOne(row, counted.work);
  }
}

}  // namespace

int main(int argc, char** argv) {
  for (const auto add : bench::Rows::all()) add();
  if (argc > 1 && std::string(argv[1]) == "--counts") {
    printEnvironment();
    countAll(argc > 2 ? argv[2] : "");
    return 0;
  }
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
