// SPDX-License-Identifier: Apache-2.0
// Input, findings and progress of the verbs over exports.
#include "ldif_report.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <thread>

namespace tool {
namespace {

constexpr std::chrono::milliseconds kProgressStep{200};

constexpr char kClearLine[] = "\r\033[K";

std::string whole(double number) {
  return std::to_string(static_cast<std::uint64_t>(number));
}

void writeToTerminal(std::string_view text) noexcept {
  const ssize_t written = ::write(STDERR_FILENO, text.data(), text.size());
  static_cast<void>(written);  // progress that cannot be shown is no failure
}

bool isCryptVariant(std::string_view value) noexcept {
  const std::string_view payload = value.substr(value.find('}') + 1);
  return !payload.empty() && (payload.front() == '$' || payload.front() == '_');
}

}  // namespace

const LookText kLooks[] = {
    {"fine", "well formed", kSuccess},
    {"unknownTag", "unknown tag", kBadValue},
    {"malformed", "malformed payload", kBadValue},
    {"untagged", "masked without a tag", kBadValue},
    {"cryptVariant", "crypt variant that cannot be checked", kBadValue},
    {"unopened", "not opened by the keys", kBadKey},
    {"notText", "opens into bytes that are not text, as a wrong key can make them", kBadKey},
    {"broken", "the line is not well formed", kBadValue},
};
static_assert(sizeof kLooks / sizeof kLooks[0] == static_cast<std::size_t>(Look::kCount), "a row for each look");

ExportInput::ExportInput(const std::string& path) : name_(path == "-" ? "standard input" : path) {
  if (path != "-") file_ = openInput(path);
}

int ExportInput::fd() const noexcept {
  return file_.valid() ? file_.get() : STDIN_FILENO;
}

unsigned threadsFor(unsigned asked) noexcept {
  return asked > 0 ? asked : std::max(1U, std::thread::hardware_concurrency());
}

Finding findingAt(const RecordWalker& walker, Status status) {
  return {walker.lineNumber(), walker.dn(), status};
}

void tell(const Finding& finding) noexcept {
  try {
    message("line " + std::to_string(finding.line) + ": " + (finding.dn.empty() ? "(no dn)" : finding.dn) + ": " +
            finding.status.text);
  } catch (const std::bad_alloc&) {
    message(finding.status.text);
  }
}

Look lookOf(std::string_view value) {
  if (unknownTag(value)) return Look::kUnknownTag;
  const Scheme& scheme = schemeOf(value);
  if (scheme.code == FORMAT_CRYPT && isCryptVariant(value)) return Look::kCryptVariant;
  if (scheme.code == FORMAT_QVEIL && value.front() == '>') return Look::kUntagged;
  return payloadProblem(value) != nullptr ? Look::kMalformed : Look::kFine;
}

bool looksLikeText(std::string_view bytes) noexcept {
  for (const char byte : bytes) {
    if (static_cast<unsigned char>(byte) < 0x20 || byte == 0x7f) return false;
  }
  return wellFormedUtf8(bytes);
}

std::string cell(std::string_view text, std::size_t width) {
  return std::string(width - std::min(width, text.size()), ' ').append(text);
}

std::string cell(std::uint64_t number, std::size_t width) {
  return cell(std::to_string(number), width);
}

std::string leftCell(std::string_view text, std::size_t width) {
  return std::string(text).append(width - std::min(width, text.size()), ' ');
}

Progress::Progress(int inputFd, bool resultsOnStdout)
    : shown_(isatty(STDERR_FILENO) == 1 && !(resultsOnStdout && isatty(STDOUT_FILENO) == 1)) {
  struct stat status {};
  if (fstat(inputFd, &status) == 0 && S_ISREG(status.st_mode)) total_ = static_cast<std::uint64_t>(status.st_size);
}

void Progress::advance(std::uint64_t entries, std::uint64_t bytes) {
  entries_ += entries;
  bytes_ += bytes;
  const Clock::time_point now = Clock::now();
  if (!shown_ || now < next_) return;
  next_ = now + kProgressStep;
  const double seconds = std::chrono::duration<double>(now - start_).count();
  const double rate = seconds > 0 ? static_cast<double>(entries_) / seconds : 0;
  std::string line = kClearLine + std::to_string(entries_) + " entries, " + whole(rate) + " a second";
  if (total_ > bytes_ && bytes_ > 0) {
    line += ", " + whole(seconds * static_cast<double>(total_ - bytes_) / static_cast<double>(bytes_)) + " s left";
  }
  writeToTerminal(line);
  visible_ = true;
}

void Progress::hide() noexcept {
  if (visible_) writeToTerminal(kClearLine);
  visible_ = false;
}

}  // namespace tool
