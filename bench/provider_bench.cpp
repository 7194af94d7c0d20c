// SPDX-License-Identifier: Apache-2.0
// The provider alone: a digest and a block of ciphertext as the library asks for them, each with a context of its own,
// beside EVP with an algorithm fetched beforehand; and the rounds of a key derivation, beside EVP with one context.
#include <openssl/evp.h>

#include "bench_support.h"
#include "crypto_provider.h"

namespace {

using bench::bytesOf;
using bench::kPassword;

constexpr int kRounds = 1000;
constexpr char kCipher[] = "AES-256-ECB";

void* provider() {
  void* ctx = nullptr;
  initQelCrypto(&ctx);
  return ctx;
}

void addDigest(const std::string& row, const char* name) {
  bench::measure(row + "/ours", [ctx = provider(), name] {
    unsigned char out[64];
    void* digestCtx = pQEL_EVP_MD_CTX_new(ctx);
    pQEL_EVP_MD_CTX_init(ctx, digestCtx);
    pQEL_EVP_DigestInit(ctx, digestCtx, pQEL_EVP_get_digestbyname(ctx, name));
    pQEL_EVP_DigestUpdate(ctx, digestCtx, kPassword.data(), static_cast<unsigned>(kPassword.size()));
    pQEL_EVP_DigestFinal(ctx, digestCtx, out, nullptr);
    pQEL_EVP_MD_CTX_cleanup(ctx, digestCtx);
    pQEL_EVP_MD_CTX_free(ctx, digestCtx);
  });
  bench::measure(row + "/openssl", [digest = EVP_MD_fetch(nullptr, name, nullptr)] {
    unsigned char out[64];
    EVP_MD_CTX* digestCtx = EVP_MD_CTX_new();
    EVP_DigestInit_ex2(digestCtx, digest, nullptr);
    EVP_DigestUpdate(digestCtx, kPassword.data(), kPassword.size());
    EVP_DigestFinal_ex(digestCtx, out, nullptr);
    EVP_MD_CTX_free(digestCtx);
  });
}

void addCipher(const std::string& row) {
  bench::measure(row + "/ours", [ctx = provider()] {
    unsigned char out[64];
    int first = 0;
    int last = 0;
    void* cipherCtx = pQEL_EVP_CIPHER_CTX_new(ctx);
    pQEL_EVP_CIPHER_CTX_init(ctx, cipherCtx);
    const void* cipher = pQEL_EVP_get_cipherbyname(ctx, kCipher);
    pQEL_EVP_EncryptInit(ctx, cipherCtx, cipher, bench::keys()->aesKeys[2].data, nullptr);
    pQEL_EVP_EncryptUpdate(ctx, cipherCtx, out, &first, bytesOf(kPassword), static_cast<int>(kPassword.size()));
    pQEL_EVP_EncryptFinal(ctx, cipherCtx, out + first, &last);
    pQEL_EVP_CIPHER_CTX_cleanup(ctx, cipherCtx);
    pQEL_EVP_CIPHER_CTX_free(ctx, cipherCtx);
  });
  bench::measure(row + "/openssl", [cipher = EVP_CIPHER_fetch(nullptr, kCipher, nullptr)] {
    unsigned char out[64];
    int first = 0;
    int last = 0;
    EVP_CIPHER_CTX* cipherCtx = EVP_CIPHER_CTX_new();
    EVP_EncryptInit_ex2(cipherCtx, cipher, bench::keys()->aesKeys[2].data, nullptr, nullptr);
    EVP_EncryptUpdate(cipherCtx, out, &first, bytesOf(kPassword), static_cast<int>(kPassword.size()));
    EVP_EncryptFinal_ex(cipherCtx, out + first, &last);
    EVP_CIPHER_CTX_free(cipherCtx);
  });
}

void addRounds(const std::string& row) {
  void* const ctx = provider();
  bench::measure(row + "/ours",
                 [ctx, digestCtx = pQEL_EVP_MD_CTX_new(ctx), digest = pQEL_EVP_get_digestbyname(ctx, "SHA1")] {
                   unsigned char block[20] = {};
                   for (int i = 0; i < kRounds; ++i) {
                     pQEL_EVP_DigestInit(ctx, digestCtx, digest);
                     pQEL_EVP_DigestUpdate(ctx, digestCtx, block, sizeof block);
                     pQEL_EVP_DigestFinal(ctx, digestCtx, block, nullptr);
                   }
                 });
  bench::measure(row + "/openssl", [digestCtx = EVP_MD_CTX_new(), digest = EVP_MD_fetch(nullptr, "SHA1", nullptr)] {
    unsigned char block[20] = {};
    for (int i = 0; i < kRounds; ++i) {
      EVP_DigestInit_ex2(digestCtx, digest, nullptr);
      EVP_DigestUpdate(digestCtx, block, sizeof block);
      EVP_DigestFinal_ex(digestCtx, block, nullptr);
    }
  });
}

const bench::Rows kRows([] {
  addDigest("provider-sha1", "SHA1");
  addDigest("provider-md5", "md5");
  addCipher("provider-aes256");
  addRounds("provider-rounds");
});

}  // namespace
