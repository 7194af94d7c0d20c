// SPDX-License-Identifier: Apache-2.0
// Runs batches of records through several threads and hands on the results in the order of the input. A thread reads
// its next batch itself and waits until its result is due, so there are never more batches in memory than threads.
#ifndef LDAPPW_TOOLS_LDIF_PIPELINE_H
#define LDAPPW_TOOLS_LDIF_PIPELINE_H

#include <condition_variable>
#include <exception>
#include <functional>
#include <mutex>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "ldif_lines.h"

namespace tool {

// work runs on many threads at once; deliver on one at a time, in order. An exception of either, or of the reader,
// stops all and leaves run().
template <class Result>
class Pipeline {
 public:
  using Work = std::function<Result(const Batch&)>;
  using Deliver = std::function<void(const Batch&, Result&)>;

  Pipeline(RecordReader& reader, Work work, Deliver deliver)
      : reader_(reader), work_(std::move(work)), deliver_(std::move(deliver)) {}

  void run(unsigned threads) {
    std::vector<std::thread> helpers;
    helpers.reserve(threads);
    try {
      for (unsigned i = 1; i < threads; ++i) helpers.emplace_back([this] { loop(); });
    } catch (const std::system_error&) {
      // Fewer threads do the same work.
    }
    loop();
    for (std::thread& helper : helpers) helper.join();
    if (failure_) std::rethrow_exception(failure_);
  }

 private:
  void loop() noexcept {
    try {
      Batch batch;
      while (take(batch)) {
        Result result = work_(batch);
        if (!hand(batch, result)) return;
      }
    } catch (...) {
      stop(std::current_exception());
    }
  }

  bool take(Batch& batch) {
    const std::lock_guard<std::mutex> lock(input_);
    return !stopped() && reader_.next(batch);
  }

  bool hand(const Batch& batch, Result& result) {
    std::unique_lock<std::mutex> lock(output_);
    turn_.wait(lock, [&] { return failure_ || due_ == batch.number; });
    if (failure_) return false;
    deliver_(batch, result);
    ++due_;
    turn_.notify_all();
    return true;
  }

  bool stopped() {
    const std::lock_guard<std::mutex> lock(output_);
    return static_cast<bool>(failure_);
  }

  void stop(std::exception_ptr failure) {
    const std::lock_guard<std::mutex> lock(output_);
    if (!failure_) failure_ = std::move(failure);
    turn_.notify_all();
  }

  RecordReader& reader_;
  Work work_;
  Deliver deliver_;
  std::mutex input_;
  std::mutex output_;
  std::condition_variable turn_;
  std::uint64_t due_ = 0;
  std::exception_ptr failure_;
};

}  // namespace tool

#endif
