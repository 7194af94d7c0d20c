// SPDX-License-Identifier: Apache-2.0
// The stash file format, with its one writer and its one reader.
#include "aes/aes_file_format.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "aes/aes_utils_record.h"
#include "support/cancellation.h"
#include "support/trace_scope.h"

static_assert(__BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__, "the file's sync length is little-endian");

namespace ldappw {
namespace {

constexpr TraceInfo kWrite = operation(kAesFile, 1, "writeKeyStashFile", {"keyStashFile", "keyData"});
constexpr TraceInfo kRead = operation(kAesFile, 2, "readKeyStashFile", {"keyStashFile", "keyData"});

// A stash file under way. There is no stream: that would want memory after the file has been cut to nothing, and keep
// keys in its buffer.
class StashFile {
 public:
  explicit StashFile(const char* path, int flags) noexcept
      : descriptor_(open(path, flags | O_CLOEXEC, S_IRUSR | S_IWUSR)) {}
  ~StashFile() {
    if (descriptor_ >= 0) close(descriptor_);
  }
  StashFile(const StashFile&) = delete;
  StashFile& operator=(const StashFile&) = delete;

  explicit operator bool() const noexcept { return descriptor_ >= 0; }
  bool read(void* data, size_t bytes) noexcept { return wholly(::read, static_cast<char*>(data), bytes); }
  bool write(const void* data, size_t bytes) noexcept { return wholly(::write, static_cast<const char*>(data), bytes); }
  bool write(const SecBuffer& buffer) noexcept { return write(buffer.data, buffer.length); }

  // True if a regular file has fewer than bytes left.
  bool endsBefore(size_t bytes) noexcept {
    struct stat about {};
    const off_t at = lseek(descriptor_, 0, SEEK_CUR);
    return fstat(descriptor_, &about) == 0 && S_ISREG(about.st_mode) && at >= 0 &&
           static_cast<uint64_t>(about.st_size) - static_cast<uint64_t>(at) < bytes;
  }

 private:
  // All bytes, in as many steps as it takes.
  template <typename Step, typename Data>
  bool wholly(Step step, Data* data, size_t bytes) noexcept {
    while (bytes != 0) {
      const ssize_t count = step(descriptor_, data, bytes);
      if (count < 0 && errno == EINTR) continue;
      if (count <= 0) return false;
      data += count;
      bytes -= static_cast<size_t>(count);
    }
    return true;
  }

  int descriptor_;
};

// The sync text with its length before it. What a regular file cannot hold is not allocated.
int readSync(TracedCall& call, StashFile& file, SecBuffer& sync) noexcept {
  uint32_t length = 0;
  const bool isWhole = file.read(&length, sizeof length);
  release(sync);
  sync.length = length;
  if (!isWhole || file.endsBefore(length)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(cryptoSync) failed.");
  sync.data = length == UINT32_MAX ? nullptr : zeroedBytes<unsigned char>(size_t{length} + 1);
  if (sync.data == nullptr) {  // log readers find the name of the function that usually makes the sync text
    return call.failText(LDAPPW_NO_MEMORY, "Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = %d\n",
                         static_cast<int>(LDAPPW_NO_MEMORY));
  }
  if (!file.read(sync.data, length)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(cryptoSync) failed.");
  return LDAPPW_SUCCESS;
}

}  // namespace

int writeKeyStashFile(const char* keyStashFile, const AesKeyData* keyData) noexcept {
  TracedCall call{kWrite, keyStashFile, keyData};
  if (anyNull(keyStashFile, keyData)) return call.invalid();
  const NoCancellation uncancelled;
  StashFile file(keyStashFile, O_WRONLY | O_CREAT | O_TRUNC);
  if (!file) return call.fail(LDAPPW_OPERATIONS_ERROR, "fopen() failed.");
  const uint32_t length = keyData->cryptoSync.length;
  if (!file.write(&length, sizeof length) || !file.write(keyData->cryptoSync)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "fwrite(cryptoSync) failed.");
  }
  if (!file.write(keyData->cryptoSalt)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fwrite(cryptoSalt) failed.");
  for (const SecBuffer& key : keyData->aesKeys) {
    if (!file.write(key)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fwrite(aesKeys) failed.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int readKeyStashFile(const char* keyStashFile, AesKeyData* keyData) noexcept {
  TracedCall call{kRead, keyStashFile, keyData};
  if (anyNull(keyStashFile, keyData)) return call.invalid();
  const NoCancellation uncancelled;
  StashFile file(keyStashFile, O_RDONLY);
  if (!file) return call.fail(LDAPPW_OPERATIONS_ERROR, "fopen() failed.");
  if (const int rc = readSync(call, file, keyData->cryptoSync); rc != 0) return rc;
  if (!file.read(keyData->cryptoSalt.data, keyData->cryptoSalt.length)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(cryptoSalt) failed.");
  }
  for (const SecBuffer& key : keyData->aesKeys) {
    if (!file.read(key.data, key.length)) return call.fail(LDAPPW_OPERATIONS_ERROR, "fread(aesKeys) failed.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
