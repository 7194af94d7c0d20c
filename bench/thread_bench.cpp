// SPDX-License-Identifier: Apache-2.0
// Verification on one thread and on several.
#include "bench_support.h"

namespace {

struct Row {
  const char* name;
  int scheme;
};

constexpr Row kSchemes[] = {{"sha", FORMAT_SHA},       {"ssha", FORMAT_SSHA},    {"md5", FORMAT_MD5},
                            {"crypt", FORMAT_CRYPT},   {"qveil", FORMAT_QVEIL},  {"aes128", FORMAT_AES128},
                            {"aes192", FORMAT_AES192}, {"aes256", FORMAT_AES256}};

const bench::Rows kRows([] {
  for (const Row& row : kSchemes) {
    const std::string stored = bench::formatted(row.scheme, bench::kPassword);
    bench::measureThreads(std::string(row.name) + "-verify",
                          [stored] { benchmark::DoNotOptimize(bench::verified(bench::kPassword, stored)); });
  }
});

}  // namespace
