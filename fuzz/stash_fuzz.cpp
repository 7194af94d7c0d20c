// SPDX-License-Identifier: Apache-2.0
// Stash files of any content, and seed and salt texts, against the format and the rules in plain words.
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>

#include "fuzz_input.h"

using namespace fuzz;

namespace {

constexpr size_t kFixed = 12 + 16 + 24 + 32;

// The path of an anonymous file with this content.
const char* fileOf(std::string_view content) {
  static const int descriptor = memfd_create("stash", 0);
  static const std::string path = "/proc/self/fd/" + std::to_string(descriptor);
  const auto size = static_cast<off_t>(content.size());
  require(ftruncate(descriptor, 0) == 0 && pwrite(descriptor, content.data(), content.size(), 0) == size);
  return path.c_str();
}

void tryRecord(std::string_view content, uint32_t syncLength, const AesKeyData& record) {
  require(record.cryptoSync.length == syncLength);
  const SecBuffer* const buffers[] = {&record.cryptoSync, &record.cryptoSalt, &record.aesKeys[0], &record.aesKeys[1],
                                      &record.aesKeys[2]};
  std::string held;
  for (const SecBuffer* buffer : buffers) held.append(reinterpret_cast<char*>(buffer->data), buffer->length);
  require(held == content.substr(sizeof syncLength, held.size()) && record.cryptoSync.data[syncLength] == '\0');

  AesKeyData* copy = nullptr;
  require(copyAesKeyData(&record, &copy) == 0 && freeAesKeyData(copy) == 0);
  int matches = -1;
  const char* sync = reinterpret_cast<char*>(record.cryptoSync.data);
  require(checkKeyStashFile(1, &record, sync, reinterpret_cast<char*>(record.cryptoSalt.data), &matches) == 0);
  require(matches == 0 || matches == 1);
}

void tryFile(std::string_view content) {
  uint32_t syncLength = 0;
  if (content.size() >= sizeof syncLength) std::memcpy(&syncLength, content.data(), sizeof syncLength);
  const bool isWhole = content.size() >= sizeof syncLength + uint64_t{syncLength} + kFixed;
  AesKeyData* record = nullptr;
  require(setAESKeyData(fileOf(content), &record) == (isWhole ? 0 : 1) && (record != nullptr) == isWhole);
  if (isWhole) tryRecord(content, syncLength, *record);
  freeAesKeyData(record);

  require(initAesKeyData(&record) == 0);  // read into one record twice, whole or not, and released
  for (int round = 0; round < 2; ++round) require(readKeyStashFile(fileOf(content), record) == (isWhole ? 0 : 1));
  freeAesKeyData(record);
}

void tryText(std::string_view bytes) {
  const Block text = Block::text(bytes);
  const std::string_view characters(text.text());
  const bool clean = std::all_of(characters.begin(), characters.end(), [](char c) { return c >= 33 && c <= 126; });
  const size_t length = characters.size();
  require(validateCryptoString(text.text(), 0) == (clean && length >= 12 && length <= 1016 ? 0 : 19));
  require(validateCryptoString(text.text(), 1) == (clean && length == 12 ? 0 : 19));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view content(reinterpret_cast<const char*>(data), size);
  tryFile(content);
  tryText(content);
  return 0;
}
