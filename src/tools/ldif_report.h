// SPDX-License-Identifier: Apache-2.0
// What the verbs over exports share: their input, findings by entry, the findings that a value can give rise to, and
// the progress line.
#ifndef LDAPPW_TOOLS_LDIF_REPORT_H
#define LDAPPW_TOOLS_LDIF_REPORT_H

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

#include "common.h"
#include "ldif_record.h"

namespace tool {

// The export to read, "-" for standard input, and what messages call it. Throws Failure.
class ExportInput {
 public:
  explicit ExportInput(const std::string& path);
  int fd() const noexcept;
  const std::string& name() const noexcept { return name_; }

 private:
  std::string name_;
  Descriptor file_;
};

// How many threads to work with: as many as asked for, one a processor when that is 0.
unsigned threadsFor(unsigned asked) noexcept;

struct Finding {
  std::uint64_t line;
  std::string dn;
  Status status;
};

Finding findingAt(const RecordWalker& walker, Status status);
void tell(const Finding& finding) noexcept;

// What a value looks like from outside. The order is that of kLooks.
enum class Look { kFine, kUnknownTag, kMalformed, kUntagged, kCryptVariant, kUnopened, kNotText, kBroken, kCount };
struct LookText {
  const char* name;  // as a JSON field
  const char* text;
  ExitCode code;
};
extern const LookText kLooks[];

// Without keys: kFine to kCryptVariant.
Look lookOf(std::string_view value);

// True for well-formed UTF-8 without control characters. What a wrong key makes of a value is practically never that,
// while its padding is right once in some 250 times.
bool looksLikeText(std::string_view bytes) noexcept;

// A cell of a table: text filled up to width with blanks, before it or, for a left cell, after it.
std::string cell(std::string_view text, std::size_t width);
std::string cell(std::uint64_t number, std::size_t width);
std::string leftCell(std::string_view text, std::size_t width);

// A line on standard error with entries, rate and time left, when that is a terminal. Used by one thread.
class Progress {
 public:
  // inputFd tells how much there is to come, when it is a file. Results that go to a terminal are not disturbed.
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
