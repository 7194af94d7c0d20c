// SPDX-License-Identifier: Apache-2.0
// Verification on one thread, named verify-<scheme>/threads:1, and on two. {crypt} has its one lock and does not scale.
#include <benchmark/benchmark.h>

#include "bench_support.h"

namespace {

void verify(benchmark::State& state, int scheme) {
  const std::string stored = bench::formatted(scheme, bench::kPassword);
  for (auto _ : state) benchmark::DoNotOptimize(bench::verified(bench::kPassword, stored));
  state.SetItemsProcessed(state.iterations());
}

#define LDAPPW_SCALING(name, scheme) \
  BENCHMARK_CAPTURE(verify, name, scheme)->Name("verify-" #name)->Threads(1)->Threads(2)->UseRealTime()
LDAPPW_SCALING(sha, FORMAT_SHA);
LDAPPW_SCALING(md5, FORMAT_MD5);
LDAPPW_SCALING(ssha, FORMAT_SSHA);
LDAPPW_SCALING(crypt, FORMAT_CRYPT);
LDAPPW_SCALING(qveil, FORMAT_QVEIL);
LDAPPW_SCALING(aes128, FORMAT_AES128);
LDAPPW_SCALING(aes192, FORMAT_AES192);
LDAPPW_SCALING(aes256, FORMAT_AES256);
#undef LDAPPW_SCALING

}  // namespace
