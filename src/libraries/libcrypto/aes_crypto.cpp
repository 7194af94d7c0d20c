// SPDX-License-Identifier: Apache-2.0
// AES encryption of buffers through the crypto provider, with base64 text around it.
#include <climits>
#include <cstring>

#include "aes_keys.h"
#include "qel_utils.h"
#include "trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kEncrypt{"aesEncryptBuffer", operationScope(moduleId(kAesCrypto, 1)), LineClass::debug};
constexpr TraceInfo kDecrypt{"aesDecryptBuffer", operationScope(moduleId(kAesCrypto, 2)), LineClass::debug};

constexpr int kPaddingOn = 1;

// The vector that the cipher asks for: as much of the source as fits, then zeros. Null when memory runs out.
SecretOwner<unsigned char> vectorFor(void* qelCtx, const CipherContext& cipher, const SecBuffer& source) noexcept {
  const int asked = pQEL_EVP_CIPHER_iv_length(qelCtx, cipher.algorithm());
  const size_t bytes = asked > 0 ? static_cast<size_t>(asked) : 0;
  SecretOwner<unsigned char> vector(callocBytes<unsigned char>(bytes));
  const size_t given = source.data == nullptr ? 0 : source.length;
  const size_t taken = given < bytes ? given : bytes;
  if (vector && taken != 0) std::memcpy(vector.get(), source.data, taken);
  return vector;
}

// Room for n bytes through the cipher, one more block and a NUL; null also when that is more than can be had.
char* workBuffer(void* qelCtx, const CipherContext& cipher, size_t n) noexcept {
  const int block = pQEL_EVP_CIPHER_block_size(qelCtx, cipher.algorithm());
  return block < 0 ? nullptr : callocBytes<char>(static_cast<size_t>(block) + n + 1);
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

bool isBase64Text(const char* text) noexcept {
  const size_t symbols = std::strspn(text, pBase64Find);
  return text[symbols] == '\0';
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int aesEncryptBuffer(const char* clear, char** out, const char* cipherName, const SecBuffer* key, const SecBuffer* iv,
                     int clearLength) noexcept {
  TracedCall call{kEncrypt, {{"clear", clear}, {"out", out}, {"cipherName", cipherName}, {"key", key}, {"iv", iv}}};
  if (clear == nullptr || out == nullptr || cipherName == nullptr || key == nullptr || iv == nullptr ||
      clearLength < 0) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  OutGuard result{out};
  CipherContext cipher(qelCtx);
  if (const int rc = cipher.init(cipherName); rc != 0) return call.fail(rc, "initQelCipher() failed.");

  const SecretOwner<unsigned char> vector = vectorFor(qelCtx, cipher, *iv);
  if (!vector)
    return call.failText(LDAPPW_NO_MEMORY, "Error - aesEncryptBuffer: calloc() failed.\n");  // no code: meant
  *out = workBuffer(qelCtx, cipher, static_cast<size_t>(clearLength));
  if (*out == nullptr) return call.fail(LDAPPW_NO_MEMORY, "calloc() returned NULL.");
  auto* raw = reinterpret_cast<unsigned char*>(*out);
  if (pQEL_EVP_EncryptInit(qelCtx, cipher.get(), cipher.algorithm(), key->data, vector.get()) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_EncryptInit() failed.");
  }
  if (pQEL_EVP_CIPHER_CTX_set_padding(qelCtx, cipher.get(), kPaddingOn) != 1) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_EVP_CIPHER_CTX_set_padding() failed.");
  }
  int rawLength = 0;
  if (const int rc = encipher(call, qelCtx, cipher, clear, clearLength, raw, rawLength); rc != 0) return rc;
  char* text = binaryBlobToBase64(raw, rawLength);
  if (text == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "binaryBlobToBase64() returned NULL.");
  result.keep(text);
  return call.leave(LDAPPW_SUCCESS);
}

int aesDecryptBuffer(const char* text, char** out, const char* cipherName, const SecBuffer* key, const SecBuffer* iv,
                     int* clearLength) noexcept {
  TracedCall call{kDecrypt, {{"text", text}, {"out", out}, {"cipherName", cipherName}, {"key", key}, {"iv", iv}}};
  if (text == nullptr || out == nullptr || cipherName == nullptr || key == nullptr || iv == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  unsigned rawLength = 0;
  const PlainOwner<unsigned char> raw(isBase64Text(text) ? base64ToBinaryBlob(text, &rawLength) : nullptr);
  if (!raw || rawLength > INT_MAX) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "base64ToBinaryBlob() returned NULL.");
  }
  void* qelCtx = nullptr;
  if (const int rc = initQelCrypto(&qelCtx); rc != 0) return call.fail(rc, "initQelCrypto() failed.");
  OutGuard result{out};
  CipherContext cipher(qelCtx);
  if (const int rc = cipher.init(cipherName); rc != 0) return call.fail(rc, "initQelCipher() failed.");

  const SecretOwner<unsigned char> vector = vectorFor(qelCtx, cipher, *iv);
  if (!vector)
    return call.failText(LDAPPW_NO_MEMORY, "Error - aesDecryptBuffer: calloc() failed.\n");  // no code: meant
  *out = workBuffer(qelCtx, cipher, rawLength);
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
