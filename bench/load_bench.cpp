// SPDX-License-Identifier: Apache-2.0
// Loading the library and its provider up to the first {SSHA} value, beside OpenSSL's loading up to its first salted
// digest: a process of load_probe each, which reports its own time.
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>

#include "bench_support.h"

namespace {

// Seconds that the probe took; negative when it failed.
double probe(const char* what) {
  int ends[2];
  if (pipe(ends) != 0) return -1;
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, ends[1], STDOUT_FILENO);
  posix_spawn_file_actions_addclose(&actions, ends[0]);
  std::string program = LDAPPW_LOAD_PROBE;
  std::string argument = what;
  char* const arguments[] = {program.data(), argument.data(), nullptr};
  pid_t child = -1;
  const int failure = posix_spawn(&child, program.c_str(), &actions, nullptr, arguments, environ);
  posix_spawn_file_actions_destroy(&actions);
  close(ends[1]);
  char text[32] = "";
  const ssize_t length = failure != 0 ? 0 : read(ends[0], text, sizeof text - 1);
  close(ends[0]);
  if (failure == 0) waitpid(child, nullptr, 0);
  return length > 0 ? std::atof(text) : -1;
}

void measureProbe(const char* name, const char* what) {
  benchmark::RegisterBenchmark(name, [what](benchmark::State& state) {
    for (auto _ : state) {
      const double seconds = probe(what);
      if (seconds < 0) state.SkipWithError("the probe failed");
      state.SetIterationTime(seconds);
    }
  })->UseManualTime();
}

const bench::Rows kRows([] {
  measureProbe("first-ssha/ours", "ours");
  measureProbe("first-ssha/openssl", "openssl");
});

}  // namespace
