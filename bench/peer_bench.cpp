// SPDX-License-Identifier: Apache-2.0
// Each operation of the library, named <work>/ours, and the same work done directly with OpenSSL, named <work>/peer.
// The peers use algorithms fetched beforehand and a new context for each call.
#include <benchmark/benchmark.h>
#include <openssl/evp.h>
#include <openssl/rand.h>

#include <cstdlib>
#include <vector>

#include "bench_support.h"

namespace {

using bench::formatted;
using bench::keys;
using bench::kPassword;
using bench::verified;

// ---- {AES256} format and reveal ----

const EVP_CIPHER* aes256() {
  static EVP_CIPHER* const cipher = EVP_CIPHER_fetch(nullptr, "AES-256-ECB", nullptr);
  return cipher;
}

void aesFormatOurs(benchmark::State& state) {
  char out[1024];
  for (auto _ : state) {
    benchmark::DoNotOptimize(format_password(FORMAT_AES256, nullptr, keys(), kPassword.data(),
                                             static_cast<int>(kPassword.size()), out, sizeof out));
  }
}
BENCHMARK(aesFormatOurs)->Name("aes256-format/ours");

void aesFormatPeer(benchmark::State& state) {
  unsigned char raw[128];
  unsigned char out[1024];
  for (auto _ : state) {
    EVP_CIPHER_CTX* context = EVP_CIPHER_CTX_new();
    int first = 0;
    int last = 0;
    EVP_EncryptInit_ex2(context, aes256(), keys()->aesKeys[2].data, nullptr, nullptr);
    EVP_EncryptUpdate(context, raw, &first, reinterpret_cast<const unsigned char*>(kPassword.data()),
                      static_cast<int>(kPassword.size()));
    EVP_EncryptFinal_ex(context, raw + first, &last);
    EVP_CIPHER_CTX_free(context);
    std::memcpy(out, "{AES256}", 8);
    benchmark::DoNotOptimize(EVP_EncodeBlock(out + 8, raw, first + last));
  }
}
BENCHMARK(aesFormatPeer)->Name("aes256-format/peer");

void aesRevealOurs(benchmark::State& state) {
  const std::string value = formatted(FORMAT_AES256, kPassword);
  for (auto _ : state) {
    char* clear = nullptr;
    int length = 0;
    benchmark::DoNotOptimize(unformat_password(value.c_str(), &clear, keys(), &length));
    std::free(clear);
  }
}
BENCHMARK(aesRevealOurs)->Name("aes256-reveal/ours");

void aesRevealPeer(benchmark::State& state) {
  const std::string value = formatted(FORMAT_AES256, kPassword);
  for (auto _ : state) {
    auto* raw = static_cast<unsigned char*>(std::malloc(value.size()));
    auto* clear = static_cast<unsigned char*>(std::malloc(value.size() + 16));
    const int rawLength = EVP_DecodeBlock(raw, reinterpret_cast<const unsigned char*>(value.data()) + 8,
                                          static_cast<int>(value.size()) - 8);
    EVP_CIPHER_CTX* context = EVP_CIPHER_CTX_new();
    int first = 0;
    int last = 0;
    EVP_DecryptInit_ex2(context, aes256(), keys()->aesKeys[2].data, nullptr, nullptr);
    EVP_DecryptUpdate(context, clear, &first, raw, rawLength / 16 * 16);
    benchmark::DoNotOptimize(EVP_DecryptFinal_ex(context, clear + first, &last));
    EVP_CIPHER_CTX_free(context);
    std::free(clear);
    std::free(raw);
  }
}
BENCHMARK(aesRevealPeer)->Name("aes256-reveal/peer");

// ---- Digests ----

const EVP_MD* sha1() {
  static EVP_MD* const digest = EVP_MD_fetch(nullptr, "SHA1", nullptr);
  return digest;
}

const EVP_MD* md5() {
  static EVP_MD* const digest = EVP_MD_fetch(nullptr, "MD5", nullptr);
  return digest;
}

void sshaVerifyOurs(benchmark::State& state) {
  const std::string stored = formatted(FORMAT_SSHA, kPassword);
  for (auto _ : state) benchmark::DoNotOptimize(verified(kPassword, stored));
}
BENCHMARK(sshaVerifyOurs)->Name("ssha-verify/ours");

void sshaVerifyPeer(benchmark::State& state) {
  const std::string stored = formatted(FORMAT_SSHA, kPassword);
  for (auto _ : state) {
    unsigned char decoded[64];
    unsigned char fresh[20];
    EVP_DecodeBlock(decoded, reinterpret_cast<const unsigned char*>(stored.data()) + 6, 56);
    EVP_MD_CTX* context = EVP_MD_CTX_new();
    EVP_DigestInit_ex2(context, sha1(), nullptr);
    EVP_DigestUpdate(context, kPassword.data(), kPassword.size());
    EVP_DigestUpdate(context, decoded + 20, 20);
    EVP_DigestFinal_ex(context, fresh, nullptr);
    EVP_MD_CTX_free(context);
    benchmark::DoNotOptimize(std::memcmp(fresh, decoded, sizeof fresh));
  }
}
BENCHMARK(sshaVerifyPeer)->Name("ssha-verify/peer");

void md5FormatOurs(benchmark::State& state) {
  char out[1024];
  for (auto _ : state) {
    benchmark::DoNotOptimize(format_password(FORMAT_MD5, nullptr, nullptr, kPassword.data(),
                                             static_cast<int>(kPassword.size()), out, sizeof out));
  }
}
BENCHMARK(md5FormatOurs)->Name("md5-format/ours");

void md5FormatPeer(benchmark::State& state) {
  unsigned char out[1024];
  for (auto _ : state) {
    unsigned char fresh[16];
    EVP_MD_CTX* context = EVP_MD_CTX_new();
    EVP_DigestInit_ex2(context, md5(), nullptr);
    EVP_DigestUpdate(context, kPassword.data(), kPassword.size());
    EVP_DigestFinal_ex(context, fresh, nullptr);
    EVP_MD_CTX_free(context);
    std::memcpy(out, "{MD5}", 5);
    benchmark::DoNotOptimize(EVP_EncodeBlock(out + 5, fresh, sizeof fresh));
  }
}
BENCHMARK(md5FormatPeer)->Name("md5-format/peer");

void shaVerifyOurs(benchmark::State& state) {
  const std::string stored = formatted(FORMAT_SHA, kPassword);
  for (auto _ : state) benchmark::DoNotOptimize(verified(kPassword, stored));
}
BENCHMARK(shaVerifyOurs)->Name("sha-verify/ours");

// The digest alone: the least that any checker has to do.
void shaVerifyPeer(benchmark::State& state) {
  for (auto _ : state) {
    unsigned char fresh[20];
    benchmark::DoNotOptimize(EVP_Digest(kPassword.data(), kPassword.size(), fresh, nullptr, sha1(), nullptr));
  }
}
BENCHMARK(shaVerifyPeer)->Name("sha-verify/peer");

// ---- Base64, 20 bytes (a digest) and 3000 ----

std::vector<unsigned char> sampleBytes(benchmark::State& state) {
  std::vector<unsigned char> bytes(static_cast<size_t>(state.range(0)));
  RAND_bytes(bytes.data(), static_cast<int>(bytes.size()));
  return bytes;
}

void encodeOurs(benchmark::State& state) {
  const auto bytes = sampleBytes(state);
  for (auto _ : state) {
    char* text = binaryBlobToBase64(bytes.data(), static_cast<int>(bytes.size()));
    benchmark::DoNotOptimize(text);
    std::free(text);
  }
}
BENCHMARK(encodeOurs)->Name("base64-encode/ours")->Arg(20)->Arg(3000);

// A result on the heap, as a caller of ours gets it.
void encodePeer(benchmark::State& state) {
  const auto bytes = sampleBytes(state);
  for (auto _ : state) {
    auto* text = static_cast<unsigned char*>(std::malloc(bytes.size() / 3 * 4 + 5));
    EVP_EncodeBlock(text, bytes.data(), static_cast<int>(bytes.size()));
    benchmark::DoNotOptimize(text);
    std::free(text);
  }
}
BENCHMARK(encodePeer)->Name("base64-encode/peer")->Arg(20)->Arg(3000);

void decodeOurs(benchmark::State& state) {
  const auto bytes = sampleBytes(state);
  char* text = binaryBlobToBase64(bytes.data(), static_cast<int>(bytes.size()));
  for (auto _ : state) {
    unsigned length = 0;
    unsigned char* data = base64ToBinaryBlob(text, &length);
    benchmark::DoNotOptimize(data);
    std::free(data);
  }
  std::free(text);
}
BENCHMARK(decodeOurs)->Name("base64-decode/ours")->Arg(20)->Arg(3000);

void decodePeer(benchmark::State& state) {
  const auto bytes = sampleBytes(state);
  char* text = binaryBlobToBase64(bytes.data(), static_cast<int>(bytes.size()));
  for (auto _ : state) {
    const size_t length = std::strlen(text);
    auto* data = static_cast<unsigned char*>(std::malloc(length / 4 * 3 + 4));
    EVP_DecodeBlock(data, reinterpret_cast<const unsigned char*>(text), static_cast<int>(length));
    benchmark::DoNotOptimize(data);
    std::free(data);
  }
  std::free(text);
}
BENCHMARK(decodePeer)->Name("base64-decode/peer")->Arg(20)->Arg(3000);

}  // namespace
