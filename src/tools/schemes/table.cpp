// SPDX-License-Identifier: Apache-2.0
#include "schemes/scheme.h"

#include <climits>

#include "password_schemes.h"
#include "schemes/foreign_payloads.h"
#include "schemes/foreign_values.h"
#include "schemes/library_values.h"

namespace tool {
namespace {

constexpr PayloadRule kAny{nullptr, 0, 0, 0, nullptr};
constexpr PayloadRule kBlocks{base64Problem, 16, LONG_MAX, 16, "the payload is not a whole number of 16-byte blocks"};
constexpr PayloadRule kHex{hexProblem, 16, LONG_MAX, 1, "the payload is not hexadecimal text of a digest"};
constexpr PayloadRule kArgon2{argon2Problem, 0, 0, 0, "the payload is not $type$v=...$m=...,t=...,p=...$salt$hash"};

// Base64 of exactly, or at least, so many bytes.
constexpr PayloadRule digest(long bytes) {
  return {base64Problem, bytes, bytes, 1, "the payload does not hold as many bytes as the digest"};
}
constexpr PayloadRule salted(long bytes) {
  return {base64Problem, bytes, LONG_MAX, 1, "the payload holds less than the digest"};
}
// Settings of crypt(3), then a hash of so many characters.
constexpr PayloadRule crypted(long characters) {
  return {cryptStringProblem, characters, characters, 1, "the payload is no whole crypt value of this kind"};
}
// Iterations, salt and a hash of at least so many bytes.
constexpr PayloadRule derived(long bytes) {
  return {pbkdf2Problem, bytes, LONG_MAX, 1, "the payload is not iterations$salt$hash"};
}
constexpr PayloadRule scram(long bytes) {
  return {scramProblem, bytes, bytes, 1, "the payload is not iterations,salt,stored key,server key"};
}

// What new values cost: least, usual, most of rounds, memory in KiB, lanes, bytes of salt. The usual costs are those of
// the servers that read the values: of slapd's argon2 module since 2.6, of 389 Directory Server since 2.4 for PBKDF2,
// of crypt(3) itself.
constexpr CostRules kArgon2Costs{{1, 8, 1, 8}, {5, 7168, 1, 16}, {1000, 1048576, 64, 64}};
constexpr CostRules kPbkdf2Costs{{1000, 0, 0, 8}, {100000, 0, 0, 16}, {10000000, 0, 0, 64}};
constexpr CostRules kYescryptCosts{{1, 0, 0, 0}, {5, 0, 0, 0}, {11, 0, 0, 0}};
constexpr CostRules kShaCryptCosts{{1000, 0, 0, 0}, {5000, 0, 0, 0}, {10000000, 0, 0, 0}};
constexpr CostRules kSshaCosts{{0, 0, 0, 4}, {0, 0, 0, 20}, {0, 0, 0, 64}};
constexpr CostRules kSaltCosts{{0, 0, 0, 4}, {0, 0, 0, 16}, {0, 0, 0, 64}};

// The columns of a row that open, check and make.
struct Functions {
  decltype(Scheme::open) open = nullptr;
  decltype(Scheme::check) check = nullptr;
  decltype(Scheme::make) make = nullptr;
  const CostRules* costs = nullptr;
};
constexpr Functions kNone{};
constexpr Functions kPlain{openPlain, checkOpened};
constexpr Functions kDigest{nullptr, checkDigest};
constexpr Functions kCrypt{nullptr, checkCrypt3};
constexpr Functions kPbkdf2{nullptr, checkPbkdf2};
constexpr Functions kArgon2Check{nullptr, checkArgon2};

// A scheme of other servers.
constexpr Scheme row(const char* name, std::string_view tags, std::string_view prefix, Strength strength,
                     const char* writers, const PayloadRule& payload, const Functions& functions = kNone,
                     const char* algorithm = "") {
  const bool opens = strength == Strength::kClear || strength == Strength::kReversible;
  Scheme scheme;
  scheme.name = name;
  scheme.tag = tags;
  scheme.kind = opens ? Kind::kReversible : Kind::kOneWay;
  scheme.payload = payload;
  if (functions.make == makeCrypt3) scheme.passwordProblem = crypt3PasswordProblem;
  scheme.make = functions.make;
  scheme.check = functions.check;
  scheme.open = functions.open;
  scheme.strength = strength;
  scheme.writers = writers;
  scheme.costs = functions.costs;
  scheme.algorithm = algorithm;
  scheme.prefix = prefix;
  return scheme;
}

// A scheme of the library. The other columns are set by name.
class Own {
 public:
  constexpr Own(const char* name, std::string_view tag, int code, Kind kind, Strength strength, const char* writers)
      : scheme_(start(name, tag, code, kind, strength, writers)) {}

  constexpr Own payload(const PayloadRule& rule) const { return with(&Scheme::payload, rule); }
  constexpr Own foreignMarks(const char* marks) const { return with(&Scheme::foreignMarks, marks); }
  constexpr Own cutBytes(size_t bytes) const { return with(&Scheme::cutBytes, bytes); }
  constexpr Own comparedBytes(size_t bytes) const { return with(&Scheme::comparedBytes, bytes); }
  constexpr Own key(int index) const { return with(&Scheme::keyIndex, index); }
  constexpr Own needsProvider() const { return with(&Scheme::needsProvider, true); }
  constexpr Own refuses(decltype(Scheme::passwordProblem) function) const {
    return with(&Scheme::passwordProblem, function);
  }
  constexpr Own made(decltype(Scheme::make) function) const { return with(&Scheme::make, function); }
  constexpr Own checked(decltype(Scheme::check) function) const { return with(&Scheme::check, function); }
  constexpr Own opened(decltype(Scheme::open) function) const { return with(&Scheme::open, function); }
  constexpr Own costs(const CostRules& rules) const { return with(&Scheme::costs, &rules); }
  constexpr Own algorithm(const char* name) const { return with(&Scheme::algorithm, name); }

  constexpr operator Scheme() const { return scheme_; }  // NOLINT(google-explicit-constructor): a row of the table

 private:
  static constexpr Scheme start(const char* name, std::string_view tag, int code, Kind kind, Strength strength,
                                const char* writers) {
    Scheme scheme;
    scheme.name = name;
    scheme.tag = tag;
    scheme.code = code;
    scheme.kind = kind;
    scheme.strength = strength;
    scheme.writers = writers;
    return scheme;
  }
  template <typename Member, typename Value>
  constexpr Own with(Member Scheme::*member, const Value& value) const {
    Own changed = *this;
    changed.scheme_.*member = value;
    return changed;
  }

  Scheme scheme_;
};

// The three AES schemes differ in their keys alone.
constexpr Own aes(const char* name, std::string_view tag, int code, int key) {
  return Own(name, tag, code, Kind::kReversible, Strength::kReversible, "ldappw")
      .payload(kBlocks)
      .key(key)
      .needsProvider()
      .made(makeByLibrary)
      .checked(checkByOpening)
      .opened(openByLibrary);
}

constexpr Strength kClear = Strength::kClear, kReversible = Strength::kReversible, kUnsalted = Strength::kUnsalted,
                   kDesCrypt = Strength::kDesCrypt, kSaltedFast = Strength::kSaltedFast, kStrong = Strength::kStrong,
                   kExternal = Strength::kExternal, kLocked = Strength::kLocked;

// The numbers of Argon2's types.
constexpr char kArgon2d[] = "0", kArgon2i[] = "1", kArgon2id[] = "2";

}  // namespace

// clang-format off
const std::initializer_list<Scheme> kSchemes = {
    // Of the library, clear text first: name, tag, code, kind, strength, who writes it, and what the names say.
    Own("clear", "", FORMAT_NONE, Kind::kClear, kClear, "any")
        .comparedBytes(46).made(makeClear).checked(checkByLibrary).opened(openClear),
    Own("sha", "{SHA}", FORMAT_SHA, Kind::kOneWay, kUnsalted, "ldappw, slapd, 389-ds, Dovecot, passlib")
        .payload({base64Problem, 20, 20, 1, "the payload does not hold 20 bytes"})
        .refuses(shaPasswordProblem).made(makeByLibrary).checked(checkByLibrary),
    Own("ssha", "{SSHA}", FORMAT_SSHA, Kind::kOneWay, kSaltedFast, "ldappw, slapd, 389-ds, Dovecot, passlib")
        .payload({base64Problem, 20, LONG_MAX, 1, "the payload holds less than a digest of 20 bytes"})
        .needsProvider().made(makeSsha).costs(kSshaCosts).algorithm("SHA1").checked(checkByLibrary),
    Own("md5", "{MD5}", FORMAT_MD5, Kind::kOneWay, kUnsalted, "ldappw, slapd, 389-ds, passlib")
        .payload({base64Problem, 16, 16, 1, "the payload does not hold 16 bytes"}).foreignMarks("$")
        .needsProvider().made(makeByLibrary).checked(checkByLibrary),
    Own("crypt", "{crypt}", FORMAT_CRYPT, Kind::kOneWay, kDesCrypt, "ldappw, slapd, 389-ds, passlib")
        .payload({cryptProblem, 0, 0, 0, "the payload is not 13 characters of the crypt alphabet"}).foreignMarks("$_*!")
        .cutBytes(8).comparedBytes(8).made(makeCrypt).checked(checkByLibrary),
    Own("qveil", "{qVEIL}", FORMAT_QVEIL, Kind::kReversible, kReversible, "ldappw")
        .payload({maskedProblem, 0, 0, 0, "the masked payload does not decode"})
        .cutBytes(46).comparedBytes(46).made(makeByLibrary).checked(checkByLibrary).opened(openByLibrary),
    aes("aes128", "{AES128}", FORMAT_AES128, 0),
    aes("aes192", "{AES192}", FORMAT_AES192, 1),
    aes("aes256", "{AES256}", FORMAT_AES256, 2),
    Own("vldl", "{VLDL}", FORMAT_VLDL, Kind::kOneWay, Strength::kUnknown, ""),

    // Of other servers.
    // name, tags, beginning of the payload, strength, who writes it,
    //     payload, functions, algorithm
    row("plain", "{CLEARTEXT}{CLEAR}{PLAIN}{PLAINTEXT}", "", kClear, "slapd, 389-ds, Dovecot", kAny, kPlain),
    row("base64", "{BASE64}", "", kClear, "other servers",
        {base64Problem, 0, LONG_MAX, 1, ""}, {openBase64, checkOpened}),
    row("389-des", "{DES}", "", kReversible, "389-ds", kAny),
    row("389-aes", "{AES-*}", "", kReversible, "389-ds", kAny),
    row("totp", "{TOTP1}{TOTP256}{TOTP512}{TOTP1ANDPW}{TOTP256ANDPW}{TOTP512ANDPW}", "", kReversible, "slapd", kAny),

    row("sha1", "{SHA1}", "", kUnsalted, "Dovecot", digest(20), kDigest, "SHA1"),
    row("sha256", "{SHA256}", "", kUnsalted, "slapd, 389-ds, Dovecot", digest(32), kDigest, "SHA256"),
    row("sha384", "{SHA384}", "", kUnsalted, "slapd, 389-ds", digest(48), kDigest, "SHA384"),
    row("sha512", "{SHA512}", "", kUnsalted, "slapd, 389-ds, Dovecot", digest(64), kDigest, "SHA512"),
    row("ldap-md5", "{LDAP-MD5}", "", kUnsalted, "Dovecot", digest(16), kDigest, "MD5"),
    row("plain-md5", "{PLAIN-MD5}", "", kUnsalted, "Dovecot", kHex, {nullptr, checkHexDigest}, "MD5"),
    row("plain-md4", "{PLAIN-MD4}", "", kUnsalted, "Dovecot", kHex),
    row("cram-md5", "{CRAM-MD5}{HMAC-MD5}", "", kUnsalted, "Dovecot", kHex),
    row("lanman", "{LANMAN}{LM}", "", kUnsalted, "slapd", kHex),
    row("nt", "{NTLM}{NT}", "", kUnsalted, "slapd", kHex, {nullptr, checkNtHash}),
    row("nt-crypt", "{CRYPT}", "$3$", kUnsalted, "mkpasswd", crypted(32), kCrypt),

    row("smd5", "{SMD5}", "", kSaltedFast, "slapd, 389-ds, Dovecot, passlib", salted(16), kDigest, "MD5"),
    row("ssha256", "{SSHA256}", "", kSaltedFast, "slapd, 389-ds, Dovecot, passlib", salted(32), kDigest, "SHA256"),
    row("ssha384", "{SSHA384}", "", kSaltedFast, "slapd, 389-ds", salted(48), kDigest, "SHA384"),
    row("ssha512", "{SSHA512}", "", kSaltedFast, "ldappw, slapd, 389-ds, Dovecot, passlib",
        salted(64), {nullptr, checkDigest, makeSalted, &kSaltCosts}, "SHA512"),
    row("ns-mta-md5", "{NS-MTA-MD5}", "", kSaltedFast, "389-ds", kHex),
    row("digest-md5", "{DIGEST-MD5}", "", kSaltedFast, "Dovecot", kHex),
    row("apr1", "{APR1}{BSDMD5}", "", kSaltedFast, "slapd", salted(16)),

    row("md5-crypt", "{CRYPT}{MD5-CRYPT}{CRYPT-MD5}{MD5}", "$1$", kSaltedFast, "slapd, 389-ds, Dovecot, mkpasswd",
        crypted(22), kCrypt),
    row("des-crypt", "{DES-CRYPT}", "", kDesCrypt, "Dovecot", {cryptProblem, 0, 0, 0, "no crypt value"}, kCrypt),
    row("bigcrypt", "{CRYPT}", "", kDesCrypt, "slapd",
        {bigcryptProblem, 0, 0, 0, "the payload is not 2 characters of salt and 11 for each 8 of the password"},
        kCrypt),
    row("bsdi-crypt", "{CRYPT}", "_", kDesCrypt, "passlib, mkpasswd", crypted(20), kCrypt),
    row("sunmd5", "{CRYPT}", "$md5", kSaltedFast, "mkpasswd", crypted(22), kCrypt),
    row("sha1-crypt", "{CRYPT}", "$sha1$", kStrong, "passlib", crypted(28), kCrypt),
    row("bcrypt", "{CRYPT}{BLF-CRYPT}{BCRYPT}", "$2", kStrong, "Dovecot, passlib, mkpasswd", crypted(53), kCrypt),
    row("sha256-crypt", "{CRYPT}{SHA256-CRYPT}{CRYPT-SHA256}", "$5$", kStrong,
        "slapd, 389-ds, Dovecot, passlib, mkpasswd", crypted(43), kCrypt),
    row("sha512-crypt", "{CRYPT}{SHA512-CRYPT}{CRYPT-SHA512}", "$6$", kStrong,
        "ldappw, slapd, 389-ds, Dovecot, passlib, mkpasswd",
        crypted(86), {nullptr, checkCrypt3, makeCrypt3, &kShaCryptCosts}),
    row("scrypt", "{CRYPT}", "$7$", kStrong, "mkpasswd", crypted(43), kCrypt),
    row("yescrypt", "{CRYPT}", "$y$", kStrong, "ldappw, mkpasswd",
        crypted(43), {nullptr, checkCrypt3, makeCrypt3, &kYescryptCosts}),
    row("gost-yescrypt", "{CRYPT}{GOST_YESCRYPT}", "$gy$", kStrong, "389-ds, mkpasswd", crypted(43), kCrypt),

    row("pbkdf2", "{PBKDF2}", "", kStrong, "slapd, passlib", derived(20), kPbkdf2, "SHA1"),
    row("pbkdf2-dovecot", "{PBKDF2}", "$1$", kStrong, "Dovecot", derived(20), kPbkdf2, "SHA1"),
    row("pbkdf2-sha1", "{PBKDF2-SHA1}", "", kStrong, "slapd, 389-ds", derived(20), kPbkdf2, "SHA1"),
    row("pbkdf2-sha256", "{PBKDF2-SHA256}", "", kStrong, "slapd, 389-ds, passlib", derived(32), kPbkdf2, "SHA256"),
    row("pbkdf2-sha512", "{PBKDF2-SHA512}", "", kStrong, "ldappw, slapd, 389-ds, passlib",
        derived(64), {nullptr, checkPbkdf2, makePbkdf2, &kPbkdf2Costs}, "SHA512"),
    row("pbkdf2-389", "{PBKDF2_SHA256}", "", kStrong, "389-ds",
        {base64Problem, 324, 324, 1, "the payload is not 4 bytes of iterations, 64 of salt and 256 of hash"},
        kPbkdf2, "SHA256"),
    row("argon2i", "{ARGON2}{ARGON2I}", "$argon2i$", kStrong, "slapd, Dovecot", kArgon2, kArgon2Check, kArgon2i),
    row("argon2d", "{ARGON2}", "$argon2d$", kStrong, "other servers", kArgon2, kArgon2Check, kArgon2d),
    row("argon2id", "{ARGON2}{ARGON2ID}", "$argon2id$", kStrong, "ldappw, slapd, Dovecot",
        kArgon2, {nullptr, checkArgon2, makeArgon2, &kArgon2Costs}, kArgon2id),
    row("scram-sha-1", "{SCRAM-SHA-1}", "", kStrong, "Dovecot", scram(20), {nullptr, checkScram}, "SHA1"),
    row("scram-sha-256", "{SCRAM-SHA-256}", "", kStrong, "Dovecot", scram(32), {nullptr, checkScram}, "SHA256"),

    row("sasl", "{SASL}", "", kExternal, "slapd", kAny),
    row("kerberos", "{KERBEROS}{K5KEY}", "", kExternal, "slapd", kAny),
    row("unix", "{UNIX}", "", kExternal, "slapd", kAny),
    row("radius", "{RADIUS}", "", kExternal, "slapd", kAny),
    row("one-time", "{OTP}{SKEY}{RPA}", "", kExternal, "Dovecot", kAny),
    row("locked", "{CRYPT}", "!", kLocked, "passwd", kAny),
    row("disabled", "{CRYPT}", "*", kLocked, "passwd", kAny),
};
// clang-format on

}  // namespace tool
