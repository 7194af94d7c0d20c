// SPDX-License-Identifier: Apache-2.0
// Byte-exact splitting of LDIF text (RFC 2849): an input into batches of whole records, a batch into logical lines.
// The LDAP library's record reader will not do: it joins folded lines and drops comments and carriage returns, and what
// is not changed has to come out as it came in.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "base/input.h"
#include "base/secret.h"

namespace tool {

// One line with its continuation lines, as it stands in the input.
struct LogicalLine {
  std::string_view raw;       // line ends included
  std::string_view first;     // the first physical line without its end
  std::string_view firstEnd;  // "\n", "\r\n", or less at the end of the input
  std::string_view lastEnd;   // of the last physical line
  size_t physicalLines = 0;
  bool folded() const noexcept { return physicalLines > 1; }
  bool blank() const noexcept { return first.empty(); }
};

// Cuts the first logical line off the text; false when there is none. A blank line stands alone; a continuation line
// without a line before it is a logical line of its own.
bool takeLogicalLine(std::string_view& text, LogicalLine& line) noexcept;

// The text of a logical line with the folding undone and without its line end.
void unfold(const LogicalLine& line, Secret& out);

// Appends text folded at 76 columns, with the given line end between the parts and none after the last.
void foldInto(std::string_view text, std::string_view lineEnd, Secret& out);

// Records that follow each other in the input, up to and including a blank line (or the end of the input).
struct Batch {
  std::uint64_t number = 0;
  std::uint64_t firstLine = 1;
  std::uint64_t inputBytes = 0;  // how far the file had been read
  Secret text;
};

// Cuts an input into batches. Used by one thread at a time; the input stays the caller's.
class RecordReader {
 public:
  static constexpr size_t kBatchBytes = size_t{256} << 10;
  // A record larger than this is refused: memory must not follow a file that has no records in it.
  static constexpr size_t kMaxRecordBytes = size_t{256} << 20;

  explicit RecordReader(Input& input, size_t batchBytes = kBatchBytes) noexcept
      : input_(input), batchBytes_(batchBytes) {}

  // False at the end of the input. Throws Failure: kIoError, or kBadValue for a record that is too large.
  bool next(Batch& batch);

 private:
  Input& input_;
  const size_t batchBytes_;  // at least, but for the last
  Secret ahead_;             // read already, but of the next batch
  std::uint64_t batches_ = 0;
  std::uint64_t lines_ = 0;
  bool ended_ = false;
};

}  // namespace tool
