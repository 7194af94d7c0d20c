// SPDX-License-Identifier: Apache-2.0
// The password schemes: detection, formatting, verification and reversal, and what is left of secrets.
// What is expected comes from OpenSSL and from the system's own crypt, not from the product.
#include <algorithm>
#include <climits>

#include "crypt/crypto_des_tables.h"
#include "digests/sha.h"
#include "failures.h"
#include "oracle.h"
#include "password_schemes.h"
#include "system_crypt.h"

using namespace std::string_literals;
using namespace test;

namespace {

const std::pair<int, std::string> kSchemes[] = {{1, ""},           {2, "{SHA}"},      {3, "{MD5}"},
                                                {4, "{crypt}"},    {9, "{SSHA}"},     {128, "{qVEIL}"},
                                                {133, "{AES256}"}, {134, "{AES192}"}, {135, "{AES128}"}};

AesKeyData* keys() {
  static const std::unique_ptr<AesKeyData, int (*)(AesKeyData*) noexcept> record(fixedRecord(), freeAesKeyData);
  return record.get();
}

std::string format(int scheme, const std::string& clear, std::string salt = "ab") {
  char out[1024];
  Guarded in(clear);
  const int size = static_cast<int>(clear.size());
  return {out, static_cast<size_t>(format_password(scheme, salt.data(), keys(), in.data(), size, out, sizeof out))};
}

int verify(const std::string& presented, const std::string& stored, int isClear = 0, AesKeyData* keyData = keys()) {
  Guarded p(presented);
  Guarded s(stored);
  dirtyStack();
  return verify_password(p.data(), static_cast<int>(presented.size()), s.data(), static_cast<int>(stored.size()),
                         isClear, keyData);
}

std::string unformat(const std::string& value, AesKeyData* keyData, int* length = nullptr) {
  Guarded guarded(value + '\0');
  char* clear = nullptr;
  const int good = unformat_password(guarded.data(), &clear, keyData, length);
  EXPECT_EQ(good, clear != nullptr ? 1 : 0);
  return taken(clear);
}

std::string decodePW(const std::string& value, AesKeyData* keyData, int& rc) {
  Guarded guarded(value + '\0');
  char* clear = nullptr;
  rc = morva_decodePW(&clear, guarded.data(), keyData);
  EXPECT_EQ(guarded.data(), value);  // the decoder's habit of writing to its text does not show
  return taken(clear);
}

// What the scheme makes of a clear text; the salt is taken from the payload to compare with.
std::string payloadOf(int scheme, const std::string& clear, const std::string& payload) {
  std::string text = upToNul(clear);
  if (scheme == 1) return clear;
  if (scheme == 3) return opensslBase64(opensslDigest("MD5", text));
  if (scheme == 4) return systemCrypt(text, "ab");
  if (scheme == 9) return saltedPayload(text, opensslDecoded(payload).substr(20, 20));
  if (scheme == 128) return payload;  // reversing checks it
  const auto aes = [&clear](const char* cipher, size_t keyAt) {
    return opensslBase64(opensslCipher({cipher, fixedContent().substr(keyAt), "", true, true}, clear));
  };
  if (scheme == 133) return aes("AES-256-ECB", 60);
  if (scheme == 134) return aes("AES-192-ECB", 36);
  if (scheme == 135) return aes("AES-128-ECB", 20);
  text.resize(clear.size());  // to SHA, what follows a NUL counts as NUL
  return opensslBase64(opensslDigest("SHA1", text));
}

TEST(CheckFormat, FollowsTheUnevenLengthsOfTheTags) {
  const std::pair<std::string, int> rows[] = {
      {"", 1},           {"{MD5", 1},        {"{MD5}", 3},    {"{md5}x", 3},      {"{SHA}", 1},    {"{sha}x", 2},
      {"{SSHA}", 1},     {"{SSHA}x", 9},     {"{crypt}", 1},  {"{Crypt}a", 4},    {"{qVEIL}", 1},  {"{QVeil}x", 128},
      {"{AES128}", 1},   {"{AES128}x", 135}, {"{AES192}", 1}, {"{aes192}x", 134}, {"{AES256}", 1}, {"{AES256}x", 133},
      {"{VLDL}", 1},     {"{vldl}x", 8},     {"{XYZ}abc", 1}, {"{AES12}xyz", 1},  {"[SHA]abc", 1}, {"xyz{SHA}", 1},
      {">abcdef<", 128}, {">abcde<", 1},     {">abcdefg", 1}, {"{abcdefg<", 1},   {"{SHA]abc", 1}, {"{crypt", 1}};
  for (const auto& [text, code] : rows) {
    SCOPED_TRACE(text);
    Guarded value(text);
    const TraceCapture trace;
    EXPECT_EQ(check_format(value.data(), static_cast<unsigned>(text.size())), code);
    const size_t lines = code == 1 && text.size() > 4 && text[0] == '{' ? 1 : 0;
    EXPECT_EQ(trace.messages(), Lines(lines, "CheckFormat:UNKNOWN pwd encoding,assume unencrypted\n"));
  }
  const Replaced<char> changed(VLDL_BRACED[2], 'W');
  EXPECT_EQ(check_format("{VWDL}x", 7), 8);
}

TEST(Sha, AgreesWithOpensslAtEveryLengthInBothWays) {
  std::mt19937 random(4);
  for (size_t n = 0; n <= 300; ++n) {
    const std::string data = randomBytes(random, n);
    Guarded in(data);
    Guarded out(std::string(sizeof(sha_digest), '!'));
    for (const auto digest : {ldappw::digestPlainly, ldappw::digestBytes}) {
      digest(bytesOf(in.data()), n, reinterpret_cast<sha_digest*>(out.data()));
      EXPECT_EQ(std::string(out.data(), sizeof(sha_digest)), opensslDigest("SHA1", data)) << n;
    }
  }
}

TEST(UnknownSchemes, AreRefusedWithALine) {
  for (const int scheme : {0, 5, 8, 132, 136, -1}) {
    const TraceCapture trace;
    EXPECT_EQ(formatted_password_length(scheme, 5), -1);
    EXPECT_EQ(format(scheme, "abc"), "");
    const std::string end = ": Format-UNKNOWN pwd encoding " + std::to_string(scheme) + "\n";
    EXPECT_EQ(trace.messages(), Lines({"Error - formatted_password_length" + end, "Error - format_password" + end}));
  }
  EXPECT_EQ(formatted_password_length(133, INT_MAX), -1);
}

void expectRoundTrip(int scheme, const std::string& tag, const std::string& clear) {
  const int clearLength = static_cast<int>(clear.size());
  const int least = formatted_password_length(scheme, clearLength);
  const int length = scheme == 3 ? least + 8 : least;
  Guarded in(clear);
  Guarded out(std::string(static_cast<size_t>(length), '!'));  // no room for a NUL
  const auto formatted = [&](int size) {
    return format_password(scheme, std::string("ab").data(), keys(), in.data(), clearLength, out.data(), size);
  };
  ASSERT_EQ(formatted(length), length);
  std::string value(out.data(), static_cast<size_t>(length));
  EXPECT_EQ(value, tag + payloadOf(scheme, clear, value.substr(tag.size())));
  EXPECT_EQ(verify(clear, value, 1), scheme == 128 && clear != upToNul(clear) ? 99 : 0);
  EXPECT_NE(verify("!" + clear, value, 1), 0);
  if (scheme >= 128) {
    const std::string kept = scheme == 128 ? upToNul(clear.substr(0, 46)) : clear;
    int keptLength = 0;
    EXPECT_EQ(unformat(value, keys(), &keptLength), upToNul(kept));
    EXPECT_EQ(keptLength, static_cast<int>(kept.size()));
  }
  const auto zeros = static_cast<size_t>(least == 0 ? 0 : least - 1);
  EXPECT_EQ(formatted(least - 1), 0);
  EXPECT_EQ(value.replace(0, zeros, zeros, '\0'), std::string(out.data(), value.size()));
}

TEST(EachScheme, FormatsVerifiesAndReversesTextsOfAllLengths) {
  Lines texts{"ab\0cd"s, "twenty letters and a \0 nul"s, "\0"s};
  for (const size_t n : {0, 1, 8, 9, 15, 16, 46, 47, 55, 56, 63, 64, 120, 128, 300}) texts.push_back(letters(n));
  for (const auto& [scheme, tag] : kSchemes) {
    for (const std::string& clear : texts) {
      SCOPED_TRACE(tag + toHex(clear.data(), clear.size()));
      expectRoundTrip(scheme, tag, clear);
    }
  }
}

TEST(EachScheme, GivesNothingWhenMemoryRunsOut) {
  const std::string clear = letters(300);  // long enough for copies on the heap
  for (const auto& [code, tag] : kSchemes) {
    SCOPED_TRACE(tag);
    const int scheme = code;
    const std::string left = tag + std::string(500 - tag.size(), '\0');
    const std::string value = format(scheme, clear);
    for (const std::string& text : {clear, letters(100) + '\0' + letters(199)}) {
      sweepAllocations(1, 0, [&] {
        std::string out(500, '!');
        const int length = format_password(scheme, std::string("ab").data(), keys(), text.data(), 300, out.data(), 500);
        return length != 0 || out != left;
      });
    }
    sweepAllocations(1, 0, [&] { return verify(clear, value) == 0; });
    sweepAllocations(1, 1, [&] { return verify("!" + clear, value) != 0; });
    sweepAllocations(0, scheme >= 128 ? 80 : 90, [&] {
      int rc = -1;
      const std::string text = decodePW(value, keys(), rc);
      EXPECT_EQ(text == "(null)", rc != 0);
      return rc;
    });
  }
}

TEST(FormatPassword, RefusesAndLeavesAtMostTheTag) {
  const struct {
    int scheme, clearLength, outSize;
    std::string left;
  } rows[] = {{4, 3, 64, ""}, {134, 3, 64, "{AES192}"}, {135, 3, 64, "{AES128}"}, {133, 3, 170, ""},
              {1, 3, 2, ""},  {2, -1, 64, ""}};
  char out[171];
  for (const auto& row : rows) {  // without salt and keys
    SCOPED_TRACE(row.scheme);
    std::memset(out, '!', sizeof out);
    EXPECT_EQ(format_password(row.scheme, nullptr, nullptr, "abc", row.clearLength, out, row.outSize), 0);
    const auto size = static_cast<size_t>(row.outSize);
    EXPECT_EQ(std::string(out, size + 1), row.left + std::string(size - row.left.size(), '\0') + "!");
  }
  EXPECT_EQ(format_password(1, nullptr, nullptr, out, 3, out, sizeof out), 0);
  EXPECT_EQ(out[100], '!');  // the same buffer is left as it is
  ASSERT_EQ(format_password(133, nullptr, nullptr, "abc", 3, out, sizeof out), 171);  // masked instead
  EXPECT_EQ(unformat({out, 171}, nullptr), "abc");
}

TEST(FormatPassword, ReadsNothingBehindAFirstNul) {
  for (const int scheme : {2, 3, 4, 9, 128}) {
    char out[2][256];
    for (const std::string& clear : {"{SHA"s, "pass"s}) {
      Guarded end(clear + '\0');
      const std::string whole = clear + std::string(296, '\0');
      const int length = format_password(scheme, std::string("ab").data(), nullptr, end.data(), 300, out[0], 256);
      EXPECT_EQ(format_password(scheme, std::string("ab").data(), nullptr, whole.data(), 300, out[1], 256), length);
      const bool equal = std::string(out[0], 12) == std::string(out[1], 12);
      EXPECT_TRUE(scheme == 128 || equal == (scheme < 9)) << scheme;  // 9 draws a salt; 128 may draw one alphabet twice
    }
  }
}

// A provider that makes more than there is room for.
TEST(FormatPassword, WritesNothingBehindTheRoomItHas) {
  const std::string clear = letters(740);  // as AES, nearly all that verification has room for
  const struct {
    int scheme, outSize, written;
    Failure tooMuch;
  } rows[] = {{9, 62, 6, replacing(pQEL_EVP_MD_size, [](auto...) { return 60; })},
              {3, 21, 29, replacing(pQEL_EVP_MD_size, [](auto...) { return 20; })},
              {135, 1016, 8, replacing(pQEL_EVP_EncryptFinal, [](void*, void*, unsigned char* end, int* count) {
                 return std::memset(end, 1, 64), *count = 64, 1;
               })}};
  for (const auto& row : rows) {
    const std::string stored = format(row.scheme, clear);
    Guarded in(clear);
    Guarded out(std::string(static_cast<size_t>(std::max(row.outSize, row.written)), '!'));
    row.tooMuch([&] {
      EXPECT_EQ(format_password(row.scheme, nullptr, keys(), in.data(), 740, out.data(), row.outSize), 0);
      EXPECT_NE(verify(clear, stored, 1), 0);
    });
  }
}

TEST(FormatPassword, TakesTaggedShaAsAlreadyHashed) {
  const Lines final{"format_password: This pwd update is in SHA format and is from an ORVEX supplier. Do nothing.\n"};
  const Lines raw{"format_password: This pwd update is in SHA format and is NOT from an ORVEX supplier. Base64 it.\n"};
  const struct {
    std::string clear, value;
    Lines lines;
  } rows[] = {{"{sha}qZk+NkcGgWq6PiVxeFDCbJzQ2J0=", "", final},
              {"{SHA}" + std::string(28, '*'), "", final},
              {"{Sha}" + opensslDigest("SHA1", "abc") + "surplus", "{SHA}qZk+NkcGgWq6PiVxeFDCbJzQ2J0=", raw},
              {"{SHA}", "{SHA}AAAAAAAAAAAAAAAAAAAAAAAAAAA=", raw},
              {"{SHA", "{SHA}" + opensslBase64(opensslDigest("SHA1", "{SHA")), {}},
              {"abc", "{SHA}qZk+NkcGgWq6PiVxeFDCbJzQ2J0=", {}}};  // FIPS 180-1, appendix A
  for (const auto& row : rows) {
    SCOPED_TRACE(row.clear);
    const TraceCapture trace;
    EXPECT_EQ(format(2, row.clear), row.value);
    EXPECT_EQ(trace.messages(), row.lines);
  }
}

// Each scheme's value of one password presented against each other's, stored: '=' matches, '9' cannot be compared, '<'
// and '>' are the signs of the first difference, '1' is the salted digest's refusal of what is no digest.
TEST(VerifyPassword, DecidesByThePairOfSchemes) {
  const char* const decisions[] = {"=====9====", "==99999999", "=9=9999999", "=99=999999", "1999=99999",
                                   "99999=9999", "=99999=999", "=999999=>>", "=999999<=>", "=999999<<="};
  const auto valuesOf = [](const std::string& clear) {
    Lines values;
    for (const auto& [scheme, tag] : kSchemes) values.push_back(format(scheme, clear));
    values.insert(values.begin() + 5, "{VLDL}" + clear);
    return values;
  };
  const Lines values = valuesOf("Sw0rdf1sh");
  const Lines others = valuesOf("sw0rdf1sh");
  for (size_t p = 0; p < values.size(); ++p) {
    for (size_t s = 0; s < values.size(); ++s) {
      SCOPED_TRACE(values[p] + " presented, stored " + values[s]);
      const char decision = decisions[p][s];
      EXPECT_EQ(verify(values[p], values[s]), decision == '=' ? 0 : decision == '9' ? 99 : decision == '<' ? -1 : 1);
      EXPECT_NE(verify(values[p], others[s]), 0);
    }
  }
}

TEST(VerifyPassword, TreatsTheOddPairsAsPromised) {
  const std::string text46 = letters(46);
  const std::string sha = format(2, "secret");
  const std::string noAlphabet = "{qVEIL}>1\x7f====<";
  const std::string tooShort = format(128, "").substr(0, 10) + "AAAA<";
  const std::string gapSalt = "ab\0cd"s;  // what "YWI=" and "Y2Rl" give, a byte less than they take
  const std::string gap = "{SSHA}" + opensslBase64(opensslDigest("SHA1", "secretx" + gapSalt) + "x") + "YWI=Y2Rl";
  const std::string salted8 = "{SSHA}" + saltedPayload("secret", "8 bytes!");
  const struct {
    const char* name;
    std::string presented, stored;
    int expected, isClear;
    AesKeyData* keyData;
  } rows[] = {
      {"a tag in other letters", "secret", "{sSha}" + salted8.substr(6), 0, 0, keys()},
      {"a payload in other letters", "abc", "{SHA}QZk+NkcGgWq6PiVxeFDCbJzQ2J0=", 1, 0, keys()},
      {"bits behind the digest", "abc", "{SHA}qZk+NkcGgWq6PiVxeFDCbJzQ2J1=", -1, 0, keys()},
      {"a pad for a zero byte, made up for at the end", "12", "{SHA}e1I=m2T9CipJ5tipOXUwd3krBVQA", 1, 0, keys()},
      {"alike in the first 46", text46 + "a", text46 + "bcd", 0, 0, keys()},
      {"different in the 46th", text46.substr(0, 45) + "a", text46.substr(0, 45) + "b", -1, 0, keys()},
      {"the first difference counts, unsigned", "\x80y", "\x7fz", 1, 0, keys()},
      {"a tagged text is clear on demand", sha, format(3, sha), 0, 1, keys()},
      {"what cannot be compared at all", "{VLDL}x", "{VLDL}x", 99, 1, keys()},
      {"a raw digest presented", "{SHA}" + opensslDigest("SHA1", "secret"), sha, 0, 0, keys()},
      {"crypt with half a salt", "secret", "{crypt}a", 99, 0, keys()},
      {"AES-256 without a key", "secret", format(133, "secret"), 99, 0, nullptr},
      {"as long as what is made without a key", "secret", "{AES256}" + std::string(163, 'x'), 'q' - 'a', 0, nullptr},
      {"a digest is no password", "{SHA}" + opensslDigest("SHA1", "secret"), sha, -1, 1, keys()},
      {"nor is it of another length", "{SHA}" + opensslDigest("SHA1", "secret") + "12345678", sha, 1, 1, keys()},
      {"nor a value", sha, sha, 1, 1, keys()},
      {"a password like a value", sha, "{SHA}" + opensslBase64(opensslDigest("SHA1", sha)), 0, 1, keys()},
      {"a password like a tag", "{SHA}", "{SHA}" + opensslBase64(opensslDigest("SHA1", "{SHA}")), 0, 1, keys()},
      {"the salt has a gap", "secret", gap, 0, 0, keys()},
      {"an unknown alphabet stands for itself", noAlphabet, noAlphabet, 0, 1, keys()},
      {"what cannot be unmasked matches nothing", tooShort, tooShort, 99, 1, keys()},
      {"less than a digest", "secret", "{SSHA}" + opensslBase64(std::string(19, 'x')), 1, 0, keys()},
      {"a stored tag alone makes a digest of zeros", "{SHA}" + std::string(27, 'A') + "=", "{SHA}", 0, 0, keys()},
      {"no base64", "secret", "{SSHA}" + std::string(56, '!'), 1, 0, keys()},
      {"a salted value presented stays the password", salted8, "skip 6" + saltedPayload(salted8, "salt"), 0, 0, keys()},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    EXPECT_EQ(verify(row.presented, row.stored, row.isClear, row.keyData), row.expected);
  }
}

TEST(Reversal, GivesTheClearTextOrNothing) {
  const std::string none = "(null)";
  const std::string masked = format(128, "secret");
  const struct {
    std::string value;
    AesKeyData* keyData;
    int foreign;  // the scheme that unformat_password says it does not know
    std::string decoded;
  } rows[] = {
      {masked.substr(7), nullptr, 0, "secret"},
      {masked + "surplus", nullptr, 0, "secret"},
      {"{qVEIL}hello", nullptr, 0, "hello"},
      {"{qVEIL}>0BFoE<", nullptr, 0, "abc"},  // the older form
      {"{qVEIL}>1\x7f====<", nullptr, 0, none},
      {masked.substr(0, 10) + "AAAA<", nullptr, 0, none},
      {format(135, "secret"), nullptr, 0, none},
      {"{AES256}AAAA", keys(), 0, none},
      {"{AES256}********", keys(), 0, none},
      {"{SHA}qZk+NkcGgWq6PiVxeFDCbJzQ2J0=", keys(), 2, "{SHA}qZk+NkcGgWq6PiVxeFDCbJzQ2J0="},
      {"", keys(), 1, ""},
      {">1\x7f<", keys(), 1, none},  // these are too short to be taken as masked
      {">0BFoE<", keys(), 1, "abc"},
      {">xYWJj<", keys(), 1, "abc"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.value);
    const TraceCapture trace;
    EXPECT_EQ(unformat(row.value, row.keyData), row.foreign != 0 ? none : row.decoded);
    const std::string line = "Format:UNIMPLEMENTED pwd encoding " + std::to_string(row.foreign) + "\n";
    EXPECT_TRUE(row.foreign == 0 || trace.messages() == Lines{line});
    int rc = -1;
    EXPECT_EQ(decodePW(row.value, row.keyData, rc), row.decoded);
    EXPECT_EQ(rc, row.decoded != none ? 0 : row.foreign == 0 ? 80 : 90);
  }
}

const std::string kSecret = "Zq7#kW2!";  // as much as the shortest scheme looks at

// Single operations on texts that begin with the secret; each releases what it is given.
std::vector<Body> secretUses() {
  std::vector<Body> uses{[] {
    ldappw_crypt_data state;
    char bits[64];
    for (size_t i = 0; i < 64; ++i) bits[i] = static_cast<char>((kSecret[i / 8] >> (7 - i % 8)) & 1);
    _setkey_r(bits, &state);
  }};
  for (const std::string& clear :
       {kSecret, kSecret + letters(30), kSecret + letters(300), kSecret + '\0' + letters(300)}) {
    for (const auto& [code, tag] : kSchemes) {
      if (code == 1) continue;  // its value is the secret
      const std::string value = format(code, clear);
      const auto reverse = [value] {
        char* text = nullptr;
        morva_decodePW(&text, value.c_str(), keys());
        _morva_utils_decode_buffer_free(&text);
      };
      uses.emplace_back([scheme = code, clear] { format(scheme, clear); });
      uses.emplace_back([clear, value] { verify(clear, value, 1); });
      uses.emplace_back(reverse);
      const auto fails = [](auto...) { return 0; };
      const Failure noEnd = both(replacing(pQEL_EVP_DigestFinal, fails), replacing(pQEL_EVP_EncryptFinal, fails));
      uses.emplace_back([scheme = code, clear, noEnd] { noEnd([&] { format(scheme, clear); }); });
      uses.emplace_back([clear, value, noEnd] { noEnd([&] { verify(clear, value, 1); }); });
      uses.emplace_back([reverse, fails] { replacing(pQEL_EVP_DecryptFinal, fails)(reverse); });
    }
  }
  return uses;
}

TEST(Secrets, AreGoneFromMemoryThatIsReleased) {
  const ReleaseWatch watch(kSecret);
  std::free(strdup((kSecret + "unwiped").c_str()));
  ASSERT_EQ(watch.withSecret(), 1) << "the watch sees nothing";
  for (const Body& use : secretUses()) use();
  EXPECT_EQ(watch.withSecret(), 1);
}

TEST(Secrets, AreGoneFromTheStack) {
#ifndef __OPTIMIZE__
  GTEST_SKIP() << "without optimisation words of a secret pass through the stack instead of registers";
#endif
  const auto leave = [] {
    char copy[64];
    std::memcpy(copy, kSecret.data(), kSecret.size());
    __asm__ volatile("" : : "r"(copy) : "memory");
  };
  EXPECT_TRUE(leftOnStack(leave, kSecret)) << "the search sees nothing";
  const std::vector<Body> uses = secretUses();
  for (const Body& use : uses) use();  // resolves the symbols, which saves registers on the stack
  Lines forms{kSecret};
  // SHA works on words with their bytes turned round, its kernel on four of them from the last to the first.
  forms.emplace_back(kSecret.rbegin(), kSecret.rend());
  forms.push_back(forms[1].substr(4) + forms[1].substr(0, 4));
  for (const std::string& form : forms) {
    for (size_t i = 0; i < uses.size(); ++i) EXPECT_FALSE(leftOnStack(uses[i], form)) << i << " " << form;
  }
  const unsigned char key[8] = {255, 255, 255, 255, 255, 255, 255, 255};
  uint32_t words[32];
  EXPECT_FALSE(leftOnStack([&] { deskey40(words, key, 0); }, std::string(28, '\1')))
      << "the bits of a key, a byte each";
  const ldappw::RoundWords* const rows[][2] = {{&ldappw::kKeyParts.c[6][15], &ldappw::kKeyParts.c[7][15]},
                                               {&ldappw::kKeyParts.d[6][15], &ldappw::kKeyParts.d[7][15]}};
  for (const auto& pair : rows) {
    const std::string addresses(reinterpret_cast<const char*>(pair), sizeof pair);
    EXPECT_FALSE(leftOnStack([&] { deskey(words, key, 0); }, addresses)) << "where the parts of a key are";
  }
}

}  // namespace
