// SPDX-License-Identifier: Apache-2.0
#include "schemes/wrapping.h"

#include <algorithm>
#include <iterator>

#include "base/base64.h"
#include "base/text.h"
#include "schemes/schemes.h"

namespace tool {
namespace {

constexpr std::string_view kBlanks = " \t\r\n";
constexpr std::string_view kLocks[] = {"x", "*", "!", "!!", "*LK*", "*NP*", "*LOCKED*"};

std::string_view trimmed(std::string_view text) noexcept {
  const size_t start = std::min(text.find_first_not_of(kBlanks), text.size());
  const size_t end = text.find_last_not_of(kBlanks);
  return start == text.size() ? std::string_view() : text.substr(start, end + 1 - start);
}

bool isTagged(std::string_view text) {
  const Secret copy(text);
  const StoredValue value(copy);
  return !value.scheme().isClear() && !value.tag().empty();
}

// True for a lock alone, and for marks before a value or before the payload of one.
bool isLocked(std::string_view text, bool payload) {
  if (!payload && std::find(std::begin(kLocks), std::end(kLocks), text) != std::end(kLocks)) return true;
  const std::string_view behind = text.substr(std::min(text.find_first_not_of("!*"), text.size()));
  return behind.size() < text.size() && (payload || isTagged(trimmed(behind)));
}

Secret decoded(std::string_view base64) {
  Secret bytes;
  decodeBase64(base64, bytes);
  return bytes;
}

}  // namespace

Wrapping wrappingOf(const StoredValue& value, const char* problem) {
  const bool clear = value.scheme().isClear();
  const std::string_view whole = value.whole().view();
  const std::string_view lockable = clear ? whole : value.payload();
  if (isLocked(lockable, !clear) && (clear || problem != nullptr)) return Wrapping::kLocked;
  const std::string_view inner = trimmed(whole);
  if (inner.size() != whole.size() && isTagged(inner)) return Wrapping::kPadded;
  if (!clear || whole.empty() || whole.front() != 'e') return Wrapping::kNone;  // base64 of "{"
  const Secret within = decoded(whole);
  return isTagged(within.view()) && StoredValue(within).problem() == nullptr ? Wrapping::kEncoded : Wrapping::kNone;
}

Secret unwrapped(const Secret& value, Wrapping wrapping) {
  return wrapping == Wrapping::kEncoded ? decoded(value.view()) : Secret(trimmed(value.view()));
}

}  // namespace tool
