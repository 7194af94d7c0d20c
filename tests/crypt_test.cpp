// SPDX-License-Identifier: Apache-2.0
// The primitives under the password schemes: Unix crypt, DES on single bits, SHA-1, and the salted and unsalted
// digests, against published vectors, OpenSSL and the system's own crypt.
#include <ctime>

#include "failures.h"
#include "oracle.h"
#include "password_schemes.h"
#include "system_crypt.h"

using namespace std::string_literals;
using namespace test;

namespace {

// ---- Unix crypt ----

TEST(UnixCrypt, AgreesWithTheSystemsForRandomKeysAndSalts) {
  static const char kCharacters[] = "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
  std::mt19937 random(4711);
  ldappw_crypt_data state;
  for (int round = 0; round < 1500; ++round) {
    const std::string key = upToNul(randomBytes(random, random() % 12));
    const std::string salt{kCharacters[random() % 64], kCharacters[random() % 64]};
    const std::string expected = systemCrypt(key, salt);
    SCOPED_TRACE(toHex(key.data(), key.size()) + " " + salt);
    std::memset(&state, 0x5a, sizeof state);  // what was there before does not matter
    const AllocationWatch watch;
    EXPECT_EQ(_crypt_r(key.c_str(), salt.c_str(), &state), state.iobuf);
    EXPECT_EQ(state.iobuf, expected);
    EXPECT_EQ(__crypt_std(key.c_str(), salt.c_str()), expected);
    EXPECT_EQ(_crypt(key.c_str(), salt.c_str()), expected);
    EXPECT_EQ(watch.count(), 0);
    if (round % 20 != 0) continue;
    // The state holds what makes the hash: salted expansion, round keys and the last block.
    char block[66] = {};
    for (int i = 0; i < 25; ++i) ASSERT_EQ(_encrypt_r(block, 0, &state), 0);
    EXPECT_EQ(std::string(block, 66), std::string(state.block, 66));
    EXPECT_EQ(__crypt_std_r(key.c_str(), salt.c_str(), &state), expected);
  }
}

// Each byte stands for the six bits of some usual character, by the arithmetic of the salt alone.
TEST(UnixCrypt, TakesAnyByteAsSalt) {
  const struct {
    std::string salt, shown, counts;
  } rows[] = {{"x\0"s, "xx", "xG"}, {"\0"s, "\0\0"s, "GG"},   {"!~\0"s, "!~", "n1"},
              {"[:"s, "[:", "U3"},  {"\xff@", "\xff@", "F9"}, {"ab$1$", "ab", "ab"}};
  for (const auto& row : rows) {
    SCOPED_TRACE(toHex(row.salt.data(), row.salt.size()));
    Guarded key("8 letter");  // not terminated: more is never looked at
    Guarded salt(row.salt);
    ldappw_crypt_data state;
    ASSERT_NE(_crypt_r(key.data(), salt.data(), &state), nullptr);
    EXPECT_EQ(std::string(state.iobuf, 14), row.shown + systemCrypt("8 letter", row.counts).substr(2) + '\0');
  }
  EXPECT_EQ(_crypt_r("key", "ab", nullptr), nullptr);
}

std::string bitsOf(const std::string& bytes) {
  std::string bits;
  for (const char byte : bytes) {
    for (int i = 7; i >= 0; --i) bits += static_cast<char>((static_cast<unsigned char>(byte) >> i) & 1);
  }
  return bits;
}

void expectCipher(const std::string& key, const std::string& plain, const std::string& expected) {
  SCOPED_TRACE(toHex(key.data(), 8) + " " + toHex(plain.data(), 8));
  static ldappw_crypt_data state;
  using Key = int (*)(const char*);
  using Cipher = int (*)(char*);
  static constexpr std::pair<Key, Cipher> kForms[] = {
      {[](const char* k) { return _setkey_r(k, &state); }, [](char* b) { return _encrypt_r(b, 0, &state); }},
      {[](const char* k) { return ldappw_setkey_r(k, &state); },
       [](char* b) { return ldappw_encrypt_r(b, 0, &state); }},
      {[](const char* k) { return _setkey(k); }, [](char* b) { return _encrypt(b, 0); }},
      {[](const char* k) { return ldappw_setkey(k); }, [](char* b) { return ldappw_encrypt(b, 0); }}};
  for (const auto& [setKey, encipher] : kForms) {
    std::string block = bitsOf(plain);
    EXPECT_EQ(setKey(bitsOf(key).data()), 0);
    EXPECT_EQ(encipher(block.data()), 0);
    EXPECT_EQ(block, bitsOf(expected));
  }
}

// NIST SP 800-17, appendix B, table 3 (key, text, cipher text): every entry of the substitution boxes.
const char* const kSubstitutionVectors[] = {
    "7ca110454a1a6e5701a1d6d039776742690f5b0d9a26939b", "0131d9619dc1376e5cd54ca83def57da7a389d10354bd271",
    "07a1133e4a0b26860248d43806f67172868ebb51cab4599a", "3849674c2602319e51454b582ddf440a7178876e01f19b2a",
    "04b915ba43feb5b642fd443059577fa2af37fb421f8c4095", "0113b970fd34f2ce059b5e0851cf143a86a560f10ec6d85b",
    "0170f175468fb5e60756d8e0774761d20cd3da020021dc09", "43297fad38e373fe762514b829bf486aea676b2cb7db2b7a",
    "07a7137045da2a163bdd119049372802dfd64a815caf1a0f", "04689104c2fd3b2f26955f6835af609a5c513c9c4886c088",
    "37d06bb516cb7546164d5e404f2752320a2aeeae3ff4ab77", "1f08260d1ac2465e6b056e18759f5ccaef1bf03e5dfa575a",
    "584023641aba6176004bd6ef0917606288bf0db6d70dee56", "025816164629b007480d39006ee762f2a1f9915541020b56",
    "49793ebc79b3258f437540c8698f3cfa6fbf1cafcffd0556", "4fb05e1515ab73a7072d43a0770752922f22e49bab7ca1ac",
    "49e95d6d4ca229bf02fe55778117f12a5a6b612cc26cce4a", "018310dc409b26d61d9d5c5018f728c25f4c038ed12b2e41",
    "1c587f1c13924fef305532286d6f295a63fac0d034d9f793"};

TEST(SetkeyAndEncrypt, AreDesOnBitsInEveryForm) {
  for (const std::string vector : kSubstitutionVectors) {
    expectCipher(fromHex(vector.substr(0, 16)), fromHex(vector.substr(16, 16)), fromHex(vector.substr(32)));
  }
  const std::string zero(8, '\0');
  for (size_t bit = 0; bit < 64; ++bit) {  // the other tables: each bit of the text and of the key alone
    std::string one = zero;
    one[bit / 8] = static_cast<char>(0x80U >> (bit % 8));
    expectCipher(zero, one, opensslDes(zero, one, true));
    expectCipher(one, zero, opensslDes(one, zero, true));
  }
  // The round keys lie open in the state. Values of J. Orlin Grabbe, "The DES Algorithm Illustrated".
  ldappw_crypt_data state;
  ASSERT_EQ(_setkey_r(bitsOf(fromHex("133457799bbcdff1")).data(), &state), 0);
  EXPECT_EQ(std::string(state.KS[0], 48), bitsOf(fromHex("1b02effc7072")));
  EXPECT_EQ(std::string(state.KS[15], 48), bitsOf(fromHex("cb3d8b0e17f5")));
}

TEST(SetkeyAndEncrypt, RefuseDecipheringAndNull) {
  ldappw_crypt_data state;
  const std::string key = bitsOf("anything");
  ASSERT_EQ(_setkey_r(key.data(), &state), 0);
  std::string block = key;
  EXPECT_EQ(_encrypt_r(block.data(), 1, &state), -1);
  EXPECT_EQ(_encrypt(block.data(), -1), -1);
  EXPECT_EQ(ldappw_encrypt_r(block.data(), 1, &state), 0);  // the public forms hide it
  EXPECT_EQ(ldappw_encrypt(block.data(), 1), 0);
  EXPECT_EQ(block, key);
  EXPECT_EQ(_setkey_r(key.data(), nullptr), -1);
  EXPECT_EQ(_encrypt_r(block.data(), 0, nullptr), -1);
  EXPECT_EQ(ldappw_setkey_r(key.data(), nullptr), 0);
  EXPECT_EQ(ldappw_encrypt_r(block.data(), 0, nullptr), 0);
}

TEST(UnixCrypt, LeavesNoKeyInTheSharedState) {
  const std::string zero(8, '\0');
  const auto enciphered = [&] {
    std::string block = bitsOf(zero);
    _encrypt(block.data(), 0);
    return block;
  };
  _crypt("secret", "..");  // a salt that leaves the expansion as it is
  EXPECT_NE(enciphered(), bitsOf(opensslDes(zero, zero, true)));
  char salt[] = "..";
  char value[32];
  ASSERT_EQ(format_password(4, salt, nullptr, "secret", 6, value, sizeof value), 20);
  EXPECT_EQ(enciphered(), bitsOf(opensslDes(zero, zero, true)));  // no bit of a key is left
}

TEST(GenerateCryptSalt, DrawsFromClockAndProcessNumber) {
  const std::string alphabet = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ1234567890./";
  const time_t before = time(nullptr);
  Guarded salt("!!!");
  generate_crypt_salt(salt.data());
  bool found = false;
  for (time_t now = before; now <= time(nullptr); ++now) {
    const auto mixed = static_cast<int>(static_cast<unsigned>(now) ^ static_cast<unsigned>(getpid()));
    auto seed = static_cast<unsigned>(mixed % 2147483647);
    const char first = alphabet[static_cast<unsigned>(rand_r(&seed) >> 4) % 64];
    const char second = alphabet[static_cast<unsigned>(rand_r(&seed) >> 4) % 64];
    found = found || salt.data() == std::string{first, second};
  }
  EXPECT_TRUE(found) << salt.data();
}

// ---- Digests ----

std::string shaOf(const std::string& data) {
  Guarded guarded(data);
  sha_digest out;
  const AllocationWatch watch;
  SHA(guarded.data(), data.size(), &out);
  EXPECT_EQ(watch.count(), 0);
  return {reinterpret_cast<char*>(&out), sizeof out};
}

TEST(Sha, IsSha1AtEveryLength) {
  std::string data;
  for (int length = 0; length <= 200; ++length) {
    EXPECT_EQ(shaOf(data), opensslDigest("SHA1", data)) << length;
    data += static_cast<char>(length * 89);
  }
  // FIPS 180-1, appendices A to C.
  EXPECT_EQ(shaOf("abc"), fromHex("a9993e364706816aba3e25717850c26c9cd0d89d"));
  EXPECT_EQ(shaOf("abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq"),
            fromHex("84983e441c3bd26ebaae4aa1f95129e5e54670f1"));
  EXPECT_EQ(shaOf(std::string(1000000, 'a')), fromHex("34aa973cd4c4daa4f61eeb2bdbad27316534016f"));
}

// The three operations over one password, and what each is given.
struct DigestCall {
  const char* clear = "secret";
  const char* stored;  // to be verified
  const char* digestName;
  char* out;

  int encrypt() { return saltedHashEncrypt(clear, &out, digestName); }
  int verify() { return saltedHashVerify(clear, stored, digestName); }
  int unsalted() { return unsaltedHashEncrypt(digestName, clear, &out); }
};

TEST(SaltedAndUnsalted, AgreeWithOpensslForAnyDigestOfTheProvider) {
  for (const char* name : {"SHA1", "md5", "SHA256"}) {
    for (const std::string& clear : {""s, "secret"s, letters(300)}) {
      SCOPED_TRACE(name);
      DigestCall call{clear.c_str(), nullptr, name, nullptr};
      ASSERT_EQ(call.unsalted(), 0);
      EXPECT_EQ(taken(std::exchange(call.out, nullptr)), opensslBase64(opensslDigest(name, clear)));
      ASSERT_EQ(call.encrypt(), 0);
      const std::string first = taken(std::exchange(call.out, nullptr));
      ASSERT_EQ(call.encrypt(), 0);
      const std::string second = taken(std::exchange(call.out, nullptr));
      EXPECT_NE(first, second);
      const size_t n = opensslDigest(name, "").size();
      ASSERT_EQ(opensslDecoded(first).size(), 2 * n);
      EXPECT_EQ(first, saltedPayload(clear, opensslDecoded(first).substr(n), name));
      EXPECT_EQ(saltedHashVerify(clear.c_str(), second.c_str(), name), 0);
      for (const std::string& salt : {""s, "8 bytes."s, letters(99)}) {
        EXPECT_EQ(saltedHashVerify(clear.c_str(), saltedPayload(clear, salt, name).c_str(), name), 0) << salt.size();
      }
    }
  }
  const TraceCapture trace;
  EXPECT_EQ(saltedHashVerify("wrong", saltedPayload("right", "salt").c_str(), "SHA1"), 49);
  EXPECT_TRUE(trace.messages().empty());
  char* out = nullptr;
  EXPECT_EQ(saltedHashEncrypt(nullptr, &out, "SHA1"), 1);
  EXPECT_EQ(saltedHashEncrypt("clear", nullptr, "SHA1"), 1);
}

int liveContexts = 0;
void* (*realNew)(void*) = nullptr;
int (*realFree)(void*, void*) = nullptr;
int updates = 0;
int (*realUpdate)(void*, void*, const void*, unsigned) = nullptr;

TEST(SaltedAndUnsalted, ReportProviderFailuresInTheirOwnWords) {
  void* context = nullptr;
  ASSERT_EQ(initQelCrypto(&context), 0);
  realNew = pQEL_EVP_MD_CTX_new;
  realFree = pQEL_EVP_MD_CTX_free;
  realUpdate = pQEL_EVP_DigestUpdate;
  const Replaced made(
      pQEL_EVP_MD_CTX_new, +[](void* ctx) { return ++liveContexts, realNew(ctx); });
  const Replaced freed(
      pQEL_EVP_MD_CTX_free, +[](void* ctx, void* c) { return --liveContexts, realFree(ctx, c); });

  const std::string stored = saltedPayload("secret", letters(500));
  DigestCall call{"secret", stored.c_str(), "SHA1", nullptr};
  const auto zero = [](auto...) { return 0; };
  const auto two = [](auto...) { return 2; };  // a success only to the unsalted operation
  const Failure initGives2 = replacing(pQEL_EVP_DigestInit, two);
  const Failure updateGives2 = replacing(pQEL_EVP_DigestUpdate, two);
  const Failure finalGives2 = replacing(pQEL_EVP_DigestFinal, two);
  const Failure unknown = replacing(call.digestName, "no digest");
  const Failure noName = replacing(call.digestName, nullptr);
  const Failure secondUpdate = [&](const Body& body) {
    updates = 0;
    replacing(pQEL_EVP_DigestUpdate, [](void* ctx, void* c, const void* data, unsigned length) {
      return ++updates == 2 ? 0 : realUpdate(ctx, c, data, length);
    })(body);
  };
  const std::vector<FailureCase> encrypting = {
      {1, {"Error - saltedHashEncrypt: Invalid parameter. rc = 1\n"}, noName},
      {1, {"Error - saltedHashEncrypt: initQelCrypto() failed. rc = 1\n"}, withoutProvider()},
      {1, {"Error - saltedHashEncrypt: initQelDigest() failed. rc = 1\n"}, unknown},
      {90,
       {"Error - saltedHashEncrypt: calloc() returned NULL. rc = 90\n"},
       both(replacing(pQEL_EVP_MD_size, [](auto...) { return 400; }), failingAllocation(0))},
      {1, {"Error - saltedHashEncrypt: QEL_RAND_bytes() failed. rc = 1\n"}, replacing(pQEL_RAND_bytes, zero)},
      {1, {"Error - saltedHashEncrypt: QEL_RAND_bytes() failed. rc = 1\n"}, replacing(pQEL_RAND_bytes, two)},
      {1, {"Error - saltedHashEncrypt: QEL_EVP_DigestInit() failed. rc = 1\n"}, initGives2},
      {1, {"Error - saltedHashEncrypt: QEL_EVP_DigestUpdate() failed. rc = 1\n"}, updateGives2},
      {1, {"Error - saltedHashEncrypt: QEL_EVP_DigestUpdate() failed. rc = 1\n"}, secondUpdate},
      {1, {"Error - saltedHashEncrypt: QEL_EVP_DigestFinal() failed. rc = 1\n"}, finalGives2},
      {1, {"Error - saltedHashEncrypt: binaryBlobToBase64() returned NULL. rc = 1\n"}, failingAllocation(0)},
  };
  const std::vector<FailureCase> verifying = {
      {1, {"Error - saltedHashVerify: Invalid parameter. rc = 1\n"}, noName},
      {1, {"Error - saltedHashVerify: Invalid parameter. rc = 1\n"}, replacing(call.clear, nullptr)},
      {1, {"Error - saltedHashVerify: Invalid parameter. rc = 1\n"}, replacing(call.stored, nullptr)},
      {1, {"Error - saltedHashVerify: base64ToBinaryBlob() returned NULL. rc = 1\n"}, failingAllocation(0)},
      {1, {"Error - saltedHashVerify: initQelCrypto() failed. rc = 1\n"}, withoutProvider()},
      {1, {"Error - saltedHashVerify: initQelDigest() failed. rc = 1\n"}, unknown},
      {90,
       {"Error - saltedHashVerify: calloc() returned NULL. rc = 90\n"},
       both(replacing(pQEL_EVP_MD_size, [](auto...) { return 400; }), failingAllocation(1))},
      {1, {"Error - saltedHashVerify: QEL_EVP_DigestInit() failed. rc = 1\n"}, initGives2},
      {1, {"Error - saltedHashVerify: QEL_EVP_DigestUpdate() failed. rc = 1\n"}, updateGives2},
      {1, {"Error - saltedHashVerify: QEL_EVP_DigestUpdate() failed. rc = 1\n"}, secondUpdate},
      {1, {"Error - saltedHashVerify: QEL_EVP_DigestFinal() failed. rc = 1\n"}, finalGives2},
  };
  const std::vector<FailureCase> unsalted = {
      {1, {"Error - unsaltedHashEncrypt: initQelDigest() failed"}, unknown},
      {1, {"Error - unsaltedHashEncrypt: QEL_EVP_DigestInit() failed"}, replacing(pQEL_EVP_DigestInit, zero)},
      {90,
       {"Error - unsaltedHashEncrypt : calloc() failed\n"},
       both(replacing(pQEL_EVP_MD_size, [](auto...) { return 400; }), failingAllocation(0))},
      {1, {"Error - unsaltedHashEncrypt: QEL_EVP_DigestUpdate() failed"}, replacing(pQEL_EVP_DigestUpdate, zero)},
      {1, {"Error - unsaltedHashEncrypt: QEL_EVP_DigestFinal() failed"}, replacing(pQEL_EVP_DigestFinal, zero)},
      {1, {"Error - unsaltedHashEncrypt: binaryBlobToBase64()returned NULL. rc = 1\n"}, failingAllocation(0)},
  };
  const auto emptied = [&](int rc) { return call.out == nullptr ? rc : -1; };
  expectFailures(encrypting, LDTR_DEBUG, [&] { return emptied(call.encrypt()); });
  expectFailures(verifying, LDTR_DEBUG, [&] { return call.verify(); });
  expectFailures(unsalted, LDTR_DEBUG, [&] { return emptied(call.unsalted()); });
  EXPECT_EQ(liveContexts, 0);
  both(both(initGives2, updateGives2), finalGives2)([&] { EXPECT_EQ(call.unsalted(), 0); });
  EXPECT_EQ(taken(std::exchange(call.out, nullptr)), opensslBase64(std::string(20, '\0')));

  // Without a provider the slot is left alone, and the unsalted operation says nothing of its own.
  char kept[] = "kept";
  DigestCall slot{"secret", nullptr, "SHA1", kept};
  const TraceCapture trace;
  withoutProvider()([&] { EXPECT_EQ(slot.encrypt(), 1); });
  withoutProvider()([&] { EXPECT_EQ(slot.unsalted(), 1); });
  EXPECT_EQ(slot.out, kept);
  EXPECT_EQ(outlineOf(trace).find("Error - unsaltedHashEncrypt"), std::string::npos);
}

TEST(SaltedAndUnsalted, WriteTheirLinesAboutEnteringAndLeaving) {
  const std::string stored = saltedPayload("secret", "salt");
  for (const char* name : {"SHA1", "no digest"}) {
    const std::string rc = name == "SHA1"s ? "0" : "1";
    DigestCall call{"secret", stored.c_str(), name, nullptr};
    const auto expectLines = [&](const std::function<void()>& act, const std::string& first, const std::string& last) {
      const TraceCapture trace;
      act();
      const std::string outline = outlineOf(trace);
      EXPECT_EQ(outline.rfind(">" + first, 0), 0U) << outline;
      EXPECT_EQ(outline.substr(outline.size() - last.size() - 1), last + "<");
      EXPECT_EQ(outline.find("secret"), std::string::npos);
      std::free(std::exchange(call.out, nullptr));
    };
    expectLines([&] { call.encrypt(); }, "saltedHashEncrypt: Entering. clear = #, out = #, digestName = #\n",
                "saltedHashEncrypt: Leaving. rc = " + rc + "\n");
    expectLines([&] { call.verify(); }, "saltedHashVerify: Entering. clear = #, stored = #, digestName = #\n",
                "saltedHashVerify: Leaving. rc = " + rc + "\n");
    expectLines([&] { call.unsalted(); }, ">initQelCrypto: Entering.", "unsaltedHashEncrypt: Leaving. rc=" + rc + "\n");
  }
}

}  // namespace
