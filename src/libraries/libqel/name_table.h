// SPDX-License-Identifier: Apache-2.0
// The names that one provider context has looked up with success, and the algorithm slots they lead to. Looking up
// takes no lock: entries are only ever added, each is complete before it becomes visible, and the table never moves.
#ifndef QEL_NAME_TABLE_H
#define QEL_NAME_TABLE_H

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <new>

#include "lane.h"

namespace qel {

constexpr std::size_t kNameBytes = 64;  // with the NUL; OpenSSL's longest name is about half of that

// A name with its ASCII letters in lower case, which is how OpenSSL compares names, and its hash. Empty when the name
// is empty or too long to be an algorithm's.
class FoldedName {
 public:
  explicit FoldedName(const char* name) noexcept : spelling_{name} {
    for (; name[length_] != '\0'; ++length_) {
      if (length_ == kNameBytes - 1) {
        length_ = 0;
        return;
      }
      const char c = name[length_];
      text_[length_] = c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
      hash_ = (hash_ ^ static_cast<unsigned char>(text_[length_])) * kFnvPrime;
    }
    text_[length_] = '\0';
  }

  bool empty() const noexcept { return length_ == 0; }
  std::size_t bytes() const noexcept { return length_ + 1; }
  const char* text() const noexcept { return text_; }
  const char* spelling() const noexcept { return spelling_; }
  std::uint32_t hash() const noexcept { return hash_ ^ (hash_ >> 16); }

 private:
  static constexpr std::uint32_t kFnvOffset = 2166136261U;
  static constexpr std::uint32_t kFnvPrime = 16777619U;

  const char* spelling_;  // the caller's text
  char text_[kNameBytes];
  std::size_t length_ = 0;
  std::uint32_t hash_ = kFnvOffset;
};

template <typename Slot>
class NameTable {
 public:
  NameTable() noexcept = default;
  NameTable(const NameTable&) = delete;
  NameTable& operator=(const NameTable&) = delete;

  ~NameTable() {
    for (auto& entry : entries_) delete entry.load(std::memory_order_relaxed);
  }

  // The slot of the name that the lane's thread found last, when it is this name in the spelling that was added; else
  // null. Spares the folding and the hash.
  Slot* findRecent(const char* name, unsigned lane) const noexcept {
    const Entry* entry = recent_[lane % kRecents].entry.load(std::memory_order_acquire);
    if (entry == nullptr || name == nullptr) return nullptr;
    return std::strcmp(entry->spelling, name) == 0 ? entry->slot : nullptr;
  }

  Slot* find(const FoldedName& name, unsigned lane) noexcept {
    for (std::size_t at = name.hash();; ++at) {
      Entry* entry = entries_[at % kEntries].load(std::memory_order_acquire);
      if (entry == nullptr) return nullptr;
      if (std::memcmp(entry->name, name.text(), name.bytes()) != 0) continue;
      recent_[lane % kRecents].entry.store(entry, std::memory_order_release);
      return entry->slot;
    }
  }

  // Adds a name that find does not know. One caller at a time. False when memory or the table has run out.
  bool add(const FoldedName& name, Slot* slot) noexcept {
    if (count_ == kMaxNames) return false;
    Entry* entry = new (std::nothrow) Entry;
    if (entry == nullptr) return false;
    std::memcpy(entry->name, name.text(), name.bytes());
    std::memcpy(entry->spelling, name.spelling(), name.bytes());
    entry->slot = slot;
    std::size_t at = name.hash();
    while (entries_[at % kEntries].load(std::memory_order_relaxed) != nullptr) ++at;
    entries_[at % kEntries].store(entry, std::memory_order_release);
    ++count_;
    return true;
  }

  // The first slot for which the test holds, or null.
  template <typename Test>
  Slot* findIf(Test test) const noexcept {
    for (const auto& place : entries_) {
      const Entry* entry = place.load(std::memory_order_acquire);
      if (entry != nullptr && test(*entry->slot)) return entry->slot;
    }
    return nullptr;
  }

 private:
  static constexpr unsigned kRecents = 16;
  static constexpr std::size_t kEntries = 1024;
  static constexpr std::size_t kMaxNames = kEntries / 2;  // more than the names that OpenSSL has for one kind

  struct Entry {
    char name[kNameBytes] = {};
    char spelling[kNameBytes] = {};
    Slot* slot = nullptr;
  };

  struct alignas(kCacheLine) Recent {
    std::atomic<const Entry*> entry{nullptr};
  };

  Recent recent_[kRecents];
  std::atomic<Entry*> entries_[kEntries] = {};
  std::size_t count_ = 0;
};

}  // namespace qel

#endif
