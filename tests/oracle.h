// SPDX-License-Identifier: Apache-2.0
// OpenSSL as the other opinion, and texts to ask both about.
#pragma once

#include <gtest/gtest.h>
#include <openssl/evp.h>

#include <memory>
#include <random>
#include <string>

#include "support.h"

namespace test {

inline std::string randomBytes(std::mt19937& random, size_t size) {
  std::string bytes(size, '\0');
  for (char& byte : bytes) byte = static_cast<char>(random());
  return bytes;
}

struct CipherJob {
  const char* name;
  std::string key;
  std::string iv;
  bool encrypts;
  bool padded;
};

inline std::string opensslCipher(const CipherJob& job, const std::string& data) {
  const std::unique_ptr<EVP_CIPHER, void (*)(EVP_CIPHER*)> cipher(EVP_CIPHER_fetch(nullptr, job.name, nullptr),
                                                                  EVP_CIPHER_free);
  const std::unique_ptr<EVP_CIPHER_CTX, void (*)(EVP_CIPHER_CTX*)> context(EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free);
  std::string out(data.size() + EVP_MAX_BLOCK_LENGTH, '\0');
  int written = 0;
  int last = 0;
  EVP_CipherInit_ex(context.get(), cipher.get(), nullptr, bytesOf(job.key), bytesOf(job.iv), job.encrypts ? 1 : 0);
  EVP_CIPHER_CTX_set_padding(context.get(), job.padded ? 1 : 0);
  EVP_CipherUpdate(context.get(), bytesOf(out), &written, bytesOf(data), static_cast<int>(data.size()));
  EXPECT_EQ(EVP_CipherFinal_ex(context.get(), bytesOf(out) + written, &last), 1);
  out.resize(static_cast<size_t>(written + last));
  return out;
}

// Triple DES; with three equal keys it is single DES.
inline std::string opensslDes(const std::string& key, const std::string& data, bool encrypts) {
  return opensslCipher({"DES-EDE3-ECB", key.size() == 8 ? key + key + key : key, "", encrypts, false}, data);
}

inline std::string opensslBase64(const std::string& data) {
  std::string text((data.size() + 2) / 3 * 4 + 1, '\0');
  EVP_EncodeBlock(bytesOf(text), bytesOf(data), static_cast<int>(data.size()));
  text.pop_back();
  return text;
}

inline std::string opensslDecoded(const std::string& text) {
  std::string bytes(text.size() / 4 * 3, '\0');
  const int length = EVP_DecodeBlock(bytesOf(bytes), bytesOf(text), static_cast<int>(text.size()));
  const size_t pads = text.size() - text.find_last_not_of('=') - 1;
  return length < 0 ? "no base64" : bytes.substr(0, static_cast<size_t>(length) - pads);
}

inline std::string opensslDigest(const char* name, const std::string& data) {
  unsigned char out[EVP_MAX_MD_SIZE];
  unsigned length = 0;
  EVP_Digest(data.data(), data.size(), out, &length, EVP_get_digestbyname(name), nullptr);
  return {reinterpret_cast<char*>(out), length};
}

// The payload of a salted value.
inline std::string saltedPayload(const std::string& clear, const std::string& salt, const char* name = "SHA1") {
  return opensslBase64(opensslDigest(name, clear + salt) + salt);
}

inline std::string upToNul(const std::string& text) {
  return text.c_str();
}

// A text of bytes other than NUL, which begins otherwise for other lengths.
inline std::string letters(size_t length) {
  std::string text(length, '\0');
  for (size_t i = 0; i < length; ++i) text[i] = static_cast<char>(1 + (i * 37 + length) % 255);
  return text;
}

}  // namespace test
