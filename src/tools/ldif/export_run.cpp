// SPDX-License-Identifier: Apache-2.0
// The threads of a pass. A thread reads its next batch itself and waits until its part is due, so there are never more
// batches in memory than threads.
#include "ldif/export_run.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <exception>
#include <mutex>
#include <system_error>
#include <thread>

#include "base/messages.h"
#include "base/signals.h"
#include "ldif/library.h"

namespace tool {
namespace {

constexpr std::chrono::milliseconds kStep{200};
constexpr std::chrono::milliseconds kLogStep{5000};  // where lines stay
constexpr size_t kCostlyBatchBytes = size_t{4} << 10;
constexpr char kClearLine[] = "\r\033[K";

std::string whole(double number) {
  return std::to_string(static_cast<std::uint64_t>(number));
}

// A line on standard error with entries, rate and time left, when that is a terminal; lines from time to time when they
// are asked for and it is none. Used by one thread at a time.
class Progress {
 public:
  // inputFd says how much there is to come, when it is a file. Results that go to a terminal are not disturbed.
  Progress(int inputFd, bool resultsOnStdout, bool asked);
  ~Progress() { hide(); }
  Progress(const Progress&) = delete;
  Progress& operator=(const Progress&) = delete;

  // Counts entries; bytes is how far the input has been read.
  void advance(std::uint64_t entries, std::uint64_t bytes);
  // Takes the line away, so that a message can be written.
  void hide() noexcept;

 private:
  using Clock = std::chrono::steady_clock;

  bool shown_;
  bool logged_;
  bool visible_ = false;
  std::uint64_t total_ = 0;
  std::uint64_t entries_ = 0;
  std::uint64_t bytes_ = 0;
  Clock::time_point start_ = Clock::now();
  Clock::time_point next_ = start_;
};

Progress::Progress(int inputFd, bool resultsOnStdout, bool asked)
    : shown_(isatty(STDERR_FILENO) == 1 && !(resultsOnStdout && isatty(STDOUT_FILENO) == 1)),
      logged_(asked && !shown_) {
  struct stat status {};
  if (fstat(inputFd, &status) == 0 && S_ISREG(status.st_mode)) total_ = static_cast<std::uint64_t>(status.st_size);
}

void Progress::advance(std::uint64_t entries, std::uint64_t bytes) {
  entries_ += entries;
  bytes_ = bytes;
  const Clock::time_point now = Clock::now();
  if ((!shown_ && !logged_) || now < next_) return;
  next_ = now + (logged_ ? kLogStep : kStep);
  const double seconds = std::chrono::duration<double>(now - start_).count();
  const double rate = seconds > 0 ? static_cast<double>(entries_) / seconds : 0;
  std::string line = std::to_string(entries_) + " entries, " + whole(rate) + " a second";
  if (total_ > bytes_ && bytes_ > 0) {
    line += ", " + whole(seconds * static_cast<double>(total_ - bytes_) / static_cast<double>(bytes_)) + " s left";
  }
  if (logged_) return message(line);
  tryWrite(STDERR_FILENO, kClearLine + line);
  visible_ = true;
}

void Progress::hide() noexcept {
  if (visible_) tryWrite(STDERR_FILENO, kClearLine);
  visible_ = false;
}

}  // namespace

class ExportRun::State {
 public:
  State(Input& input, const ExportOptions& options)
      : input_(input),
        reader_(input, options.costly ? kCostlyBatchBytes : RecordReader::kBatchBytes),
        attributes_(options.attributes, options.others),
        progress_(input.fd(), options.resultsOnStdout, options.progress),
        write_(options.write),
        threads_(options.threads > 0 ? options.threads : std::max(1U, std::thread::hardware_concurrency())) {}

  const AttributeSet& attributes() const noexcept { return attributes_; }

  ExportSum all(const std::function<void()>& loop) {
    std::vector<std::thread> helpers;
    helpers.reserve(threads_);
    try {
      for (unsigned i = 1; i < threads_; ++i) helpers.emplace_back([&] { guarded(loop); });
    } catch (const std::system_error&) {
      // Fewer threads do the same work.
    }
    guarded(loop);
    for (std::thread& helper : helpers) helper.join();
    progress_.hide();
    messages_.finish();
    if (failure_) std::rethrow_exception(failure_);
    reportWhole();
    return sum_;
  }

  bool take(Batch& batch) {
    const std::lock_guard<std::mutex> lock(reading_);
    if (stopped() || stopIsAsked() || !reader_.next(batch)) return false;
    batch.inputBytes = input_.bytesRead();
    return true;
  }

  void spill(const Batch& batch, ExportPart& part) {
    std::unique_lock<std::mutex> lock(output_);
    turn_.wait(lock, [&] { return failure_ || due_ == batch.number; });
    if (!failure_ && write_) write_(part.out.view());
    part.out.clear();
  }

  bool hand(const Batch& batch, const RecordWalker& walker, ExportPart& part, const std::function<void()>& deliver) {
    constexpr char kOutside[] = "lines that belong to no entry";
    for (const std::uint64_t line : walker.outside()) part.report(line, "", kBadValue, kOutside);
    std::unique_lock<std::mutex> lock(output_);
    turn_.wait(lock, [&] { return failure_ || due_ == batch.number; });
    if (failure_) return false;
    if (write_) write_(part.out.view());
    deliver();
    if (!part.messages.empty()) progress_.hide();
    for (const ExportPart::Message& one : part.messages) messages_.add(one.text, one.kind);
    for (const auto& [kind, count] : part.reported) {
      if (count > kMostOfAKind) messages_.addUnshown(kind, count - kMostOfAKind);
    }
    if (batch.number == 0 && batch.text.view().substr(0, kByteOrderMark.size()) == kByteOrderMark) {
      warning(input_.name() + " begins with a byte order mark, which LDIF does not have");
    }
    seen_ |= walker.seen();
    cutOff_ = batch.text.view().back() != '\n';
    keepFirst(sum_.exitCode, part.exitCode);
    sum_.entries += walker.entries();
    progress_.advance(walker.entries(), batch.inputBytes);
    ++due_;
    turn_.notify_all();
    return true;
  }

 private:
  void guarded(const std::function<void()>& loop) noexcept {
    try {
      loop();
    } catch (...) {
      stop(std::current_exception());
    }
  }

  void reportWhole() const {
    if (stopIsAsked()) return;
    if (sum_.entries == 0) {
      throw Failure(kBadValue, input_.name() + " has no entry, no line that begins with \"dn:\"; it seems to be " +
                                   input_.seems());
    }
    if (cutOff_) warning(input_.name() + ": the last line does not end in a newline; the export may be cut off");
    for (size_t i = 0; i < attributes_.given(); ++i) {
      if ((seen_ >> i & 1U) == 0) warning("no entry has an attribute " + attributes_.name(i));
    }
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

  Input& input_;
  RecordReader reader_;
  const AttributeSet attributes_;
  Progress progress_;
  const std::function<void(std::string_view)> write_;
  const unsigned threads_;
  std::mutex reading_;
  std::mutex output_;
  std::condition_variable turn_;
  std::uint64_t due_ = 0;
  std::exception_ptr failure_;
  Repeated messages_{kMostOfAKind, message};
  std::uint64_t seen_ = 0;
  bool cutOff_ = false;
  ExportSum sum_;
};

ExportRun::ExportRun(Input& input, const ExportOptions& options) : state_(std::make_unique<State>(input, options)) {}
ExportRun::~ExportRun() = default;

const AttributeSet& ExportRun::attributes() const noexcept {
  return state_->attributes();
}

ExportSum ExportRun::all(const std::function<void()>& loop) {
  return state_->all(loop);
}

bool ExportRun::take(Batch& batch) {
  return state_->take(batch);
}

void ExportRun::spill(const Batch& batch, ExportPart& part) {
  state_->spill(batch, part);
}

bool ExportRun::hand(const Batch& batch, const RecordWalker& walker, ExportPart& part,
                     const std::function<void()>& deliver) {
  return state_->hand(batch, walker, part, deliver);
}

void ExportPart::spill() {
  constexpr size_t kMuch = size_t{4} << 20;
  if (out.size() >= kMuch && early) early();
}

void ExportPart::report(std::uint64_t line, const std::string& dn, ExitCode code, const std::string& text) {
  keepFirst(exitCode, code);
  if (++reported[text] > kMostOfAKind) return;
  messages.push_back({"line " + std::to_string(line) + ": " + shownDn(dn) + ": " + text, text});
}

Input openExport(const ExportOptions& options) {
  ldifLibrary();
  const AttributeSet checked(options.attributes);
  Input input = Input(options.in);
  input.requireText();
  return input;
}

}  // namespace tool
