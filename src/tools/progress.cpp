// SPDX-License-Identifier: Apache-2.0
// The progress line of a pass over an export.
#include "progress.h"

#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "descriptor.h"

namespace tool {
namespace {

constexpr std::chrono::milliseconds kStep{200};
constexpr char kClearLine[] = "\r\033[K";

std::string whole(double number) {
  return std::to_string(static_cast<std::uint64_t>(number));
}

}  // namespace

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
  next_ = now + kStep;
  const double seconds = std::chrono::duration<double>(now - start_).count();
  const double rate = seconds > 0 ? static_cast<double>(entries_) / seconds : 0;
  std::string line = kClearLine + std::to_string(entries_) + " entries, " + whole(rate) + " a second";
  if (total_ > bytes_ && bytes_ > 0) {
    line += ", " + whole(seconds * static_cast<double>(total_ - bytes_) / static_cast<double>(bytes_)) + " s left";
  }
  tryWrite(STDERR_FILENO, line);
  visible_ = true;
}

void Progress::hide() noexcept {
  if (visible_) tryWrite(STDERR_FILENO, kClearLine);
  visible_ = false;
}

}  // namespace tool
