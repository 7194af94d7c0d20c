// SPDX-License-Identifier: Apache-2.0
// AES encryption of buffers against OpenSSL, and each way in which it can fail.
#include <climits>

#include "failures.h"
#include "oracle.h"

using namespace test;

namespace {

const std::string kKey = fromHex("2b7e151628aed2a6abf7158809cf4f3c0011223344556677fedcba9876543210");

TEST(AesBuffers, AgreeWithOpensslAndComeBack) {
  static const struct {
    const char* cipher;
    size_t keyBytes;
    std::string salt;
  } rows[] = {{"AES-192-ECB", 24, "saltsaltsalt"},
              {"AES-128-CBC", 16, "short"},
              {"AES-256-CBC", 32, "0123456789abcdefghijklmnopqrst"}};
  for (const auto& row : rows) {
    Guarded keyBytes(kKey.substr(0, row.keyBytes)), saltBytes(row.salt);
    const SecBuffer key{bytesOf(keyBytes.data()), 0};  // its length is not looked at
    const SecBuffer salt{bytesOf(saltBytes.data()), static_cast<uint32_t>(row.salt.size())};
    const std::string vector = (row.salt + std::string(16, '\0')).substr(0, 16);
    for (const size_t length : {0U, 15U, 16U, 17U, 240U, 256U, 1000U}) {
      SCOPED_TRACE(testing::Message() << row.cipher << " " << length);
      const std::string clear = letters(length).replace(0, length / 9, length / 9, '\0');
      char *text = nullptr, *back = nullptr;
      int backLength = static_cast<int>(length);
      ASSERT_EQ(aesEncryptBuffer(Guarded(clear).data(), &text, row.cipher, &key, &salt, backLength), 0);
      const CipherJob job{row.cipher, kKey.substr(0, row.keyBytes), vector, true, true};
      EXPECT_EQ(text, opensslBase64(opensslCipher(job, clear)));
      ASSERT_EQ(aesDecryptBuffer(text, &back, row.cipher, &key, &salt, &backLength), 0);
      EXPECT_EQ(std::string(back, static_cast<size_t>(backLength) + 1), clear + '\0');
      free(text);
      free(back);
    }
  }
}

int unreleased;  // cipher contexts
void* (*realNew)(void*);
int (*realFree)(void*, void*);
constexpr auto kFails = [](auto...) { return 0; };

class AesFailures : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(initQelCrypto(&context_), 0);
    realNew = std::exchange(pQEL_EVP_CIPHER_CTX_new, [](void* ctx) { return ++unreleased, realNew(ctx); });
    realFree =
        std::exchange(pQEL_EVP_CIPHER_CTX_free, [](void* ctx, void* c) { return --unreleased, realFree(ctx, c); });
  }
  void TearDown() override {
    EXPECT_EQ(unreleased, 0);
    EXPECT_EQ(out, nullptr);
    pQEL_EVP_CIPHER_CTX_new = realNew;
    pQEL_EVP_CIPHER_CTX_free = realFree;
  }

  void* context_ = nullptr;
  std::string keyBytes_ = kKey;
  const SecBuffer keyBuffer_{bytesOf(keyBytes_), 16};
  const std::string clear_ = std::string(300, 'x');  // more than any buffer of usual size holds
  const std::string text_ = opensslBase64(opensslCipher({"AES-128-ECB", kKey, "", true, true}, clear_));
  // The arguments, for rows to replace.
  const char *text = text_.c_str(), *clear = clear_.c_str(), *name = "AES-128-ECB";
  char *out = nullptr, **slot = &out;
  const SecBuffer *key = &keyBuffer_, *iv = &keyBuffer_;
  int length = 300;
  const Operation encrypt{"aesEncryptBuffer", [this] { return aesEncryptBuffer(clear, slot, name, key, iv, length); },
                          LDTR_DEBUG};
  const Operation decrypt{"aesDecryptBuffer", [this] { return aesDecryptBuffer(text, slot, name, key, iv, &length); },
                          LDTR_DEBUG};
  const Failure longVector = replacing(pQEL_EVP_CIPHER_iv_length, [](auto...) { return 1000; });
  const Failure noPadding = replacing(pQEL_EVP_CIPHER_CTX_set_padding, [](auto...) { return 2; });
};

TEST_F(AesFailures, OfBothDirections) {
  for (const Operation& each : {encrypt, decrypt}) {
    each.refusesNulls(slot, name, key, iv);
    each.fails({{1, "initQelCrypto() failed.", withoutProvider()},
                {1, "initQelCipher() failed.", replacing(name, "AES-512-ECB")},
                {1, "QEL_EVP_CIPHER_CTX_set_padding() failed.", noPadding}});
  }
}

TEST_F(AesFailures, OfEncryption) {
  encrypt.refusesNulls(clear);
  encrypt.fails({{1, "Invalid parameter.", replacing(length, -1)},
                 {90, "calloc() returned NULL.", replacing(length, INT_MAX)},
                 {90, "calloc() returned NULL.", replacing(length, INT_MAX - 64)},
                 {90, "Error - aesEncryptBuffer: calloc() failed.\n", both(longVector, failingAllocation(0))},
                 {90, "calloc() returned NULL.", failingAllocation(0)},
                 {1, "QEL_EVP_EncryptInit() failed.", replacing(pQEL_EVP_EncryptInit, kFails)},
                 {1, "QEL_EVP_EncryptUpdate() failed.", replacing(pQEL_EVP_EncryptUpdate, kFails)},
                 {1, "QEL_EVP_EncryptFinal() failed.", replacing(pQEL_EVP_EncryptFinal, kFails)},
                 {1, "binaryBlobToBase64() returned NULL.", failingAllocation(1)}});
}

// A provider that claims more than it writes.
TEST_F(AesFailures, YieldZerosForWhatWasNotWritten) {
  const auto claims = [](void*, void*, unsigned char*, int* count, auto...) { return *count = 20, 1; };
  const auto claimsTooMuch = [](void*, void*, unsigned char*, int* count, auto...) { return *count = 2000, 1; };
  const auto claimsLess = [](void*, void*, unsigned char*, int* count, auto...) { return *count = -1, 1; };
  replacing(pQEL_EVP_EncryptUpdate, claims)([&] {
    replacing(pQEL_EVP_EncryptFinal, [](auto...) { return 1; })([&] {
      dirtyStack();
      ASSERT_EQ(aesEncryptBuffer("20 bytes of the text", &out, name, key, iv, 20), 0);
      EXPECT_EQ(taken(std::exchange(out, nullptr)), opensslBase64(std::string(20, '\0')));
    });
  });
  encrypt.fails(
      {{1, "QEL_EVP_EncryptUpdate() failed.", replacing(pQEL_EVP_EncryptUpdate, claimsTooMuch)},
       {1, "QEL_EVP_EncryptUpdate() failed.", replacing(pQEL_EVP_EncryptUpdate, claimsLess)},
       {1, "QEL_EVP_EncryptFinal() failed.",
        replacing(pQEL_EVP_EncryptFinal, [](void*, void*, unsigned char*, int* count) { return *count = 2000, 1; })}});
}

// Key wrapping adds more than a block.
TEST_F(AesFailures, AreNotThoseOfRoom) {
  const auto widest = [](void*, void*, unsigned char* to, int* count) {
    std::memset(to, 'w', 64);
    return *count = 64, 1;
  };
  replacing(pQEL_EVP_EncryptFinal, widest)([&] { ASSERT_EQ(encrypt(), 0); });
  EXPECT_EQ(opensslDecoded(taken(std::exchange(out, nullptr))).substr(288), std::string(64, 'w'));
}

TEST_F(AesFailures, OfDecryption) {
  const Failure noBase64 = both(replacing(text, "AAAA-AAA"), withoutProvider());  // the text is looked at first
  decrypt.refusesNulls(text);
  decrypt.fails({{1, "base64ToBinaryBlob() returned NULL.", noBase64},
                 {1, "base64ToBinaryBlob() returned NULL.", failingAllocation(0)},
                 {90, "Error - aesDecryptBuffer: calloc() failed.\n", both(longVector, failingAllocation(1))},
                 {90, "QEL_EVP_DecryptInit() failed.", failingAllocation(1)},
                 {1, "QEL_EVP_DecryptInit() failed.", replacing(pQEL_EVP_DecryptInit, kFails)},
                 {1, "QEL_EVP_DecryptUpdate() failed.", replacing(pQEL_EVP_DecryptUpdate, kFails)},
                 {1, "QEL_EVP_DecryptFinal() failed.", replacing(text, "AAAAAAAAAAA=")}});
  EXPECT_EQ(length, 300) << "written without a result";
}

TEST_F(AesFailures, ClearTheSlotFromTheStatedStepOn) {
  const auto clears = [&](const Operation& operation, const Failure& failure) {
    char* const held = strdup("held");
    out = held;
    failure([&] { EXPECT_EQ(operation(), 1); });
    if (out == held) free(held);
    return std::exchange(out, nullptr) == nullptr;
  };
  EXPECT_FALSE(clears(encrypt, withoutProvider()));
  EXPECT_TRUE(clears(encrypt, replacing(name, "AES-512-ECB")));
  EXPECT_FALSE(clears(decrypt, replacing(text, "-")));
  EXPECT_TRUE(clears(decrypt, withoutProvider()));
}

}  // namespace
