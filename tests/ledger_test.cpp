// SPDX-License-Identifier: Apache-2.0
// A ledger of the exported operations: what each gives when one of its arguments is odd while the others are sound. A
// row has an outcome for each argument: of a pointer that is null; of a number that is the least, -1, 0 and the
// greatest; of a count of bytes the same without the greatest, since that much memory is not there; of a slot that is
// null, and of one that holds what no operation may release ("+" is a new result in it). Rows called "same" give one
// memory twice.
#include <climits>
#include <tuple>

#include "crypto_provider.h"
#include "failures.h"
#include "oracle.h"
#include "password_schemes.h"

using namespace test;

namespace {

// Hands out arguments, one of them odd.
class Odd {
 public:
  Odd(int argument, int variant) : argument_(argument), variant_(variant) {}

  template <class T>
  T* pointer(T* sound) {
    return isOdd(1) ? nullptr : sound;
  }
  int number(int sound) { return odd(sound, 4); }
  int bytes(int sound) { return odd(sound, 3); }
  template <class T>
  T** slot(T** sound) {
    if (!isOdd(2)) return sound;
    if (variant_ == 0) return nullptr;
    *sound = reinterpret_cast<T*>(held_);
    return sound;
  }

  static bool isHeld(const void* data) { return data == held_; }
  bool ended() const { return argument_ >= count_; }
  bool tried() const { return variant_ >= variants_; }

 private:
  bool isOdd(int variants) {
    const bool here = count_++ == argument_;
    if (here) variants_ = variants;
    return here && variant_ < variants;
  }
  int odd(int sound, int variants) {
    static constexpr int kOdd[] = {INT_MIN, -1, 0, INT_MAX};
    return isOdd(variants) ? kOdd[variant_] : sound;
  }

  static char held_[64];
  int argument_, variant_;
  int count_ = 0, variants_ = 0;
};
char Odd::held_[64];

std::string shown(int result) {
  return std::to_string(result);
}
template <class T>
std::string shown(T* result) {
  free(result);
  return result == nullptr ? "null" : "some";
}

// What the operations work on.
char text[64] = "secret", salt[] = "ab", room[256], bits[64], masked[256], value[] = "{AES256}", base64[] = "YWJj";
unsigned char bytes[64] = "sixteen bytes ok";
uint32_t words[96];
ldappw_crypt_data state;
sha_digest digest;
SecBuffer key{bytes, 32};
AesKeyData* const keys = fixedRecord();
const char seed[] = "twelve-and-1", keySalt[] = "saltsaltsalt", cfg[] = "/dev/null", nowhere[] = "/nowhere/at/all";
void *ctx = nullptr, *digestCtx = nullptr, *sha1 = nullptr;

// Slots. What an operation puts there is released and shows as a plus.
char* made = nullptr;
unsigned char* madeBytes = nullptr;
AesKeyData* record = nullptr;
void *context = nullptr, *algorithm = nullptr;
unsigned length = 0;
int number = 0;

template <class T>
std::string with(
    int rc, T*& slot, void (*release)(T*) = [](T* data) { free(data); }) {
  T* const got = std::exchange(slot, nullptr);
  const bool isNew = got != nullptr && !Odd::isHeld(got);
  if (isNew) release(got);
  return std::to_string(rc) + (isNew ? "+" : "");
}
std::string withRecord(int rc) {
  return with<AesKeyData>(rc, record, [](AesKeyData* data) { freeAesKeyData(data); });
}
std::string withCipher(int rc) {
  return with<void>(rc, context, [](void* data) { freeQelCipher(ctx, data); });
}
std::string withDigest(int rc) {
  return with<void>(rc, context, [](void* data) { freeQelDigest(ctx, data); });
}
std::string blob(unsigned char* data) {
  return shown(data);
}

// Arguments in braces, so that they are handed out from left to right.
template <class... T>
struct Arguments : std::tuple<T...> {
  Arguments(T... arguments) : std::tuple<T...>(arguments...) {}
};

template <class Operation, class... T>
auto run(Operation operation, const Arguments<T...>& arguments) {
  return std::apply(operation, static_cast<const std::tuple<T...>&>(arguments));
}

struct Row {
  const char* name;
  std::string (*call)(Odd&);
  const char* outcomes;
};

const char* maskedText() {
  char* encoded = nullptr;
  EXPECT_EQ(_morva_utils_encode_buffer(text, &encoded), 0);
  std::strcpy(masked, encoded);
  free(encoded);
  return masked;
}

const char* cipherText() {
  static std::string kept;
  char* enciphered = nullptr;
  EXPECT_EQ(aesEncryptBuffer(text, &enciphered, "AES-256-ECB", &key, &key, 6), 0);
  return (kept = taken(enciphered)).c_str();
}

// clang-format off
const Row kRows[] = {
    {"check_format", [](Odd& a) -> std::string { return shown(run(check_format, Arguments{a.pointer(value), static_cast<unsigned>(a.bytes(8))})); }, "1 | 133 133 1"},
    {"formatted_password_length", [](Odd& a) -> std::string { return shown(run(formatted_password_length, Arguments{a.number(133), a.number(16)})); }, "-1 -1 -1 -1 | -1 8 32 -1"},
    {"format_password", [](Odd& a) -> std::string { return shown(run(format_password, Arguments{a.number(2), a.pointer(salt), a.pointer(keys), a.pointer(text), a.bytes(6), a.pointer(room), a.bytes(256)})); }, "0 0 0 0 | 33 | 33 | 0 | 0 0 33 | 0 | 0 0 0"},
    {"format_password, crypt", [](Odd& a) -> std::string { return shown(run(format_password, Arguments{4, a.pointer(salt), nullptr, a.pointer(text), a.bytes(6), a.pointer(room), a.bytes(256)})); }, "0 | 0 | 0 0 20 | 0 | 0 0 0"},
    {"format_password, AES", [](Odd& a) -> std::string { return shown(run(format_password, Arguments{134, nullptr, a.pointer(keys), a.pointer(text), a.bytes(6), a.pointer(room), a.bytes(256)})); }, "0 | 0 | 0 0 32 | 0 | 0 0 0"},
    {"format_password, same", [](Odd& a) -> std::string { return shown(run(format_password, Arguments{a.number(1), nullptr, nullptr, room, 3, room, 256})); }, "0 0 0 0"},
    {"verify_password", [](Odd& a) -> std::string { return shown(run(verify_password, Arguments{a.pointer(text), a.bytes(6), a.pointer(text), a.bytes(6), a.number(1), a.pointer(keys)})); }, "99 | 99 99 99 | 99 | 99 99 99 | 0 0 0 0 | 0"},
    {"unformat_password", [](Odd& a) -> std::string { return with(run(unformat_password, Arguments{a.pointer(maskedText()), a.slot(&made), a.pointer(keys), a.pointer(&number)}), made); }, "0 | 0 1+ | 1+ | 1+"},
    {"morva_decodePW", [](Odd& a) -> std::string { return with(run(morva_decodePW, Arguments{a.slot(&made), a.pointer(maskedText()), a.pointer(keys)}), made); }, "1 0+ | 1 | 0+"},
    {"_crypt_r", [](Odd& a) -> std::string { return std::to_string(run(_crypt_r, Arguments{a.pointer(text), a.pointer(salt), a.pointer(&state)}) != nullptr); }, "0 | 0 | 0"},
    {"_crypt_r, same", [](Odd& a) -> std::string { return std::to_string(run(_crypt_r, Arguments{state.iobuf, a.pointer(salt), &state}) != nullptr); }, "0"},
    {"__crypt_std_r", [](Odd& a) -> std::string { return std::to_string(run(__crypt_std_r, Arguments{a.pointer(text), a.pointer(salt), a.pointer(&state)}) != nullptr); }, "0 | 0 | 0"},
    {"_crypt", [](Odd& a) -> std::string { return std::to_string(run(_crypt, Arguments{a.pointer(text), a.pointer(salt)}) != nullptr); }, "0 | 0"},
    {"__crypt_std", [](Odd& a) -> std::string { return std::to_string(run(__crypt_std, Arguments{a.pointer(text), a.pointer(salt)}) != nullptr); }, "0 | 0"},
    {"_setkey_r", [](Odd& a) -> std::string { return shown(run(_setkey_r, Arguments{a.pointer(bits), a.pointer(&state)})); }, "-1 | -1"},
    {"_setkey_r, same", [](Odd& a) -> std::string { return shown(run(_setkey_r, Arguments{state.block, a.pointer(&state)})); }, "-1"},
    {"_encrypt_r", [](Odd& a) -> std::string { return shown(run(_encrypt_r, Arguments{a.pointer(bits), a.number(0), a.pointer(&state)})); }, "-1 | -1 -1 0 -1 | -1"},
    {"_encrypt_r, same", [](Odd& a) -> std::string { return shown(run(_encrypt_r, Arguments{state.block, a.number(0), &state})); }, "-1 -1 0 -1"},
    {"_setkey", [](Odd& a) -> std::string { return shown(run(_setkey, Arguments{a.pointer(bits)})); }, "-1"},
    {"_encrypt", [](Odd& a) -> std::string { return shown(run(_encrypt, Arguments{a.pointer(bits), a.number(0)})); }, "-1 | -1 -1 0 -1"},
    {"setkey_r", [](Odd& a) -> std::string { return shown(run(ldappw_setkey_r, Arguments{a.pointer(bits), a.pointer(&state)})); }, "0 | 0"},
    {"encrypt_r", [](Odd& a) -> std::string { return shown(run(ldappw_encrypt_r, Arguments{a.pointer(bits), a.number(0), a.pointer(&state)})); }, "0 | 0 0 0 0 | 0"},
    {"setkey", [](Odd& a) -> std::string { return shown(run(ldappw_setkey, Arguments{a.pointer(bits)})); }, "0"},
    {"encrypt", [](Odd& a) -> std::string { return shown(run(ldappw_encrypt, Arguments{a.pointer(bits), a.number(0)})); }, "0 | 0 0 0 0"},
    {"generate_crypt_salt", [](Odd& a) -> std::string { return (run(generate_crypt_salt, Arguments{a.pointer(salt)}), "-"); }, "-"},
    {"SHA", [](Odd& a) -> std::string { return (run(SHA, Arguments{a.pointer(text), 6, a.pointer(&digest)}), "-"); }, "- | -"},
    {"SHA, same", [](Odd& a) -> std::string { return (run(SHA, Arguments{reinterpret_cast<char*>(digest.word), 20, a.pointer(&digest)}), "-"); }, "-"},
    {"saltedHashEncrypt", [](Odd& a) -> std::string { return with(run(saltedHashEncrypt, Arguments{a.pointer(text), a.slot(&made), a.pointer("SHA1")}), made); }, "1 | 1 0+ | 1"},
    {"unsaltedHashEncrypt", [](Odd& a) -> std::string { return with(run(unsaltedHashEncrypt, Arguments{a.pointer("md5"), a.pointer(text), a.slot(&made)}), made); }, "1 | 1 | 1 0+"},
    {"saltedHashVerify", [](Odd& a) -> std::string { return shown(run(saltedHashVerify, Arguments{a.pointer(text), a.pointer(base64), a.pointer("SHA1")})); }, "1 | 1 | 1"},
    {"saltedHashVerify, same", [](Odd& a) -> std::string { return shown(run(saltedHashVerify, Arguments{text, text, a.pointer("SHA1")})); }, "1"},
    {"binaryBlobToString", [](Odd& a) -> std::string { return shown(run(binaryBlobToString, Arguments{a.pointer(bytes), a.bytes(16), a.pointer(pBase64)})); }, "null | some some some | null"},
    {"binaryBlobToBase64", [](Odd& a) -> std::string { return shown(run(binaryBlobToBase64, Arguments{a.pointer(bytes), a.bytes(16)})); }, "null | some some some"},
    {"stringToBinaryBlob", [](Odd& a) -> std::string { return blob(run(stringToBinaryBlob, Arguments{a.pointer(base64), a.pointer(&length), a.pointer(pBase64)})); }, "null | null | null"},
    {"stringToBinaryBlob, same", [](Odd& a) -> std::string { return blob(run(stringToBinaryBlob, Arguments{pBase64, a.pointer(&length), pBase64})); }, "null"},
    {"base64ToBinaryBlob", [](Odd& a) -> std::string { return blob(run(base64ToBinaryBlob, Arguments{a.pointer(base64), a.pointer(&length)})); }, "null | null"},
    {"compactToOnlyString", [](Odd& a) -> std::string { return shown(run(compactToOnlyString, Arguments{a.pointer(base64), a.pointer(pBase64)})); }, "null | null"},
    {"compactToOnlyBase64", [](Odd& a) -> std::string { return shown(run(compactToOnlyBase64, Arguments{a.pointer(base64)})); }, "null"},
    {"des", [](Odd& a) -> std::string { return (run(des, Arguments{a.pointer(words), a.pointer(bytes)}), "-"); }, "- | -"},
    {"deskey", [](Odd& a) -> std::string { return (run(deskey, Arguments{a.pointer(words), a.pointer(bytes), a.number(0)}), "-"); }, "- | - | - - - -"},
    {"deskey, same", [](Odd& a) -> std::string { return (run(deskey, Arguments{words, reinterpret_cast<unsigned char*>(a.pointer(words)), 0}), "-"); }, "-"},
    {"deskey56", [](Odd& a) -> std::string { return (run(deskey56, Arguments{a.pointer(words), a.pointer(bytes), a.number(0)}), "-"); }, "- | - | - - - -"},
    {"deskey40", [](Odd& a) -> std::string { return (run(deskey40, Arguments{a.pointer(words), a.pointer(bytes), a.number(0)}), "-"); }, "- | - | - - - -"},
    {"des3key", [](Odd& a) -> std::string { return (run(des3key, Arguments{a.pointer(words), a.pointer(bytes), a.number(0)}), "-"); }, "- | - | - - - -"},
    {"simpleCrypt", [](Odd& a) -> std::string { return shown(run(simpleCrypt, Arguments{a.pointer(text), a.bytes(6)})); }, "null | some some some"},
    {"_morva_utils_encode_buffer", [](Odd& a) -> std::string { return with(run(_morva_utils_encode_buffer, Arguments{a.pointer(text), a.slot(&made)}), made); }, "1 | 1 0+"},
    {"_morva_utils_encode_binary", [](Odd& a) -> std::string { return with(run(_morva_utils_encode_binary, Arguments{a.pointer(bytes), a.number(16), a.slot(&made)}), made); }, "1 | 80 80 0+ 80 | 1 0+"},
    {"_morva_utils_decode_buffer", [](Odd& a) -> std::string { return with(run(_morva_utils_decode_buffer, Arguments{a.pointer(const_cast<char*>(maskedText())), a.slot(&made)}), made); }, "1 | 1 0+"},
    {"_morva_utils_decode_binary", [](Odd& a) -> std::string { return with(run(_morva_utils_decode_binary, Arguments{a.pointer(const_cast<char*>(maskedText())), a.slot(&madeBytes), a.pointer(&number)}), madeBytes); }, "1 | 1 0+ | 1"},
    {"_morva_utils_encode_buffer_free", [](Odd& a) -> std::string { return (run(_morva_utils_encode_buffer_free, Arguments{a.pointer(&made)}), "-"); }, "-"},
    {"_morva_utils_encode_binary_free", [](Odd& a) -> std::string { return (run(_morva_utils_encode_binary_free, Arguments{a.pointer(&made)}), "-"); }, "-"},
    {"_morva_utils_decode_buffer_free", [](Odd& a) -> std::string { return (run(_morva_utils_decode_buffer_free, Arguments{a.pointer(&made)}), "-"); }, "-"},
    {"_morva_utils_decode_binary_free", [](Odd& a) -> std::string { return (run(static_cast<void (*)(char**)>(_morva_utils_decode_binary_free), Arguments{a.pointer(&made)}), "-"); }, "-"},
    {"_morva_utils_getEncodedSize", [](Odd& a) -> std::string { return shown(run(_morva_utils_getEncodedSize, Arguments{a.number(16)})); }, "165 165 165 0"},
    {"ldapLoadLib", [](Odd& a) -> std::string { return std::to_string(ldapUnloadLib(run(ldapLoadLib, Arguments{a.pointer(nowhere), 0}))); }, "80"},
    {"ldapGetSymAddress", [](Odd& a) -> std::string { return std::to_string(run(ldapGetSymAddress, Arguments{a.pointer(qelLoadGlobal), a.pointer("QEL_Init")}) != nullptr); }, "0 | 0"},
    {"fixupCipherSpecs", [](Odd& a) -> std::string { return (run(fixupCipherSpecs, Arguments{a.pointer(room)}), "-"); }, "-"},
    {"loadQelCrypto", [](Odd& a) -> std::string { return with(run(loadQelCrypto, Arguments{a.slot(&made)}), made); }, "1 0+"},
    {"initQelCrypto", [](Odd& a) -> std::string { return shown(run(initQelCrypto, Arguments{a.pointer(&ctx)})); }, "1"},
    {"freeQelCrypto", [](Odd& a) -> std::string { return shown(run(freeQelCrypto, Arguments{a.pointer<void>(nullptr)})); }, "0"},
    {"initQelCipher", [](Odd& a) -> std::string { return withCipher(run(initQelCipher, Arguments{a.pointer(ctx), a.slot(&context), a.pointer("AES-128-ECB"), a.slot(&algorithm)})); }, "1 | 1 0+ | 1 | 1 0+"},
    {"initQelDigest", [](Odd& a) -> std::string { return withDigest(run(initQelDigest, Arguments{a.pointer(ctx), a.slot(&context), a.pointer("SHA1"), a.slot(&algorithm)})); }, "1 | 1 0+ | 1 | 1 0+"},
    {"initQelDigest, same", [](Odd& a) -> std::string { return shown(run(initQelDigest, Arguments{ctx, a.pointer(&algorithm), "SHA1", &algorithm})); }, "1"},
    {"freeQelCipher", [](Odd& a) -> std::string { return shown(run(freeQelCipher, Arguments{a.pointer(ctx), a.pointer(digestCtx)})); }, "1 | 0"},
    {"freeQelDigest", [](Odd& a) -> std::string { return shown(run(freeQelDigest, Arguments{a.pointer(ctx), a.pointer<void>(nullptr)})); }, "1 | 0"},
    {"qelStatusToLdap", [](Odd& a) -> std::string { return shown(run(qelStatusToLdap, Arguments{a.pointer<void>(nullptr), a.pointer<QelStatus>(nullptr)})); }, "1 | 1"},
    {"initAesKeyData", [](Odd& a) -> std::string { return withRecord(run(initAesKeyData, Arguments{a.slot(&record)})); }, "1 0+"},
    {"copyAesKeyData", [](Odd& a) -> std::string { return withRecord(run(copyAesKeyData, Arguments{a.pointer(keys), a.slot(&record)})); }, "1 | 1 0+"},
    {"freeAesKeyData", [](Odd& a) -> std::string { return shown(run(freeAesKeyData, Arguments{a.pointer<AesKeyData>(nullptr)})); }, "0"},
    {"setAESKeyData", [](Odd& a) -> std::string { return withRecord(run(setAESKeyData, Arguments{a.pointer("/dev/zero"), a.slot(&record)})); }, "1 | 1 0+"},
    {"setCfgKeyDataGlobal", [](Odd& a) -> std::string { return shown(run(setCfgKeyDataGlobal, Arguments{a.pointer(nowhere)})); }, "1"},
    {"setDirKeyDataGlobal", [](Odd& a) -> std::string { return shown(run(setDirKeyDataGlobal, Arguments{a.pointer(nowhere)})); }, "1"},
    {"setCfgCryptoSyncGlobal", [](Odd& a) -> std::string { return shown(run(setCfgCryptoSyncGlobal, Arguments{a.pointer<char>(nullptr)})); }, "1"},
    {"checkKeyStashFile", [](Odd& a) -> std::string { return shown(run(checkKeyStashFile, Arguments{a.number(1), a.pointer(keys), a.pointer(text), a.pointer(text), a.pointer(&number)})); }, "1 1 0 1 | 1 | 1 | 1 | 1"},
    {"readKeyStashFile", [](Odd& a) -> std::string { return shown(run(readKeyStashFile, Arguments{a.pointer("/dev/zero"), a.pointer(keys)})); }, "1 | 1"},
    {"createKeyStashFiles", [](Odd& a) -> std::string { return with(run(createKeyStashFiles, Arguments{a.pointer(cfg), a.pointer(cfg), a.pointer(seed), a.slot(&made), a.pointer(keySalt)}), made); }, "1 | 1 | 1 | 1 0+ | 0+"},
    {"restoreKeyStashFile", [](Odd& a) -> std::string { return shown(run(restoreKeyStashFile, Arguments{a.pointer(cfg), a.pointer(seed), a.pointer(keySalt)})); }, "1 | 1 | 1"},
    {"validateCryptoString", [](Odd& a) -> std::string { return shown(run(validateCryptoString, Arguments{a.pointer(seed), a.number(0)})); }, "1 | 1 1 0 1"},
    {"morva_rand_ascii", [](Odd& a) -> std::string { return shown(run(morva_rand_ascii, Arguments{ctx, a.pointer(bytes), static_cast<unsigned>(a.bytes(16) & 63)})); }, "0 | 0 0 0"},
    {"genKeySaltVal", [](Odd& a) -> std::string { return shown(run(genKeySaltVal, Arguments{a.pointer(ctx), a.pointer(keys)})); }, "1 | 1"},
    {"morva_pbkdf2", [](Odd& a) -> std::string { return shown(run(morva_pbkdf2, Arguments{a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1), a.pointer(bytes), 4, a.pointer(bytes), 4, static_cast<uint32_t>(a.number(1) & 7), a.pointer(bytes), 20})); }, "1 | 1 | 1 | 1 | 1 | 0 0 0 0 | 1"},
    {"growKeysFromSeed", [](Odd& a) -> std::string { return shown(run(growKeysFromSeed, Arguments{a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1), a.pointer(seed), a.pointer(keys)})); }, "1 | 1 | 1 | 1 | 1"},
    {"genKeySyncVal", [](Odd& a) -> std::string { return shown(run(genKeySyncVal, Arguments{a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1), a.pointer(seed), a.pointer(keys)})); }, "1 | 1 | 1 | 1 | 1"},
    {"genKeyDataVal", [](Odd& a) -> std::string { return withRecord(run(genKeyDataVal, Arguments{a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1), a.pointer(seed), a.pointer(keySalt), a.slot(&record)})); }, "1 | 1 | 1 | 0+ | 0+ | 1 0+"},
    {"genTmpKeyDataVal", [](Odd& a) -> std::string { return withRecord(run(genTmpKeyDataVal, Arguments{a.pointer(seed), a.pointer(keySalt), a.slot(&record)})); }, "1 | 1 | 1 0+"},
    {"aesEncryptBuffer", [](Odd& a) -> std::string { return with(run(aesEncryptBuffer, Arguments{a.pointer(text), a.slot(&made), a.pointer("AES-256-ECB"), a.pointer(&key), a.pointer(&key), a.number(6)}), made); }, "1 | 1 0+ | 1 | 1 | 1 | 1 1 0+ 90"},
    {"aesDecryptBuffer", [](Odd& a) -> std::string { return with(run(aesDecryptBuffer, Arguments{a.pointer(cipherText()), a.slot(&made), a.pointer("AES-256-ECB"), a.pointer(&key), a.pointer(&key), a.pointer(&number)}), made); }, "1 | 1 0+ | 1 | 1 | 1 | 0+"},
};
// clang-format on

std::string outcomesOf(const Row& row) {
  std::string outcomes;
  for (int argument = 0;; ++argument) {
    for (int variant = 0;; ++variant) {
      Odd odd(argument, variant);
      const std::string outcome = row.call(odd);
      if (odd.ended()) return outcomes;
      if (odd.tried()) break;
      outcomes += (variant > 0 ? " " : argument > 0 ? " | " : "") + outcome;
    }
  }
}

TEST(Ledger, HoldsForEveryOperation) {
  ASSERT_EQ(initQelCrypto(&ctx), 0);
  ASSERT_EQ(initQelDigest(ctx, &digestCtx, "SHA1", &sha1), 0);
  withQuickDigests()([] {
    for (const Row& row : kRows) {
      testing::internal::CaptureStdout();
      const std::string outcomes = outcomesOf(row);
      testing::internal::GetCapturedStdout();
      EXPECT_EQ(outcomes, row.outcomes) << row.name;
    }
  });
  freeQelDigest(ctx, digestCtx);
  freeAesKeyData(keys);
}

}  // namespace
