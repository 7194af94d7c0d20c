// SPDX-License-Identifier: Apache-2.0
// A ledger of the exported operations. A row has what an operation gives when one of its arguments is odd while the
// others are sound: an outcome for a pointer that is null; for a number that is the least, -1, 0 and the greatest; for
// a count of bytes the same without the greatest, since that much memory is not there; for a slot that is null, and for
// one that holds what no operation may release. "+" is a new result in the slot, "!" the line about invalid parameters.
// Rows called "same" give one memory twice.
//
// Then what it gives, and the line that it traces, when memory or the provider fails at any point: each allocation
// refused, alone and with all later ones; no provider; each of the provider's entries giving 0, 2, -1 or null; and when
// the host has taken the base64 alphabet away. What a row does not name there has to go well, and one without such
// memory allocates nothing.
//
// And what of the host's state is another after any of these calls: its environment, signal mask, locale, errno, error
// queue of OpenSSL or floating-point state. An operation that changes one names it. The variable in which the loading
// of the provider says which copy it tries does not count.
#include <openssl/err.h>

#include <cerrno>
#include <cfenv>
#include <climits>
#include <clocale>
#include <csignal>
#include <map>
#include <regex>
#include <set>
#include <tuple>

#include "crypto_provider.h"
#include "failures.h"
#include "oracle.h"
#include "password_schemes.h"
#include "provider/qel_utils_table.h"

using namespace test;

namespace {

// Hands out arguments, one of them odd.
class Odd {
 public:
  Odd(int argument, int variant) : argument_(argument), variant_(variant) {}

  template <typename T>
  T* pointer(T* sound) {
    return isOdd(1) ? nullptr : sound;
  }
  int number(int sound) { return odd(sound, 4); }
  int bytes(int sound) { return odd(sound, 3); }
  template <typename T>
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

std::string shown(const std::string& result) {
  return result;
}
std::string shown(int result) {
  return std::to_string(result);
}
template <typename T>
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
const TempFolder folder;
const std::string stashPath = folder.file("stash");
const char* const stash = stashPath.c_str();

// Slots. What an operation puts there is released and shows as a plus.
char* made = nullptr;
unsigned char* madeBytes = nullptr;
AesKeyData* record = nullptr;
void *context = nullptr, *algorithm = nullptr;
unsigned length = 0;
int number = 0;

template <typename T>
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
std::string isThere(const void* data) {
  return data != nullptr ? "1" : "0";
}

// Arguments in braces, so that they are handed out from left to right.
template <typename... T>
struct Arguments : std::tuple<T...> {
  Arguments(T... arguments) : std::tuple<T...>(arguments...) {}
};

template <typename Operation, typename... T>
auto run(Operation operation, const Arguments<T...>& arguments) {
  const auto apply = [&] { return std::apply(operation, static_cast<const std::tuple<T...>&>(arguments)); };
  if constexpr (std::is_void_v<decltype(apply())>) {
    return apply(), std::string("-");
  } else {
    return apply();
  }
}

struct Row {
  const char* name;
  std::string (*call)(Odd&);
  const char* outcomes;
  Lines memory = {}, provider = {};
  std::string changes = {};
};

// Results of operations that serve as arguments; decoding writes to its text.
std::string maskedValue, cipherValue, longCipherValue;
const std::string longText(300, 'x'),
    saltedValue = saltedPayload(text, letters(500)), shaValue = "{SHA}" + opensslBase64(opensslDigest("SHA1", text));
const char* maskedText() {
  return std::strcpy(masked, maskedValue.c_str());
}
const char* cipherText() {
  return cipherValue.c_str();
}
void prepare() {
  char *encoded = nullptr, *enciphered = nullptr, *longer = nullptr;
  EXPECT_EQ(_morva_utils_encode_buffer(text, &encoded), 0);
  EXPECT_EQ(aesEncryptBuffer(text, &enciphered, "AES-256-ECB", &key, &key, 6), 0);
  EXPECT_EQ(aesEncryptBuffer(longText.c_str(), &longer, "AES-256-ECB", &key, &key, 300), 0);
  longCipherValue = taken(longer);
  maskedValue = taken(encoded);
  cipherValue = taken(enciphered);
  putFile(stash, fixedFile());
}

// Outcomes that several operations share.
Lines operator+(Lines first, const Lines& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}
Lines noRecord() {
  return {"90 Error - initAesKeyData: calloc(keyData) returned NULL. rc = 90\n",
          "90 Error - initAesKeyData: calloc(cryptoSalt) returned NULL. rc = 90\n",
          "90 Error - initAesKeyData: calloc(aesKeys) returned NULL. rc = 90\n"};
}
Lines noKeys(const std::string& step) {
  return {"90 " + step + " failed.", "1 " + step + " failed.", "90 " + step + " failed."};
}
Lines digestSteps(const std::string& step) {
  return {"no provider: 1 initQelCrypto() failed.", "get_digestbyname=0 MD_CTX_new=0: 1 initQelDigest() failed.",
          "DigestInit DigestUpdate DigestFinal no alphabet: 1 " + step + " failed."};
}
Lines saltedSteps(const Lines& sizes, const Lines& last = {}) {
  const Lines start = {"no provider: 1 debug: initQelCrypto() failed.",
                       "get_digestbyname=0 MD_CTX_new=0: 1 debug: initQelDigest() failed."};
  const Lines steps = {"DigestInit: 1 debug: QEL_EVP_DigestInit() failed.",
                       "DigestUpdate: 1 debug: QEL_EVP_DigestUpdate() failed.",
                       "DigestFinal: 1 debug: QEL_EVP_DigestFinal() failed."};
  return start + sizes + steps + last;
}
Lines cipherSteps(const std::string& direction,
                  const std::string& before = "1 debug: ", const std::string& after = "") {
  Lines lines = {"no provider: " + before + "initQelCrypto() failed." + after,
                 "get_cipherbyname=0 CIPHER_CTX_new=0: " + before + "initQelCipher() failed." + after,
                 "CIPHER_CTX_set_padding: " + before + "QEL_EVP_CIPHER_CTX_set_padding() failed." + after};
  for (const std::string step : {"Init", "Update", "Final"}) {
    lines.push_back(direction + step + ": " + before + "QEL_EVP_" + direction + step + "() failed." + after);
  }
  return lines;
}
Lines contextSteps(const std::string& name, const std::string& kind, const std::string& algorithmEntry) {
  const std::string entries[] = {"get_" + algorithmEntry, kind + "_CTX_new"};
  const std::string steps[] = {kind + "_CTX_free", kind + "_CTX_cleanup"};
  Lines lines;
  for (const std::string& entry : entries) {
    lines.push_back(entry + "=0: none Error - initQel" + name + ": QEL_EVP_" + entry + "() failed. rc = 1\n");
  }
  for (const std::string& entry : steps) {
    const std::string line = ": 1 Error - freeQel" + name + ": QEL_EVP_" + entry + "() failed. rc = ";
    for (const std::string given : {"0", "2", "-1"}) lines.push_back(entry + "=" + given + line + given + "\n");
  }
  return lines;
}

// What operations must leave alone, by name; with values that nobody has by accident.
class HostState {
 public:
  static void prepare() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGUSR2);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    uselocale(newlocale(LC_NUMERIC_MASK, "C.UTF-8", nullptr));
    ERR_clear_error();
    ERR_raise(ERR_LIB_USER, 77);
    fesetround(FE_UPWARD);
  }
  static std::map<std::string, std::string> now() {
    std::map<std::string, std::string> host = {{"errno", std::to_string(errno)}};
    const int floating[] = {fetestexcept(FE_ALL_EXCEPT), fegetround()};
    host["floating point"] = toHex(floating, sizeof floating);
    sigset_t signals;
    pthread_sigmask(SIG_BLOCK, nullptr, &signals);
    for (int i = 1; i < SIGRTMAX; ++i) host["signal mask"] += std::to_string(sigismember(&signals, i));
    const locale_t locale = uselocale(nullptr);
    host["locale"] = setlocale(LC_ALL, nullptr) + toHex(&locale, sizeof locale);
    const unsigned long errors[] = {ERR_peek_error(), ERR_peek_last_error()};
    host["error queue"] = toHex(errors, sizeof errors);
    for (char** each = environ; *each != nullptr; ++each) {
      if (std::strncmp(*each, "TRESK_SHIPPED_QEL=", 18) != 0) host["environment"] += *each + std::string("\n");
    }
    return host;
  }
};

// A row's name, and a call with odd arguments, which an initialiser takes in order.
#define AS(name, result, ...) name, [](Odd& a) -> std::string { return result(RUN(__VA_ARGS__)); }
#define CALL(operation, ...) AS(#operation, shown, operation, __VA_ARGS__)
#define WITH(slot, operation, ...) \
#operation, [](Odd & a) -> std::string { return with(RUN(operation, __VA_ARGS__), slot); }
#define RUN(operation, ...) run(operation, Arguments{__VA_ARGS__})

// clang-format off
const Row kRows[] = {
    {CALL(check_format, a.pointer(value), static_cast<unsigned>(a.bytes(8))), "1 | 133 133 1"},
    {CALL(formatted_password_length, a.number(133), a.number(16)), "-1 -1 -1 -1 | -1 8 32 -1"},
    {CALL(format_password, a.number(2), a.pointer(salt), a.pointer(keys), a.pointer(text), a.bytes(6), a.pointer(room),
     a.bytes(256)), "0 0 0 0 | 33 | 33 | 0 | 0 0 33 | 0 | 0 0 0", {}, {"no alphabet: 0 "}},
    {AS("format_password, crypt", shown, format_password, 4, a.pointer(salt), nullptr, a.pointer(text), a.bytes(6),
     a.pointer(room), a.bytes(256)), "0 | 0 | 0 0 20 | 0 | 0 0 0"},
    {AS("format_password, AES", shown, format_password, 134, nullptr, a.pointer(keys), a.pointer(text), a.bytes(6),
     a.pointer(room), a.bytes(256)), "0 | 0 | 0 0 32 | 0 | 0 0 0", {}, cipherSteps("Encrypt",
     "0 debug: Error - aesEncryptBuffer: ", " rc = 1\n") +
     Lines{"no alphabet: 0 debug: Error - aesEncryptBuffer: binaryBlobToBase64() returned NULL. rc = 1\n"}},
    {AS("format_password, same", shown, format_password, a.number(1), nullptr, nullptr, room, 3, room, 256), "0 0 0 0"},
    {CALL(verify_password, a.pointer(text), a.bytes(6), a.pointer(text), a.bytes(6), a.number(1), a.pointer(keys)),
     "99 | 99 99 99 | 99 | 99 99 99 | 0 0 0 0 | 0"},
    {AS("verify_password, SHA", shown, verify_password, text, 6, shaValue.c_str(), a.bytes(33), 1, a.pointer(keys)),
     "99 99 99 | 0", {}, {"no alphabet: 99 "}},
    {WITH(made, unformat_password, a.pointer(maskedText()), a.slot(&made), a.pointer(keys), a.pointer(&number)),
     "0 | 0 1+ | 1+ | 1+", {"0 "}},
    {WITH(made, morva_decodePW, a.slot(&made), a.pointer(maskedText()), a.pointer(keys)), "1 0+ | 1 | 0+", {"80 "}},
    {AS("_crypt_r", isThere, _crypt_r, a.pointer(text), a.pointer(salt), a.pointer(&state)), "0 | 0 | 0"},
    {AS("_crypt_r, same", isThere, _crypt_r, state.iobuf, a.pointer(salt), &state), "0"},
    {AS("__crypt_std_r", isThere, __crypt_std_r, a.pointer(text), a.pointer(salt), a.pointer(&state)), "0 | 0 | 0"},
    {AS("_crypt", isThere, _crypt, a.pointer(text), a.pointer(salt)), "0 | 0"},
    {AS("__crypt_std", isThere, __crypt_std, a.pointer(text), a.pointer(salt)), "0 | 0"},
    {CALL(_setkey_r, a.pointer(bits), a.pointer(&state)), "-1 | -1"},
    {AS("_setkey_r, same", shown, _setkey_r, state.block, a.pointer(&state)), "-1"},
    {CALL(_encrypt_r, a.pointer(bits), a.number(0), a.pointer(&state)), "-1 | -1 -1 0 -1 | -1"},
    {AS("_encrypt_r, same", shown, _encrypt_r, state.block, a.number(0), &state), "-1 -1 0 -1"},
    {CALL(_setkey, a.pointer(bits)), "-1"},
    {CALL(_encrypt, a.pointer(bits), a.number(0)), "-1 | -1 -1 0 -1"},
    {AS("setkey_r", shown, ldappw_setkey_r, a.pointer(bits), a.pointer(&state)), "0 | 0"},
    {AS("encrypt_r", shown, ldappw_encrypt_r, a.pointer(bits), a.number(0), a.pointer(&state)), "0 | 0 0 0 0 | 0"},
    {AS("setkey", shown, ldappw_setkey, a.pointer(bits)), "0"},
    {AS("encrypt", shown, ldappw_encrypt, a.pointer(bits), a.number(0)), "0 | 0 0 0 0"},
    {CALL(generate_crypt_salt, a.pointer(salt)), "-"},
    {CALL(SHA, a.pointer(text), 6, a.pointer(&digest)), "- | -"},
    {AS("SHA, same", shown, SHA, reinterpret_cast<char*>(digest.word), 20, a.pointer(&digest)), "-"},
    {WITH(made, saltedHashEncrypt, a.pointer(text), a.slot(&made), a.pointer("SHA1")), "1! | 1! 0+ | 1!",
     {"1 debug: binaryBlobToBase64() returned NULL."},
     saltedSteps({"MD_size=0 MD_size=-1: 1 debug: QEL_EVP_MD_size() failed."},
     {"RAND_bytes: 1 debug: QEL_RAND_bytes() failed."}) +
     Lines{"no alphabet: 1 debug: binaryBlobToBase64() returned NULL."}},
    {WITH(made, unsaltedHashEncrypt, a.pointer("md5"), a.pointer(text), a.slot(&made)), "1 | 1 | 1 0+",
     {"1 debug: binaryBlobToBase64()returned NULL."},
     {"no provider: 1 Error - initQelCrypto: loadQelCrypto() failed. \n",
     "get_digestbyname=0 MD_CTX_new=0: 1 debug: Error - unsaltedHashEncrypt: initQelDigest() failed",
     "MD_size=0 MD_size=-1: 1 debug: Error - unsaltedHashEncrypt: QEL_EVP_MD_size() failed",
     "DigestInit=0: 1 debug: Error - unsaltedHashEncrypt: QEL_EVP_DigestInit() failed",
     "DigestInit=2 DigestInit=-1 DigestUpdate=0: 1 debug: Error - unsaltedHashEncrypt: QEL_EVP_DigestUpdate() failed",
     "DigestFinal=0: 1 debug: Error - unsaltedHashEncrypt: QEL_EVP_DigestFinal() failed",
     "no alphabet: 1 debug: binaryBlobToBase64()returned NULL."}},
    {CALL(saltedHashVerify, a.pointer(text), a.pointer(saltedValue.c_str()), a.pointer("SHA1")), "1! | 1! | 1!",
     {"1 debug: base64ToBinaryBlob() returned NULL."}, saltedSteps({"MD_size=0: 1 debug: QEL_EVP_MD_size() failed.",
     "MD_size=2: 49 ", "MD_size=-1: 1 debug: QEL_EVP_MD_size() failed."}) +
     Lines{"no alphabet: 1 debug: base64ToBinaryBlob() returned NULL."}},
    {CALL(binaryBlobToString, a.pointer(bytes), a.bytes(16), a.pointer(pBase64)), "null | some some some | null",
     {"null "}, {"no alphabet: null "}},
    {CALL(binaryBlobToBase64, a.pointer(bytes), a.bytes(16)), "null | some some some", {"null "},
     {"no alphabet: null "}},
    {CALL(stringToBinaryBlob, a.pointer(base64), a.pointer(&length), a.pointer(pBase64)), "null | null | null",
     {"null "}, {"no alphabet: null "}},
    {AS("stringToBinaryBlob, same", shown, stringToBinaryBlob, pBase64, a.pointer(&length), pBase64), "null", {"null "},
     {"no alphabet: null "}},
    {CALL(base64ToBinaryBlob, a.pointer(base64), a.pointer(&length)), "null | null", {"null "}, {"no alphabet: null "}},
    {CALL(compactToOnlyString, a.pointer(base64), a.pointer(pBase64)), "null | null", {"null "},
     {"no alphabet: null "}},
    {CALL(compactToOnlyBase64, a.pointer(base64)), "null", {"null "}, {"no alphabet: null "}},
    {CALL(des, a.pointer(words), a.pointer(bytes)), "- | -"},
    {CALL(deskey, a.pointer(words), a.pointer(bytes), a.number(0)), "- | - | - - - -"},
    {AS("deskey, same", shown, deskey, words, reinterpret_cast<unsigned char*>(a.pointer(words)), 0), "-"},
    {CALL(deskey56, a.pointer(words), a.pointer(bytes), a.number(0)), "- | - | - - - -"},
    {CALL(deskey40, a.pointer(words), a.pointer(bytes), a.number(0)), "- | - | - - - -"},
    {CALL(des3key, a.pointer(words), a.pointer(bytes), a.number(0)), "- | - | - - - -"},
    {CALL(simpleCrypt, a.pointer(text), a.bytes(6)), "null | some some some", {"null "}},
    {WITH(made, _morva_utils_encode_buffer, a.pointer(text), a.slot(&made)), "1 | 1 0+", {"90 "}},
    {WITH(made, _morva_utils_encode_binary, a.pointer(bytes), a.number(16), a.slot(&made)), "1 | 80 80 0+ 80 | 1 0+",
     {"90 "}},
    {WITH(made, _morva_utils_decode_buffer, a.pointer(const_cast<char*>(maskedText())), a.slot(&made)), "1 | 1 0+",
     {"90 "}},
    {WITH(madeBytes, _morva_utils_decode_binary, a.pointer(const_cast<char*>(maskedText())), a.slot(&madeBytes),
     a.pointer(&number)), "1 | 1 0+ | 1", {"90 "}},
    {CALL(_morva_utils_encode_buffer_free, a.pointer(&made)), "-"},
    {CALL(_morva_utils_encode_binary_free, a.pointer(&made)), "-"},
    {CALL(_morva_utils_decode_buffer_free, a.pointer(&made)), "-"},
    {AS("_morva_utils_decode_binary_free", shown, static_cast<void (*)(char**)>(_morva_utils_decode_binary_free),
     a.pointer(&made)), "-"},
    {CALL(_morva_utils_getEncodedSize, a.number(16)), "165 165 165 0"},
    {"ldapLoadLib", [](Odd& a) -> std::string { return std::to_string(ldapUnloadLib(run(ldapLoadLib,
     Arguments{a.pointer(nowhere), 0}))); }, "80", {"80 "}},
    {AS("ldapGetSymAddress", isThere, ldapGetSymAddress, a.pointer(qelLoadGlobal), a.pointer("QEL_Init")), "0 | 0", {},
     {"no provider: 0 "}},
    {"setDefLibpath", [](Odd&) { setenv("LD_LIBRARY_PATH", "/opt/x", 1); return shown(setDefLibpath()); }, "", {}, {},
     "environment"},
    {CALL(fixupCipherSpecs, a.pointer(room)), "-"},
    {WITH(made, loadQelCrypto, a.slot(&made)), "1! 0+", {"0 debug:  Memory allocation failed ! \n",
     "90 Error - loadQelCrypto: Out of Memory!.\n"},
     {"no provider: 1 Error - loadQelCrypto: ldapGetSymAddress(pQEL_GetStatus) failed.\n"}},
    {CALL(initQelCrypto, a.pointer(&ctx)), "1!", {},
     {"no provider: 1 Error - initQelCrypto: loadQelCrypto() failed. \n"}},
    {CALL(freeQelCrypto, a.pointer<void>(nullptr)), "0"},
    {AS("initQelCipher", withCipher, initQelCipher, a.pointer(ctx), a.slot(&context), a.pointer("AES-128-ECB"),
     a.slot(&algorithm)), "1! | 1! 0+ | 1! | 1! 0+", {}, {"get_cipherbyname=0: 1 QEL_EVP_get_cipherbyname() failed.",
     "CIPHER_CTX_new=0: 1 QEL_EVP_CIPHER_CTX_new() failed."}},
    {AS("initQelDigest", withDigest, initQelDigest, a.pointer(ctx), a.slot(&context), a.pointer("SHA1"),
     a.slot(&algorithm)), "1! | 1! 0+ | 1! | 1! 0+", {}, {"get_digestbyname=0: 1 QEL_EVP_get_digestbyname() failed.",
     "MD_CTX_new=0: 1 QEL_EVP_MD_CTX_new() failed."}},
    {CALL(freeQelCipher, a.pointer(ctx), a.pointer(digestCtx)), "1! | 0"},
    {CALL(freeQelDigest, a.pointer(ctx), a.pointer<void>(nullptr)), "1! | 0"},
    {CALL(qelStatusToLdap, a.pointer<void>(nullptr), a.pointer<QelStatus>(nullptr)), "1! | 1!"},
    {AS("initAesKeyData", withRecord, initAesKeyData, a.slot(&record)), "1! 0+", {"90 calloc(keyData) returned NULL.",
     "90 calloc(cryptoSalt) returned NULL.", "90 calloc(aesKeys) returned NULL."}},
    {AS("copyAesKeyData", withRecord, copyAesKeyData, a.pointer(keys), a.slot(&record)), "1! | 1! 0+",
     {"90 calloc(keyDataCopy) returned NULL.", "90 calloc(cryptoSalt) returned NULL.",
     "90 calloc(aesKeys) returned NULL."}},
    {CALL(freeAesKeyData, a.pointer<AesKeyData>(nullptr)), "0"},
    {AS("setAESKeyData", withRecord, setAESKeyData, a.pointer("/dev/zero"), a.slot(&record)), "1! | 1! 0+",
     {"90 Error - initAesKeyData: calloc(keyData) returned NULL. rc = 90\n",
     "90 Error - initAesKeyData: calloc(cryptoSalt) returned NULL. rc = 90\n",
     "90 Error - initAesKeyData: calloc(aesKeys) returned NULL. rc = 90\n",
     "90 Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = 90\n"}},
    {CALL(setCfgKeyDataGlobal, a.pointer(nowhere)), "1!", noRecord()},
    {CALL(setDirKeyDataGlobal, a.pointer(nowhere)), "1!", noRecord()},
    {"getCfgKeyDataGlobal", [](Odd&) -> std::string { return getCfgKeyDataGlobal() == nullptr ? "null" : "some"; }, ""},
    {"getDirKeyDataGlobal", [](Odd&) -> std::string { return getDirKeyDataGlobal() == nullptr ? "null" : "some"; }, ""},
    {CALL(setCfgCryptoSyncGlobal, a.pointer<char>(nullptr)), "1"},
    {CALL(checkKeyStashFile, a.number(1), a.pointer(keys), a.pointer(text), a.pointer(text), a.pointer(&number)),
     "1 1 0 1 | 1! | 1! | 1! | 1!"},
    {CALL(readKeyStashFile, a.pointer("/dev/zero"), a.pointer(keys)), "1! | 1!",
     {"90 Error - genKeySyncVal: calloc(cryptoSync) returned NULL. rc = 90\n"}},
    {WITH(made, createKeyStashFiles, a.pointer(cfg), a.pointer(cfg), a.pointer(seed), a.slot(&made),
     a.pointer(keySalt)), "1! | 1! | 1! | 1! 0+ | 0+", {"90 genKeyDataVal(cfg) failed.", "1 genKeyDataVal(cfg) failed.",
     "90 genKeyDataVal(cfg) failed.", "90 calloc(cryptoSyncStr) returned NULL.", "90 genKeyDataVal(dir) failed.",
     "1 genKeyDataVal(dir) failed.", "90 genKeyDataVal(dir) failed."}, digestSteps("genKeyDataVal(cfg)")},
    {CALL(restoreKeyStashFile, a.pointer(cfg), a.pointer(seed), a.pointer(keySalt)), "1! | 1! | 1!",
     noKeys("genKeyDataVal(dir)"), digestSteps("genKeyDataVal(dir)")},
    {CALL(validateCryptoString, a.pointer(seed), a.number(0)), "1! | 1 1 0 1"},
    {CALL(morva_rand_ascii, ctx, a.pointer(bytes), static_cast<unsigned>(a.bytes(16) & 63)), "0 | 0 0 0"},
    {CALL(genKeySaltVal, a.pointer(ctx), a.pointer(keys)), "1! | 1!"},
    {CALL(morva_pbkdf2, a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1), a.pointer(bytes), 4, a.pointer(bytes), 4,
     static_cast<uint32_t>(a.number(1) & 7), a.pointer(bytes), 20), "1! | 1! | 1! | 1! | 1! | 0 0 0 0 | 1!",
     {"90 morva_pkcs5_F() failed."}},
    {CALL(growKeysFromSeed, a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1), a.pointer(seed), a.pointer(keys)),
     "1! | 1! | 1! | 1! | 1!", {"90 morva_pbkdf2() failed."},
     {"DigestInit DigestUpdate DigestFinal: 1 morva_pbkdf2() failed."}},
    {CALL(genKeySyncVal, a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1), a.pointer(seed), a.pointer(keys)),
     "1! | 1! | 1! | 1! | 1!", {"90 calloc(cryptoSync) returned NULL.", "90 morva_pbkdf2() failed.",
     "1 binaryBlobToBase64() returned NULL."}, {"DigestInit DigestUpdate DigestFinal: 1 morva_pbkdf2() failed.",
     "no alphabet: 1 binaryBlobToBase64() returned NULL."}},
    {AS("genKeyDataVal", withRecord, genKeyDataVal, a.pointer(ctx), a.pointer(digestCtx), a.pointer(sha1),
     a.pointer(seed), a.pointer(keySalt), a.slot(&record)), "1! | 1! | 1! | 0+ | 0+ | 1! 0+",
     {"90 initAesKeyData() failed.", "90 strdup() returned NULL.", "90 genKeySyncVal() failed.",
     "1 genKeySyncVal() failed.", "90 growKeysFromSeed() failed."},
     {"DigestInit DigestUpdate DigestFinal no alphabet: 1 genKeySyncVal() failed."}},
    {AS("genTmpKeyDataVal", withRecord, genTmpKeyDataVal, a.pointer(seed), a.pointer(keySalt), a.slot(&record)),
     "1! | 1! | 1! 0+", noKeys("genKeyDataVal()"), digestSteps("genKeyDataVal()")},
    {WITH(made, aesEncryptBuffer, a.pointer(text), a.slot(&made), a.pointer("AES-256-ECB"), a.pointer(&key),
     a.pointer(&key), a.number(6)), "1! | 1! 0+ | 1! | 1! | 1! | 1! 1! 0+ 90",
     {"1 debug: binaryBlobToBase64() returned NULL."}, cipherSteps("Encrypt") +
     Lines{"no alphabet: 1 debug: binaryBlobToBase64() returned NULL."}},
    {"aesEncryptBuffer, long", [](Odd&) { return with(aesEncryptBuffer(longText.c_str(), &made, "AES-256-ECB", &key,
     &key, 300), made); }, "", {"90 debug: calloc() returned NULL.", "1 debug: binaryBlobToBase64() returned NULL."},
     cipherSteps("Encrypt") + Lines{"no alphabet: 1 debug: binaryBlobToBase64() returned NULL."}},
    {"aesDecryptBuffer, long", [](Odd&) { return with(aesDecryptBuffer(longCipherValue.c_str(), &made, "AES-256-ECB",
     &key, &key, &number), made); }, "", {"1 debug: base64ToBinaryBlob() returned NULL.",
     "90 debug: QEL_EVP_DecryptInit() failed."}, cipherSteps("Decrypt") +
     Lines{"no alphabet: 1 debug: base64ToBinaryBlob() returned NULL."}},
    {"freeQelCipher, live", [](Odd&) { return initQelCipher(ctx, &context, "AES-128-ECB", &algorithm) != 0 ? "none" :
     shown(freeQelCipher(ctx, context)); }, "", {}, contextSteps("Cipher", "CIPHER", "cipherbyname")},
    {"freeQelDigest, live", [](Odd&) { return initQelDigest(ctx, &context, "SHA1", &algorithm) != 0 ? "none" :
     shown(freeQelDigest(ctx, context)); }, "", {}, contextSteps("Digest", "MD", "digestbyname")},
    {WITH(made, aesDecryptBuffer, a.pointer(cipherText()), a.slot(&made), a.pointer("AES-256-ECB"), a.pointer(&key),
     a.pointer(&key), a.pointer(&number)), "1! | 1! 0+ | 1! | 1! | 1! | 0+",
     {"90 debug: QEL_EVP_DecryptInit() failed."}, cipherSteps("Decrypt") +
     Lines{"no alphabet: 1 debug: base64ToBinaryBlob() returned NULL."}},
};
// clang-format on

std::set<std::string> changed;

// An operation, called in a host whose state is looked at.
std::string outcomeIn(const Row& row, Odd& arguments) {
  return outcomeOf(row.name, [&] {
    feclearexcept(FE_ALL_EXCEPT);
    errno = 4711;
    const auto before = HostState::now();
    errno = 4711;
    const std::string result = row.call(arguments);
    const int error = errno;
    const auto after = (errno = error, HostState::now());
    for (const auto& [name, former] : before) {
      if (after.at(name) != former) changed.insert(name);
    }
    return result;
  });
}

std::string outcomesOf(const Row& row) {
  std::string outcomes;
  for (int argument = 0;; ++argument) {
    for (int variant = 0;; ++variant) {
      Odd odd(argument, variant);
      std::string outcome = outcomeIn(row, odd);
      const bool isInvalid = outcome.find("Invalid parameter.") != std::string::npos;
      const bool isOdd = outcome[0] == '0' && outcome.find(" debug: ") == std::string::npos && outcome.back() != ' ';
      outcome = outcome.substr(0, outcome.find(' ')) + (isInvalid ? "!" : isOdd ? "?" : "");
      if (odd.ended()) return outcomes;
      if (odd.tried()) break;
      outcomes += (variant > 0 ? " " : argument > 0 ? " | " : "") + outcome;
    }
  }
}

// Whether it makes keys, with thousands of rounds and random bytes that it cannot do without.
bool isOfKeys(const Row& row) {
  return std::strstr(row.name, "Key") != nullptr || std::strstr(row.name, "rand") != nullptr;
}

// Outcomes in their order, each once in a run of the same, after what they are of.
class Outcomes {
 public:
  void add(const std::string& what, const std::string& outcome) {
    if (lines_.empty() || outcome != last_) lines_.push_back(what.empty() ? outcome : ": " + outcome);
    last_ = outcome;
    std::string& line = lines_.back();
    if (!what.empty()) line.insert(line.find(": "), (line[0] == ':' ? "" : " ") + what);
  }
  // An entry that fails whatever it gives stands without its values.
  Lines lines() const {
    Lines result;
    for (const std::string& line : lines_) {
      result.push_back(std::regex_replace(line, std::regex("(\\w+)=0 \\1=2 \\1=-1"), "$1"));
    }
    return result;
  }

 private:
  std::string last_;
  Lines lines_;
};

Odd sound() {
  return {-1, 0};
}

Lines memoryOutcomes(const Row& row, bool andLater) {
  Outcomes outcomes;
  long unreleased = 0;
  for (long n = 0; n < 60; ++n) {
    Odd arguments = sound();
    const AllocationWatch watch(n, andLater);
    const std::string outcome = outcomeIn(row, arguments);
    unreleased += watch.unreleased();
    if (watch.count() <= n) break;
    outcomes.add("", outcome);
  }
  EXPECT_LE(unreleased, 0);  // loading releases what another library has allocated
  return outcomes.lines();
}

// Stands for any entry, whatever it is called with.
template <int kValue>
intptr_t gives() {
  return kValue;
}

int contexts = 0;  // of the provider, unreleased
template <auto* kSlot, int kStep>
Failure counting() {
  static const auto real = *kSlot;
  return replacing(*kSlot, [](auto... arguments) { return contexts += kStep, real(arguments...); });
}
Failure countingContexts() {
  return both(both(counting<&pQEL_EVP_MD_CTX_new, 1>(), counting<&pQEL_EVP_MD_CTX_free, -1>()),
              both(counting<&pQEL_EVP_CIPHER_CTX_new, 1>(), counting<&pQEL_EVP_CIPHER_CTX_free, -1>()));
}

Lines providerOutcomes(const Row& row) {
  Outcomes outcomes;
  Odd arguments = sound();
  const std::string usual = row.call(arguments);
  const auto add = [&](const std::string& what, const Failure& failure) {
    const AllocationWatch watch;
    failure([&] {
      const std::string outcome = outcomeIn(row, arguments);
      if (outcome.substr(0, outcome.find(' ')) != usual) outcomes.add(what, outcome);
    });
    EXPECT_TRUE(contexts == 0 || what.find("CTX_") != std::string::npos) << what;
    contexts = 0;
    EXPECT_LE(watch.unreleased(), 0) << what;
  };
  add("no provider", withoutProvider());
  for (const ldappw::Entry& entry : ldappw::kEntries) {
    using Slot = intptr_t (*)();
    Slot& slot = *static_cast<Slot*>(entry.slot);
    const bool isUsed = std::strncmp(entry.symbol, "QEL_EVP_", 8) == 0;
    const std::string name = entry.symbol + (isUsed ? 8 : 4);
    const bool isPointer = name.find("_new") != std::string::npos || name.find("get_") != std::string::npos;
    if (!isUsed && (name != "RAND_bytes" || isOfKeys(row))) continue;  // keys then end the process
    add(name + "=0", replacing(slot, gives<0>));
    if (isPointer) continue;
    add(name + "=2", replacing(slot, gives<2>));
    add(name + "=-1", replacing(slot, gives<-1>));
  }
  add("no alphabet", replacing(pBase64, nullptr));
  return outcomes.lines();
}

class Ledger : public testing::Test {
 protected:
  static void SetUpTestSuite() {
    ASSERT_EQ(initQelCrypto(&ctx), 0);
    ASSERT_EQ(initQelDigest(ctx, &digestCtx, "SHA1", &sha1), 0);
    HostState::prepare();
  }
  static void TearDownTestSuite() {
    freeQelDigest(ctx, digestCtx);
    freeAesKeyData(keys);
  }
};

TEST_F(Ledger, HoldsForEveryOperation) {
  for (const Row& row : kRows) {
    SCOPED_TRACE(row.name);
    prepare();
    const auto examine = [&row] {
      EXPECT_EQ(outcomesOf(row), row.outcomes);
      EXPECT_EQ(memoryOutcomes(row, false), row.memory);
      EXPECT_EQ(memoryOutcomes(row, true), row.memory);
      countingContexts()([&row] { EXPECT_EQ(providerOutcomes(row), row.provider); });
    };
    testing::internal::CaptureStdout();
    changed.clear();
    isOfKeys(row) ? withQuickDigests()(examine) : examine();
    std::string changes;
    for (const std::string& each : changed) changes += (changes.empty() ? "" : ", ") + each;
    EXPECT_EQ(changes, row.changes);
    const std::string printed = testing::internal::GetCapturedStdout();
    if (HasFailure()) std::fputs(printed.c_str(), stderr);
  }
}

// What log readers find operations by, as tests/data/scopes.vec has it: the scope's number, level and mask, the code
// that it gives, and the line on entering, where there is one. The line on leaving has the same name, but for a few.
TEST_F(Ledger, ScopesNameThemselves) {
  std::map<std::string, std::string> scopes;
  std::map<std::string, std::string> exits;  // the last ones
  std::map<unsigned, std::string> entered;
  std::set<std::string> oddlyLeft;
  const TraceCapture trace;
  for (const Row& row : kRows) {
    prepare();
    Odd arguments = sound();
    row.call(arguments);
  }
  for (const Record& r : trace.records()) {
    char scope[32];
    std::snprintf(scope, sizeof scope, "%08x %u %x", r.id, r.level, r.mask);
    if (r.kind == LDTR_ENTRY) scopes.emplace(scope, "\n");
    if (r.kind == LDTR_EXIT) exits[scope] = std::to_string(r.rc);
    const bool isLeft = r.text.find(": Leaving.") != std::string::npos;
    const std::regex usual(entered[r.id] + ": Leaving\\. rc = -?\\d+\n");
    if (isLeft && !std::regex_match(r.text, usual)) oddlyLeft.insert(r.text);
    if (r.text.find(": Entering.") == std::string::npos) continue;
    entered[r.id] = r.text.substr(0, r.text.find(':'));
    scopes[scope] = " " + std::regex_replace(r.text, std::regex("0x[0-9a-f]+|\\(nil\\)"), "#");
  }
  std::string all;
  for (const auto& [scope, line] : scopes) all += scope + " gives " + exits[scope] + line;
  EXPECT_EQ(all, fileContent(LDAPPW_TEST_DATA "/scopes.vec"));
  const std::set<std::string> expected = {"genKeyStashFile: Leaving. rc = 0\n", "unsaltedHashEncrypt: Leaving. rc=0\n",
                                          "validateCryptoString: Leaving. rc = 0\n"};
  EXPECT_EQ(oddlyLeft, expected);
}

}  // namespace
