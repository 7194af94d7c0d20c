// SPDX-License-Identifier: Apache-2.0
#include "ldif/key_ring.h"

#include <algorithm>
#include <utility>

#include "base/text.h"
#include "schemes/schemes.h"

namespace tool {
namespace {

constexpr Status kNotText{kBadKey,
                          "opens into bytes that are not text: a wrong key, or a binary password (--allow-binary)"};
constexpr Status kAmbiguous{kBadKey, "opens into bytes that are not text with more than one of the keys"};

}  // namespace

void KeyRing::add(const std::string& path) {
  if (!path.empty()) keys_.push_back(KeyRecord::load(path));
}

Status KeyRing::Opened::status(bool allowBinary) const noexcept {
  switch (result) {
    case Result::kRefused:
      return refusal;
    case Result::kText:
      return {};
    case Result::kBytes:
      return allowBinary ? Status{} : kNotText;
    case Result::kAmbiguous:
      break;
  }
  return allowBinary ? kAmbiguous : kNotText;
}

KeyRing::Opened KeyRing::open(const Examined& value, size_t first, Secret& clear) const {
  const bool keyless = !value.scheme().needsKey() || first >= keys_.size();
  const KeyRecord none;
  const size_t count = keyless ? 1 : keys_.size() - first;
  const size_t latest = std::max(latest_.load(std::memory_order_relaxed), first) - first;
  Opened best;
  for (size_t n = 0; n < count; ++n) {
    const size_t key = keyless ? kNoKey : first + (latest + n) % count;
    Secret found;
    const Status status = openValue(value, keyless ? none : keys_[key], found);
    if (!status.ok()) {
      best.refusal = status;
    } else if (value.scheme().strength == Strength::kClear || looksLikeText(found.view())) {
      if (!keyless) latest_.store(key, std::memory_order_relaxed);
      clear = std::move(found);
      return {Opened::Result::kText, key, {}};
    } else if (best.result == Opened::Result::kRefused || found.size() < clear.size()) {
      clear = std::move(found);
      best = {Opened::Result::kBytes, key, {}};
    } else if (found.size() == clear.size()) {
      best.result = Opened::Result::kAmbiguous;
    }
  }
  return best;
}

}  // namespace tool
