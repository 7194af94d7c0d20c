// SPDX-License-Identifier: Apache-2.0
// Results on standard output, JSON text for secrets, and messages on standard error.
#include <errno.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <memory>
#include <new>

#include "common.h"

namespace tool {
namespace {

constexpr std::size_t kFlushBytes = std::size_t{1} << 16;

// The number of bytes of the well-formed UTF-8 character at the beginning of text (RFC 3629), or 0.
std::size_t utf8Bytes(std::string_view text) noexcept {
  const auto byteAt = [&](std::size_t i) { return static_cast<std::uint32_t>(static_cast<unsigned char>(text[i])); };
  const std::uint32_t first = byteAt(0);
  if (first < 0x80) return 1;
  const std::size_t bytes = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
  if (first < 0xC2 || first > 0xF4 || text.size() < bytes) return 0;
  std::uint32_t point = first & (0x7FU >> bytes);
  for (std::size_t i = 1; i < bytes; ++i) {
    if ((byteAt(i) & 0xC0U) != 0x80U) return 0;
    point = (point << 6) | (byteAt(i) & 0x3FU);
  }
  const std::uint32_t least = bytes == 4 ? 0x10000 : bytes == 3 ? 0x800 : 0x80;
  const bool surrogate = point >= 0xD800 && point <= 0xDFFF;
  return point < least || point > 0x10FFFF || surrogate ? 0 : bytes;
}

bool controls(std::string_view character) noexcept {
  const auto first = static_cast<unsigned char>(character[0]);
  if (character.size() == 1) return first < 0x20 || first == 0x7F;
  return first == 0xC2 && static_cast<unsigned char>(character[1]) < 0xA0;
}

void tell(std::string_view prefix, std::string_view text) noexcept {
  try {
    std::string line(prefix);
    line += printable(text);
    line += '\n';
    const ssize_t written = ::write(STDERR_FILENO, line.data(), line.size());
    static_cast<void>(written);  // there is nowhere else to tell it
  } catch (const std::bad_alloc&) {
    static constexpr char kNoMemory[] = "ldappw: out of memory\n";
    const ssize_t written = ::write(STDERR_FILENO, kNoMemory, sizeof kNoMemory - 1);
    static_cast<void>(written);
  }
}

struct WipeText {
  void operator()(char* text) const noexcept {
    explicit_bzero(text, strlen(text));
    free(text);
  }
};

}  // namespace

std::string systemText(const std::string& what, int error) {
  return what + ": " + strerror(error);
}

void message(std::string_view text) noexcept {
  tell("ldappw: ", text);
}

void warning(std::string_view text) noexcept {
  tell("ldappw: warning: ", text);
}

std::string printable(std::string_view text) {
  std::string shown;
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t bytes = utf8Bytes(text.substr(i));
    if (bytes > 0 && !controls(text.substr(i, bytes))) {
      shown += text.substr(i, bytes);
      i += bytes;
      continue;
    }
    char hex[5];
    snprintf(hex, sizeof hex, "\\x%02X", static_cast<unsigned>(static_cast<unsigned char>(text[i])));
    shown += hex;
    ++i;
  }
  return shown;
}

bool wellFormedUtf8(std::string_view text) noexcept {
  while (!text.empty()) {
    const std::size_t bytes = utf8Bytes(text);
    if (bytes == 0) return false;
    text.remove_prefix(bytes);
  }
  return true;
}

void appendJsonString(Secret& out, std::string_view text) {
  out.append('"');
  for (const char c : text) {
    if (c == '"' || c == '\\') {
      out.append('\\');
      out.append(c);
    } else if (static_cast<unsigned char>(c) < 0x20) {
      char escape[7];
      snprintf(escape, sizeof escape, "\\u%04x", static_cast<unsigned>(static_cast<unsigned char>(c)));
      out.append(escape);
    } else {
      out.append(c);
    }
  }
  out.append('"');
}

void appendBase64(Secret& out, std::string_view bytes) {
  const auto* data = reinterpret_cast<const unsigned char*>(bytes.data());
  const std::unique_ptr<char, WipeText> text(binaryBlobToBase64(data, static_cast<int>(bytes.size())));
  if (!text) throw std::bad_alloc();
  out.append(text.get());
}

std::string problemJson(std::size_t index, const Status& status) {
  Secret text;
  appendJsonString(text, status.text);
  return "{\"index\":" + std::to_string(index) + ",\"error\":" + text.c_str() +
         ",\"code\":" + std::to_string(status.code) + "}";
}

void Results::write(std::string_view bytes) {
  buffer_.append(bytes);
  if (buffer_.size() >= kFlushBytes) flush();
}

void Results::line(std::string_view text) {
  buffer_.append(text);
  write("\n");
}

void Results::flush() {
  std::string_view rest = buffer_.view();
  while (!rest.empty()) {
    const ssize_t count = ::write(STDOUT_FILENO, rest.data(), rest.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) {
      const int error = errno;
      buffer_.clear();
      throw Failure(kIoError, systemText("standard output", error));
    }
    rest.remove_prefix(static_cast<std::size_t>(count));
  }
  buffer_.clear();
}

}  // namespace tool
