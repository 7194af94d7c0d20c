// SPDX-License-Identifier: Apache-2.0
// The provider alone: a digest and a block of ciphertext as the library asks for them, each with a context of its own,
// against EVP with an algorithm fetched beforehand; and the rounds of a key derivation, against EVP with one context.
#include <benchmark/benchmark.h>
#include <openssl/evp.h>

#include "bench_support.h"
#include "crypto_provider.h"

namespace {

constexpr int kRounds = 50000;

const unsigned char* password() {
  return reinterpret_cast<const unsigned char*>(bench::kPassword.data());
}

void* provider() {
  void* ctx = nullptr;
  initQelCrypto(&ctx);
  return ctx;
}

void digestOurs(benchmark::State& state, const char* name) {
  void* ctx = provider();
  unsigned char out[64];
  for (auto _ : state) {
    void* digestCtx = pQEL_EVP_MD_CTX_new(ctx);
    pQEL_EVP_MD_CTX_init(ctx, digestCtx);
    pQEL_EVP_DigestInit(ctx, digestCtx, pQEL_EVP_get_digestbyname(ctx, name));
    pQEL_EVP_DigestUpdate(ctx, digestCtx, password(), 16);
    benchmark::DoNotOptimize(pQEL_EVP_DigestFinal(ctx, digestCtx, out, nullptr));
    pQEL_EVP_MD_CTX_cleanup(ctx, digestCtx);
    pQEL_EVP_MD_CTX_free(ctx, digestCtx);
  }
}

void digestPeer(benchmark::State& state, const char* name) {
  EVP_MD* digest = EVP_MD_fetch(nullptr, name, nullptr);
  unsigned char out[64];
  for (auto _ : state) {
    EVP_MD_CTX* digestCtx = EVP_MD_CTX_new();
    EVP_DigestInit_ex2(digestCtx, digest, nullptr);
    EVP_DigestUpdate(digestCtx, password(), 16);
    benchmark::DoNotOptimize(EVP_DigestFinal_ex(digestCtx, out, nullptr));
    EVP_MD_CTX_free(digestCtx);
  }
  EVP_MD_free(digest);
}
BENCHMARK_CAPTURE(digestOurs, sha1, "SHA1")->Name("provider-sha1/ours");
BENCHMARK_CAPTURE(digestPeer, sha1, "SHA1")->Name("provider-sha1/peer");
BENCHMARK_CAPTURE(digestOurs, md5, "md5")->Name("provider-md5/ours");
BENCHMARK_CAPTURE(digestPeer, md5, "md5")->Name("provider-md5/peer");

void cipherOurs(benchmark::State& state) {
  void* ctx = provider();
  unsigned char out[64];
  int first = 0;
  int last = 0;
  for (auto _ : state) {
    void* cipherCtx = pQEL_EVP_CIPHER_CTX_new(ctx);
    pQEL_EVP_CIPHER_CTX_init(ctx, cipherCtx);
    const void* cipher = pQEL_EVP_get_cipherbyname(ctx, "AES-256-ECB");
    pQEL_EVP_EncryptInit(ctx, cipherCtx, cipher, bench::keys()->aesKeys[2].data, nullptr);
    pQEL_EVP_EncryptUpdate(ctx, cipherCtx, out, &first, password(), 16);
    benchmark::DoNotOptimize(pQEL_EVP_EncryptFinal(ctx, cipherCtx, out + first, &last));
    pQEL_EVP_CIPHER_CTX_cleanup(ctx, cipherCtx);
    pQEL_EVP_CIPHER_CTX_free(ctx, cipherCtx);
  }
}
BENCHMARK(cipherOurs)->Name("provider-aes256/ours");

void cipherPeer(benchmark::State& state) {
  EVP_CIPHER* cipher = EVP_CIPHER_fetch(nullptr, "AES-256-ECB", nullptr);
  unsigned char out[64];
  int first = 0;
  int last = 0;
  for (auto _ : state) {
    EVP_CIPHER_CTX* cipherCtx = EVP_CIPHER_CTX_new();
    EVP_EncryptInit_ex2(cipherCtx, cipher, bench::keys()->aesKeys[2].data, nullptr, nullptr);
    EVP_EncryptUpdate(cipherCtx, out, &first, password(), 16);
    benchmark::DoNotOptimize(EVP_EncryptFinal_ex(cipherCtx, out + first, &last));
    EVP_CIPHER_CTX_free(cipherCtx);
  }
  EVP_CIPHER_free(cipher);
}
BENCHMARK(cipherPeer)->Name("provider-aes256/peer");

void roundsOurs(benchmark::State& state) {
  void* ctx = provider();
  void* digestCtx = pQEL_EVP_MD_CTX_new(ctx);
  const void* digest = pQEL_EVP_get_digestbyname(ctx, "SHA1");
  unsigned char block[20] = {};
  for (auto _ : state) {
    for (int i = 0; i < kRounds; ++i) {
      pQEL_EVP_DigestInit(ctx, digestCtx, digest);
      pQEL_EVP_DigestUpdate(ctx, digestCtx, block, sizeof block);
      pQEL_EVP_DigestFinal(ctx, digestCtx, block, nullptr);
    }
  }
  pQEL_EVP_MD_CTX_free(ctx, digestCtx);
}
BENCHMARK(roundsOurs)->Name("provider-rounds/ours");

void roundsPeer(benchmark::State& state) {
  EVP_MD* digest = EVP_MD_fetch(nullptr, "SHA1", nullptr);
  EVP_MD_CTX* digestCtx = EVP_MD_CTX_new();
  unsigned char block[20] = {};
  for (auto _ : state) {
    for (int i = 0; i < kRounds; ++i) {
      EVP_DigestInit_ex2(digestCtx, digest, nullptr);
      EVP_DigestUpdate(digestCtx, block, sizeof block);
      EVP_DigestFinal_ex(digestCtx, block, nullptr);
    }
  }
  EVP_MD_CTX_free(digestCtx);
  EVP_MD_free(digest);
}
BENCHMARK(roundsPeer)->Name("provider-rounds/peer");

}  // namespace
