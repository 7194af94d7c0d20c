// SPDX-License-Identifier: Apache-2.0
// Documented in key_file.h.
#include "key_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "secret_bytes.h"

namespace plugin {
namespace {

constexpr char kDamaged[] = "not a whole key stash file";
constexpr int kSaltType = 1;           // of validateCryptoString
constexpr off_t kMostBytes = 1 << 16;  // far more than a stash file has
constexpr mode_t kOthers = S_IRWXG | S_IRWXO;

class Descriptor {
 public:
  // Does not wait for the other end of a pipe.
  explicit Descriptor(const char* path) noexcept : fd_(open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY)) {}
  ~Descriptor() {
    if (fd_ >= 0) close(fd_);
  }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  int get() const noexcept { return fd_; }

 private:
  int fd_;
};

// Why the open file cannot be read, or null.
const char* fileProblem(const Descriptor& file, const char* path, struct stat& found, KeyReport& report) noexcept {
  if (file.get() < 0 || fstat(file.get(), &found) != 0) return std::strerror(errno);
  if (S_ISDIR(found.st_mode)) return std::strerror(EISDIR);
  if (!S_ISREG(found.st_mode)) return "not a regular file";
  if (found.st_size == 0) return "the file is empty";
  if (found.st_size > kMostBytes) return kDamaged;
  if ((found.st_mode & kOthers) != 0) {
    std::snprintf(report.warning, sizeof report.warning,
                  "key file %s: open to other users (mode %04o); its mode should be 0600", path,
                  static_cast<unsigned>(found.st_mode & 07777U));
  }
  return nullptr;
}

void fill(SecBuffer& buffer, std::string_view& from) noexcept {
  std::memcpy(buffer.data, from.data(), buffer.length);
  from.remove_prefix(buffer.length);
}

// Takes the content apart. The library's own reader takes a path: what is behind it then need not be what was looked at
// here.
const char* parse(const Library& library, std::string_view content, AesKeyData*& keys) noexcept {
  if (library.makeKeys(&keys) != LDAPPW_SUCCESS) return std::strerror(ENOMEM);
  std::uint32_t syncBytes = 0;
  if (content.size() < sizeof syncBytes) return kDamaged;
  std::memcpy(&syncBytes, content.data(), sizeof syncBytes);
  content.remove_prefix(sizeof syncBytes);
  std::uint64_t needed = std::uint64_t{syncBytes} + keys->cryptoSalt.length;
  for (const SecBuffer& key : keys->aesKeys) needed += key.length;
  if (content.size() < needed) return kDamaged;
  keys->cryptoSync.data = static_cast<unsigned char*>(std::calloc(size_t{syncBytes} + 1, 1));
  if (keys->cryptoSync.data == nullptr) return std::strerror(ENOMEM);
  keys->cryptoSync.length = syncBytes;
  fill(keys->cryptoSync, content);
  fill(keys->cryptoSalt, content);
  for (SecBuffer& key : keys->aesKeys) fill(key, content);
  return nullptr;
}

// Files of other content can be long enough: their texts tell. Of damaged keys, that a shorter one is not the beginning
// of the longer one any more.
bool looksWhole(const Library& library, const AesKeyData& keys) noexcept {
  const auto* sync = reinterpret_cast<const char*>(keys.cryptoSync.data);
  const auto* salt = reinterpret_cast<const char*>(keys.cryptoSalt.data);
  if (sync == nullptr || keys.cryptoSync.length == 0 || salt == nullptr ||
      library.validateText(salt, kSaltType) != LDAPPW_SUCCESS) {
    return false;
  }
  for (uint32_t i = 0; i < keys.cryptoSync.length; ++i) {
    if (sync[i] < '!' || sync[i] > '~') return false;
  }
  for (size_t i = 0; i + 1 < 3; ++i) {
    const SecBuffer& shorter = keys.aesKeys[i];
    const auto* longer = reinterpret_cast<const char*>(keys.aesKeys[i + 1].data);
    if (!equalBytes({reinterpret_cast<const char*>(shorter.data), shorter.length}, {longer, shorter.length})) {
      return false;
    }
  }
  return true;
}

// Why there are no keys in the file, or null. It is opened once, and no more is read than it had then.
const char* loadProblem(const Library& library, const char* path, AesKeyData*& keys, KeyReport& report) noexcept {
  const Descriptor file(path);
  struct stat found {};
  if (const char* problem = fileProblem(file, path, found, report)) return problem;
  SecretBytes content(static_cast<size_t>(found.st_size));
  if (!content) return std::strerror(ENOMEM);
  const ssize_t bytes = read(file.get(), content.data(), content.size());
  if (bytes < 0) return std::strerror(errno);
  const std::string_view whole(content.data(), static_cast<size_t>(bytes));
  if (const char* problem = parse(library, whole, keys)) return problem;
  if (!looksWhole(library, *keys)) return kDamaged;
  library.nameCiphers();
  void* provider = nullptr;
  return library.startProvider(&provider) == LDAPPW_SUCCESS ? nullptr : "the crypto provider cannot be loaded";
}

}  // namespace

AesKeyData* loadKeyFile(const Library& library, const char* path, KeyReport& report) noexcept {
  if (path == nullptr) {
    std::snprintf(report.problem, sizeof report.problem, "no key file is given (keys=FILE)");
    return nullptr;
  }
  AesKeyData* keys = nullptr;
  const char* problem = loadProblem(library, path, keys, report);
  if (problem == nullptr) return keys;
  library.freeKeys(keys);
  std::snprintf(report.problem, sizeof report.problem, "key file %s: %s", path, problem);
  return nullptr;
}

}  // namespace plugin
