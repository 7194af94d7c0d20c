// SPDX-License-Identifier: Apache-2.0
// The crypto provider: published answers, misuse of every entry, failures and their texts, wiping, threads, and the
// built library as the loader sees it. OpenSSL's allocator is replaced, so that blocks can be searched and refused.
#include "qel.h"

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <malloc.h>
#include <openssl/crypto.h>
#include <openssl/err.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <future>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

namespace {

using Bytes = std::vector<unsigned char>;

Bytes fromHex(const std::string& hex) {
  Bytes bytes;
  for (size_t i = 0; i < hex.size(); i += 2) {
    bytes.push_back(static_cast<unsigned char>(std::stoi(hex.substr(i, 2), nullptr, 16)));
  }
  return bytes;
}

// ---- OpenSSL's memory ----

const char kSecret[] = "a secret that nobody else would write";
std::mutex blocksMutex;
std::set<void*>* blocks = nullptr;  // live ones; never destroyed, OpenSSL releases some at exit
std::atomic<bool> searching{false};
std::atomic<int> secretsReleased{0};
std::atomic<long> allocationsLeft{-1};  // the one after these fails; negative: none does

bool holdsSecret(void* block) {
  return memmem(block, malloc_usable_size(block), kSecret, 16) != nullptr;
}

void noteRelease(void* block) {
  std::lock_guard<std::mutex> lock{blocksMutex};
  blocks->erase(block);
  if (searching && holdsSecret(block)) ++secretsReleased;
}

void* opensslRealloc(void* old, size_t size, const char*, int) {
  if (allocationsLeft >= 0 && allocationsLeft-- == 0) return nullptr;
  void* block = std::calloc(1, size);
  if (block == nullptr) return nullptr;
  if (old != nullptr) {
    std::memcpy(block, old, std::min(size, malloc_usable_size(old)));
    noteRelease(old);
    std::free(old);
  }
  std::lock_guard<std::mutex> lock{blocksMutex};
  blocks->insert(block);
  return block;
}

void* opensslMalloc(size_t size, const char* file, int line) {
  return opensslRealloc(nullptr, size, file, line);
}

void opensslFree(void* block, const char*, int) {
  if (block == nullptr) return;
  noteRelease(block);
  std::free(block);
}

// OpenSSL takes these before its first allocation only, which comes with the start of the provider.
__attribute__((constructor(101))) void replaceAllocator() {
  blocks = new std::set<void*>;
  CRYPTO_set_mem_functions(opensslMalloc, opensslRealloc, opensslFree);
}

int secretsLive() {
  std::lock_guard<std::mutex> lock{blocksMutex};
  int count = 0;
  for (void* block : *blocks) count += holdsSecret(block) ? 1 : 0;
  return count;
}

// ---- A provider context with one of each object ----

const Bytes kKey(32, 0x2b);
unsigned char out[256];
int outLength;
unsigned int digestLength;
char text[4097];
QelStatus lastStatus;

// The objects, and their steps with usual arguments.
struct Handles {
  QEL_CTX* ctx = nullptr;
  QEL_CIPHER_CTX* cipherCtx = nullptr;
  QEL_MD_CTX* digestCtx = nullptr;
  const QEL_CIPHER* cipher = nullptr;
  const QEL_DIGEST* digest = nullptr;

  bool encryptInit() const { return QEL_EVP_EncryptInit(ctx, cipherCtx, cipher, kKey.data(), kKey.data()) == 1; }
  bool decryptInit() const { return QEL_EVP_DecryptInit(ctx, cipherCtx, cipher, kKey.data(), kKey.data()) == 1; }
  bool encrypt(int n) const { return QEL_EVP_EncryptUpdate(ctx, cipherCtx, out, &outLength, kKey.data(), n) == 1; }
  bool decrypt(int n) const { return QEL_EVP_DecryptUpdate(ctx, cipherCtx, out, &outLength, kKey.data(), n) == 1; }
  bool encryptFinal() const { return QEL_EVP_EncryptFinal(ctx, cipherCtx, out, &outLength) == 1; }
  bool decryptFinal() const { return QEL_EVP_DecryptFinal(ctx, cipherCtx, out, &outLength) == 1; }
  bool setKeyLength(int n) const { return QEL_EVP_CIPHER_CTX_set_key_length(ctx, cipherCtx, n) == 1; }
  bool freshCipher() const { return QEL_EVP_CIPHER_CTX_init(ctx, cipherCtx) == 1; }
  bool digestInit() const { return QEL_EVP_DigestInit(ctx, digestCtx, digest) == 1; }
  bool update() const { return QEL_EVP_DigestUpdate(ctx, digestCtx, kKey.data(), 3) == 1; }
  bool digestFinal() const { return QEL_EVP_DigestFinal(ctx, digestCtx, out, nullptr) == 1; }
  bool freshDigest() const { return QEL_EVP_MD_CTX_init(ctx, digestCtx) == 1; }
  bool finds(const char* name) const { return QEL_EVP_get_digestbyname(ctx, name) != nullptr; }
  bool setValue(int id, const char* value) const { return QEL_SetValue(ctx, nullptr, id, value) == 1; }
};

using H = const Handles&;

Handles makeHandles() {
  Handles h;
  h.ctx = QEL_Init(nullptr, nullptr);
  h.cipherCtx = QEL_EVP_CIPHER_CTX_new(h.ctx);
  h.digestCtx = QEL_EVP_MD_CTX_new(h.ctx);
  h.cipher = QEL_EVP_get_cipherbyname(h.ctx, "AES-128-CBC");
  h.digest = QEL_EVP_get_digestbyname(h.ctx, "SHA1");
  return h;
}

class Qel : public testing::Test {
 protected:
  Handles h = makeHandles();

  ~Qel() override { QEL_Cleanup(h.ctx, nullptr); }

  int reason() {
    QelStatus status;
    EXPECT_EQ(1, QEL_GetStatus(h.ctx, &status));
    EXPECT_EQ(1, status.majRC);
    EXPECT_NE('\0', status.desc[0]);
    EXPECT_EQ(0U, ERR_peek_error());
    return status.minRC;
  }
};

// ---- Published answers ----

struct DigestAnswer {
  const char* name;
  const char* text;
  const char* hex;
};
const DigestAnswer kDigestAnswers[] = {
    {"md5", "message digest", "f96b697d7cb7938d525a2f31aaf161d0"},  // RFC 1321 A.5, and FIPS 180
    {"sha-1", "abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq", "84983e441c3bd26ebaae4aa1f95129e5e54670f1"},
    {"SHA256", "abc", "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
};

TEST_F(Qel, DigestsGivePublishedAnswers) {
  for (const DigestAnswer& row : kDigestAnswers) {
    SCOPED_TRACE(row.name);
    const Bytes expected = fromHex(row.hex);
    h.digest = QEL_EVP_get_digestbyname(h.ctx, row.name);
    ASSERT_EQ(static_cast<int>(expected.size()), QEL_EVP_MD_size(h.ctx, h.digest));
    ASSERT_TRUE(h.digestInit());
    for (const char* c = row.text; *c != '\0'; ++c) ASSERT_EQ(1, QEL_EVP_DigestUpdate(h.ctx, h.digestCtx, c, 1));
    ASSERT_EQ(1, QEL_EVP_DigestFinal(h.ctx, h.digestCtx, out, &digestLength));
    EXPECT_EQ(expected, Bytes(out, out + digestLength));
  }
}

struct CipherAnswer {
  const char* name;
  const char* key;
  const char* enciphered;
};
const CipherAnswer kCipherAnswers[] = {
    // FIPS 197 appendix C
    {"aes-192-ecb", "000102030405060708090a0b0c0d0e0f1011121314151617", "dda97ca4864cdfe06eaf70a0ec0d7191"},
    {"AES-256-ECB", "000102030405060708090a0b0c0d0e0f101112131415161718191a1b1c1d1e1f",
     "8ea2b7ca516745bfeafc49904b496089"},
};

TEST_F(Qel, CiphersGivePublishedAnswersInBothDirections) {
  for (const CipherAnswer& row : kCipherAnswers) {
    SCOPED_TRACE(row.name);
    const Bytes key = fromHex(row.key), clear = fromHex("00112233445566778899aabbccddeeff");
    h.cipher = QEL_EVP_get_cipherbyname(h.ctx, row.name);
    ASSERT_EQ(static_cast<int>(key.size()), QEL_EVP_CIPHER_key_length(h.ctx, h.cipher));
    ASSERT_EQ(1, QEL_EVP_CIPHER_CTX_set_padding(h.ctx, h.cipherCtx, 0));
    ASSERT_EQ(1, QEL_EVP_EncryptInit(h.ctx, h.cipherCtx, h.cipher, key.data(), nullptr));
    Bytes data = clear;  // worked on in place
    ASSERT_EQ(1, QEL_EVP_EncryptUpdate(h.ctx, h.cipherCtx, data.data(), &outLength, data.data(), 16));
    EXPECT_EQ(fromHex(row.enciphered), data);
    ASSERT_TRUE(h.encryptFinal() && outLength == 0);  // padding stays off
    ASSERT_EQ(1, QEL_EVP_DecryptInit(h.ctx, h.cipherCtx, h.cipher, key.data(), nullptr));
    ASSERT_EQ(1, QEL_EVP_DecryptUpdate(h.ctx, h.cipherCtx, data.data(), &outLength, data.data(), 16));
    ASSERT_TRUE(h.decryptFinal());
    EXPECT_EQ(clear, data);
  }
}

// ---- Misuse ----

enum HandleUse { kCipherCtx = 1, kDigestCtx = 2, kCipher = 4, kDigest = 8 };

struct HandleRow {
  const char* name;
  int uses;
  bool (*works)(H);
};
const HandleRow kHandleRows[] = {
    {"GetStatus", 0, [](H h) { return QEL_GetStatus(h.ctx, &lastStatus) == 1; }},
    {"SetValue", 0, [](H h) { return h.setValue(QEL_VALUE_STRICT, "on"); }},
    {"GetValue", 0, [](H h) { return QEL_GetValue(h.ctx, nullptr, 0, text, 3) == 1; }},
    {"Attach", 0, [](H h) { return QEL_Attach(h.ctx, nullptr) == 1; }},
    {"get_cipherbyname", 0, [](H h) { return QEL_EVP_get_cipherbyname(h.ctx, "AES128") != nullptr; }},
    {"get_digestbyname", 0, [](H h) { return h.finds("MD5"); }},
    {"MD_CTX_new", 0, [](H h) { return QEL_EVP_MD_CTX_new(h.ctx) != nullptr; }},
    {"CIPHER_CTX_new", 0, [](H h) { return QEL_EVP_CIPHER_CTX_new(h.ctx) != nullptr; }},
    {"RAND_bytes", 0, [](H h) { return QEL_RAND_bytes(h.ctx, out, 9) == 1; }},
    {"RAND_seed", 0, [](H h) { return QEL_RAND_seed(h.ctx, out, 9) == 1; }},
    {"RandomSeed", 0, [](H h) { return QEL_GenerateRandomSeed(h.ctx, nullptr, out, 9) == 1; }},
    {"MD_block_size", kDigest, [](H h) { return QEL_EVP_MD_block_size(h.ctx, h.digest) == 64; }},
    {"MD_size", kDigest, [](H h) { return QEL_EVP_MD_size(h.ctx, h.digest) == 20; }},
    {"block_size", kCipher, [](H h) { return QEL_EVP_CIPHER_block_size(h.ctx, h.cipher) == 16; }},
    {"key_length", kCipher, [](H h) { return QEL_EVP_CIPHER_key_length(h.ctx, h.cipher) == 16; }},
    {"iv_length", kCipher, [](H h) { return QEL_EVP_CIPHER_iv_length(h.ctx, h.cipher) == 16; }},
    {"DigestInit", kDigestCtx | kDigest, [](H h) { return h.digestInit(); }},
    {"DigestUpdate", kDigestCtx, [](H h) { return h.update(); }},
    {"DigestFinal", kDigestCtx, [](H h) { return h.digestFinal(); }},
    {"EncryptInit", kCipherCtx | kCipher, [](H h) { return h.encryptInit(); }},
    {"EncryptUpdate", kCipherCtx, [](H h) { return h.encrypt(16); }},
    {"EncryptFinal", kCipherCtx, [](H h) { return h.encryptFinal(); }},
    {"DecryptInit", kCipherCtx | kCipher, [](H h) { return h.decryptInit(); }},
    {"set_padding", kCipherCtx, [](H h) { return QEL_EVP_CIPHER_CTX_set_padding(h.ctx, h.cipherCtx, 0) == 1; }},
    {"DecryptUpdate", kCipherCtx, [](H h) { return h.decrypt(16); }},
    {"DecryptFinal", kCipherCtx, [](H h) { return h.decryptFinal(); }},
    {"set_key_length", kCipherCtx, [](H h) { return h.setKeyLength(16); }},
    {"CTX_cipher", kCipherCtx, [](H h) { return QEL_EVP_CIPHER_CTX_cipher(h.ctx, h.cipherCtx) == h.cipher; }},
    {"CIPHER_CTX_init", kCipherCtx, [](H h) { return h.freshCipher(); }},
    {"CIPHER_CTX_cleanup", kCipherCtx, [](H h) { return QEL_EVP_CIPHER_CTX_cleanup(h.ctx, h.cipherCtx) == 1; }},
    {"CIPHER_CTX_free", kCipherCtx, [](H h) { return QEL_EVP_CIPHER_CTX_free(h.ctx, h.cipherCtx) == 1; }},
    {"MD_CTX_init", kDigestCtx, [](H h) { return h.freshDigest(); }},
    {"MD_CTX_cleanup", kDigestCtx, [](H h) { return QEL_EVP_MD_CTX_cleanup(h.ctx, h.digestCtx) == 1; }},
    {"MD_CTX_free", kDigestCtx, [](H h) { return QEL_EVP_MD_CTX_free(h.ctx, h.digestCtx) == 1; }},
};

// Values that are no handle of the context: addresses, small and odd numbers, neighbours of live handles, handles of
// another context, and a released one.
std::vector<void*> foreignValues(const Handles& h, const Handles& other) {
  const auto live = reinterpret_cast<uintptr_t>(h.cipherCtx);
  std::vector<void*> values;
  for (uintptr_t value : {uintptr_t{0}, uintptr_t{1}, uintptr_t{0x1234}, ~uintptr_t{0}, live + 1, live - 1, live << 1,
                          live ^ (uintptr_t{1} << 24), reinterpret_cast<uintptr_t>(&values)}) {
    values.push_back(reinterpret_cast<void*>(value));
  }
  QEL_MD_CTX* freed = QEL_EVP_MD_CTX_new(h.ctx);
  QEL_EVP_MD_CTX_free(h.ctx, freed);
  EXPECT_NE(freed, QEL_EVP_MD_CTX_new(h.ctx));  // its place is in use again
  values.insert(values.end(), {freed, other.cipherCtx, other.digestCtx, const_cast<QEL_CIPHER*>(other.cipher),
                               const_cast<QEL_DIGEST*>(other.digest)});
  return values;
}

TEST_F(Qel, EveryEntryRefusesForeignHandles) {
  const Handles other = makeHandles();
  std::vector<void*> values = foreignValues(h, other);
  for (const HandleRow& row : kHandleRows) {
    SCOPED_TRACE(row.name);
    for (void* value : values) {
      Handles bad = h;
      bad.ctx = static_cast<QEL_CTX*>(value);
      EXPECT_FALSE(row.works(bad)) << value;
      const auto refuses = [&](HandleUse use, const Handles& with) {
        if ((row.uses & use) == 0) return;
        EXPECT_FALSE(row.works(with)) << value << " as " << use;
        EXPECT_EQ(value == nullptr ? QEL_REASON_NULL_ARGUMENT : QEL_REASON_FOREIGN_HANDLE, reason());
      };
      refuses(kCipherCtx, {h.ctx, static_cast<QEL_CIPHER_CTX*>(value), h.digestCtx, h.cipher, h.digest});
      refuses(kDigestCtx, {h.ctx, h.cipherCtx, static_cast<QEL_MD_CTX*>(value), h.cipher, h.digest});
      refuses(kCipher, {h.ctx, h.cipherCtx, h.digestCtx, static_cast<QEL_CIPHER*>(value), h.digest});
      refuses(kDigest, {h.ctx, h.cipherCtx, h.digestCtx, h.cipher, static_cast<QEL_DIGEST*>(value)});
    }
    EXPECT_TRUE(row.works(h));  // and takes its own, in the order of the table
  }
  EXPECT_EQ(1, QEL_Cleanup(other.ctx, nullptr));
  for (const HandleRow& row : kHandleRows) EXPECT_FALSE(row.works(other)) << row.name;
  QelStatus status;
  EXPECT_EQ(0, QEL_Cleanup(other.ctx, &status));
  EXPECT_EQ(QEL_REASON_FOREIGN_HANDLE, status.minRC);
  EXPECT_EQ(0, QEL_Cleanup(nullptr, nullptr));
}

struct MisuseRow {
  const char* name;
  int expected;
  bool (*works)(H);
};
const MisuseRow kMisuseRows[] = {
    {"null name", QEL_REASON_NULL_ARGUMENT, [](H h) { return h.finds(nullptr); }},
    {"long name", QEL_REASON_UNKNOWN_ALGORITHM, [](H h) { return h.finds(std::string(5000, 'S').c_str()); }},
    {"null data", QEL_REASON_NULL_ARGUMENT,
     [](H h) { return h.digestInit() && QEL_EVP_DigestUpdate(h.ctx, h.digestCtx, nullptr, 1) == 1; }},
    {"update after final", QEL_REASON_WRONG_STATE, [](H h) { return h.digestInit() && h.digestFinal() && h.update(); }},
    {"fresh again", QEL_REASON_WRONG_STATE, [](H h) { return h.digestInit() && h.freshDigest() && h.digestFinal(); }},
    {"null key", QEL_REASON_NULL_ARGUMENT,
     [](H h) { return QEL_EVP_EncryptInit(h.ctx, h.cipherCtx, h.cipher, nullptr, out) == 1; }},
    {"wrong direction", QEL_REASON_WRONG_STATE, [](H h) { return h.encryptInit() && h.decrypt(1); }},
    {"negative length", QEL_REASON_BAD_LENGTH, [](H h) { return h.encryptInit() && h.encrypt(-1); }},
    {"null output", QEL_REASON_NULL_ARGUMENT,
     [](H h) { return QEL_EVP_EncryptUpdate(h.ctx, h.cipherCtx, nullptr, &outLength, out, 1) == 1; }},
    {"cipher after final", QEL_REASON_WRONG_STATE, [](H h) { return h.encryptFinal() && h.encrypt(1); }},
    {"key length", QEL_REASON_BAD_LENGTH, [](H h) { return h.encryptInit() && h.setKeyLength(24); }},
    {"key length before init", QEL_REASON_BAD_LENGTH,
     [](H h) { return h.freshCipher() && h.setKeyLength(24) && h.encryptInit(); }},
    {"value id", QEL_REASON_BAD_VALUE_ID, [](H h) { return h.setValue(2, "on"); }},
    {"value text", QEL_REASON_BAD_VALUE, [](H h) { return h.setValue(0, "ON"); }},
    {"long path", QEL_REASON_PATH_TOO_LONG, [](H h) { return h.setValue(1, std::string(4096, '/').c_str()); }},
    {"negative count", QEL_REASON_BAD_LENGTH, [](H h) { return QEL_RAND_bytes(h.ctx, out, -1) == 1; }},
};

TEST_F(Qel, EveryMisuseHasItsReason) {
  for (const MisuseRow& row : kMisuseRows) {
    SCOPED_TRACE(row.name);
    ERR_raise(ERR_LIB_USER, ERR_R_MALLOC_FAILURE);  // somebody else's: not the reason, and gone afterwards
    EXPECT_FALSE(row.works(h));
    EXPECT_EQ(row.expected, reason());
  }
  EXPECT_EQ(1, QEL_RAND_bytes(h.ctx, nullptr, 0));
}

// ---- Failures and values ----

TEST_F(Qel, FailuresAreTheThreadsOwnAndSayWhatOpensslSays) {
  QelStatus status;
  std::memset(&status, 1, sizeof status);
  EXPECT_EQ(1, QEL_GetStatus(h.ctx, &status));
  EXPECT_EQ(Bytes(sizeof status), Bytes(reinterpret_cast<char*>(&status), reinterpret_cast<char*>(&status + 1)));
  std::thread{[this] { EXPECT_EQ(nullptr, QEL_EVP_get_digestbyname(h.ctx, "no such digest")); }}.join();
  EXPECT_EQ(1, QEL_GetStatus(h.ctx, &status));
  EXPECT_EQ(0, status.majRC);
  ASSERT_TRUE(h.decryptInit());
  EXPECT_TRUE(h.decrypt(16));
  outLength = 7;
  EXPECT_FALSE(h.decryptFinal());
  EXPECT_EQ(0, outLength);
  EXPECT_EQ(QEL_REASON_CIPHER_FAILURE, reason());
  EXPECT_EQ(1, QEL_Attach(h.ctx, nullptr));  // a success in between
  EXPECT_EQ(1, QEL_GetStatus(h.ctx, &status));
  EXPECT_NE(nullptr, std::strstr(status.desc, ": bad decrypt")) << status.desc;
  EXPECT_EQ(1, QEL_GenerateRandomSeed(h.ctx, &status, out, 1));
  EXPECT_EQ(0, status.majRC);
}

TEST_F(Qel, NotStrictLeavesTheFinalStepToOpenssl) {
  ASSERT_TRUE(h.setValue(QEL_VALUE_STRICT, "off") && h.encryptInit());
  EXPECT_TRUE(h.encryptFinal() && h.encrypt(16));
  EXPECT_TRUE(h.freshCipher() && !h.encrypt(16));
}

TEST_F(Qel, ValuesFitTheBufferOrLeaveItAlone) {
  std::strcpy(text, "untouched");
  EXPECT_EQ(0, QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 2));
  EXPECT_EQ(QEL_REASON_BUFFER_TOO_SMALL, reason());
  EXPECT_STREQ("untouched", text);
  EXPECT_EQ(1, QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 3));
  EXPECT_STREQ("on", text);
  const std::string longest(4095, 'x');
  QelStatus status;
  QEL_CTX* ctx = QEL_Init(&status, longest.c_str());
  EXPECT_EQ(0, QEL_GetValue(ctx, &status, QEL_VALUE_LOAD_PATH, text, 4095));
  EXPECT_EQ(1, QEL_GetValue(ctx, &status, QEL_VALUE_LOAD_PATH, text, 4096));
  EXPECT_EQ(longest, text);
  EXPECT_EQ(1, QEL_Cleanup(ctx, &status));
  EXPECT_EQ(nullptr, QEL_Init(&status, (longest + "x").c_str()));
  EXPECT_EQ(QEL_REASON_PATH_TOO_LONG, status.minRC);
}

TEST_F(Qel, NamesOfOneAlgorithmShareAHandle) {
  for (const char* name : {"sha1", "SHA-1", "ssl3-sha1", "1.3.14.3.2.26"}) {
    EXPECT_EQ(h.digest, QEL_EVP_get_digestbyname(h.ctx, name)) << name;
  }
  EXPECT_NE(h.digest, QEL_EVP_get_digestbyname(h.ctx, "SHA256"));
  for (int i = 0; i < 2000; ++i) {  // more than a table would hold
    EXPECT_EQ(nullptr, QEL_EVP_get_digestbyname(h.ctx, ("unknown" + std::to_string(i)).c_str()));
  }
  EXPECT_NE(nullptr, QEL_EVP_get_digestbyname(h.ctx, "SHA384"));
}

// ---- Memory ----

void useSecret(const Handles& h, const char* digest, bool finish) {
  Handles used = h;
  used.digest = QEL_EVP_get_digestbyname(h.ctx, digest);
  const auto* secret = reinterpret_cast<const unsigned char*>(kSecret);
  ASSERT_TRUE(used.digestInit());
  ASSERT_EQ(1, QEL_EVP_DigestUpdate(h.ctx, h.digestCtx, secret, 37));
  ASSERT_EQ(1, QEL_EVP_DecryptInit(h.ctx, h.cipherCtx, h.cipher, secret, secret));
  ASSERT_EQ(1, QEL_EVP_DecryptUpdate(h.ctx, h.cipherCtx, out, &outLength, secret, 16));
  if (!finish) return;
  ASSERT_EQ(1, QEL_EVP_DigestFinal(h.ctx, h.digestCtx, out, nullptr));
  ASSERT_EQ(0, QEL_EVP_DecryptFinal(h.ctx, h.cipherCtx, out, &outLength));
}

TEST_F(Qel, NothingSecretStaysInOrLeavesAContext) {
  searching = true;
  for (const char* digest : {"MD5", "SHA1", "SHA512", "SHA3-256"}) {
    for (const bool finish : {false, true}) {
      SCOPED_TRACE(digest);
      useSecret(h, digest, finish);
      EXPECT_NE(0, secretsLive());
      EXPECT_EQ(1, QEL_EVP_MD_CTX_cleanup(h.ctx, h.digestCtx));
      EXPECT_EQ(1, QEL_EVP_CIPHER_CTX_cleanup(h.ctx, h.cipherCtx));
      EXPECT_EQ(0, secretsLive());
    }
  }
  useSecret(h, "SHA1", false);
  EXPECT_EQ(1, QEL_Cleanup(h.ctx, nullptr));  // with the contexts live
  searching = false;
  EXPECT_EQ(0, secretsLive());
  EXPECT_EQ(0, secretsReleased);
}

bool makesContexts(H h) {
  bool made = true;
  for (int i = 0; made && i < 40; ++i) made = QEL_EVP_MD_CTX_new(h.ctx) != nullptr;
  return made;
}

// Refuses OpenSSL's allocations one after the other: each attempt fails with a status, until there is enough.
TEST_F(Qel, RefusedMemoryIsAResult) {
  for (bool (*works)(H) : {+[](H x) { return x.digestInit(); }, +[](H x) { return x.encryptInit(); }, makesContexts}) {
    long refused = 0;
    for (bool worked = false; !worked && refused < 5000; ++refused) {
      allocationsLeft = refused;
      worked = works(h);
      allocationsLeft = -1;
      EXPECT_TRUE(worked || reason() == QEL_REASON_OUT_OF_MEMORY) << refused;
    }
    EXPECT_TRUE(1 < refused && refused < 5000);
  }
}

// The steps grow with the count, so that the many allocations of a provider context are sampled all along.
TEST_F(Qel, RefusedMemoryLeavesNoProviderContextBehind) {
  bool worked = false;
  for (long refused = 0; !worked && refused < 20000; refused += 1 + refused / 50) {
    allocationsLeft = refused;
    QEL_CTX* ctx = QEL_Init(&lastStatus, nullptr);
    worked = ctx != nullptr && QEL_Attach(ctx, &lastStatus) == 1;
    allocationsLeft = -1;
    EXPECT_EQ(worked ? 0 : 1, lastStatus.majRC) << refused;
    EXPECT_EQ(ctx != nullptr ? 1 : 0, QEL_Cleanup(ctx, nullptr));
  }
  EXPECT_TRUE(worked);
}

// ---- Threads ----

void digestAndEncrypt(const Handles& shared, int round) {
  Handles own = shared;
  own.digestCtx = QEL_EVP_MD_CTX_new(own.ctx);
  own.cipherCtx = QEL_EVP_CIPHER_CTX_new(own.ctx);
  const DigestAnswer& row = kDigestAnswers[static_cast<size_t>(round) % std::size(kDigestAnswers)];
  own.digest = QEL_EVP_get_digestbyname(own.ctx, row.name);
  unsigned char buffer[64];
  unsigned int length = 0;
  EXPECT_TRUE(own.digestInit());
  EXPECT_EQ(1, QEL_EVP_DigestUpdate(own.ctx, own.digestCtx, row.text, static_cast<unsigned>(std::strlen(row.text))));
  EXPECT_EQ(1, QEL_EVP_DigestFinal(own.ctx, own.digestCtx, buffer, &length));
  EXPECT_EQ(fromHex(row.hex), Bytes(buffer, buffer + length));
  EXPECT_TRUE(own.encryptInit());
  EXPECT_EQ(1, QEL_EVP_MD_CTX_free(own.ctx, own.digestCtx));
  EXPECT_EQ(1, QEL_EVP_CIPHER_CTX_free(own.ctx, own.cipherCtx));
  EXPECT_EQ(0, QEL_EVP_MD_CTX_free(own.ctx, own.digestCtx));
}

TEST_F(Qel, ThreadsShareAContextWhileOthersComeAndGo) {
  std::vector<std::thread> threads;
  for (int t = 0; t < 10; ++t) {  // more than there are replicas of an algorithm
    threads.emplace_back([this, t] {
      Handles passing = makeHandles();
      for (int i = 0; i < 100; ++i) digestAndEncrypt(i % 2 == 0 ? h : passing, i + t);
      EXPECT_EQ(1, QEL_Cleanup(passing.ctx, nullptr));
    });
  }
  for (std::thread& thread : threads) thread.join();
}

// ---- The library as the loader sees it ----

template <typename Function>
Function* entry(void* library, const char* name, Function*) {
  return reinterpret_cast<Function*>(dlsym(library, name));
}

// The library with work left behind in it, in this thread, in one that has exited and in one that outlives it.
struct LibraryInUse {
  void* handle = nullptr;
  std::promise<void> end;
  std::thread outliving;

  explicit LibraryInUse(const std::string& path) : handle{dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL)} {
    if (handle == nullptr) return;
    QEL_CTX* ctx = entry(handle, "QEL_Init", QEL_Init)(nullptr, nullptr);
    auto* makeDigest = entry(handle, "QEL_EVP_MD_CTX_new", QEL_EVP_MD_CTX_new);
    auto* digestByName = entry(handle, "QEL_EVP_get_digestbyname", QEL_EVP_get_digestbyname);
    auto* init = entry(handle, "QEL_EVP_DigestInit", QEL_EVP_DigestInit);
    const auto work = [=] { EXPECT_EQ(1, init(ctx, makeDigest(ctx), digestByName(ctx, "SHA1"))); };
    work();
    std::thread{work}.join();
    std::promise<void> begun;
    outliving = std::thread{[&begun, work, over = end.get_future()] {
      work();
      begun.set_value();
      over.wait();
    }};
    begun.get_future().wait();
  }
  ~LibraryInUse() {
    end.set_value();
    if (outliving.joinable()) outliving.join();
  }
};

TEST(QelLibrary, LoadsAndUnloadsWithContextsLive) {
  const std::string path = LDAPPW_PROVIDER_PATH;
  const std::string folder = path.substr(0, path.rfind("/qellib/"));
  for (const std::string& way : {path, path, folder + "/qellib/.//libtresk7qels.so"}) {
    const LibraryInUse inUse{way};
    void* library = inUse.handle;
    ASSERT_NE(nullptr, library) << dlerror();
    auto* where = entry(library, "treskqels_path", treskqels_path);
    std::vector<char> buffer(folder.size() + 1, '?');
    const int size = static_cast<int>(buffer.size());
    EXPECT_EQ(0, where(nullptr, size));
    EXPECT_EQ(0, where(buffer.data(), -1));
    EXPECT_EQ(0, where(buffer.data(), size - 1));
    EXPECT_EQ('?', buffer[0]);
    EXPECT_NE(0, where(buffer.data(), size));
    EXPECT_EQ(folder, buffer.data());
    EXPECT_EQ(0, dlclose(library));
    EXPECT_EQ(nullptr, dlopen(path.c_str(), RTLD_NOW | RTLD_NOLOAD));
  }
}

void exitInUse(bool opensslFirst) {
  const LibraryInUse inUse{LDAPPW_PROVIDER_PATH};
  if (opensslFirst) OPENSSL_cleanup();
  std::exit(3);
}

// What OpenSSL made is lost then, which the leak checker of a usual exit would tell.
void unloadWithoutOpenssl() {
  {
    const LibraryInUse inUse{LDAPPW_PROVIDER_PATH};
    OPENSSL_cleanup();
    dlclose(inUse.handle);
  }
  _exit(3);
}

TEST(QelLibraryDeathTest, EndsWithContextsLive) {
  testing::FLAGS_gtest_death_test_style = "threadsafe";
  EXPECT_EXIT(exitInUse(false), testing::ExitedWithCode(3), "");
  EXPECT_EXIT(exitInUse(true), testing::ExitedWithCode(3), "");
  EXPECT_EXIT(unloadWithoutOpenssl(), testing::ExitedWithCode(3), "");
}

}  // namespace
