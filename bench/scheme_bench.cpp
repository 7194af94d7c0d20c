// SPDX-License-Identifier: Apache-2.0
// The digest and AES schemes and the making of keys, beside the same work through OpenSSL's EVP interface. The peers
// use algorithms fetched beforehand and, but for the keys, a new context for each call.
#include <openssl/evp.h>
#include <openssl/rand.h>

#include <cstdlib>
#include <memory>

#include "bench_support.h"

namespace {

using bench::formatted;
using bench::keys;
using bench::kPassword;
using bench::verified;

constexpr int kSha1Bytes = 20;
constexpr int kMd5Bytes = 16;

const EVP_CIPHER* aes256() {
  static EVP_CIPHER* const cipher = EVP_CIPHER_fetch(nullptr, "AES-256-ECB", nullptr);
  return cipher;
}
const EVP_MD* sha1() {
  static EVP_MD* const digest = EVP_MD_fetch(nullptr, "SHA1", nullptr);
  return digest;
}
const EVP_MD* md5() {
  static EVP_MD* const digest = EVP_MD_fetch(nullptr, "MD5", nullptr);
  return digest;
}

auto formattingOf(int scheme) {
  return [scheme] {
    char out[1024];
    format_password(scheme, nullptr, keys(), kPassword.data(), static_cast<int>(kPassword.size()), out, sizeof out);
    benchmark::DoNotOptimize(out);
  };
}
auto verifyingOf(int scheme) {
  return [stored = formatted(scheme, kPassword)] { benchmark::DoNotOptimize(verified(kPassword, stored)); };
}

// ---- {AES256} ----

int encipher(unsigned char* raw) {
  EVP_CIPHER_CTX* context = EVP_CIPHER_CTX_new();
  int first = 0;
  int last = 0;
  EVP_EncryptInit_ex2(context, aes256(), keys()->aesKeys[2].data, nullptr, nullptr);
  EVP_EncryptUpdate(context, raw, &first, bench::bytesOf(kPassword), static_cast<int>(kPassword.size()));
  EVP_EncryptFinal_ex(context, raw + first, &last);
  EVP_CIPHER_CTX_free(context);
  return first + last;
}

void formatAesWithOpenssl(unsigned char* out) {
  unsigned char raw[128];
  const int length = encipher(raw);
  std::memcpy(out, "{AES256}", 8);
  EVP_EncodeBlock(out + 8, raw, length);
}

void verifyAesWithOpenssl(const std::string& stored) {
  unsigned char out[1024];
  formatAesWithOpenssl(out);
  benchmark::DoNotOptimize(std::memcmp(out, stored.data(), stored.size()));
}

// The clear text on the heap, as a caller of ours gets it.
void revealAesWithOpenssl(const std::string& value) {
  auto* raw = static_cast<unsigned char*>(std::malloc(value.size()));
  auto* clear = static_cast<unsigned char*>(std::malloc(value.size() + 16));
  const int length = EVP_DecodeBlock(raw, bench::bytesOf(value) + 8, static_cast<int>(value.size()) - 8);
  EVP_CIPHER_CTX* context = EVP_CIPHER_CTX_new();
  int first = 0;
  int last = 0;
  EVP_DecryptInit_ex2(context, aes256(), keys()->aesKeys[2].data, nullptr, nullptr);
  EVP_DecryptUpdate(context, clear, &first, raw, length / 16 * 16);
  benchmark::DoNotOptimize(EVP_DecryptFinal_ex(context, clear + first, &last));
  EVP_CIPHER_CTX_free(context);
  std::free(clear);
  std::free(raw);
}

const bench::Rows kAes([] {
  const std::string stored = formatted(FORMAT_AES256, kPassword);
  bench::measure("aes256-format/ours", formattingOf(FORMAT_AES256));
  bench::measure("aes256-format/openssl", [] {
    unsigned char out[1024];
    formatAesWithOpenssl(out);
    benchmark::DoNotOptimize(out);
  });
  bench::measure("aes256-verify/ours", verifyingOf(FORMAT_AES256));
  bench::measure("aes256-verify/openssl", [stored] { verifyAesWithOpenssl(stored); });
  bench::measure("aes256-reveal/ours", [stored] {
    char* clear = nullptr;
    int length = 0;
    unformat_password(stored.c_str(), &clear, keys(), &length);
    std::free(clear);
  });
  bench::measure("aes256-reveal/openssl", [stored] { revealAesWithOpenssl(stored); });
});

// ---- Digests ----

struct Salt {
  const unsigned char* data;
  size_t bytes;
};

void digestWithOpenssl(const EVP_MD* digest, const Salt& salt, unsigned char* out) {
  EVP_MD_CTX* context = EVP_MD_CTX_new();
  EVP_DigestInit_ex2(context, digest, nullptr);
  EVP_DigestUpdate(context, kPassword.data(), kPassword.size());
  if (salt.bytes != 0) EVP_DigestUpdate(context, salt.data, salt.bytes);
  EVP_DigestFinal_ex(context, out, nullptr);
  EVP_MD_CTX_free(context);
}

void formatMd5WithOpenssl(unsigned char* out) {
  unsigned char digest[kMd5Bytes];
  digestWithOpenssl(md5(), {}, digest);
  std::memcpy(out, "{MD5}", 5);
  EVP_EncodeBlock(out + 5, digest, sizeof digest);
}

void formatSshaWithOpenssl(unsigned char* out) {
  unsigned char raw[2 * kSha1Bytes];
  RAND_bytes(raw + kSha1Bytes, kSha1Bytes);
  digestWithOpenssl(sha1(), {raw + kSha1Bytes, kSha1Bytes}, raw);
  std::memcpy(out, "{SSHA}", 6);
  EVP_EncodeBlock(out + 6, raw, sizeof raw);
}

void verifySshaWithOpenssl(const std::string& stored) {
  unsigned char decoded[64];
  unsigned char fresh[kSha1Bytes];
  EVP_DecodeBlock(decoded, bench::bytesOf(stored) + 6, 56);
  digestWithOpenssl(sha1(), {decoded + kSha1Bytes, kSha1Bytes}, fresh);
  benchmark::DoNotOptimize(std::memcmp(fresh, decoded, sizeof fresh));
}

void verifyMd5WithOpenssl(const std::string& stored) {
  unsigned char out[64];
  formatMd5WithOpenssl(out);
  benchmark::DoNotOptimize(std::memcmp(out, stored.data(), stored.size()));
}

const bench::Rows kDigests([] {
  bench::measure("ssha-format/ours", formattingOf(FORMAT_SSHA));
  bench::measure("ssha-format/openssl", [] {
    unsigned char out[1024];
    formatSshaWithOpenssl(out);
    benchmark::DoNotOptimize(out);
  });
  bench::measure("ssha-verify/ours", verifyingOf(FORMAT_SSHA));
  bench::measure("ssha-verify/openssl",
                 [stored = formatted(FORMAT_SSHA, kPassword)] { verifySshaWithOpenssl(stored); });
  bench::measure("md5-format/ours", formattingOf(FORMAT_MD5));
  bench::measure("md5-format/openssl", [] {
    unsigned char out[1024];
    formatMd5WithOpenssl(out);
    benchmark::DoNotOptimize(out);
  });
  bench::measure("md5-verify/ours", verifyingOf(FORMAT_MD5));
  bench::measure("md5-verify/openssl", [stored = formatted(FORMAT_MD5, kPassword)] { verifyMd5WithOpenssl(stored); });
  bench::measure("sha-verify/ours", verifyingOf(FORMAT_SHA));
  bench::measure("sha-verify/openssl", [] {  // the digest alone: the least that any checker has to do
    unsigned char fresh[kSha1Bytes];
    EVP_Digest(kPassword.data(), kPassword.size(), fresh, nullptr, sha1(), nullptr);
    benchmark::DoNotOptimize(fresh);
  });
});

// ---- A key record: five blocks of ten thousand rounds ----

constexpr char kSeed[] = "aSeedThatNobodyKnows";
constexpr char kSalt[] = "saltsaltsalt";

void deriveBlockWithOpenssl(EVP_MD_CTX* context, unsigned index, unsigned char* key) {
  const unsigned char counter[4] = {0, 0, 0, static_cast<unsigned char>(index)};
  unsigned char u[kSha1Bytes];
  EVP_DigestInit_ex2(context, sha1(), nullptr);
  EVP_DigestUpdate(context, kSalt, sizeof kSalt - 1);
  EVP_DigestUpdate(context, kSeed, sizeof kSeed - 1);
  EVP_DigestUpdate(context, counter, sizeof counter);
  EVP_DigestFinal_ex(context, u, nullptr);
  std::memcpy(key, u, sizeof u);
  for (int round = 1; round < 10000; ++round) {
    EVP_DigestInit_ex2(context, nullptr, nullptr);
    EVP_DigestUpdate(context, u, sizeof u);
    EVP_DigestFinal_ex(context, u, nullptr);
    for (int i = 0; i < kSha1Bytes; ++i) key[i] = static_cast<unsigned char>(key[i] ^ u[i]);
  }
}

const bench::Rows kKeys([] {
  bench::measure("key-record/ours", [] {
    AesKeyData* record = nullptr;
    genTmpKeyDataVal(kSeed, kSalt, &record);
    freeAesKeyData(record);
  });
  bench::measure("key-record/openssl", [] {
    unsigned char key[2 * kSha1Bytes];
    EVP_MD_CTX* context = EVP_MD_CTX_new();
    for (const unsigned index : {1U, 1U, 2U, 1U, 2U}) {  // one block for the shortest key, two for each of the others
      deriveBlockWithOpenssl(context, index, key + kSha1Bytes * (index - 1));
    }
    EVP_MD_CTX_free(context);
    benchmark::DoNotOptimize(key);
  });
});

}  // namespace
