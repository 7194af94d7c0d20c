// SPDX-License-Identifier: Apache-2.0
// The table of schemes, and telling stored values apart without opening them.
#include <limits.h>

#include <algorithm>
#include <cstring>

#include "common.h"

namespace tool {

const Scheme kSchemes[] = {
    {"clear", "", FORMAT_NONE, false, true, 0, -1},
    {"sha", "{SHA}", FORMAT_SHA, false, true, 0, -1},
    {"ssha", "{SSHA}", FORMAT_SSHA, false, true, 0, -1},
    {"md5", "{MD5}", FORMAT_MD5, false, true, 0, -1},
    {"crypt", "{crypt}", FORMAT_CRYPT, false, true, 8, -1},
    {"qveil", "{qVEIL}", FORMAT_QVEIL, true, true, 46, -1},
    {"aes128", "{AES128}", FORMAT_AES128, true, true, 0, 0},
    {"aes192", "{AES192}", FORMAT_AES192, true, true, 0, 1},
    {"aes256", "{AES256}", FORMAT_AES256, true, true, 0, 2},
    {"vldl", "{VLDL}", FORMAT_VLDL, false, false, 0, -1},
    {nullptr, nullptr, 0, false, false, 0, -1},
};

namespace {

char lower(char c) noexcept {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

bool sameText(std::string_view a, std::string_view b) noexcept {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) { return lower(x) == lower(y); });
}

bool beginsWith(std::string_view text, std::string_view tag) noexcept {
  return text.size() >= tag.size() && sameText(text.substr(0, tag.size()), tag);
}

const Scheme* schemeOfTag(std::string_view value) noexcept {
  for (const Scheme* scheme = kSchemes + 1; scheme->name != nullptr; ++scheme) {
    if (beginsWith(value, scheme->tag)) return scheme;
  }
  return nullptr;
}

std::string_view payloadOf(std::string_view value) noexcept {
  const Scheme* scheme = schemeOfTag(value);
  return scheme != nullptr ? value.substr(strlen(scheme->tag)) : value;
}

bool isBase64(char c) noexcept {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '+' || c == '/';
}

const char* cryptProblem(std::string_view payload) noexcept {
  const bool ours =
      std::all_of(payload.begin(), payload.end(), [](char c) { return c == '.' || (isBase64(c) && c != '+'); });
  return ours && payload.size() == 13 ? nullptr : "the payload is not 13 characters of the crypt alphabet";
}

const char* maskedProblem(std::string_view payload) {
  if (payload.size() < 4 || payload.substr(0, 2) != ">1" || payload.back() != '<') {
    return "the payload is not wrapped in \">1\" and \"<\"";
  }
  Secret copy(payload);  // decoding writes to its input
  unsigned char* clear = nullptr;
  int clearBytes = 0;
  const int code = _morva_utils_decode_binary(copy.data(), &clear, &clearBytes);
  const bool decoded = code == LDAPPW_SUCCESS && clear != nullptr;
  _morva_utils_decode_binary_free(&clear);
  return decoded ? nullptr : "the masked payload does not decode";
}

const char* base64Problem(const Scheme& scheme, std::string_view payload) noexcept {
  const long bytes = base64Bytes(payload);
  if (bytes < 0) return "the payload is not base64 text";
  switch (scheme.code) {
    case FORMAT_SHA:
      return bytes == 20 ? nullptr : "the payload does not hold 20 bytes";
    case FORMAT_SSHA:
      return bytes >= 20 ? nullptr : "the payload holds less than a digest of 20 bytes";
    case FORMAT_MD5:
      return bytes == 16 ? nullptr : "the payload does not hold 16 bytes";
    default:
      return bytes > 0 && bytes % 16 == 0 ? nullptr : "the payload is not a whole number of 16-byte blocks";
  }
}

}  // namespace

const Scheme* findScheme(std::string_view name) noexcept {
  for (const Scheme* scheme = kSchemes; scheme->name != nullptr; ++scheme) {
    if (sameText(name, scheme->name) || (*scheme->tag != '\0' && sameText(name, scheme->tag))) return scheme;
  }
  return nullptr;
}

const Scheme& schemeOf(std::string_view value) noexcept {
  if (const Scheme* tagged = schemeOfTag(value)) return *tagged;
  const unsigned length = static_cast<unsigned>(std::min<std::size_t>(value.size(), INT_MAX));
  const int code = check_format(value.data(), length);
  for (const Scheme* scheme = kSchemes; scheme->name != nullptr; ++scheme) {
    if (scheme->code == code) return *scheme;
  }
  return kSchemes[0];
}

bool unknownTag(std::string_view value) noexcept {
  return !value.empty() && value.front() == '{' && value.find('}') != std::string_view::npos &&
         schemeOfTag(value) == nullptr;
}

const char* payloadProblem(std::string_view value) {
  if (unknownTag(value)) return "the tag is of no known scheme";
  const Scheme& scheme = schemeOf(value);
  if (scheme.code == FORMAT_NONE || scheme.code == FORMAT_VLDL) return nullptr;
  const std::string_view payload = payloadOf(value);
  if (payload.empty()) return "there is no payload";
  if (payload.find('\0') != std::string_view::npos) return "the payload holds a NUL byte";
  if (payload.back() == '\r') return "the payload ends in a carriage return";
  if (scheme.code == FORMAT_CRYPT) return cryptProblem(payload);
  if (scheme.code == FORMAT_QVEIL) return maskedProblem(payload);
  return base64Problem(scheme, payload);
}

long base64Bytes(std::string_view text) noexcept {
  if (text.size() % 4 != 0) return -1;
  std::size_t pads = 0;
  while (pads < 2 && pads < text.size() && text[text.size() - 1 - pads] == '=') ++pads;
  const std::string_view digits = text.substr(0, text.size() - pads);
  if (!std::all_of(digits.begin(), digits.end(), isBase64)) return -1;
  return static_cast<long>(text.size() / 4 * 3 - pads);
}

}  // namespace tool
