// SPDX-License-Identifier: Apache-2.0
// The buffer before standard output, and the JSON writer.
#include "base/results.h"

#include <unistd.h>

#include <cstdio>
#include <new>
#include <string>

#include "base/base64.h"
#include "base/descriptor.h"
#include "base/text.h"

namespace tool {
namespace {

constexpr size_t kFlushBytes = size_t{1} << 16;

}  // namespace

void Results::write(std::string_view bytes) {
  buffer_.append(bytes);
  if (buffer_.size() >= kFlushBytes) flush();
}

void Results::line(std::string_view text) {
  buffer_.append(text);
  write({&end_, 1});
}

void Results::flush() {
  writeAll(STDOUT_FILENO, buffer_.view(), "standard output");
  buffer_.clear();
}

Json& Json::raw(std::string_view text) {
  text_.append(text);
  return *this;
}

void Json::escape(std::uint32_t point) {
  if (point > 0xFFFF) {  // as a pair, which stands for 20 bits
    escape(0xD800U + ((point - 0x10000U) >> 10));
    return escape(0xDC00U + (point & 0x3FFU));
  }
  char code[7];
  snprintf(code, sizeof code, "\\u%04x", static_cast<unsigned>(point & 0xFFFFU));
  raw(code);
}

void Json::quote(std::string_view text) {
  raw("\"");
  while (!text.empty()) {
    const std::string_view character = text.substr(0, utf8Bytes(text));
    const std::uint32_t point = codePoint(character);
    if (isUnseen(point)) {
      escape(point);
    } else {
      if (point == '"' || point == '\\') raw("\\");
      raw(character);
    }
    text.remove_prefix(character.size());
  }
  raw("\"");
}

Json& Json::begin(std::string_view name, std::string_view value) {
  const char last = text_.view().back();
  if (last != '{' && last != '[') raw(",");
  if (!name.empty()) quote(name);
  return raw(name.empty() ? "" : ":").raw(value);
}

Json& Json::text(std::string_view name, std::string_view value) {
  begin(name, "");
  wellFormedUtf8(value) ? quote(value) : quote(printable(value));
  return *this;
}

Json& Json::base64(std::string_view name, std::string_view bytes) {
  Secret text;
  appendBase64(bytes, text);
  return begin(name, "\"").raw(text.view()).raw("\"");
}

Json& Json::number(std::string_view name, std::uint64_t value) {
  return begin(name, std::to_string(value));
}

Json& Json::flag(std::string_view name, bool value) {
  return begin(name, value ? "true" : "false");
}

Json& Json::null(std::string_view name) {
  return begin(name, "null");
}

}  // namespace tool
