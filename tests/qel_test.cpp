// SPDX-License-Identifier: Apache-2.0
// The crypto provider: OpenSSL's answers for every algorithm, misuse of every entry, wiping, refused memory, threads,
// and the built library as the loader sees it. OpenSSL's allocator is replaced, so that blocks can be searched and
// refused, and so is its giving of lists. Hosts that fork, exit and cancel threads stand in hosts.cpp.
#include "qel.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <malloc.h>
#include <openssl/err.h>
#include <openssl/provider.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <future>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "oracle.h"

namespace {

// ---- OpenSSL's memory ----

constexpr char kWord[] = "sEcReT?!";  // what any part of the secret holds that is long enough
unsigned char secret[512];            // the word, over and over
std::mutex blocksMutex;
std::set<void*>* blocks = nullptr;  // live ones; never destroyed, OpenSSL releases some at exit
std::atomic<int> secretsReleased{0};
std::atomic<long> allocationsLeft{-1};  // those after these fail; negative: none does
std::atomic<bool> hasRefused{false};    // one of them

bool holdsSecret(void* block) {
  return memmem(block, malloc_usable_size(block), kWord, 8) != nullptr;
}

void opensslFree(void* block, const char*, int) {
  if (block != nullptr) {
    if (holdsSecret(block)) ++secretsReleased;
    const std::lock_guard<std::mutex> lock{blocksMutex};
    blocks->erase(block);
  }
  std::free(block);
}

void* opensslRealloc(void* old, size_t size, const char* file, int line) {
  if (allocationsLeft == 0) return hasRefused = true, nullptr;
  if (allocationsLeft > 0) --allocationsLeft;
  void* block = std::calloc(1, size);
  if (old != nullptr) std::memcpy(block, old, std::min(size, malloc_usable_size(old)));
  opensslFree(old, file, line);
  const std::lock_guard<std::mutex> lock{blocksMutex};
  blocks->insert(block);
  return block;
}

void* opensslMalloc(size_t size, const char* file, int line) {
  return opensslRealloc(nullptr, size, file, line);
}

// OpenSSL takes these before its first allocation only.
__attribute__((constructor(101))) void replaceAllocator() {
  blocks = new std::set<void*>;
  for (size_t i = 0; i < sizeof secret; ++i) secret[i] = static_cast<unsigned char>(kWord[i % 8]);
  CRYPTO_set_mem_functions(opensslMalloc, opensslRealloc, opensslFree);
}

// ---- OpenSSL's lists ----

// Gives copies, which are spoiled when they are given back, as the lists of a provider may be.
std::vector<OSSL_ALGORITHM>& copiedList(int operation) {
  static auto* const lists = new std::vector<OSSL_ALGORITHM>[2];  // never destroyed: the names are not either
  return lists[operation == OSSL_OP_DIGEST ? 0 : 1];
}

extern "C" const OSSL_ALGORITHM* OSSL_PROVIDER_query_operation(const OSSL_PROVIDER* provider, int operation,
                                                               int* kept) {
  const auto real = reinterpret_cast<decltype(&OSSL_PROVIDER_query_operation)>(dlsym(RTLD_NEXT, __func__));
  std::vector<OSSL_ALGORITHM>& list = copiedList(operation);
  const OSSL_ALGORITHM* each = real(provider, operation, kept);
  for (list.clear(); each->algorithm_names != nullptr; ++each) {
    list.push_back(*each);
    list.back().algorithm_names = strdup(each->algorithm_names);
  }
  list.push_back({});
  return list.data();
}

extern "C" void OSSL_PROVIDER_unquery_operation(const OSSL_PROVIDER*, int operation, const OSSL_ALGORITHM*) {
  for (const OSSL_ALGORITHM& each : copiedList(operation)) {
    if (each.algorithm_names != nullptr) *const_cast<char*>(each.algorithm_names) = '?';
  }
}

int secretsLive() {
  const std::lock_guard<std::mutex> lock{blocksMutex};
  return static_cast<int>(std::count_if(blocks->begin(), blocks->end(), holdsSecret));
}

// ---- A provider context with one of each object ----

unsigned char out[1024];
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

  bool encryptInit() const { return QEL_EVP_EncryptInit(ctx, cipherCtx, cipher, secret, secret) == 1; }
  bool decryptInit() const { return QEL_EVP_DecryptInit(ctx, cipherCtx, cipher, secret, secret) == 1; }
  bool encrypt(int n) const { return QEL_EVP_EncryptUpdate(ctx, cipherCtx, out, &outLength, secret, n) == 1; }
  bool decrypt(int n) const { return QEL_EVP_DecryptUpdate(ctx, cipherCtx, out, &outLength, secret, n) == 1; }
  bool encryptFinal() const { return QEL_EVP_EncryptFinal(ctx, cipherCtx, out, &outLength) == 1; }
  bool decryptFinal() const { return QEL_EVP_DecryptFinal(ctx, cipherCtx, out, &outLength) == 1; }
  bool setKeyLength(int n) const { return QEL_EVP_CIPHER_CTX_set_key_length(ctx, cipherCtx, n) == 1; }
  bool setPadding(int on) const { return QEL_EVP_CIPHER_CTX_set_padding(ctx, cipherCtx, on) == 1; }
  bool freshCipher() const { return QEL_EVP_CIPHER_CTX_init(ctx, cipherCtx) == 1; }
  bool digestInit() const { return QEL_EVP_DigestInit(ctx, digestCtx, digest) == 1; }
  bool update(const void* data, unsigned n = 37) const { return QEL_EVP_DigestUpdate(ctx, digestCtx, data, n) == 1; }
  bool digestFinal() const { return QEL_EVP_DigestFinal(ctx, digestCtx, out, nullptr) == 1; }
  bool freshDigest() const { return QEL_EVP_MD_CTX_init(ctx, digestCtx) == 1; }
  bool finds(const char* name) const { return QEL_EVP_get_digestbyname(ctx, name) != nullptr; }
  bool drawsRandom() const { return QEL_RAND_bytes(ctx, out, 20) == 1; }
  bool setValue(int id, const char* value) const { return QEL_SetValue(ctx, nullptr, id, value) == 1; }
  bool works() const { return digestInit() && update(secret) && encryptInit() && encrypt(37) && encryptFinal(); }
};

using H = const Handles&;

class Qel : public testing::Test {
 protected:
  Handles h;

  // The host has an error in OpenSSL's queue, which stays the only one.
  Qel() { ERR_raise(ERR_LIB_USER, ERR_R_MALLOC_FAILURE); }
  ~Qel() override {
    QEL_Cleanup(h.ctx, nullptr);
    expectHostsError();
    ERR_clear_error();
  }

  static void expectHostsError() {
    EXPECT_EQ(ERR_GET_LIB(ERR_peek_error()), ERR_LIB_USER);
    EXPECT_EQ(ERR_GET_LIB(ERR_peek_last_error()), ERR_LIB_USER);
  }
  int reason() {
    EXPECT_EQ(QEL_GetStatus(h.ctx, &lastStatus), 1);
    EXPECT_EQ(lastStatus.majRC, 1);
    expectHostsError();
    return lastStatus.minRC;
  }
};

// ---- Every algorithm ----

using Names = std::vector<std::string>;

const Names& allDigests() {
  static Names names;
  const auto add = [](EVP_MD* each, void*) { names.emplace_back(EVP_MD_get0_name(each)); };
  if (names.empty()) EVP_MD_do_all_provided(nullptr, add, nullptr);
  return names;
}

const Names& allCiphers() {
  static Names names;
  const auto add = [](EVP_CIPHER* each, void*) { names.emplace_back(EVP_CIPHER_get0_name(each)); };
  if (names.empty()) EVP_CIPHER_do_all_provided(nullptr, add, nullptr);
  return names;
}

bool isRefused(const std::string& name) {
  const Names parts = {"GCM", "CCM", "OCB", "SIV", "Poly1305", "HMAC", "WRAP", "XTS", "CTS"};
  return std::any_of(parts.begin(), parts.end(), [&](auto& part) { return name.find(part) != std::string::npos; });
}

// Takes the data in two steps, each into as much room as the header asks for and not a byte more.
std::string ciphered(H h, bool encrypts, const std::string& data, size_t split) {
  auto* init = encrypts ? QEL_EVP_EncryptInit : QEL_EVP_DecryptInit;
  auto* update = encrypts ? QEL_EVP_EncryptUpdate : QEL_EVP_DecryptUpdate;
  auto* end = encrypts ? QEL_EVP_EncryptFinal : QEL_EVP_DecryptFinal;
  std::string result;
  const auto take = [&](size_t bytes, auto step) {
    std::vector<unsigned char> room(bytes + static_cast<size_t>(QEL_EVP_CIPHER_block_size(h.ctx, h.cipher)));
    int length = -1;
    EXPECT_EQ(step(room.data(), &length), 1);
    result.append(room.begin(), room.begin() + length);
  };
  const auto add = [&](const std::string& part) {
    take(part.size(), [&](unsigned char* o, int* n) {
      return update(h.ctx, h.cipherCtx, o, n, test::bytesOf(part), static_cast<int>(part.size()));
    });
  };
  EXPECT_EQ(init(h.ctx, h.cipherCtx, h.cipher, secret, secret), 1);
  add(data.substr(0, split));
  add(data.substr(split));
  take(0, [&](unsigned char* o, int* n) { return end(h.ctx, h.cipherCtx, o, n); });
  return result;
}

TEST_F(Qel, EveryCipherGivesBackWhatItTookOrIsNotFound) {
  const std::string word(reinterpret_cast<char*>(secret), sizeof secret);
  for (const std::string& name : allCiphers()) {
    SCOPED_TRACE(name);
    h.cipher = QEL_EVP_get_cipherbyname(h.ctx, name.c_str());
    ASSERT_EQ(h.cipher == nullptr, isRefused(name));
    for (size_t length = 0; h.cipher != nullptr && length < 50; ++length) {
      const std::string data = word.substr(length % 8, length);
      const std::string encrypted = ciphered(h, true, data, length / 3);
      ASSERT_EQ(encrypted, test::opensslCipher({name.c_str(), word, word, true, true}, data));
      ASSERT_EQ(ciphered(h, false, encrypted, encrypted.size() / 2), data);
    }
  }
}

// Those that have any size or none are not found: what their customary one is depends on the release of OpenSSL.
TEST_F(Qel, EveryDigestIsOpensslsOrIsNotFound) {
  const std::set<std::string> refused = {"SHAKE-128", "SHAKE-256", "KECCAK-KMAC-128", "KECCAK-KMAC-256", "NULL"};
  for (const std::string& name : allDigests()) {
    h.digest = QEL_EVP_get_digestbyname(h.ctx, name.c_str());
    ASSERT_EQ(h.digest == nullptr, refused.count(name) == 1) << name;
    if (h.digest == nullptr) continue;
    for (const unsigned length : {0U, 1U, 55U, 64U, 129U, 336U}) {
      unsigned size = 99;
      size_t expectedSize = 0;
      unsigned char expected[EVP_MAX_MD_SIZE];
      EVP_Q_digest(nullptr, name.c_str(), nullptr, secret, length, expected, &expectedSize);
      ASSERT_TRUE(h.digestInit() && h.update(secret, length / 3) && h.update(nullptr, 0)) << name;
      ASSERT_TRUE(h.update(secret + length / 3, length - length / 3)) << name;
      ASSERT_EQ(QEL_EVP_DigestFinal(h.ctx, h.digestCtx, out, &size), 1) << name;
      EXPECT_EQ(std::string(out, out + size), std::string(expected, expected + expectedSize)) << name;
    }
  }
  for (const char* name : {"sha-1", "Sha1", "1.3.14.3.2.26"}) {
    EXPECT_EQ(QEL_EVP_get_digestbyname(h.ctx, name), QEL_EVP_get_digestbyname(h.ctx, "SHA1")) << name;
  }
}

TEST_F(Qel, PaddingAndStrictness) {
  const auto lengthOf = [](bool works) { return works ? outLength : -1; };
  EXPECT_EQ(lengthOf(h.setPadding(0) && h.encryptInit() && h.encrypt(32)), 32);
  EXPECT_EQ(lengthOf(h.encryptFinal()), 0);
  EXPECT_EQ(lengthOf(h.decryptInit() && h.decrypt(16)), 16);
  EXPECT_EQ(lengthOf(h.setPadding(1) && h.encryptInit() && h.encryptFinal()), 16);
  EXPECT_EQ(lengthOf(h.setPadding(0) && h.freshCipher() && h.encryptInit() && h.encryptFinal()), 16);
  EXPECT_TRUE(h.setValue(QEL_VALUE_STRICT, "off") && h.encrypt(16) && !h.decrypt(16));
  EXPECT_TRUE(h.encryptFinal() && QEL_EVP_DecryptInit(h.ctx, h.cipherCtx, h.cipher, secret, secret) == 1);
  EXPECT_TRUE(h.decrypt(16) && !h.decryptFinal() && !h.decrypt(16));  // a block is left
  EXPECT_TRUE(h.freshCipher() && !h.encrypt(16));
}

// ---- Misuse ----

// Hosts know the reasons by their numbers; the other ones stand below.
static_assert(QEL_REASON_DIGEST_FAILURE == 10 && QEL_REASON_RANDOM_FAILURE == 12);
static_assert(QEL_REASON_NOT_AVAILABLE == 13 && QEL_REASON_OUT_OF_MEMORY == 15);

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
                   << (QEL_EVP_CIPHER_CTX_new(h.ctx) != nullptr) << h.drawsRandom() << QEL_RAND_seed(h.ctx, out, 9)
                   << QEL_GenerateRandomSeed(h.ctx, nullptr, out, 9);
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
                   << h.setPadding(0) << h.decryptFinal() << h.setKeyLength(24)
                   << (QEL_EVP_CIPHER_CTX_cipher(h.ctx, h.cipherCtx) == h.cipher) << h.freshCipher()
                   << QEL_EVP_CIPHER_CTX_cleanup(h.ctx, h.cipherCtx) << QEL_EVP_CIPHER_CTX_free(h.ctx, h.cipherCtx)
                   << h.digestInit() << h.update(secret) << h.digestFinal() << h.freshDigest()
                   << QEL_EVP_MD_CTX_cleanup(h.ctx, h.digestCtx) << QEL_EVP_MD_CTX_free(h.ctx, h.digestCtx);
}

// Addresses, odd numbers, neighbours of live handles, a released handle, and those of another context.
TEST_F(Qel, EveryEntryRefusesForeignHandles) {
  const Handles other;
  QEL_MD_CTX* freed = QEL_EVP_MD_CTX_new(h.ctx);
  QEL_EVP_MD_CTX_free(h.ctx, freed);
  EXPECT_NE(QEL_EVP_MD_CTX_new(h.ctx), freed);  // its place is in use again
  std::vector<const void*> values = {nullptr,         &other,       freed,       other.cipherCtx,
                                     other.digestCtx, other.cipher, other.digest};
  const auto live = reinterpret_cast<uintptr_t>(h.cipherCtx);
  for (const uintptr_t number : {uintptr_t{1}, ~uintptr_t{0}, live + 1, live << 1, live ^ (uintptr_t{1} << 24)}) {
    values.push_back(reinterpret_cast<void*>(number));
  }
  std::set<uintptr_t> found;
  for (const std::string& name : allDigests()) {
    found.insert(reinterpret_cast<uintptr_t>(QEL_EVP_get_digestbyname(h.ctx, name.c_str())));
  }
  found.erase(0);
  const uintptr_t last = *found.rbegin(), step = last - *std::prev(found.end(), 2);
  values.push_back(reinterpret_cast<void*>(last + step));
  for (const void* each : values) {
    SCOPED_TRACE(each);
    const int expected = each == nullptr ? 1 : 2;
    void* value = const_cast<void*>(each);
    Handles bad = h;
    bad.ctx = static_cast<QEL_CTX*>(value);
    for (const auto entries : {ofContext, ofAlgorithms, ofWork}) EXPECT_EQ(entries(bad).worked, 0);
    bad = h;
    bad.cipher = static_cast<QEL_CIPHER*>(value);
    bad.digest = static_cast<QEL_DIGEST*>(value);
    EXPECT_EQ(ofAlgorithms(bad).worked, 0);
    EXPECT_EQ(reason(), expected);
    bad = {h.ctx, static_cast<QEL_CIPHER_CTX*>(value), static_cast<QEL_MD_CTX*>(value), h.cipher, h.digest};
    EXPECT_EQ(ofWork(bad).worked, 0);
    EXPECT_EQ(reason(), expected);
  }
  EXPECT_EQ(QEL_Cleanup(other.ctx, nullptr), 1);
  for (const auto entries : {ofContext, ofAlgorithms, ofWork}) {
    EXPECT_EQ(entries(other).worked, 0);
    const Results own = entries(h);
    EXPECT_EQ(own.worked, own.called);
  }
  EXPECT_EQ(QEL_Cleanup(other.ctx, &lastStatus), 0);
  EXPECT_EQ(lastStatus.minRC, 2);
}

TEST_F(Qel, EveryMisuseHasItsReason) {
  const std::string longName(5000, 'S');
  const auto refusal = [this](bool worked) { return worked ? 0 : reason(); };
  EXPECT_EQ(refusal(h.finds(nullptr)), 1);
  EXPECT_EQ(refusal(h.finds(longName.c_str())), 3);
  EXPECT_EQ(refusal(h.finds("") || h.finds("SHA") || h.finds("AES-128-ECB")), 3);
  EXPECT_EQ(refusal(QEL_EVP_MD_size(h.ctx, nullptr) != 0), 1);
  EXPECT_EQ(refusal(h.update(secret)), 5);
  EXPECT_EQ(refusal(h.digestInit() && h.update(nullptr)), 1);
  EXPECT_EQ(refusal(QEL_EVP_DigestFinal(h.ctx, h.digestCtx, nullptr, nullptr)), 1);
  EXPECT_EQ(refusal(h.digestFinal() && h.digestFinal()), 5);
  EXPECT_EQ(refusal(h.digestInit() && h.freshDigest() && h.digestFinal()), 5);
  EXPECT_EQ(refusal(QEL_EVP_CIPHER_CTX_cipher(h.ctx, h.cipherCtx) != nullptr), 5);
  EXPECT_EQ(refusal(QEL_EVP_DecryptInit(h.ctx, h.cipherCtx, h.cipher, secret, nullptr)), 1);
  EXPECT_EQ(refusal(h.encryptInit() && h.decrypt(1)), 5);
  EXPECT_EQ(refusal(h.encrypt(-1) || h.encrypt(INT_MAX)), 4);
  EXPECT_EQ(refusal(QEL_EVP_EncryptInit(h.ctx, h.cipherCtx, h.cipher, nullptr, secret)), 1);
  EXPECT_EQ(refusal(h.encrypt(1)), 5);
  ASSERT_TRUE(h.encryptInit());
  EXPECT_EQ(refusal(QEL_EVP_EncryptUpdate(h.ctx, h.cipherCtx, nullptr, &outLength, out, 1)), 1);
  EXPECT_EQ(refusal(QEL_EVP_EncryptUpdate(h.ctx, h.cipherCtx, out, &outLength, nullptr, 1)), 1);
  EXPECT_EQ(refusal(QEL_EVP_EncryptFinal(h.ctx, h.cipherCtx, out, nullptr)), 1);
  EXPECT_EQ(refusal(h.encryptFinal() && h.encrypt(1)), 5);
  EXPECT_EQ(refusal(h.encryptInit() && h.setKeyLength(16)), 4);
  EXPECT_EQ(refusal(h.freshCipher() && h.setKeyLength(16) && h.encryptInit()), 4);
  EXPECT_EQ(refusal(h.setKeyLength(65) || h.setKeyLength(0)), 4);
  EXPECT_EQ(refusal(h.setValue(2, "on") || h.setValue(-1, "on")), 7);
  EXPECT_EQ(refusal(h.setValue(QEL_VALUE_STRICT, nullptr)), 1);
  EXPECT_EQ(refusal(h.setValue(QEL_VALUE_STRICT, "ON")), 8);
  EXPECT_EQ(refusal(h.setValue(QEL_VALUE_LOAD_PATH, longName.c_str())), 6);
  EXPECT_EQ(refusal(QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 2)), 9);
  EXPECT_EQ(refusal(QEL_GetValue(h.ctx, nullptr, 2, text, 9)), 7);
  EXPECT_EQ(refusal(QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, nullptr, 9)), 1);
  EXPECT_EQ(refusal(QEL_GetStatus(h.ctx, nullptr)), 1);
  EXPECT_EQ(refusal(QEL_RAND_bytes(h.ctx, out, -1)), 4);
  EXPECT_EQ(refusal(QEL_RAND_bytes(h.ctx, reinterpret_cast<unsigned char*>(1), 20)), 12);
  EXPECT_EQ(refusal(QEL_RAND_seed(h.ctx, nullptr, 1)), 1);
  EXPECT_EQ(refusal(h.freshCipher() && h.setPadding(0) && h.encryptInit() && h.encrypt(5) && h.encryptFinal()), 11);
  EXPECT_EQ(refusal(h.decryptInit() && h.decrypt(17) && h.decryptFinal()), 11);
  EXPECT_EQ(refusal(h.setPadding(1) && h.decryptInit() && h.decrypt(17) && h.decryptFinal()), 11);
  EXPECT_EQ(refusal(h.decryptInit() && h.decryptFinal()), 11);
}

// With what the context holds back, and how far the output lies behind the input: what would overwrite input that is
// still to be read is refused, and the rest is as without an overlap.
TEST_F(Qel, WorksInPlaceOrRefuses) {
  const int bytes = 48;
  for (const bool encrypts : {true, false}) {
    auto* update = encrypts ? QEL_EVP_EncryptUpdate : QEL_EVP_DecryptUpdate;
    for (const int held : {0, 5, 16}) {
      for (int behind = -80; behind <= 80; ++behind) {
        unsigned char area[256] = {}, expected[64] = {};
        unsigned char* const in = area + 100;
        int lengths[2] = {};
        const auto begins = [&] {
          return encrypts ? h.encryptInit() && h.encrypt(held) : h.decryptInit() && h.decrypt(held);
        };
        std::memcpy(in, secret + 1, bytes);
        ASSERT_TRUE(begins() && update(h.ctx, h.cipherCtx, expected, &lengths[0], in, bytes) == 1 && begins());
        const bool works = update(h.ctx, h.cipherCtx, in + behind, &lengths[1], in, bytes) == 1;
        const bool isApart = behind >= bytes || behind <= -bytes - 16;
        const bool isInPlace = behind == 0 && (held == 0 || (held == 16 && encrypts));
        EXPECT_TRUE(works ? std::memcmp(in + behind, expected, static_cast<size_t>(lengths[0])) == 0 : reason() == 14)
            << held << " held, " << behind;
        EXPECT_TRUE(works || !(isApart || isInPlace)) << held << " held, " << behind;
      }
    }
  }
}

// ---- Failures and values ----

TEST_F(Qel, AThreadRemembersItsLastFailure) {
  const Handles other;
  ASSERT_TRUE(h.decryptInit() && h.decrypt(16));
  outLength = 7;
  EXPECT_FALSE(h.decryptFinal());
  EXPECT_EQ(outLength, 0);
  EXPECT_EQ(QEL_Attach(h.ctx, &lastStatus), 1);  // a success in between
  EXPECT_EQ(lastStatus.majRC, 0);
  EXPECT_EQ(reason(), 11);
  EXPECT_STREQ(lastStatus.desc, "the padding is wrong");
  const auto remembered = [](QEL_CTX* ctx) { return QEL_GetStatus(ctx, &lastStatus) == 1 ? lastStatus.minRC : -1; };
  EXPECT_FALSE(other.finds("no such digest"));
  EXPECT_EQ(remembered(h.ctx), 0);
  EXPECT_EQ(remembered(other.ctx), QEL_REASON_UNKNOWN_ALGORITHM);
  std::thread{[&] { EXPECT_EQ(remembered(other.ctx), 0); }}.join();
  QEL_Cleanup(other.ctx, nullptr);
}

TEST_F(Qel, ValuesFitTheBufferOrLeaveItAlone) {
  const std::string longest(4095, 'x');
  text[0] = '?';
  EXPECT_EQ(QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 2), 0);
  EXPECT_EQ(text[0], '?');
  EXPECT_EQ(QEL_GetValue(h.ctx, nullptr, QEL_VALUE_STRICT, text, 3), 1);
  EXPECT_STREQ(text, "on");
  EXPECT_TRUE(h.setValue(QEL_VALUE_LOAD_PATH, longest.c_str()));
  EXPECT_EQ(QEL_GetValue(h.ctx, nullptr, QEL_VALUE_LOAD_PATH, text, 4096), 1);
  EXPECT_EQ(text, longest);
  EXPECT_EQ(QEL_Init(nullptr, (longest + "x").c_str()), nullptr);
}

// ---- Secrets and threads ----

int secretsSeen = 0;  // how often there was something to wipe

void expectNoSecret(const std::string& where) {
  EXPECT_EQ(secretsLive(), 0) << where;
  EXPECT_EQ(secretsReleased.exchange(0), 0) << where;
}

// Uses an algorithm with a word, and ends its contexts in the middle of the work and after it, one by one and all at
// once.
void useWith(const char* word, const char* name, bool isDigest) {
  for (size_t i = 0; i < sizeof secret; ++i) secret[i] = static_cast<unsigned char>(word[i % 8]);
  QEL_CTX* ctx = QEL_Init(nullptr, nullptr);
  for (int step = 0; step < 10; ++step) {
    Handles h{ctx};
    if (isDigest) {
      h.digest = QEL_EVP_get_digestbyname(ctx, name);
      EXPECT_TRUE(h.digestInit() && h.update(secret, 190) && (step < 5 || h.digestFinal()));
      EXPECT_TRUE(step % 2 == 0 || QEL_EVP_MD_CTX_cleanup(ctx, h.digestCtx) == 1);
      EXPECT_EQ(QEL_EVP_CIPHER_CTX_free(ctx, h.cipherCtx), 1);
    } else {
      h.cipher = QEL_EVP_get_cipherbyname(ctx, name);
      EXPECT_TRUE(h.setPadding(step < 8) &&
                  (step < 4 ? h.decryptInit() && h.decrypt(32) : h.encryptInit() && h.encrypt(37)));
      if (step < 2) h.decryptFinal();  // mostly wrong padding
      EXPECT_TRUE((step != 4 && step != 5) || h.encryptFinal());
      EXPECT_TRUE(step % 2 == 0 || QEL_EVP_CIPHER_CTX_cleanup(ctx, h.cipherCtx) == 1);
      EXPECT_EQ(QEL_EVP_MD_CTX_free(ctx, h.digestCtx), 1);
    }
  }
  if (secretsLive() > 0) ++secretsSeen;
  EXPECT_EQ(QEL_Cleanup(ctx, nullptr), 1);
  std::memset(secret, 0, sizeof secret);
  std::memset(out, 0, sizeof out);
}

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
long placeThatDependsOnTheWord(const char* name, bool isDigest) {
  return useWith(kWord, name, isDigest), -1;
}
#else
// All that this process can write, as it is at four moments, but for these copies and the stack, where OpenSSL's
// functions leave words of theirs.
class Memory {
 public:
  static constexpr size_t kMost = size_t{1} << 26U;

  Memory() {
    std::ifstream maps("/proc/self/maps");
    for (std::string line; std::getline(maps, line);) {
      unsigned long begin = 0, end = 0;
      char mode[5] = "";
      std::sscanf(line.c_str(), "%lx-%lx %4s", &begin, &end, mode);
      const bool isOwn = std::strcmp(mode, "rw-p") == 0 && line.find("[stack]") == std::string::npos;
      if (isOwn) parts_.emplace_back(begin, end - begin);
    }
  }
  // What is no longer there stays as it is.
  void keep(int moment) {
    char* to = reinterpret_cast<char*>(copy(moment));
    for (const auto& [begin, size] : parts_) {
      EXPECT_TRUE(pread(file_, to, size, static_cast<off_t>(begin)) > 0 || errno == EIO);
      to += size;
    }
    size_ = static_cast<size_t>(to - reinterpret_cast<char*>(copy(moment))) / sizeof(unsigned);
  }
  unsigned* copy(int moment) const { return copies_ + static_cast<size_t>(moment) * (kMost / sizeof(unsigned)); }
  size_t size() const { return size_; }

 private:
  static inline unsigned* const copies_ = static_cast<unsigned*>(
      mmap(nullptr, 4 * kMost, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0));
  static inline const int file_ = open("/proc/self/mem", O_RDONLY | O_CLOEXEC);
  std::vector<std::pair<unsigned long, size_t> > parts_;
  size_t size_ = 0;
};

// Where something is the same whenever one word was used, and another whenever another one was; -1: nowhere.
long placeThatDependsOnTheWord(const char* name, bool isDigest) {
  static const char* const kWords[] = {kWord, "oThEr...", "oThEr...", kWord};
  useWith(kWord, name, isDigest);
  Memory memory;
  for (int i = 0; i < 4; ++i) {
    useWith(kWords[i], name, isDigest);
    memory.keep(i);
  }
  const unsigned *first = memory.copy(0), *second = memory.copy(1), *third = memory.copy(2), *last = memory.copy(3);
  for (size_t i = 0; i < memory.size(); ++i) {
    if (first[i] == last[i] && second[i] == third[i] && first[i] != second[i]) return static_cast<long>(i);
  }
  return -1;
}
#endif

TEST_F(Qel, NothingThatDependsOnASecretStaysInMemory) {
  for (const bool isDigest : {true, false}) {
    for (const std::string& name : isDigest ? allDigests() : allCiphers()) {
      const bool isServed = isDigest ? h.finds(name.c_str()) : QEL_EVP_get_cipherbyname(h.ctx, name.c_str()) != nullptr;
      if (!isServed) continue;
      // The kernel notes there on which processor a thread is: what is found once is looked for again.
      long place = 0;
      for (int tries = 0; place >= 0 && tries < 3; ++tries) place = placeThatDependsOnTheWord(name.c_str(), isDigest);
      EXPECT_EQ(place, -1) << name;
      expectNoSecret(name);
    }
  }
  EXPECT_GT(secretsSeen, 50);
}

TEST_F(Qel, AContextEndsWithTheThreadThatUsedItLast) {
  Handles left = h, given = h;
  std::promise<void> made, taken;
  std::thread{[&] { h.finds("a room for the next thread"); }}.join();
  const size_t blocksBefore = blocks->size();
  std::thread thread{[&] {
    left = Handles{h.ctx};
    given = Handles{h.ctx};
    EXPECT_TRUE(left.works() && given.works());
    made.set_value();
    taken.get_future().wait();
  }};
  made.get_future().wait();
  EXPECT_TRUE(given.digestInit() && given.encryptInit() && given.update(secret));
  taken.set_value();
  thread.join();
  EXPECT_EQ(blocks->size(), blocksBefore + 2);  // the states of what was given
  EXPECT_TRUE(given.digestFinal() && given.encrypt(1) && given.freshCipher());
  EXPECT_FALSE(left.digestInit() || left.encryptInit() || left.freshDigest());
  EXPECT_EQ(reason(), QEL_REASON_FOREIGN_HANDLE);
  expectNoSecret("a thread");
}

TEST_F(Qel, AnotherThreadsCleanupRefusesContextsAndLeavesNoneForEver) {
  size_t blocksBefore = 0;
  for (int i = 0; i < 100; ++i) {
    const Handles other;
    EXPECT_TRUE(other.works());
    std::thread{[&] { EXPECT_EQ(QEL_Cleanup(other.ctx, nullptr), 1); }}.join();
    EXPECT_EQ(ofWork(other).worked, 0);
    if (i == 20) blocksBefore = blocks->size();
  }
  EXPECT_LE(blocks->size(), blocksBefore);
}

TEST_F(Qel, ThreadsShareAContextWhileOthersComeAndGo) {
  std::vector<std::thread> threads;
  const auto work = [this] {
    for (int i = 0; i < 100; ++i) {
      const Handles passing;
      std::vector<Handles> all;
      while (all.size() < 20) all.push_back(Handles{i % 2 == 0 ? h.ctx : passing.ctx});  // more than there is room for
      for (H each : all) {
        unsigned char digest[64];
        EXPECT_TRUE(each.digestInit() && each.update("abc", 3));
        EXPECT_EQ(QEL_EVP_DigestFinal(each.ctx, each.digestCtx, digest, nullptr), 1);
        EXPECT_EQ(std::string(digest, digest + 4), "\xA9\x99\x3E\x36");  // FIPS 180
        EXPECT_EQ(QEL_EVP_MD_CTX_free(each.ctx, each.digestCtx), 1);
      }
      EXPECT_EQ(QEL_Cleanup(passing.ctx, nullptr), 1);
    }
  };
  for (int i = 0; i < 10; ++i) threads.emplace_back(work);
  for (std::thread& thread : threads) thread.join();
}

// ---- What happens once in a process: in children of it, before it starts OpenSSL ----

constexpr int kGood = 3, kBad = 4, kRefused = 5;

// Refuses all allocations from one on, the first in the first use of OpenSSL. Afterwards everything works that says so.
// An OpenSSL newer than 3.0 has its base first: without memory it waits for itself there.
TEST(QelDeathTest, RefusedMemoryIsAResult) {
  int refused = 0;
  for (long n = 0; n < 300; ++n) {
    const int result = test::inChild([n] {
      if (OPENSSL_version_minor() > 0) OPENSSL_init_crypto(OPENSSL_INIT_NO_ATEXIT, nullptr);
      allocationsLeft = n;
      const Handles first;
      const bool worked = first.works(), wasRefused = hasRefused;
      if (first.ctx != nullptr && !first.drawsRandom()) return kBad;
      allocationsLeft = -1;
      QEL_Cleanup(first.ctx, nullptr);
      const Handles second;
      if (second.ctx != nullptr && !(second.works() && second.drawsRandom())) return kBad;
      if (ERR_peek_error() != 0) return kBad;
      return worked == wasRefused ? kBad : wasRefused ? kRefused : kGood;
    });
    EXPECT_TRUE(result == kRefused || result == kGood) << n << " gives " << result;
    refused += result == kRefused ? 1 : 0;
  }
  EXPECT_GT(refused, 100);
}

// A digest whose start had no memory gives none, not even that of what came before.
int startWithoutMemory() {
  Handles h;
  unsigned length = 9;
  const bool isBegun = h.digestInit() && h.update(secret);
  h.digest = QEL_EVP_get_digestbyname(h.ctx, "SHA512");
  allocationsLeft = 0;
  const bool goesOn = h.digestInit() || h.update(secret) || QEL_EVP_DigestFinal(h.ctx, h.digestCtx, out, &length) == 1;
  return isBegun && !goesOn && length == 0 ? kGood : kBad;
}

int endOpenssl() {
  const Handles h;
  const bool isBegun = h.works() && h.drawsRandom();
  OPENSSL_cleanup();
  const bool goesOn = h.works() && h.digestFinal() && h.drawsRandom() && QEL_Cleanup(h.ctx, nullptr) == 1;
  std::exit(isBegun && goesOn ? kGood : kBad);
}

// OpenSSL's own exit handler would have run before this one, also after a call that was refused before OpenSSL started.
int outliveExit() {
  static const Handles* lasting = nullptr;
  std::atexit([] { _exit(lasting->works() && OPENSSL_init_crypto(0, nullptr) == 1 ? kGood : kBad); });
  QEL_EVP_MD_CTX_new(nullptr);
  static const Handles h;
  lasting = &h;
  std::exit(kBad);
}

// A context more takes no longer than the first, or this would not end in time.
int holdAll() {
  const Handles h;
  std::vector<QEL_MD_CTX*> held{h.digestCtx};
  while (QEL_MD_CTX* made = QEL_EVP_MD_CTX_new(h.ctx)) held.push_back(made);
  const bool isFull = held.size() == 131072 && QEL_GetStatus(h.ctx, &lastStatus) == 1 && lastStatus.minRC == 15;
  for (size_t i = 0; i < held.size(); i += 2) QEL_EVP_MD_CTX_free(h.ctx, held[i]);
  for (size_t i = 0; i < held.size(); i += 2) held[i] = QEL_EVP_MD_CTX_new(h.ctx);
  return isFull && std::set<QEL_MD_CTX*>(held.begin(), held.end()).size() == held.size() &&
                 std::find(held.begin(), held.end(), nullptr) == held.end() && QEL_Cleanup(h.ctx, nullptr) == 1
             ? kGood
             : kBad;
}

TEST(QelDeathTest, WhatHappensOnce) {
  EXPECT_EQ(test::inChild(startWithoutMemory), kGood);
  EXPECT_EQ(test::inChild(endOpenssl), kGood);
  EXPECT_EQ(test::inChild(outliveExit), kGood);
  EXPECT_EQ(test::inChild(holdAll), kGood);
}

// ---- The library as the loader sees it ----

template <typename Function>
Function* entry(void* library, const char* name, Function*) {
  return reinterpret_cast<Function*>(dlsym(library, name));
}

const std::string kProvider = LDAPPW_PROVIDER_PATH;
const std::string kFolder = kProvider.substr(0, kProvider.rfind("/qellib/"));

// From a folder, with others of 200 bytes below it, the library being in the lowest; a size; an empty folder: none.
TEST(QelDeathTest, ReportsItsFolder) {
  const test::TempFolder temp;
  const std::string root = temp.file("qel"), deep(200, 'd');
  std::filesystem::create_directories(root + "/qellib/sub");
  std::filesystem::copy_file(kProvider, root + "/qellib/libtresk7qels.so");
  const struct {
    std::string from;
    int levels;
    std::string name, folder;
    size_t bytes;
  } rows[] = {
      {"/", 0, kProvider, kFolder, kFolder.size() + 1},
      {"/", 0, kProvider, "", kFolder.size()},
      {"/", 0, kFolder + "/qellib/.//libtresk7qels.so", kFolder, 1024},
      {kFolder, 0, "qellib/libtresk7qels.so", kFolder, 1024},
      {kFolder + "/qellib", 0, "./libtresk7qels.so", kFolder, 1024},
      {"/", 0, root + "/qellib/sub/../libtresk7qels.so", root + "/qellib/sub/../..", 1024},
      {root, 45, "./libtresk7qels.so", "", 20000},
  };
  for (const auto& row : rows) {
    if (row.levels > 0 && !test::loaderFindsDeepFolders()) continue;
    const auto report = [&] {
      std::filesystem::current_path(row.from);
      for (int i = 0; i < row.levels; ++i) {
        std::filesystem::create_directory(deep);
        if (chdir(deep.c_str()) != 0) return kBad;
      }
      if (row.levels > 0) std::filesystem::copy_file(kProvider, "libtresk7qels.so");
      void* library = dlopen(row.name.c_str(), RTLD_NOW | RTLD_LOCAL);
      std::string buffer(row.bytes + 1, '?');
      auto* where = entry(library, "treskqels_path", treskqels_path);
      const bool works = where(buffer.data(), static_cast<int>(row.bytes)) != 0;
      const std::string expected = row.folder.empty() ? "" : row.folder + '\0';
      return works == !expected.empty() && buffer.find_first_of('?') == expected.size() ? kGood : kBad;
    };
    EXPECT_EQ(test::inChild(report), kGood) << row.name << " from " << row.from << " into " << row.bytes;
    std::filesystem::remove_all(root + "/" + deep);
  }
}

}  // namespace
