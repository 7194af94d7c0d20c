// SPDX-License-Identifier: Apache-2.0
// The rows of the foreign schemes, and finding the row of a name or a value.
#include "foreign_schemes.h"

#include <limits.h>

#include <algorithm>
#include <functional>

#include "foreign_payloads.h"
#include "library_schemes.h"
#include "password_schemes.h"
#include "text.h"

namespace tool {
namespace {

constexpr PayloadRule kAny{nullptr, 0, 0, 0, nullptr};
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
// iterations$salt$hash with a hash of at least so many bytes.
constexpr PayloadRule derived(long bytes) {
  return {pbkdf2Problem, bytes, LONG_MAX, 1, "the payload is not iterations$salt$hash"};
}

constexpr Scheme row(const char* name, std::string_view tags, std::string_view prefix, Strength strength,
                     const char* writers, const PayloadRule& payload) {
  const bool opens = strength == Strength::kClear || strength == Strength::kReversible;
  return {name,    tags,    FORMAT_NONE, opens ? Kind::kReversible : Kind::kOneWay,
          0,       0,       -1,          false,
          payload, "",      nullptr,     nullptr,
          nullptr, nullptr, strength,    writers,
          prefix};
}

}  // namespace

// clang-format off
const std::initializer_list<Scheme> kForeignSchemes = {
    // name, tags, beginning of the payload, strength, who writes it, payload
    row("plain", "{CLEARTEXT}{CLEAR}{PLAIN}{PLAINTEXT}", "", Strength::kClear, "slapd, 389-ds, Dovecot", kAny),
    row("base64", "{BASE64}", "", Strength::kClear, "other servers", kAny),
    row("389-des", "{DES}", "", Strength::kReversible, "389-ds", kAny),
    row("389-aes", "{AES-*}", "", Strength::kReversible, "389-ds", kAny),
    row("totp", "{TOTP1}{TOTP256}{TOTP512}{TOTP1ANDPW}{TOTP256ANDPW}{TOTP512ANDPW}", "", Strength::kReversible,
        "slapd", kAny),

    row("sha1", "{SHA1}", "", Strength::kUnsalted, "Dovecot", digest(20)),
    row("sha256", "{SHA256}", "", Strength::kUnsalted, "slapd, 389-ds, Dovecot", digest(32)),
    row("sha384", "{SHA384}", "", Strength::kUnsalted, "slapd, 389-ds", digest(48)),
    row("sha512", "{SHA512}", "", Strength::kUnsalted, "slapd, 389-ds, Dovecot", digest(64)),
    row("ldap-md5", "{LDAP-MD5}", "", Strength::kUnsalted, "Dovecot", digest(16)),
    row("plain-md5", "{PLAIN-MD5}", "", Strength::kUnsalted, "Dovecot", kHex),
    row("plain-md4", "{PLAIN-MD4}", "", Strength::kUnsalted, "Dovecot", kHex),
    row("cram-md5", "{CRAM-MD5}", "", Strength::kUnsalted, "Dovecot", kHex),
    row("lanman", "{LANMAN}{LM}", "", Strength::kUnsalted, "slapd, Dovecot", kHex),
    row("nt", "{NTLM}{NT}{CRYPT}", "$3$", Strength::kUnsalted, "Dovecot, libxcrypt", kAny),

    row("smd5", "{SMD5}", "", Strength::kSaltedFast, "slapd, 389-ds, Dovecot, passlib", salted(16)),
    row("ssha256", "{SSHA256}", "", Strength::kSaltedFast, "slapd, 389-ds, Dovecot, passlib", salted(32)),
    row("ssha384", "{SSHA384}", "", Strength::kSaltedFast, "slapd, 389-ds", salted(48)),
    row("ssha512", "{SSHA512}", "", Strength::kSaltedFast, "slapd, 389-ds, Dovecot, passlib", salted(64)),
    row("ns-mta-md5", "{NS-MTA-MD5}", "", Strength::kSaltedFast, "slapd, 389-ds", kAny),
    row("digest-md5", "{DIGEST-MD5}", "", Strength::kSaltedFast, "Dovecot", kHex),
    row("apr1", "{APR1}{BSDMD5}", "", Strength::kSaltedFast, "slapd", salted(16)),

    row("md5-crypt", "{CRYPT}{MD5-CRYPT}{CRYPT-MD5}{MD5}", "$1$", Strength::kSaltedFast,
        "slapd, 389-ds, Dovecot, mkpasswd", crypted(22)),
    row("des-crypt", "{DES-CRYPT}", "", Strength::kDesCrypt, "Dovecot", {cryptProblem, 0, 0, 0, "no crypt value"}),
    row("bigcrypt", "{CRYPT}", "", Strength::kDesCrypt, "slapd",
        {bigcryptProblem, 0, 0, 0, "the payload is not 2 characters of salt and 11 for each 8 of the password"}),
    row("bsdi-crypt", "{CRYPT}", "_", Strength::kDesCrypt, "libxcrypt, passlib, mkpasswd", crypted(20)),
    row("sunmd5", "{CRYPT}", "$md5", Strength::kSaltedFast, "libxcrypt, mkpasswd", crypted(22)),
    row("sha1-crypt", "{CRYPT}", "$sha1$", Strength::kStrong, "libxcrypt, passlib, mkpasswd", crypted(28)),
    row("bcrypt", "{CRYPT}{BLF-CRYPT}{BCRYPT}", "$2", Strength::kStrong, "libxcrypt, Dovecot, passlib, mkpasswd",
        crypted(53)),
    row("sha256-crypt", "{CRYPT}{SHA256-CRYPT}{CRYPT-SHA256}", "$5$", Strength::kStrong,
        "slapd, 389-ds, Dovecot, passlib, mkpasswd", crypted(43)),
    row("sha512-crypt", "{CRYPT}{SHA512-CRYPT}{CRYPT-SHA512}", "$6$", Strength::kStrong,
        "slapd, 389-ds, Dovecot, passlib, mkpasswd", crypted(86)),
    row("scrypt", "{CRYPT}", "$7$", Strength::kStrong, "libxcrypt, mkpasswd", crypted(43)),
    row("yescrypt", "{CRYPT}", "$y$", Strength::kStrong, "libxcrypt, mkpasswd", crypted(43)),
    row("gost-yescrypt", "{CRYPT}{GOST_YESCRYPT}", "$gy$", Strength::kStrong, "libxcrypt, 389-ds, mkpasswd",
        crypted(43)),

    row("pbkdf2", "{PBKDF2}", "", Strength::kStrong, "slapd, passlib", derived(20)),
    row("pbkdf2-dovecot", "{PBKDF2}", "$1$", Strength::kStrong, "Dovecot", kAny),
    row("pbkdf2-sha1", "{PBKDF2-SHA1}", "", Strength::kStrong, "slapd, 389-ds", derived(20)),
    row("pbkdf2-sha256", "{PBKDF2-SHA256}", "", Strength::kStrong, "slapd, 389-ds, passlib", derived(32)),
    row("pbkdf2-sha512", "{PBKDF2-SHA512}", "", Strength::kStrong, "slapd, 389-ds, passlib", derived(64)),
    row("pbkdf2-389", "{PBKDF2_SHA256}", "", Strength::kStrong, "389-ds",
        {base64Problem, 324, 324, 1, "the payload is not 4 bytes of iterations, 64 of salt and 256 of hash"}),
    row("argon2i", "{ARGON2}{ARGON2I}", "$argon2i$", Strength::kStrong, "slapd, Dovecot", kArgon2),
    row("argon2d", "{ARGON2}", "$argon2d$", Strength::kStrong, "slapd", kArgon2),
    row("argon2id", "{ARGON2}{ARGON2ID}", "$argon2id$", Strength::kStrong, "slapd, Dovecot", kArgon2),
    row("scram", "{SCRAM-SHA-1}{SCRAM-SHA-256}{SCRAM-SHA-512}", "", Strength::kStrong, "Dovecot", kAny),

    row("sasl", "{SASL}", "", Strength::kExternal, "slapd", kAny),
    row("kerberos", "{KERBEROS}{K5KEY}", "", Strength::kExternal, "slapd", kAny),
    row("unix", "{UNIX}", "", Strength::kExternal, "slapd", kAny),
    row("radius", "{RADIUS}", "", Strength::kExternal, "slapd", kAny),
    row("one-time", "{OTP}{SKEY}{RPA}", "", Strength::kExternal, "Dovecot", kAny),
    row("locked", "{CRYPT}", "!", Strength::kLocked, "passwd", kAny),
    row("disabled", "{CRYPT}", "*", Strength::kLocked, "passwd", kAny),
};
// clang-format on

namespace {

// Among tags that stand one by one; "{NAME-*}" is any that begins so.
bool hasTag(std::string_view tags, std::string_view tag) noexcept {
  while (!tags.empty()) {
    const std::string_view one = tags.substr(0, tags.find('}') + 1);
    const std::string_view beginning = one.substr(0, one.find('*'));
    if (beginning.size() < one.size() ? beginsWithName(tag, beginning) : sameName(one, tag)) return true;
    tags.remove_prefix(one.size());
  }
  return false;
}

bool beginsWith(std::string_view text, std::string_view prefix) noexcept {
  return text.substr(0, prefix.size()) == prefix;
}

}  // namespace

// The longest beginning counts. Without one a row takes whatever no other row takes, except under {crypt}: there the
// payload has to be right, as otherwise it is a malformed value of the library's own.
const Scheme* foreignSchemeOf(std::string_view tag, std::string_view payload) noexcept {
  const Scheme* found = nullptr;
  for (const Scheme& scheme : kForeignSchemes) {
    if (!hasTag(scheme.tag, tag) || !beginsWith(payload, scheme.prefix)) continue;
    const bool own = scheme.prefix.empty() && sameName(tag, "{crypt}");
    if (own && scheme.payload.check(scheme.payload, payload) != nullptr) continue;
    if (found == nullptr || scheme.prefix.size() > found->prefix.size()) found = &scheme;
  }
  return found;
}

const Scheme* findForeignScheme(std::string_view name) noexcept {
  const auto* found = std::find_if(kForeignSchemes.begin(), kForeignSchemes.end(), [&](const Scheme& scheme) {
    return sameName(name, scheme.name) || hasTag(scheme.tag, name);
  });
  return found != kForeignSchemes.end() ? found : nullptr;
}

std::size_t indexOf(const Scheme& scheme) noexcept {
  const std::less<> before;
  const bool own = !before(&scheme, kSchemes.begin()) && before(&scheme, kSchemes.end());
  return own ? static_cast<std::size_t>(&scheme - kSchemes.begin())
             : kSchemes.size() + static_cast<std::size_t>(&scheme - kForeignSchemes.begin());
}

}  // namespace tool
