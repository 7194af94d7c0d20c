// SPDX-License-Identifier: Apache-2.0
// Reading: the one loop around read(), and lines over it.
#include "input.h"

#include <errno.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>

#include "failure.h"

namespace tool {
namespace {

constexpr std::size_t kReadBytes = std::size_t{1} << 16;

}  // namespace

Input::Input(const std::string& path) : file_(openPath(path, O_RDONLY)), name_(path) {
  if (!file_.valid()) throw ioFailure(path);
}

int Input::fd() const noexcept {
  return file_.valid() ? file_.get() : STDIN_FILENO;
}

bool Input::more(Secret& buffer, std::size_t bytes) {
  const std::size_t before = buffer.size();
  buffer.resize(before + bytes);
  ssize_t count = 0;
  do {
    count = read(fd(), buffer.data() + before, bytes);
  } while (count < 0 && errno == EINTR);
  if (count < 0) throw ioFailure(name_);
  buffer.resize(before + static_cast<std::size_t>(count));
  return count > 0;
}

bool LineReader::lineBuffered() const noexcept {
  return ended_ || buffer_.view().find('\n', position_) != std::string_view::npos;
}

// Drops what was handed out and reads once more; false at the end of the input.
bool LineReader::fill() {
  if (ended_) return false;
  if (position_ > 0) {
    const std::size_t rest = buffer_.size() - position_;
    std::copy_n(buffer_.data() + position_, rest, buffer_.data());
    buffer_.resize(rest);
    position_ = 0;
  }
  ended_ = !input_.more(buffer_, kReadBytes);
  return !ended_;
}

bool LineReader::next(Secret& line) {
  line.clear();
  std::size_t searched = position_;
  for (;;) {
    const std::size_t end = buffer_.view().find('\n', searched);
    if (end != std::string_view::npos) {
      line.append(buffer_.view().substr(position_, end - position_));
      position_ = end + 1;
      return true;
    }
    const std::size_t pending = buffer_.size() - position_;
    if (!fill()) break;
    searched = pending;
  }
  if (position_ == buffer_.size()) return false;
  line.append(buffer_.view().substr(position_));
  position_ = buffer_.size();
  return true;
}

Secret firstLine(const std::string& path, const char* what) {
  LineReader lines{Input(path)};
  Secret line;
  if (!lines.next(line)) throw Failure(kBadValue, std::string("there is no ") + what + " in " + path);
  return line;
}

}  // namespace tool
