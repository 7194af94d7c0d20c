// SPDX-License-Identifier: Apache-2.0
// AES encryption of buffers through the crypto provider, with base64 text around it.
#include <climits>
#include <cstring>

#include "aes_keys.h"
#include "base64.h"
#include "qel_utils.h"
#include "text_target.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt{"aesEncryptBuffer", operationScope(moduleId(kAesCrypto, 1)), LineClass::debug};
constexpr TraceInfo kDecrypt{"aesDecryptBuffer", operationScope(moduleId(kAesCrypto, 2)), LineClass::debug};

constexpr int kPaddingOn = 1;

// The vector that the cipher asks for: as much of the source as fits, then zeros.
class InitVector {
 public:
  InitVector(void* qelCtx, const CipherContext& cipher, const SecBuffer& source) noexcept
      : size_(pQEL_EVP_CIPHER_iv_length(qelCtx, cipher.algorithm())), bytes_(size()) {
    const size_t given = source.data == nullptr ? 0 : source.length;
    const size_t taken = given < size() ? given : size();
    if (!bytes_ || size() == 0) return;
    std::memset(bytes_.get(), 0, size());
    if (taken != 0) std::memcpy(bytes_.get(), source.data, taken);
  }
  explicit operator bool() const noexcept { return static_cast<bool>(bytes_); }
  const unsigned char* get() noexcept { return bytes_.get(); }

 private:
  static constexpr size_t kUsual = 16;
  size_t size() const noexcept { return size_ > 0 ? static_cast<size_t>(size_) : 0; }
  int size_;
  SecretBytes<kUsual> bytes_;
};

// Passwords of usual length need no allocation for their raw form.
constexpr size_t kUsualRaw = 256;

// The size for n bytes through the cipher: one more block, and a NUL.
size_t workSize(void* qelCtx, const CipherContext& cipher, size_t n) noexcept {
  const int block = pQEL_EVP_CIPHER_block_size(qelCtx, cipher.algorithm());
  return (block > 0 ? static_cast<size_t>(block) : 0) + n + 1;
}

int encipher(TracedCall& call, void* qelCtx, const CipherContext& cipher, const char* clear, int clearLength,
             unsigned char* raw, int& rawLength) noexcept {
  int written = 0;
  rawLength = 0;
  if (clearLength > 0) {  // whatever the number of blocks, one update takes all input there is
    const auto* input = reinterpret_cast<const unsigned char*>(clear);
    if (pQEL_EVP_EncryptUpdate(qelCtx, cipher.get(), raw, &written, input, clearLength) != 1) {
      return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_EncryptUpdate() failed.");
    }
    rawLength += written;
  }
  written = 0;
  if (pQEL_EVP_EncryptFinal(qelCtx, cipher.get(), raw + rawLength, &written) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_EncryptFinal() failed.");
  }
  rawLength += written;
  return LDAPPW_SUCCESS;
}

int decipher(TracedCall& call, void* qelCtx, const CipherContext& cipher, const unsigned char* raw, int rawLength,
             unsigned char* clear, int& clearLength) noexcept {
  int written = 0;
  if (pQEL_EVP_DecryptUpdate(qelCtx, cipher.get(), clear, &written, raw, rawLength) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DecryptUpdate() failed.");
  }
  clearLength = written;
  written = 0;
  if (pQEL_EVP_DecryptFinal(qelCtx, cipher.get(), clear + clearLength, &written) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DecryptFinal() failed.");
  }
  clearLength += written;
  return LDAPPW_SUCCESS;
}

}  // namespace

int aesEncryptTo(TextTarget& target, const char* clear, const char* cipherName, const SecBuffer* key,
                 const SecBuffer* iv, int clearLength) noexcept {
  TracedCall call{kEncrypt, "clear", clear, "out", target.slot(), "cipherName", cipherName, "key", key, "iv", iv};
  if (clear == nullptr || target.slot() == nullptr || cipherName == nullptr || key == nullptr || iv == nullptr ||
      clearLength < 0) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  target.claim();
  CipherContext cipher(qelCtx);
  if (const int rc = cipher.init(cipherName); rc != 0) return call.fail(rc, "initQelCipher() failed.");

  InitVector vector(qelCtx, cipher, *iv);
  if (!vector)
    return call.failText(LDAPPW_NO_MEMORY, "Error - aesEncryptBuffer: calloc() failed.\n");  // no code: meant
  SecretBytes<kUsualRaw> raw(workSize(qelCtx, cipher, static_cast<size_t>(clearLength)));
  if (!raw) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  if (pQEL_EVP_EncryptInit(qelCtx, cipher.get(), cipher.algorithm(), key->data, vector.get()) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_EncryptInit() failed.");
  }
  if (pQEL_EVP_CIPHER_CTX_set_padding(qelCtx, cipher.get(), kPaddingOn) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_CIPHER_CTX_set_padding() failed.");
  }
  int rawLength = 0;
  if (const int rc = encipher(call, qelCtx, cipher, clear, clearLength, raw.get(), rawLength); rc != 0) return rc;
  if (!target.write(raw.get(), static_cast<size_t>(rawLength))) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  }
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int aesEncryptBuffer(const char* clear, char** out, const char* cipherName, const SecBuffer* key, const SecBuffer* iv,
                     int clearLength) noexcept {
  TextTarget target(out);
  return aesEncryptTo(target, clear, cipherName, key, iv, clearLength);
}

int aesDecryptBuffer(const char* text, char** out, const char* cipherName, const SecBuffer* key, const SecBuffer* iv,
                     int* clearLength) noexcept {
  TracedCall call{kDecrypt, "text", text, "out", out, "cipherName", cipherName, "key", key, "iv", iv};
  if (text == nullptr || out == nullptr || cipherName == nullptr || key == nullptr || iv == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  const size_t textLength = std::strlen(text);
  PlainBytes<decodedRoom(kUsualRaw)> raw(decodedRoom(textLength));
  const DecodedText decoded = raw ? decodeText(text, textLength, pBase64, raw.get()) : DecodedText{0, false};
  if (!decoded.isClean || textLength > INT_MAX) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "base64ToBinaryBlob() returned NULL.");
  }
  const size_t rawLength = decoded.bytes;
  OutGuard result{out};
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  CipherContext cipher(qelCtx);
  if (const int rc = cipher.init(cipherName); rc != 0) return call.fail(rc, "initQelCipher() failed.");

  InitVector vector(qelCtx, cipher, *iv);
  if (!vector)
    return call.failText(LDAPPW_NO_MEMORY, "Error - aesDecryptBuffer: calloc() failed.\n");  // no code: meant
  *out = zeroedBytes<char>(workSize(qelCtx, cipher, rawLength));
  if (*out == nullptr) return call.fail(LDAPPW_NO_MEMORY, "QEL_EVP_DecryptInit() failed.");  // the wording: meant
  if (pQEL_EVP_DecryptInit(qelCtx, cipher.get(), cipher.algorithm(), key->data, vector.get()) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_DecryptInit() failed.");
  }
  if (pQEL_EVP_CIPHER_CTX_set_padding(qelCtx, cipher.get(), kPaddingOn) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_CIPHER_CTX_set_padding() failed.");
  }
  auto* clear = reinterpret_cast<unsigned char*>(*out);
  int length = 0;
  if (const int rc = decipher(call, qelCtx, cipher, raw.get(), static_cast<int>(rawLength), clear, length); rc != 0) {
    return rc;
  }
  clear[length] = '\0';
  if (clearLength != nullptr) *clearLength = length;
  result.keep(*out);
  return call.leave(LDAPPW_SUCCESS);
}

}  // extern "C"
