// SPDX-License-Identifier: Apache-2.0
// Base64 over the standard alphabet and over another one, beside OpenSSL's, which knows the standard one alone. Both
// sides give results on the heap, of the same sizes.
#include <openssl/evp.h>

#include <cstdlib>

#include "bench_support.h"
#include "encoding_utils.h"

namespace {

constexpr char kForUrls[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";  // RFC 4648, table 2

std::string sample(size_t size) {
  std::string bytes(size, '\0');
  uint32_t state = 1;
  for (char& byte : bytes) byte = static_cast<char>((state = state * 1664525 + 1013904223) >> 24U);
  return bytes;
}

std::string encoded(const std::string& bytes, const char* alphabet) {
  char* text = binaryBlobToString(bench::bytesOf(bytes), static_cast<int>(bytes.size()), alphabet);
  const std::string copy = text;
  std::free(text);
  return copy;
}

void addRows(const std::string& name, size_t size, const char* alphabet) {
  const std::string bytes = sample(size);
  const std::string encode = name + "-encode-" + std::to_string(size);
  bench::measure(encode + "/ours", [bytes, alphabet] {
    std::free(binaryBlobToString(bench::bytesOf(bytes), static_cast<int>(bytes.size()), alphabet));
  });
  bench::measure(encode + "/openssl", [bytes] {
    auto* text = static_cast<unsigned char*>(std::malloc(bytes.size() / 3 * 4 + 5));
    EVP_EncodeBlock(text, bench::bytesOf(bytes), static_cast<int>(bytes.size()));
    benchmark::DoNotOptimize(text);
    std::free(text);
  });

  const std::string decode = name + "-decode-" + std::to_string(size);
  const std::string text = encoded(bytes, alphabet);
  bench::measure(decode + "/ours", [text, alphabet] {
    unsigned length = 0;
    std::free(stringToBinaryBlob(text.c_str(), &length, alphabet));
  });
  const std::string standardText = encoded(bytes, pBase64);
  bench::measure(decode + "/openssl", [standardText] {
    const size_t length = std::strlen(standardText.c_str());
    auto* decoded = static_cast<unsigned char*>(std::malloc(length / 4 * 3 + 4));
    EVP_DecodeBlock(decoded, bench::bytesOf(standardText), static_cast<int>(length));
    benchmark::DoNotOptimize(decoded);
    std::free(decoded);
  });
}

const bench::Rows kRows([] {
  for (const size_t size : {20U, 40U, 120U, 10000U}) addRows("base64", size, pBase64);
  addRows("other", 120, kForUrls);
});

}  // namespace
