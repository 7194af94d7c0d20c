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

KeyRing::KeyRing(const std::vector<std::string>& paths) {
  for (const std::string& path : paths) {
    if (!path.empty()) keys_.push_back(KeyRecord::load(path));
  }
}

Status KeyRing::open(const Examined& value, size_t first, bool allowBinary, Secret& clear, size_t& used) const {
  used = kNoKey;
  Status refused;
  Secret bytes;
  bool opened = false;
  bool tied = false;
  const bool keyless = !value.scheme().needsKey() || first >= keys_.size();
  const KeyRecord none;
  const size_t count = keyless ? 1 : keys_.size() - first;
  const size_t latest = std::max(latest_.load(std::memory_order_relaxed), first) - first;
  for (size_t n = 0; n < count; ++n) {
    const size_t i = first + (latest + n) % count;
    const Status status = openValue(value, keyless ? none : keys_[i], clear);
    if (!status.ok()) {
      refused = status;
      continue;
    }
    const bool text = looksLikeText(clear.view()) || value.scheme().strength == Strength::kClear;
    const bool better = text || !opened || clear.size() < bytes.size();
    if (better && !keyless) used = i;
    if (text) {
      if (!keyless) latest_.store(i, std::memory_order_relaxed);
      return {};
    }
    tied = opened && clear.size() == bytes.size();
    if (better) bytes = Secret(clear.view());
    opened = true;
  }
  if (!opened) return refused;
  if (!allowBinary) return kNotText;
  clear = std::move(bytes);
  return tied ? kAmbiguous : Status{};
}

}  // namespace tool
