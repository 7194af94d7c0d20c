// SPDX-License-Identifier: Apache-2.0
// Splitting LDIF into batches of records and into logical lines; see the header.
#include "ldif_lines.h"

#include <algorithm>
#include <cstring>
#include <string>

#include "failure.h"

namespace tool {
namespace {

constexpr std::size_t kColumns = 76;
constexpr std::size_t kNone = std::string_view::npos;

// Cuts the first physical line, line end included, off the text.
std::string_view takeLine(std::string_view& text) noexcept {
  const std::size_t newline = text.find('\n');
  const std::string_view line = text.substr(0, newline == kNone ? kNone : newline + 1);
  text.remove_prefix(line.size());
  return line;
}

std::string_view endOf(std::string_view line) noexcept {
  std::size_t start = line.size();
  if (start > 0 && line[start - 1] == '\n') --start;
  if (start > 0 && line[start - 1] == '\r') --start;
  return line.substr(start);
}

std::string_view contentOf(std::string_view line) noexcept {
  return line.substr(0, line.size() - endOf(line).size());
}

// The offset just behind the last blank line whose newline is at or after from, or kNone. A blank line at the very
// start ends no record. Nothing before from is searched, so that a record of any size costs linear time.
std::size_t lastBorder(std::string_view text, std::size_t from) noexcept {
  while (const void* found = memrchr(text.data() + from, '\n', text.size() - from)) {
    const auto newline = static_cast<std::size_t>(static_cast<const char*>(found) - text.data());
    text = text.substr(0, newline);
    if (!text.empty() && text.back() == '\r') text.remove_suffix(1);
    if (!text.empty() && text.back() == '\n') return newline + 1;
    text = {text.data(), newline};
  }
  return kNone;
}

}  // namespace

bool takeLogicalLine(std::string_view& text, LogicalLine& line) noexcept {
  if (text.empty()) return false;
  const std::string_view start = text;
  const std::string_view first = takeLine(text);
  line.first = contentOf(first);
  line.firstEnd = line.lastEnd = endOf(first);
  line.physicalLines = 1;
  while (!line.blank() && !text.empty() && text.front() == ' ') {
    line.lastEnd = endOf(takeLine(text));
    ++line.physicalLines;
  }
  line.raw = start.substr(0, start.size() - text.size());
  return true;
}

void unfold(const LogicalLine& line, Secret& out) {
  out.clear();
  std::string_view rest = line.raw;
  out.append(contentOf(takeLine(rest)));
  while (!rest.empty()) out.append(contentOf(takeLine(rest)).substr(1));
}

void foldInto(std::string_view text, std::string_view lineEnd, Secret& out) {
  out.append(text.substr(0, kColumns));
  for (std::size_t at = kColumns; at < text.size(); at += kColumns - 1) {
    out.append(lineEnd);
    out.append(' ');
    out.append(text.substr(at, kColumns - 1));
  }
}

bool RecordReader::next(Batch& batch) {
  batch.text.clear();
  batch.text.append(ahead_.view());
  ahead_.clear();
  std::size_t searched = 0;
  std::size_t border = kNone;
  while (!ended_ && border == kNone) {
    if (batch.text.size() > kMaxRecordBytes) {
      throw Failure(kBadValue, input_.name() + ": the record in line " + std::to_string(lines_ + 1) +
                                   " is larger than 256 MiB: no blank line ends it");
    }
    ended_ = !input_.more(batch.text, kBatchBytes);
    if (batch.text.size() < kBatchBytes) continue;
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
  const std::string_view text = batch.text.view();
  lines_ += static_cast<std::uint64_t>(std::count(text.begin(), text.end(), '\n'));
  return true;
}

}  // namespace tool
