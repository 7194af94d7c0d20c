// SPDX-License-Identifier: Apache-2.0
// Reading: the one loop around read(), and lines over it.
#include "base/input.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "base/failure.h"

namespace tool {
namespace {

using namespace std::string_view_literals;

constexpr size_t kReadBytes = size_t{1} << 16;
constexpr size_t kMarkBytes = 4;  // the longest beginning of kMarks

// What begins like this is no LDIF.
constexpr struct {
  std::string_view mark;
  const char* text;
} kMarks[] = {
    {"\xFF\xFE"sv, "UTF-16 text (iconv -f UTF-16 -t UTF-8 turns it into UTF-8)"},
    {"\xFE\xFF"sv, "UTF-16 text (iconv -f UTF-16 -t UTF-8 turns it into UTF-8)"},
    {"\xFD"
     "7zX"sv,
     "compressed by xz (xz -dc decompresses it)"},
    {"BZh"sv, "compressed by bzip2 (bzip2 -dc decompresses it)"},
    {"PK\x03\x04"sv, "a zip archive"},
    {"\x1F\x8B"sv, "compressed twice"},
    {"\x28\xB5\x2F\xFD"sv, "compressed twice"},
};

// What text that is not LDIF can be taken for.
const char* kindOfText(std::string_view text) noexcept {
  const size_t start = text.find_first_not_of(" \t\r\n");
  if (start == std::string_view::npos) return text.empty() ? "empty" : "blank";
  const char first = text[start];
  return first == '<' ? "XML or HTML" : first == '{' || first == '[' ? "JSON" : "text of another kind";
}

}  // namespace

std::string Input::nameOf(const std::string& path) {
  return path.empty() || path == "-" ? "standard input" : path;
}

Input::Input(const std::string& path) : name_(nameOf(path)) {
  if (path.empty() || path == "-") return;
  file_ = openPath(path, O_RDONLY);
  if (!file_.valid()) throw ioFailure(path);
}

int Input::fd() const noexcept {
  return file_.valid() ? file_.get() : STDIN_FILENO;
}

bool Input::readOnce(Secret& buffer, size_t bytes) {
  const size_t before = buffer.size();
  buffer.resize(before + bytes);
  ssize_t count = 0;
  do {
    count = read(fd(), buffer.data() + before, bytes);
  } while (count < 0 && errno == EINTR);
  if (count < 0) throw ioFailure(name_);
  buffer.resize(before + static_cast<size_t>(count));
  bytesRead_ += static_cast<std::uint64_t>(count);
  return count > 0;
}

bool Input::decodeMore(Secret& buffer, size_t bytes) {
  const size_t before = buffer.size();
  for (;;) {
    std::string_view rest = raw_.view().substr(rawAt_);
    try {
      decompressor_->decode(rest, buffer, bytes);
    } catch (const Failure& failure) {
      throw Failure(failure.code(), name_ + ": " + failure.what());
    }
    rawAt_ = raw_.size() - rest.size();
    if (buffer.size() > before) return true;
    if (!rest.empty()) continue;
    raw_.clear();
    rawAt_ = 0;
    if (readOnce(raw_, kReadBytes)) continue;
    if (decompressor_->complete()) return false;
    throw Failure(kIoError, name_ + ": the compressed data ends too early");
  }
}

bool Input::more(Secret& buffer, size_t bytes) {
  if (!ahead_.empty()) {
    buffer.append(ahead_.view());
    ahead_.clear();
    return true;
  }
  return decompressor_ ? decodeMore(buffer, bytes) : readOnce(buffer, bytes);
}

void Input::requireText() {
  while (raw_.size() < kMarkBytes && readOnce(raw_, kFirstBytes - kMarkBytes)) {
  }
  decompressor_ = decompressorFor(raw_.view());
  if (!decompressor_) std::swap(ahead_, raw_);
  while (decompressor_ && ahead_.size() < kMarkBytes && decodeMore(ahead_, kFirstBytes - kMarkBytes)) {
  }
  const std::string_view text = ahead_.view();
  seems_ = kindOfText(text);
  for (const auto& row : kMarks) {
    if (text.substr(0, row.mark.size()) == row.mark) {
      throw Failure(kBadValue, name_ + " is no LDIF: it seems to be " + row.text);
    }
  }
  const size_t zero = text.find('\0');
  if (zero == std::string_view::npos) return;
  const bool wide = zero < 2 && text.size() > 3 && text[zero + 2] == '\0';
  throw Failure(kBadValue, name_ + " is no LDIF: it seems to be " + (wide ? kMarks[0].text : "binary"));
}

bool LineReader::lineBuffered() const noexcept {
  return ended_ || buffer_.view().find(end_, position_) != std::string_view::npos;
}

// Drops what was handed out and reads once more; false at the end of the input.
bool LineReader::fill() {
  if (ended_) return false;
  if (position_ > 0) {
    const size_t rest = buffer_.size() - position_;
    std::copy_n(buffer_.data() + position_, rest, buffer_.data());
    buffer_.resize(rest);
    position_ = 0;
  }
  ended_ = !input_.more(buffer_, kReadBytes);
  return !ended_;
}

void LineReader::hand(size_t bytes, Secret& line) {
  if (bytes > limit_.bytes) {
    throw Failure(kBadValue, input_.name() + ", line " + std::to_string(lines_ + 1) + ": more than the " +
                                 std::to_string(limit_.bytes) + " bytes that " + limit_.what + " may have");
  }
  ++lines_;
  line.append(buffer_.view().substr(position_, bytes));
}

bool LineReader::next(Secret& line) {
  line.clear();
  size_t searched = position_;
  for (;;) {
    const size_t end = buffer_.view().find(end_, searched);
    if (end != std::string_view::npos) {
      hand(end - position_, line);
      position_ = end + 1;
      return true;
    }
    const size_t pending = buffer_.size() - position_;
    if (pending > limit_.bytes || !fill()) break;
    searched = pending;
  }
  if (position_ == buffer_.size()) return false;
  hand(buffer_.size() - position_, line);
  position_ = buffer_.size();
  return true;
}

Secret firstLine(const std::string& path, LineLimit limit) {
  LineReader lines{Input(path), limit};
  Secret line;
  if (!lines.next(line)) throw Failure(kBadValue, path + ": there is no line to be " + limit.what);
  return line;
}

}  // namespace tool
