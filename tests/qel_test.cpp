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

#include <algorithm>
#include <atomic>
#include <cstddef>
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

const unsigned char kSecret[] = "a secret that nobody else would write";
std::mutex blocksMutex;
std::set<void*>* blocks = nullptr;  // live ones; never destroyed, OpenSSL releases some at exit
std::atomic<int> secretsReleased{0};
std::atomic<long> allocationsLeft{-1};  // the one after these fails; negative: none does

bool holdsSecret(void* block) {
  return memmem(block, malloc_usable_size(block), kSecret, 16) != nullptr;
}

void opensslFree(void* block, const char*, int) {
  if (block == nullptr) return;
  if (holdsSecret(block)) ++secretsReleased;
  {
    std::lock_guard<std::mutex> lock{blocksMutex};
    blocks->erase(block);
  }
  std::free(block);
}

void* opensslRealloc(void* old, size_t size, const char* file, int line) {
  if (allocationsLeft >= 0 && allocationsLeft-- == 0) return nullptr;
  void* block = std::calloc(1, size);
  if (old != nullptr) std::memcpy(block, old, std::min(size, malloc_usable_size(old)));
  opensslFree(old, file, line);
  std::lock_guard<std::mutex> lock{blocksMutex};
  blocks->insert(block);
  return block;
}

void* opensslMalloc(size_t size, const char* file, int line) {
  return opensslRealloc(nullptr, size, file, line);
}

// OpenSSL takes these before its first allocation only, which comes with the start of the provider.
__attribute__((constructor(101))) void replaceAllocator() {
  blocks = new std::set<void*>;
  CRYPTO_set_mem_functions(opensslMalloc, opensslRealloc, opensslFree);
}

int secretsLive() {
  std::lock_guard<std::mutex> lock{blocksMutex};
  return static_cast<int>(std::count_if(blocks->begin(), blocks->end(), holdsSecret));
}

// ---- A provider context with one of each object ----

unsigned char out[64];
int outLength;
char text[4097];
QelStatus lastStatus;

// The objects, and their steps with usual arguments.
struct Handles {
  QEL_CTX* ctx = QEL_Init(nullptr, nullptr);
  QEL_CIPHER_CTX* cipherCtx = QEL_EVP_CIPHER_CTX_new(ctx);
  QEL_MD_CTX* digestCtx = QEL_EVP_MD_CTX_new(ctx);
  const QEL_CIPHER* cipher = QEL_EVP_get_cipherbyname(ctx, "AES-192-CBC");
  const QEL_DIGEST* digest = QEL_EVP_get_digestbyname(ctx, "SHA1");

  bool encryptInit() const { return QEL_EVP_EncryptInit(ctx, cipherCtx, cipher, kSecret, kSecret) == 1; }
  bool decryptInit() const { return QEL_EVP_DecryptInit(ctx, cipherCtx, cipher, kSecret, kSecret) == 1; }
  bool encrypt(int n) const { return QEL_EVP_EncryptUpdate(ctx, cipherCtx, out, &outLength, kSecret, n) == 1; }
  bool decrypt(int n) const { return QEL_EVP_DecryptUpdate(ctx, cipherCtx, out, &outLength, kSecret, n) == 1; }
  bool encryptFinal() const { return QEL_EVP_EncryptFinal(ctx, cipherCtx, out, &outLength) == 1; }
  bool decryptFinal() const { return QEL_EVP_DecryptFinal(ctx, cipherCtx, out, &outLength) == 1; }
  bool setKeyLength(int n) const { return QEL_EVP_CIPHER_CTX_set_key_length(ctx, cipherCtx, n) == 1; }
  bool freshCipher() const { return QEL_EVP_CIPHER_CTX_init(ctx, cipherCtx) == 1; }
  bool digestInit() const { return QEL_EVP_DigestInit(ctx, digestCtx, digest) == 1; }
  bool update(const void* data) const { return QEL_EVP_DigestUpdate(ctx, digestCtx, data, 37) == 1; }
  bool digestFinal() const { return QEL_EVP_DigestFinal(ctx, digestCtx, out, nullptr) == 1; }
  bool freshDigest() const { return QEL_EVP_MD_CTX_init(ctx, digestCtx) == 1; }
  bool finds(const char* name) const { return QEL_EVP_get_digestbyname(ctx, name) != nullptr; }
  bool setValue(int id, const char* value) const { return QEL_SetValue(ctx, nullptr, id, value) == 1; }
};

using H = const Handles&;

class Qel : public testing::Test {
 protected:
  Handles h;

  ~Qel() override { QEL_Cleanup(h.ctx, nullptr); }

  int reason() {
    EXPECT_EQ(1, QEL_GetStatus(h.ctx, &lastStatus));
    EXPECT_TRUE(lastStatus.majRC == 1 && lastStatus.desc[0] != '\0');
    EXPECT_EQ(0U, ERR_peek_error());
    return lastStatus.minRC;
  }
};

// ---- Published answers ----

// From RFC 1321 A.5 and the FIPS 180 examples.
const struct DigestAnswer {
  const char *name, *text, *hex;
} kDigestAnswers[] = {
    {"md5", "message digest", "f96b697d7cb7938d525a2f31aaf161d0"},
    {"sha-1", "abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq", "84983e441c3bd26ebaae4aa1f95129e5e54670f1"},
    {"SHA256", "abc", "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
};

// Byte by byte.
void expectAnswer(Handles h, const DigestAnswer& row) {
  SCOPED_TRACE(row.name);
  unsigned char digest[64];
  unsigned int length = 0;
  h.digest = QEL_EVP_get_digestbyname(h.ctx, row.name);
  EXPECT_TRUE(h.digestInit());
  for (const char* c = row.text; *c != '\0'; ++c) EXPECT_EQ(1, QEL_EVP_DigestUpdate(h.ctx, h.digestCtx, c, 1));
  EXPECT_EQ(1, QEL_EVP_DigestUpdate(h.ctx, h.digestCtx, nullptr, 0));
  EXPECT_EQ(1, QEL_EVP_DigestFinal(h.ctx, h.digestCtx, digest, &length));
  EXPECT_EQ(fromHex(row.hex), Bytes(digest, digest + length));
}

TEST_F(Qel, GivesPublishedAnswers) {
  for (const DigestAnswer& row : kDigestAnswers) expectAnswer(h, row);
  for (const char* name : {"sha-1", "1.3.14.3.2.26"}) EXPECT_EQ(h.digest, QEL_EVP_get_digestbyname(h.ctx, name));
  // SP 800-38A F.1.1, worked on in place
  const Bytes key = fromHex("2b7e151628aed2a6abf7158809cf4f3c");
  const Bytes clear = fromHex("6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51");
  Bytes data = clear;
  h.cipher = QEL_EVP_get_cipherbyname(h.ctx, "aes-128-ECB");
  ASSERT_EQ(1, QEL_EVP_CIPHER_CTX_set_padding(h.ctx, h.cipherCtx, 0));
  ASSERT_EQ(1, QEL_EVP_EncryptInit(h.ctx, h.cipherCtx, h.cipher, key.data(), nullptr));
  ASSERT_EQ(1, QEL_EVP_EncryptUpdate(h.ctx, h.cipherCtx, data.data(), &outLength, data.data(), 32));
  EXPECT_EQ(32, outLength);
  EXPECT_EQ(fromHex("3ad77bb40d7a3660a89ecaf32466ef97f5d3d58503b9699de785895a96fdbaaf"), data);
  ASSERT_TRUE(h.encryptFinal());
  EXPECT_EQ(0, outLength);  // padding stays off
  h.cipher = QEL_EVP_get_cipherbyname(h.ctx, "AES-128-ECB");
  ASSERT_EQ(1, QEL_EVP_DecryptInit(h.ctx, h.cipherCtx, h.cipher, key.data(), nullptr));
  ASSERT_EQ(1, QEL_EVP_DecryptUpdate(h.ctx, h.cipherCtx, data.data(), &outLength, data.data(), 32));
  EXPECT_EQ(clear, data);
}

// ---- Misuse ----

// How many entries were called, in the order written, and how many worked.
struct Results {
  int called = 0, worked = 0;
  Results operator<<(bool works) const { return {called + 1, worked + (works ? 1 : 0)}; }
};

// The entries that take each kind of handle, with usual arguments.
Results ofContext(H h) {
  return Results{} << QEL_GetStatus(h.ctx, &lastStatus) << h.setValue(QEL_VALUE_STRICT, "on") << h.finds("MD5")
                   << QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 3) << QEL_Attach(h.ctx, nullptr)
                   << (QEL_EVP_get_cipherbyname(h.ctx, "AES128") != nullptr) << (QEL_EVP_MD_CTX_new(h.ctx) != nullptr)
                   << (QEL_EVP_CIPHER_CTX_new(h.ctx) != nullptr) << QEL_RAND_bytes(h.ctx, out, 9)
                   << QEL_RAND_seed(h.ctx, out, 9) << QEL_GenerateRandomSeed(h.ctx, nullptr, out, 9);
}
Results ofAlgorithms(H h) {
  return Results{} << (QEL_EVP_CIPHER_block_size(h.ctx, h.cipher) == 16)
                   << (QEL_EVP_CIPHER_key_length(h.ctx, h.cipher) == 24)
                   << (QEL_EVP_CIPHER_iv_length(h.ctx, h.cipher) == 16) << h.encryptInit() << h.decryptInit()
                   << (QEL_EVP_MD_block_size(h.ctx, h.digest) == 64) << (QEL_EVP_MD_size(h.ctx, h.digest) == 20)
                   << h.digestInit();
}
Results ofWork(H h) {
  return Results{} << h.encryptInit() << h.encrypt(16) << h.encryptFinal() << h.decryptInit() << h.decrypt(16)
                   << QEL_EVP_CIPHER_CTX_set_padding(h.ctx, h.cipherCtx, 0) << h.decryptFinal() << h.setKeyLength(24)
                   << (QEL_EVP_CIPHER_CTX_cipher(h.ctx, h.cipherCtx) == h.cipher) << h.freshCipher()
                   << QEL_EVP_CIPHER_CTX_cleanup(h.ctx, h.cipherCtx) << QEL_EVP_CIPHER_CTX_free(h.ctx, h.cipherCtx)
                   << h.digestInit() << h.update(kSecret) << h.digestFinal() << h.freshDigest()
                   << QEL_EVP_MD_CTX_cleanup(h.ctx, h.digestCtx) << QEL_EVP_MD_CTX_free(h.ctx, h.digestCtx);
}

// Addresses, odd numbers, neighbours of live handles, a released handle, and those of another context.
TEST_F(Qel, EveryEntryRefusesForeignHandles) {
  const Handles other;
  QEL_MD_CTX* freed = QEL_EVP_MD_CTX_new(h.ctx);
  QEL_EVP_MD_CTX_free(h.ctx, freed);
  EXPECT_NE(freed, QEL_EVP_MD_CTX_new(h.ctx));  // its place is in use again
  std::vector<const void*> values = {nullptr,         &other,       freed,       other.cipherCtx,
                                     other.digestCtx, other.cipher, other.digest};
  const auto live = reinterpret_cast<uintptr_t>(h.cipherCtx);
  for (const uintptr_t number : {uintptr_t{1}, ~uintptr_t{0}, live + 1, live << 1, live ^ (uintptr_t{1} << 24)}) {
    values.push_back(reinterpret_cast<void*>(number));
  }
  for (const void* each : values) {
    SCOPED_TRACE(each);
    const int expected = each == nullptr ? QEL_REASON_NULL_ARGUMENT : QEL_REASON_FOREIGN_HANDLE;
    void* value = const_cast<void*>(each);
    Handles bad = h;
    bad.ctx = static_cast<QEL_CTX*>(value);
    for (const auto entries : {ofContext, ofAlgorithms, ofWork}) EXPECT_EQ(0, entries(bad).worked);
    bad = h;
    bad.cipher = static_cast<QEL_CIPHER*>(value);
    bad.digest = static_cast<QEL_DIGEST*>(value);
    EXPECT_EQ(0, ofAlgorithms(bad).worked);
    EXPECT_EQ(expected, reason());
    bad = {h.ctx, static_cast<QEL_CIPHER_CTX*>(value), static_cast<QEL_MD_CTX*>(value), h.cipher, h.digest};
    EXPECT_EQ(0, ofWork(bad).worked);
    EXPECT_EQ(expected, reason());
  }
  EXPECT_EQ(1, QEL_Cleanup(other.ctx, nullptr));
  for (const auto entries : {ofContext, ofAlgorithms, ofWork}) {
    EXPECT_EQ(0, entries(other).worked);
    const Results own = entries(h);
    EXPECT_EQ(own.called, own.worked);
  }
  EXPECT_EQ(0, QEL_Cleanup(other.ctx, &lastStatus));
  EXPECT_EQ(QEL_REASON_FOREIGN_HANDLE, lastStatus.minRC);
  EXPECT_EQ(0, QEL_Cleanup(nullptr, nullptr));
}

TEST_F(Qel, EveryMisuseHasItsReason) {
  const auto refusal = [this](bool worked) {
    const int code = worked ? 0 : reason();
    ERR_raise(ERR_LIB_USER, ERR_R_MALLOC_FAILURE);  // somebody else's: not the next reason, and gone afterwards
    return code;
  };
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(h.finds(nullptr)));
  EXPECT_EQ(QEL_REASON_UNKNOWN_ALGORITHM, refusal(h.finds(std::string(5000, 'S').c_str())));
  EXPECT_EQ(QEL_REASON_UNKNOWN_ALGORITHM, refusal(h.finds("AES-128-ECB")));
  for (int i = 0; i < 1100; ++i) EXPECT_FALSE(h.finds(("unknown" + std::to_string(i)).c_str()));  // a table's worth
  EXPECT_TRUE(h.finds("SHA384"));
  EXPECT_EQ(QEL_REASON_WRONG_STATE, refusal(h.update(kSecret)));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(h.digestInit() && h.update(nullptr)));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(QEL_EVP_DigestFinal(h.ctx, h.digestCtx, nullptr, nullptr)));
  EXPECT_EQ(QEL_REASON_WRONG_STATE, refusal(h.digestFinal() && h.digestFinal()));
  EXPECT_EQ(QEL_REASON_WRONG_STATE, refusal(h.digestInit() && h.freshDigest() && h.digestFinal()));
  EXPECT_EQ(QEL_REASON_WRONG_STATE, refusal(QEL_EVP_CIPHER_CTX_cipher(h.ctx, h.cipherCtx) != nullptr));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(QEL_EVP_DecryptInit(h.ctx, h.cipherCtx, h.cipher, kSecret, nullptr)));
  EXPECT_EQ(QEL_REASON_WRONG_STATE, refusal(h.encryptInit() && h.decrypt(1)));
  EXPECT_EQ(QEL_REASON_BAD_LENGTH, refusal(h.encrypt(-1)));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(QEL_EVP_EncryptInit(h.ctx, h.cipherCtx, h.cipher, nullptr, kSecret)));
  EXPECT_EQ(QEL_REASON_WRONG_STATE, refusal(h.encrypt(1)));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT,
            refusal(h.encryptInit() && QEL_EVP_EncryptUpdate(h.ctx, h.cipherCtx, nullptr, &outLength, out, 1)));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(QEL_EVP_EncryptUpdate(h.ctx, h.cipherCtx, out, &outLength, nullptr, 1)));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(QEL_EVP_EncryptFinal(h.ctx, h.cipherCtx, out, nullptr)));
  EXPECT_EQ(QEL_REASON_WRONG_STATE, refusal(h.encryptFinal() && h.encrypt(1)));
  EXPECT_EQ(QEL_REASON_BAD_LENGTH, refusal(h.encryptInit() && h.setKeyLength(16)));
  EXPECT_EQ(QEL_REASON_BAD_LENGTH, refusal(h.freshCipher() && h.setKeyLength(16) && h.encryptInit()));
  EXPECT_EQ(QEL_REASON_BAD_LENGTH, refusal(h.setKeyLength(65)));
  EXPECT_EQ(QEL_REASON_BAD_VALUE_ID, refusal(h.setValue(2, "on")));
  EXPECT_EQ(QEL_REASON_BAD_VALUE, refusal(h.setValue(QEL_VALUE_STRICT, "ON")));
  EXPECT_EQ(QEL_REASON_PATH_TOO_LONG, refusal(h.setValue(QEL_VALUE_LOAD_PATH, std::string(4096, '/').c_str())));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(QEL_GetStatus(h.ctx, nullptr)));
  EXPECT_EQ(QEL_REASON_BAD_LENGTH, refusal(QEL_RAND_bytes(h.ctx, out, -1)));
  EXPECT_EQ(QEL_REASON_NULL_ARGUMENT, refusal(QEL_RAND_seed(h.ctx, nullptr, 1)));
  ERR_clear_error();
}

// ---- Failures and values ----

TEST_F(Qel, FailuresAreTheThreadsOwnAndSayWhatOpensslSays) {
  std::memset(&lastStatus, 1, sizeof lastStatus);
  std::thread{[this] { EXPECT_EQ(nullptr, QEL_EVP_get_digestbyname(h.ctx, "no such digest")); }}.join();
  const auto expectNone = [this] {
    const QelStatus none{};
    EXPECT_EQ(1, QEL_GetStatus(h.ctx, &lastStatus));
    EXPECT_EQ(0, std::memcmp(&none, &lastStatus, sizeof none));
  };
  expectNone();
  std::thread{expectNone}.join();  // takes over what the other thread left
  ASSERT_TRUE(h.decryptInit() && h.decrypt(16));
  outLength = 7;
  EXPECT_FALSE(h.decryptFinal());
  EXPECT_EQ(0, outLength);
  EXPECT_EQ(1, QEL_Attach(h.ctx, nullptr));  // a success in between
  EXPECT_EQ(QEL_REASON_CIPHER_FAILURE, reason());
  EXPECT_NE(nullptr, std::strstr(lastStatus.desc, ": bad decrypt")) << lastStatus.desc;
  EXPECT_EQ(1, QEL_GenerateRandomSeed(h.ctx, &lastStatus, out, 1));
  EXPECT_EQ(0, lastStatus.majRC);
}

TEST_F(Qel, ValuesFitTheBufferOrLeaveItAlone) {
  text[0] = '?';
  EXPECT_EQ(0, QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 2));
  EXPECT_EQ(QEL_REASON_BUFFER_TOO_SMALL, reason());
  EXPECT_EQ('?', text[0]);
  EXPECT_EQ(1, QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 3));
  EXPECT_STREQ("on", text);
  const std::string longest(4095, 'x');
  EXPECT_TRUE(h.setValue(QEL_VALUE_LOAD_PATH, longest.c_str()));
  EXPECT_EQ(1, QEL_GetValue(h.ctx, nullptr, QEL_VALUE_LOAD_PATH, text, 4096));
  EXPECT_EQ(longest, text);
  EXPECT_EQ(nullptr, QEL_Init(&lastStatus, (longest + "x").c_str()));
  EXPECT_EQ(QEL_REASON_PATH_TOO_LONG, lastStatus.minRC);
  ASSERT_TRUE(h.setValue(QEL_VALUE_STRICT, "off") && h.encryptInit());  // leaves the order of steps to OpenSSL
  EXPECT_TRUE(h.encryptFinal() && h.encrypt(16) && h.freshCipher() && !h.encrypt(16));
}

// ---- Memory ----

TEST_F(Qel, NothingSecretStaysInOrLeavesAContext) {
  for (const char* name : {"MD5", "SHA1", "SHA512", "SHA3-256"}) {
    h.digest = QEL_EVP_get_digestbyname(h.ctx, name);
    for (const bool finish : {false, true}) {
      SCOPED_TRACE(name);
      ASSERT_TRUE(h.digestInit() && h.update(kSecret) && h.decryptInit() && h.decrypt(16));
      ASSERT_TRUE(!finish || (h.digestFinal() && !h.decryptFinal()));
      EXPECT_NE(0, secretsLive());
      EXPECT_EQ(1, QEL_EVP_MD_CTX_cleanup(h.ctx, h.digestCtx));
      EXPECT_EQ(1, QEL_EVP_CIPHER_CTX_cleanup(h.ctx, h.cipherCtx));
      EXPECT_EQ(0, secretsLive());
    }
  }
  ASSERT_TRUE(h.digestInit() && h.update(kSecret) && h.encryptInit());
  EXPECT_EQ(1, QEL_Cleanup(h.ctx, nullptr));  // with the contexts live
  EXPECT_EQ(0, secretsLive());
  EXPECT_EQ(0, secretsReleased);
}

// Refuses one allocation after the other, later ones by samples, until none is left to refuse. Some can be done
// without.
TEST_F(Qel, RefusedMemoryIsAResult) {
  int failures = 0;
  for (long refused = 0, left = -1; left < 0; refused += 1 + refused / 50) {
    allocationsLeft = refused;
    const bool works = h.digestInit() && h.encryptInit();
    allocationsLeft = refused;
    const Handles passing;
    const bool allWorks = passing.digestInit() && passing.encryptInit();
    left = allocationsLeft.exchange(-1);
    EXPECT_TRUE(works || reason() == QEL_REASON_OUT_OF_MEMORY) << refused;
    EXPECT_EQ(passing.ctx != nullptr ? 1 : 0, QEL_GetStatus(passing.ctx, &lastStatus));
    EXPECT_TRUE(allWorks || lastStatus.majRC == 1) << refused;
    EXPECT_EQ(passing.ctx != nullptr ? 1 : 0, QEL_Cleanup(passing.ctx, nullptr));
    failures += (works ? 0 : 1) + (allWorks ? 0 : 1);
  }
  EXPECT_GT(failures, 30);
}

TEST_F(Qel, ThreadsShareAContextWhileOthersComeAndGo) {
  std::vector<std::thread> threads;
  for (size_t t = 0; t < 10; ++t) {  // more than there are replicas of an algorithm
    threads.emplace_back([this, t] {
      const Handles passing;
      for (size_t i = 0; i < 100; ++i) {
        Handles own = i % 2 == 0 ? h : passing;
        own.digestCtx = QEL_EVP_MD_CTX_new(own.ctx);
        own.cipherCtx = QEL_EVP_CIPHER_CTX_new(own.ctx);
        expectAnswer(own, kDigestAnswers[(i + t) % std::size(kDigestAnswers)]);
        EXPECT_TRUE(own.encryptInit());
        QEL_MD_CTX* more[6];  // than a thread keeps to itself
        for (QEL_MD_CTX*& each : more) each = QEL_EVP_MD_CTX_new(own.ctx);
        for (QEL_MD_CTX* each : more) EXPECT_EQ(1, QEL_EVP_MD_CTX_free(own.ctx, each));
        EXPECT_EQ(1, QEL_EVP_MD_CTX_free(own.ctx, own.digestCtx));
        EXPECT_EQ(1, QEL_EVP_CIPHER_CTX_free(own.ctx, own.cipherCtx));
      }
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

// Leaves work behind in this thread, in one that has exited and in one that outlives the library.
void loadAndUnload(const std::string& path, bool opensslLast) {
  void* library = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  QEL_CTX* ctx = entry(library, "QEL_Init", QEL_Init)(nullptr, nullptr);
  auto* makeDigest = entry(library, "QEL_EVP_MD_CTX_new", QEL_EVP_MD_CTX_new);
  auto* digestByName = entry(library, "QEL_EVP_get_digestbyname", QEL_EVP_get_digestbyname);
  auto* init = entry(library, "QEL_EVP_DigestInit", QEL_EVP_DigestInit);
  const auto work = [=] { EXPECT_EQ(1, init(ctx, makeDigest(ctx), digestByName(ctx, "SHA1"))); };
  work();
  std::thread{work}.join();
  std::promise<void> begun, end;
  std::thread outliving{[&] {
    work();
    begun.set_value();
    end.get_future().wait();
  }};
  begun.get_future().wait();
  if (!opensslLast) OPENSSL_cleanup();
  EXPECT_EQ(0, dlclose(library));
  EXPECT_EQ(nullptr, dlopen(path.c_str(), RTLD_NOW | RTLD_NOLOAD));
  end.set_value();
  outliving.join();
}

TEST(QelLibrary, TellsItsFolderAndUnloadsWithContextsLive) {
  const std::string path = LDAPPW_PROVIDER_PATH, folder = path.substr(0, path.rfind("/qellib/"));
  for (const std::string& way : {path, folder + "/qellib/.//libtresk7qels.so"}) {
    void* library = dlopen(way.c_str(), RTLD_NOW | RTLD_LOCAL);
    auto* where = entry(library, "treskqels_path", treskqels_path);
    std::string buffer(folder.size() + 1, '?');
    const int size = static_cast<int>(buffer.size());
    for (const int small : {-1, size - 1}) EXPECT_EQ(0, where(buffer.data(), small));
    EXPECT_EQ(0, where(nullptr, size));
    EXPECT_EQ(std::string(buffer.size(), '?'), buffer);
    EXPECT_NE(0, where(buffer.data(), size));
    EXPECT_EQ(folder, buffer.c_str());
    dlclose(library);
    loadAndUnload(way, true);
  }
}

using QelDeathTest = Qel;

// What OpenSSL made is lost when it ends first, which the leak checker of a usual exit would tell.
TEST_F(QelDeathTest, EndsWithContextsLive) {
  testing::FLAGS_gtest_death_test_style = "threadsafe";
  EXPECT_EXIT(std::exit(3), testing::ExitedWithCode(3), "");
  EXPECT_EXIT((OPENSSL_cleanup(), std::exit(3)), testing::ExitedWithCode(3), "");
  EXPECT_EXIT((loadAndUnload(LDAPPW_PROVIDER_PATH, false), _exit(3)), testing::ExitedWithCode(3), "");
}

}  // namespace
