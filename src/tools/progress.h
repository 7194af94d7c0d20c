// SPDX-License-Identifier: Apache-2.0
// The progress line of a pass over an export.
#ifndef LDAPPW_TOOLS_PROGRESS_H
#define LDAPPW_TOOLS_PROGRESS_H

#include <chrono>
#include <cstdint>

namespace tool {

// A line on standard error with entries, rate and time left, when that is a terminal. Used by one thread at a time.
class Progress {
 public:
  // inputFd says how much there is to come, when it is a file. Results that go to a terminal are not disturbed.
  Progress(int inputFd, bool resultsOnStdout);
  ~Progress() { hide(); }
  Progress(const Progress&) = delete;
  Progress& operator=(const Progress&) = delete;

  void advance(std::uint64_t entries, std::uint64_t bytes);
  // Takes the line away, so that a message can be written.
  void hide() noexcept;

 private:
  using Clock = std::chrono::steady_clock;

  bool shown_;
  bool visible_ = false;
  std::uint64_t total_ = 0;
  std::uint64_t entries_ = 0;
  std::uint64_t bytes_ = 0;
  Clock::time_point start_ = Clock::now();
  Clock::time_point next_ = start_;
};

}  // namespace tool

#endif
