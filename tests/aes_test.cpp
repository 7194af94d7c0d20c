// SPDX-License-Identifier: Apache-2.0
// AES encryption of buffers against OpenSSL, and each way in which it can fail.
#include <gtest/gtest.h>

#include "aes_keys.h"
#include "failures.h"
#include "oracle.h"

namespace {

using test::both;
using test::failingAllocation;
using test::fromHex;
using test::Guarded;
using test::opensslBase64;
using test::replacing;
using test::taken;

// Bytes that end at a page that cannot be touched.
struct GuardedBuffer : Guarded {
  GuardedBuffer(const std::string& bytes, size_t length)
      : Guarded(bytes), buffer{reinterpret_cast<unsigned char*>(data()), static_cast<uint32_t>(length)} {}
  SecBuffer buffer;
};

const std::string kKey = fromHex("2b7e151628aed2a6abf7158809cf4f3c0011223344556677fedcba9876543210");

std::string encrypted(const char* cipher, const std::string& clear, const SecBuffer& key, const SecBuffer& iv) {
  Guarded guarded(clear);
  char* text = nullptr;
  EXPECT_EQ(aesEncryptBuffer(guarded.data(), &text, cipher, &key, &iv, static_cast<int>(clear.size())), 0);
  return taken(text);
}

TEST(AesBuffers, AgreeWithOpensslAndComeBack) {
  static const struct {
    const char* cipher;
    size_t keyBytes;
    const char* salt;
    const char* vector;  // what the cipher sees of the salt
  } rows[] = {
      {"AES-128-ECB", 16, "saltsaltsalt", ""},
      {"AES-192-CBC", 24, "saltsaltsalt", "73616c7473616c7473616c7400000000"},
      {"AES-256-CBC", 32, "0123456789abcdefg", "30313233343536373839616263646566"},
  };
  for (const auto& row : rows) {
    const std::string keyBytes = kKey.substr(0, row.keyBytes);
    const GuardedBuffer key(keyBytes, 0);  // its length is not looked at
    const GuardedBuffer salt(row.salt, std::strlen(row.salt));
    for (const size_t length : {0U, 1U, 5U, 15U, 16U, 17U, 32U, 240U, 256U, 1000U}) {
      SCOPED_TRACE(testing::Message() << row.cipher << " " << length);
      std::string clear(length, 'c');
      if (length > 2) clear[2] = '\0';
      const std::string text = encrypted(row.cipher, clear, key.buffer, salt.buffer);
      const test::CipherJob job{row.cipher, keyBytes, fromHex(row.vector), true, true};
      EXPECT_EQ(text, opensslBase64(test::opensslCipher(job, clear)));
      char* back = nullptr;
      int backLength = -1;
      ASSERT_EQ(aesDecryptBuffer(text.c_str(), &back, row.cipher, &key.buffer, &salt.buffer, &backLength), 0);
      EXPECT_EQ(std::string(back, static_cast<size_t>(backLength) + 1), clear + '\0');
      free(back);
    }
  }
}

int made, released;
void* (*realNew)(void*);
int (*realFree)(void*, void*);

// Counts the cipher contexts, and gives every argument a name that a row can replace.
class AesFailures : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(initQelCrypto(&context), 0);
    made = released = 0;
    realNew = std::exchange(pQEL_EVP_CIPHER_CTX_new, [](void* ctx) { return ++made, realNew(ctx); });
    realFree = std::exchange(pQEL_EVP_CIPHER_CTX_free, [](void* ctx, void* c) { return ++released, realFree(ctx, c); });
    text_ = encrypted(name, std::string(300, 'x'), keyBuffer_, keyBuffer_);
    text = text_.c_str();
  }
  void TearDown() override {
    EXPECT_EQ(made, released);
    EXPECT_EQ(out, nullptr);
    pQEL_EVP_CIPHER_CTX_new = realNew;
    pQEL_EVP_CIPHER_CTX_free = realFree;
  }

  std::string keyBytes_ = kKey;
  SecBuffer keyBuffer_{test::bytesOf(keyBytes_), 16};
  SecBuffer otherKey_{test::bytesOf(keyBytes_) + 1, 16};
  std::string text_;
  const std::string clear_ = std::string(300, 'x');  // more than any buffer of usual size holds
  void* context = nullptr;
  const char* text = nullptr;
  const char* clear = clear_.c_str();
  char* out = nullptr;
  char** slot = &out;
  const char* name = "AES-128-ECB";
  const SecBuffer* key = &keyBuffer_;
  const SecBuffer* iv = &keyBuffer_;
  int length = 300;
  // A vector of the usual size needs no allocation.
  const test::Failure longVector = replacing(pQEL_EVP_CIPHER_iv_length, [](auto...) { return 1000; });
};

constexpr auto failing = [](auto...) { return 0; };
const test::Failure noPadding = replacing(pQEL_EVP_CIPHER_CTX_set_padding, [](auto...) { return 2; });

TEST_F(AesFailures, OfEncryption) {
  std::vector<test::FailureCase> rows =
      test::Rows("aesEncryptBuffer")
          .refuses({replacing(clear, nullptr), replacing(slot, nullptr), replacing(name, nullptr),
                    replacing(key, nullptr), replacing(iv, nullptr), replacing(length, -1)})
          .fails(1, "initQelCrypto() failed.", test::withoutProvider())
          .fails(1, "initQelCipher() failed.", replacing(name, "AES-512-ECB"),
                 {"Error - initQelCipher: QEL_EVP_get_cipherbyname() failed. rc = 1\n"})
          .fails(90, "calloc() returned NULL.", failingAllocation(0))
          .fails(1, "QEL_EVP_EncryptInit() failed.", replacing(pQEL_EVP_EncryptInit, failing))
          .fails(1, "QEL_EVP_CIPHER_CTX_set_padding() failed.", noPadding)
          .fails(1, "QEL_EVP_EncryptUpdate() failed.", replacing(pQEL_EVP_EncryptUpdate, failing))
          .fails(1, "QEL_EVP_EncryptFinal() failed.", replacing(pQEL_EVP_EncryptFinal, failing))
          .fails(1, "binaryBlobToBase64() returned NULL.", failingAllocation(1));
  rows.push_back({90, {"Error - aesEncryptBuffer: calloc() failed.\n"}, both(longVector, failingAllocation(0))});
  test::expectFailures(rows, LDTR_DEBUG, [&] { return aesEncryptBuffer(clear, slot, name, key, iv, length); });
}

TEST_F(AesFailures, OfDecryption) {
  std::vector<test::FailureCase> rows =
      test::Rows("aesDecryptBuffer")
          .refuses({replacing(text, nullptr), replacing(slot, nullptr), replacing(name, nullptr),
                    replacing(key, nullptr), replacing(iv, nullptr)})
          .fails(1, "base64ToBinaryBlob() returned NULL.",
                 both(replacing(text, "AAAA-AAA"), test::withoutProvider()))  // before the provider is asked
          .fails(1, "base64ToBinaryBlob() returned NULL.", failingAllocation(0))
          .fails(1, "initQelCrypto() failed.", test::withoutProvider())
          .fails(1, "initQelCipher() failed.", replacing(name, "AES-512-ECB"))
          .fails(90, "QEL_EVP_DecryptInit() failed.", failingAllocation(1))
          .fails(1, "QEL_EVP_DecryptInit() failed.", replacing(pQEL_EVP_DecryptInit, failing))
          .fails(1, "QEL_EVP_CIPHER_CTX_set_padding() failed.", noPadding)
          .fails(1, "QEL_EVP_DecryptUpdate() failed.", replacing(pQEL_EVP_DecryptUpdate, failing))
          .fails(1, "QEL_EVP_DecryptFinal() failed.", replacing(key, &otherKey_))
          .fails(1, "QEL_EVP_DecryptFinal() failed.", replacing(text, "AAAAAAAAAAA="))
          .fails(1, "QEL_EVP_DecryptFinal() failed.", replacing(text, ""));
  rows.push_back({90, {"Error - aesDecryptBuffer: calloc() failed.\n"}, both(longVector, failingAllocation(1))});
  test::expectFailures(rows, LDTR_DEBUG, [&] { return aesDecryptBuffer(text, slot, name, key, iv, &length); });
  EXPECT_EQ(length, 300) << "written without a result";
}

TEST_F(AesFailures, ClearTheSlotFromTheStatedStepOn) {
  const auto leaves = [&](const std::function<int()>& call) {
    char* const held = out = strdup("held");
    EXPECT_EQ(call(), 1);
    const bool left = std::exchange(out, nullptr) == held;
    if (left) free(held);
    return left;
  };
  const auto encrypt = [&] { return aesEncryptBuffer("", slot, name, key, iv, 0); };
  const auto decrypt = [&] { return aesDecryptBuffer(text, slot, name, key, iv, nullptr); };
  test::withoutProvider()([&] {
    EXPECT_TRUE(leaves(encrypt));
    EXPECT_FALSE(leaves(decrypt));
  });
  replacing(text, "-")([&] { EXPECT_TRUE(leaves(decrypt)); });
  replacing(name, "AES-512-ECB")([&] { EXPECT_FALSE(leaves(encrypt)); });
}

}  // namespace
