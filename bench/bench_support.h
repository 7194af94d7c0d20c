// SPDX-License-Identifier: Apache-2.0
// What the benchmarks share: the registration of pieces of work, fixed passwords and a key record.
#pragma once

#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

#include "password_schemes.h"

namespace bench {

// A file adds its rows with one static object of this type; the function runs when the program has started.
class Rows {
 public:
  explicit Rows(void (*add)()) { all().push_back(add); }
  static std::vector<void (*)()>& all() {
    static std::vector<void (*)()> functions;
    return functions;
  }
};

// What can be counted instead of timed.
struct Counted {
  std::string name;
  std::function<void()> work;
};
inline std::vector<Counted>& countedWorks() {
  static std::vector<Counted> works;
  return works;
}

// A piece of work, named <row>/ours, or the same work by a peer, named <row>/<peer>. scripts/measure/bench prints the
// ratios of each row, and bars.csv states what they must not exceed.
template <typename Work>
benchmark::internal::Benchmark* measure(const std::string& name, Work work) {
  countedWorks().push_back({name, work});
  return benchmark::RegisterBenchmark(name.c_str(), [work](benchmark::State& state) {
    for (auto _ : state) work();
  });
}

// The same on one, two and four threads, named <row>/threads.
template <typename Work>
void measureThreads(const std::string& row, Work work) {
  benchmark::RegisterBenchmark((row + "/threads").c_str(),
                               [work](benchmark::State& state) {
                                 for (auto _ : state) work();
                                 state.SetItemsProcessed(state.iterations());
                               })
      ->Threads(1)
      ->Threads(2)
      ->Threads(4)
      ->UseRealTime();
}

inline const std::string kPassword = "correct horse 42";

inline const unsigned char* bytesOf(const std::string& text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}

// A record with keys 0, 1, 2 ...; lives as long as the process.
inline AesKeyData* keys() {
  static AesKeyData* const record = [] {
    AesKeyData* made = nullptr;
    initAesKeyData(&made);
    for (SecBuffer& key : made->aesKeys) {
      for (uint32_t i = 0; i < key.length; ++i) key.data[i] = static_cast<unsigned char>(i);
    }
    setCipherNameGlobal();
    return made;
  }();
  return record;
}

inline std::string formatted(int scheme, const std::string& password) {
  char salt[] = "ab";
  char out[1024];
  const int length = format_password(scheme, salt, keys(), password.data(), static_cast<int>(password.size()), out,
                                     static_cast<int>(sizeof out));
  return std::string(out, static_cast<size_t>(length));
}

inline int verified(const std::string& password, const std::string& stored) {
  return verify_password(password.data(), static_cast<int>(password.size()), stored.data(),
                         static_cast<int>(stored.size()), 1, keys());
}

}  // namespace bench
