// SPDX-License-Identifier: Apache-2.0
// Splitting LDIF into batches of records and into logical lines; see the header.
#include "ldif/lines.h"

#include <algorithm>
#include <cstring>
#include <string>

#include "base/failure.h"

namespace tool {
namespace {

constexpr size_t kColumns = 76;
constexpr size_t kNone = std::string_view::npos;

struct PhysicalLine {
  std::string_view content;
  std::string_view end;  // "\n", "\r\n", or less at the end of the input
};

// Cuts the first physical line off the text.
PhysicalLine takeLine(std::string_view& text) noexcept {
  const size_t newline = text.find('\n');
  size_t bytes = newline == kNone ? text.size() : newline;
  if (bytes > 0 && text[bytes - 1] == '\r') --bytes;
  const size_t whole = newline == kNone ? text.size() : newline + 1;
  const PhysicalLine line{text.substr(0, bytes), text.substr(bytes, whole - bytes)};
  text.remove_prefix(whole);
  return line;
}

// The offset just behind the last blank line whose newline is at or after from, or kNone. A blank line at the very
// start ends no record. Nothing before from is searched, so that a record of any size costs linear time.
size_t lastBorder(std::string_view text, size_t from) noexcept {
  while (const void* found = memrchr(text.data() + from, '\n', text.size() - from)) {
    const auto newline = static_cast<size_t>(static_cast<const char*>(found) - text.data());
    text = text.substr(0, newline);
    if (!text.empty() && text.back() == '\r') text.remove_suffix(1);
    if (!text.empty() && text.back() == '\n') return newline + 1;
    text = {text.data(), newline};
  }
  return kNone;
}

// Of a block the count fits a byte, and the compiler counts with vectors: one by one the lines of an export took a
// twentieth of its conversion.
std::uint64_t newlinesIn(std::string_view text) noexcept {
  constexpr size_t kBlock = 128;
  std::uint64_t total = 0;
  for (; text.size() >= kBlock; text.remove_prefix(kBlock)) {
    std::uint8_t count = 0;
    for (size_t i = 0; i < kBlock; ++i) count = static_cast<std::uint8_t>(count + (text[i] == '\n' ? 1 : 0));
    total += count;
  }
  return total + static_cast<std::uint64_t>(std::count(text.begin(), text.end(), '\n'));
}

}  // namespace

bool takeLogicalLine(std::string_view& text, LogicalLine& line) noexcept {
  if (text.empty()) return false;
  const std::string_view start = text;
  const PhysicalLine first = takeLine(text);
  line.first = first.content;
  line.firstEnd = line.lastEnd = first.end;
  line.physicalLines = 1;
  while (!line.blank() && !text.empty() && text.front() == ' ') {
    line.lastEnd = takeLine(text).end;
    ++line.physicalLines;
  }
  line.raw = start.substr(0, start.size() - text.size());
  return true;
}

void unfold(const LogicalLine& line, Secret& out) {
  out.clear();
  std::string_view rest = line.raw;
  out.append(takeLine(rest).content);
  while (!rest.empty()) out.append(takeLine(rest).content.substr(1));
}

void foldInto(std::string_view text, std::string_view lineEnd, Secret& out) {
  out.append(text.substr(0, kColumns));
  for (size_t at = kColumns; at < text.size(); at += kColumns - 1) {
    out.append(lineEnd);
    out.append(' ');
    out.append(text.substr(at, kColumns - 1));
  }
}

bool RecordReader::next(Batch& batch) {
  batch.text.clear();
  batch.text.append(ahead_.view());
  ahead_.clear();
  size_t searched = 0;
  size_t border = kNone;
  while (!ended_ && border == kNone) {
    if (batch.text.size() > kMaxRecordBytes) {
      throw Failure(kBadValue, input_.name() + ": the record in line " + std::to_string(lines_ + 1) +
                                   " is larger than 256 MiB: no blank line ends it");
    }
    ended_ = !input_.more(batch.text, batchBytes_);
    if (batch.text.size() < batchBytes_) continue;
    border = lastBorder(batch.text.view(), searched);
    searched = batch.text.size();
  }
  if (border != kNone) {
    ahead_.append(batch.text.view().substr(border));
    batch.text.resize(border);
  }
  if (batch.text.empty()) return false;
  batch.number = batches_++;
  batch.firstLine = lines_ + 1;
  lines_ += newlinesIn(batch.text.view());
  return true;
}

}  // namespace tool
