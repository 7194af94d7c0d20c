// SPDX-License-Identifier: Apache-2.0
// AES encryption of buffers through the crypto provider, with base64 text around it. Log readers match the texts as
// they are, the two without a code and the allocation failure that speaks of DecryptInit among them; the Ledger and
// AesBuffers suites pin all.
#include "aes_keys.h"

#include <climits>
#include <cstring>

#include "provider/qel_utils.h"
#include "support/text_target.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

// What the two directions differ in. The provider's steps are reached through the entry table at call time.
struct Direction {
  TraceInfo trace;
  decltype(&pQEL_EVP_EncryptInit) init;
  decltype(&pQEL_EVP_EncryptUpdate) update;
  decltype(&pQEL_EVP_EncryptFinal) final;
  bool updatesEmpty;  // whether input of no bytes is handed over at all
  const char* initFailed;
  const char* updateFailed;
  const char* finalFailed;
};

constexpr Direction kEncrypt{operation(kAesCrypto, 1, "aesEncryptBuffer", {"clear", "out", "cipherName", "key", "iv"}),
                             &pQEL_EVP_EncryptInit,
                             &pQEL_EVP_EncryptUpdate,
                             &pQEL_EVP_EncryptFinal,
                             false,
                             "QEL_EVP_EncryptInit() failed.",
                             "QEL_EVP_EncryptUpdate() failed.",
                             "QEL_EVP_EncryptFinal() failed."};

constexpr Direction kDecrypt{operation(kAesCrypto, 2, "aesDecryptBuffer", {"text", "out", "cipherName", "key", "iv"}),
                             &pQEL_EVP_DecryptInit,
                             &pQEL_EVP_DecryptUpdate,
                             &pQEL_EVP_DecryptFinal,
                             true,
                             "QEL_EVP_DecryptInit() failed.",
                             "QEL_EVP_DecryptUpdate() failed.",
                             "QEL_EVP_DecryptFinal() failed."};

constexpr int kPaddingOn = 1;
constexpr size_t kUsualRaw = 256;    // passwords of usual length need no allocation for their raw form
constexpr size_t kWidestBlock = 32;  // of any cipher; key wrapping adds a block beyond its padding

// The size for n bytes through the cipher in either direction, and a NUL; 0 when it is none that an int can state.
size_t roomFor(const Cipher& cipher, size_t n) noexcept {
  const int block = cipher.blockSize();
  const size_t room = n + (block > 0 ? static_cast<size_t>(block) : 0) + 2 * kWidestBlock + 1;
  return n > INT_MAX || room > INT_MAX ? 0 : room;
}

// The vector that the cipher asks for: as much of the source as fits, then zeros.
class InitVector {
 public:
  InitVector(const Cipher& cipher, const SecBuffer& source) noexcept : bytes_(lengthFor(cipher)) {
    const size_t given = source.data == nullptr ? 0 : source.length;
    const size_t taken = given < bytes_.size() ? given : bytes_.size();
    if (bytes_ && taken != 0) std::memcpy(bytes_.get(), source.data, taken);
  }
  explicit operator bool() const noexcept { return static_cast<bool>(bytes_); }
  const unsigned char* get() noexcept { return bytes_.get(); }

 private:
  static constexpr size_t kUsual = 16;
  static size_t lengthFor(const Cipher& cipher) noexcept {
    const int length = cipher.vectorLength();
    return length > 0 ? static_cast<size_t>(length) : 0;
  }
  SecretBytes<kUsual> bytes_;
};

// Deciphered bytes, wiped unless they are handed over.
class ClearOutput {
 public:
  explicit ClearOutput(size_t bytes) noexcept : bytes_(bytes), data_(zeroedBytes<unsigned char>(bytes)) {}
  ~ClearOutput() { wipeAndFree(data_, bytes_); }
  ClearOutput(const ClearOutput&) = delete;
  ClearOutput& operator=(const ClearOutput&) = delete;

  explicit operator bool() const noexcept { return data_ != nullptr; }
  unsigned char* get() noexcept { return data_; }
  char* release() noexcept {
    auto* text = reinterpret_cast<char*>(data_);
    data_ = nullptr;
    return text;
  }

 private:
  size_t bytes_;
  unsigned char* data_;
};

// One pass of bytes through a cipher.
struct Pass {
  const unsigned char* key;
  const unsigned char* vector;
  const unsigned char* in;
  int inBytes;
  unsigned char* out;
  size_t room;
};

// Whether so many bytes lie in the room; what the provider claims is not trusted.
bool fits(int bytes, const Pass& pass) noexcept {
  return bytes >= 0 && static_cast<size_t>(bytes) < pass.room;
}

int run(TracedCall& call, const Direction& direction, const Cipher& cipher, const Pass& pass, int& outBytes) noexcept {
  if (callEntry(*direction.init, cipher.qelCtx, cipher.context, cipher.algorithm, pass.key, pass.vector) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, direction.initFailed);
  }
  if (cipher.setPadding(kPaddingOn) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_CIPHER_CTX_set_padding() failed.");
  }
  int first = 0;
  if (pass.inBytes > 0 || direction.updatesEmpty) {  // whatever the number of blocks, one update takes all input
    const int rc = callEntry(*direction.update, cipher.qelCtx, cipher.context, pass.out, &first, pass.in, pass.inBytes);
    if (rc != 1 || !fits(first, pass)) return call.fail(LDAPPW_OPERATIONS_ERROR, direction.updateFailed);
  }
  int last = 0;
  const int rc = callEntry(*direction.final, cipher.qelCtx, cipher.context, pass.out + first, &last);
  if (rc != 1 || last < 0 || last > INT_MAX - first || !fits(first + last, pass)) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, direction.finalFailed);
  }
  outBytes = first + last;
  return LDAPPW_SUCCESS;
}

}  // namespace

int aesEncryptTo(TextTarget& target, const char* clear, const char* cipherName, const SecBuffer* key,
                 const SecBuffer* iv, int clearLength) noexcept {
  TracedCall call{kEncrypt.trace, clear, target.address(), cipherName, key, iv};
  if (anyNull(clear, target.address(), cipherName, key, iv) || clearLength < 0) return call.invalid();
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  OutGuard<char> result(target.slot);
  CipherOwner cipher(qelCtx);
  if (const int rc = cipher.open(cipherName); rc != 0) return call.fail(rc, "initQelCipher() failed.");

  InitVector vector(cipher, *iv);
  if (!vector) return call.failText(LDAPPW_NO_MEMORY, "Error - aesEncryptBuffer: calloc() failed.\n");
  const size_t room = roomFor(cipher, static_cast<size_t>(clearLength));
  SecretBytes<kUsualRaw> raw(room);
  if (room == 0 || !raw) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  const Pass pass{key->data, vector.get(), reinterpret_cast<const unsigned char*>(clear), clearLength, raw.get(), room};
  int rawLength = 0;
  if (const int rc = run(call, kEncrypt, cipher, pass, rawLength); rc != 0) return rc;
  if (!writeBase64(target, raw.get(), static_cast<size_t>(rawLength))) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  }
  result.keep();
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int aesEncryptBuffer(const char* clear, char** out, const char* cipherName, const SecBuffer* key, const SecBuffer* iv,
                     int clearLength) noexcept {
  TextTarget target = toSlot(out);
  return aesEncryptTo(target, clear, cipherName, key, iv, clearLength);
}

int aesDecryptBuffer(const char* text, char** out, const char* cipherName, const SecBuffer* key, const SecBuffer* iv,
                     int* clearLength) noexcept {
  TracedCall call{kDecrypt.trace, text, out, cipherName, key, iv};
  if (anyNull(text, out, cipherName, key, iv)) return call.invalid();
  const size_t textLength = std::strlen(text);
  PlainBytes<decodedRoom(kUsualRaw)> raw(decodedRoom(textLength));
  const DecodedText decoded = raw ? decodeText(text, textLength, pBase64, raw.get()) : DecodedText{0, false};
  if (!decoded.isClean || textLength > INT_MAX) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "base64ToBinaryBlob() returned NULL.");
  }
  OutGuard<char> result(out);
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  CipherOwner cipher(qelCtx);
  if (const int rc = cipher.open(cipherName); rc != 0) return call.fail(rc, "initQelCipher() failed.");

  InitVector vector(cipher, *iv);
  if (!vector) return call.failText(LDAPPW_NO_MEMORY, "Error - aesDecryptBuffer: calloc() failed.\n");
  const size_t room = roomFor(cipher, decoded.bytes);
  ClearOutput clear(room);
  if (room == 0 || !clear) return call.fail(LDAPPW_NO_MEMORY, kDecrypt.initFailed);
  const Pass pass{key->data, vector.get(), raw.get(), static_cast<int>(decoded.bytes), clear.get(), room};
  int length = 0;
  if (const int rc = run(call, kDecrypt, cipher, pass, length); rc != 0) return rc;
  clear.get()[length] = '\0';
  if (clearLength != nullptr) *clearLength = length;
  *out = clear.release();
  result.keep();
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
