// SPDX-License-Identifier: Apache-2.0
// The primitives under the password schemes: Unix crypt, DES on single bits, and the salted and unsalted digests,
// against OpenSSL and the system's own crypt.
#include <ctime>

#include "failures.h"
#include "oracle.h"
#include "password_schemes.h"
#include "system_crypt.h"

using namespace std::string_literals;
using namespace test;

namespace {

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
    EXPECT_EQ(_crypt_r(key.c_str(), salt.c_str(), &state), state.iobuf);
    EXPECT_EQ(state.iobuf, expected);
    EXPECT_EQ(__crypt_std(key.c_str(), salt.c_str()), expected);
    EXPECT_EQ(_crypt(key.c_str(), salt.c_str()), expected);
    if (round % 20 != 0) continue;
    char block[66] = {};  // the state holds what makes the hash
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
    Guarded key("8 letter");  // not terminated: more is never looked at
    Guarded salt(row.salt);
    ldappw_crypt_data state;
    ASSERT_NE(_crypt_r(key.data(), salt.data(), &state), nullptr);
    EXPECT_EQ(std::string(state.iobuf, 14), row.shown + systemCrypt("8 letter", row.counts).substr(2) + '\0');
  }
}

std::string bitsOf(const std::string& bytes) {
  std::string bits;
  for (const char byte : bytes) {
    for (int i = 7; i >= 0; --i) bits += static_cast<char>((static_cast<unsigned char>(byte) >> i) & 1);
  }
  return bits;
}

TEST(SetkeyAndEncrypt, AreDesOnBitsInEveryForm) {
  static ldappw_crypt_data state;
  const std::pair<int (*)(const char*), int (*)(char*)> forms[] = {
      {[](const char* k) { return _setkey_r(k, &state); }, [](char* b) { return _encrypt_r(b, 0, &state); }},
      {[](const char* k) { return ldappw_setkey_r(k, &state); },
       [](char* b) { return ldappw_encrypt_r(b, 0, &state); }},
      {[](const char* k) { return _setkey(k); }, [](char* b) { return _encrypt(b, 0); }},
      {[](const char* k) { return ldappw_setkey(k); }, [](char* b) { return ldappw_encrypt(b, 0); }}};
  std::mt19937 random(5);
  for (int round = 0; round < 100; ++round) {
    const std::string key = randomBytes(random, 8);
    const std::string plain = randomBytes(random, 8);
    for (const auto& [setKey, encipher] : forms) {
      std::string block = bitsOf(plain);
      EXPECT_EQ(setKey(bitsOf(key).data()), 0);
      EXPECT_EQ(encipher(block.data()), 0);
      EXPECT_EQ(block, bitsOf(opensslDes(key, plain, true)));
      EXPECT_EQ(_encrypt_r(block.data(), 1, &state), -1);  // no deciphering
      EXPECT_EQ(ldappw_encrypt(block.data(), 1), 0);
      EXPECT_EQ(block, bitsOf(opensslDes(key, plain, true)));
    }
  }
  // Making and checking values leaves the shared state to its user.
  const char* const sharedText = _crypt("key", "zz");
  const std::string shared = sharedText;
  _crypt_r("key", "zz", &state);
  char value[21] = {};
  ASSERT_EQ(format_password(4, std::string("ab").data(), nullptr, "secret", 6, value, sizeof value), 20);
  EXPECT_EQ(verify_password("secret", 6, value, 20, 1, nullptr), 0);
  std::string block = bitsOf("8 bytes!");
  std::string expected = block;
  _encrypt(block.data(), 0);
  _encrypt_r(expected.data(), 0, &state);
  EXPECT_EQ(block, expected);
  EXPECT_EQ(sharedText, shared);
}

TEST(GenerateCryptSalt, DrawsFromClockAndProcessNumber) {
  const std::string alphabet = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ1234567890./";
  Guarded salt("!!!");
  std::string expected;
  for (time_t now = 0; now != time(nullptr);) {  // again when a second has passed meanwhile
    now = time(nullptr);
    generate_crypt_salt(salt.data());
    auto seed = static_cast<unsigned>(static_cast<int>(now ^ getpid()) % 2147483647);
    expected = alphabet[static_cast<unsigned>(rand_r(&seed) >> 4) % 64];
    expected += alphabet[static_cast<unsigned>(rand_r(&seed) >> 4) % 64];
  }
  EXPECT_EQ(salt.data(), expected);
}

TEST(SaltedAndUnsalted, AgreeWithOpensslForAnyDigestOfTheProvider) {
  for (const std::string& clear : {""s, letters(300)}) {
    char* out[3] = {};
    EXPECT_EQ(unsaltedHashEncrypt("SHA256", clear.c_str(), &out[0]), 0);
    EXPECT_EQ(saltedHashEncrypt(clear.c_str(), &out[1], "SHA256"), 0);
    EXPECT_EQ(saltedHashEncrypt(clear.c_str(), &out[2], "SHA256"), 0);
    EXPECT_EQ(taken(out[0]), opensslBase64(opensslDigest("SHA256", clear)));
    const std::string first = taken(out[1]);
    const std::string drawn = opensslDecoded(first).substr(32, 32);
    EXPECT_EQ(first, saltedPayload(clear, drawn, "SHA256"));
    EXPECT_NE(first, taken(out[2]));
    for (const std::string& salt : {""s, drawn, letters(99)}) {
      EXPECT_EQ(saltedHashVerify(clear.c_str(), saltedPayload(clear, salt, "SHA256").c_str(), "SHA256"), 0);
    }
  }
  EXPECT_EQ(saltedHashVerify("wrong", saltedPayload("right", "salt").c_str(), "SHA1"), 49);
}

// Beside what ledger_test.cpp breaks.
TEST(SaltedAndUnsalted, FailAsTheyPromise) {
  void* context = nullptr;
  ASSERT_EQ(initQelCrypto(&context), 0);
  const std::string stored = saltedPayload("secret", "salt");
  char *out = nullptr, kept[] = "kept";
  const auto encrypt = [&] { return saltedHashEncrypt("secret", &out, "SHA1"); };
  const auto verify = [&] { return saltedHashVerify("secret", stored.c_str(), "SHA1"); };
  const auto unsalted = [&] { return unsaltedHashEncrypt("SHA1", "secret", &out); };
  const Failure longDigest = replacing(pQEL_EVP_MD_size, [](auto...) { return 400; });  // usual ones need no allocation
  const Failure noMemory = both(longDigest, failingAllocation(0));
  const auto saltFails = [](void*, void*, const void*, unsigned length) { return length == 6 ? 1 : 0; };
  const Failure noSalt = replacing(pQEL_EVP_DigestUpdate, saltFails);
  for (const auto& [operation, call] :
       {std::pair<const char*, std::function<int()>>{"saltedHashEncrypt", encrypt}, {"saltedHashVerify", verify}}) {
    expectOutcomes(
        operation,
        {{"90 debug: calloc() returned NULL.", noMemory}, {"1 debug: QEL_EVP_DigestUpdate() failed.", noSalt}}, call);
  }
  expectOutcomes("unsaltedHashEncrypt", {{"90 debug: Error - unsaltedHashEncrypt : calloc() failed\n", noMemory}},
                 unsalted);
  EXPECT_EQ(out, nullptr);
  // Without a provider the slot is left alone.
  const Replaced slot(out, kept);
  withoutProvider()([&] { EXPECT_EQ(encrypt() + unsalted(), 2); });
  EXPECT_EQ(out, kept);
}

}  // namespace
