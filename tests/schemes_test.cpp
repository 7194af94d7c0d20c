// SPDX-License-Identifier: Apache-2.0
// The password schemes: detection, formatting, verification and reversal, what is left of secrets, and many threads.
// What is expected comes from OpenSSL and from the system's own crypt, not from the product.
#include <pthread.h>

#include <atomic>
#include <climits>
#include <optional>
#include <thread>

#include "failures.h"
#include "oracle.h"
#include "password_schemes.h"
#include "system_crypt.h"

using namespace std::string_literals;
using namespace test;

namespace {

const char kUnknownTag[] = "CheckFormat:UNKNOWN pwd encoding,assume unencrypted\n";

struct SchemeRow {
  const char* name;
  int code;
  std::string tag;
  const char* cipher;
  size_t keyBytes;
};

const SchemeRow kSchemes[] = {{"clear", 1, "", "", 0},
                              {"SHA", 2, "{SHA}", "", 0},
                              {"MD5", 3, "{MD5}", "", 0},
                              {"crypt", 4, "{crypt}", "", 0},
                              {"SSHA", 9, "{SSHA}", "", 0},
                              {"qVEIL", 128, "{qVEIL}", "", 0},
                              {"AES256", 133, "{AES256}", "AES-256-ECB", 32},
                              {"AES192", 134, "{AES192}", "AES-192-ECB", 24},
                              {"AES128", 135, "{AES128}", "AES-128-ECB", 16}};

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
  return verify_password(p.data(), static_cast<int>(presented.size()), s.data(), static_cast<int>(stored.size()),
                         isClear, keyData);
}

using Clear = std::optional<std::string>;

Clear takenClear(char* clear) {
  const Clear copy = clear != nullptr ? Clear(clear) : std::nullopt;
  _morva_utils_decode_buffer_free(&clear);
  return copy;
}

Clear unformat(const std::string& value, AesKeyData* keyData) {
  Guarded guarded(value + '\0');
  char* clear = nullptr;
  const int good = unformat_password(guarded.data(), &clear, keyData, nullptr);
  EXPECT_EQ(good, clear != nullptr ? 1 : 0);
  return takenClear(clear);
}

Clear decodePW(const std::string& value, AesKeyData* keyData, int& rc) {
  Guarded guarded(value + '\0');
  char* clear = nullptr;
  rc = morva_decodePW(&clear, guarded.data(), keyData);
  EXPECT_EQ(guarded.data(), value);  // the decoder's habit of writing to its text does not show
  return takenClear(clear);
}

// Whether a payload is what the scheme makes of the clear text.
bool isPayload(const SchemeRow& scheme, const std::string& clear, const std::string& payload) {
  std::string text = upToNul(clear);
  switch (scheme.code) {
    case 1:
      return payload == clear;
    case 2:
      text.resize(clear.size());  // what follows a NUL counts as NUL
      return payload == opensslBase64(opensslDigest("SHA1", text));
    case 3:
      return payload == opensslBase64(opensslDigest("MD5", text));
    case 4:
      return payload == systemCrypt(text, "ab");
    case 9:
      return opensslDecoded(payload).size() == 40 && payload == saltedPayload(text, opensslDecoded(payload).substr(20));
    case 128:
      return payload.size() == 164 && unformat("{qVEIL}" + payload, nullptr) == upToNul(clear.substr(0, 46));
    default:
      for (size_t i = text.assign(scheme.keyBytes, '\0').size(); i-- > 0;) text[i] = static_cast<char>(i);
      return payload == opensslBase64(opensslCipher({scheme.cipher, text, "", true, true}, clear));
  }
}

// Runs an operation with each of its allocations failing in turn, and last with none. check sees every result.
template <class Run, class Check>
void sweepAllocations(Run run, Check check) {
  for (long n = 0; n < 50; ++n) {
    SCOPED_TRACE("allocation " + std::to_string(n));
    decltype(run()) result{};
    bool failed = false;
    {
      const AllocationWatch watch(n);
      result = run();
      failed = watch.count() > n;
    }
    check(result, failed);
    if (!failed) return;
  }
  FAIL() << "never came to an end";
}

// The lines that one function wrote, which are all of the debug class.
std::string linesOf(const TraceCapture& trace, unsigned id) {
  std::string lines;
  for (const Record& r : trace.records()) {
    if (r.kind == LDTR_LINE && r.id == id) lines += r.severity == LDTR_DEBUG ? r.text : "of another class: " + r.text;
  }
  return lines;
}

// ---- Tags and detection ----

TEST(SchemeTags, LieBackToBackAndCanBeWritten) {
  const char* start = SHA_BRACED;
  __asm__("" : "+r"(start));  // the run goes on behind the first symbol, which the compiler cannot know
  EXPECT_EQ(std::string(start, 61), "{SHA}{SSHA}{MD5}{crypt}{qVEIL}{AES128}{AES192}{AES256}{VLDL}\0"s);
  const std::pair<const char*, long> symbols[] = {{SHA_BRACED, 0},     {SSHA_BRACED, 5},    {MD5_BRACED, 11},
                                                  {crypt_BRACED, 16},  {qVEIL_BRACED, 23},  {AES128_BRACED, 30},
                                                  {AES192_BRACED, 38}, {AES256_BRACED, 46}, {VLDL_BRACED, 54}};
  for (const auto& [symbol, offset] : symbols) EXPECT_EQ(symbol - start, offset);
  VLDL_BRACED[2] = 'W';
  EXPECT_EQ(check_format("{VWDL}x", 7), 8);
  VLDL_BRACED[2] = 'L';
}

TEST(CheckFormat, FollowsTheUnevenLengthsOfTheTags) {
  enum { kQuiet, kLine };
  const struct {
    std::string value;
    int code;
    int line;
  } rows[] = {
      {"", 1, kQuiet},          {"abc", 1, kQuiet},         {"{MD5", 1, kQuiet},        {"{MD5}", 3, kQuiet},
      {"{md5}x", 3, kQuiet},    {"{SHA}", 1, kLine},        {"{SHA}x", 2, kQuiet},      {"{sha}abc", 2, kQuiet},
      {"{SSHA}", 1, kLine},     {"{SSHA}x", 9, kQuiet},     {"{crypt}", 1, kLine},      {"{crypt}a", 4, kQuiet},
      {"{Crypt}xy", 4, kQuiet}, {"{qVEIL}", 1, kLine},      {"{QVeil}x", 128, kQuiet},  {"{AES128}", 1, kLine},
      {"{AES256}", 1, kLine},   {"{AES128}x", 135, kQuiet}, {"{aes192}x", 134, kQuiet}, {"{AES256}x", 133, kQuiet},
      {"{VLDL}", 1, kLine},     {"{vldl}x", 8, kQuiet},     {"{XYZ}abc", 1, kLine},     {"{AES12}xyz", 1, kLine},
      {"[SHA]abc", 1, kQuiet},  {"xyz{SHA}", 1, kQuiet},    {">abcdef<", 128, kQuiet},  {">abcde<", 1, kQuiet},
      {">abcdefg", 1, kQuiet},  {"{abcdefg<", 1, kLine},    {"{SHA>abc", 1, kLine},     {"{crypt", 1, kLine}};
  for (const auto& row : rows) {
    SCOPED_TRACE(row.value);
    Guarded value(row.value);
    const TraceCapture trace;
    const AllocationWatch watch;
    EXPECT_EQ(check_format(value.data(), static_cast<unsigned>(row.value.size())), row.code);
    EXPECT_EQ(watch.count(), 0);
    EXPECT_EQ(trace.messages(), row.line == kLine ? Lines{kUnknownTag} : Lines{});
    EXPECT_EQ(trace.records().back().rc, row.code);
  }
  EXPECT_EQ(check_format(nullptr, 20), 1);
}

TEST(CheckFormat, ReadsTheFirstEightBytesAndTheLastOnly) {
  const auto page = static_cast<size_t>(sysconf(_SC_PAGESIZE));
  auto* base = static_cast<char*>(mmap(nullptr, 3 * page, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0));
  base[2 * page] = '<';
  ASSERT_EQ(mprotect(base + page, page, PROT_NONE), 0);
  const std::pair<const char*, int> rows[] = {{">wrapped", 128}, {"{AES256}", 133}, {"{unknown", 1}, {"clear te", 1}};
  for (const auto& [first, code] : rows) {
    std::memcpy(base + page - 8, first, 8);
    EXPECT_EQ(check_format(base + page - 8, static_cast<unsigned>(page + 9)), code) << first;
  }
  munmap(base, 3 * page);
}

TEST(FormattedPasswordLength, IsFixedOrThatOfTheCipherText) {
  const struct {
    int scheme, clearLength, expected;
  } rows[] = {{1, 0, 0},       {1, 77, 77},  {2, 5, 33},    {3, 5, 21},    {4, 5, 20},    {9, 5, 62},
              {128, 500, 171}, {135, 0, 32}, {135, 15, 32}, {134, 16, 52}, {133, 31, 52}, {133, 32, 72},
              {8, 5, -1},      {0, 5, -1},   {5, 5, -1},    {132, 5, -1},  {136, 5, -1},  {-1, 5, -1}};
  for (const auto& row : rows) {
    SCOPED_TRACE(row.scheme);
    const TraceCapture trace;
    EXPECT_EQ(formatted_password_length(row.scheme, row.clearLength), row.expected);
    const std::string line =
        "Error - formatted_password_length: Format-UNKNOWN pwd encoding " + std::to_string(row.scheme) + "\n";
    EXPECT_EQ(outlineOf(trace), row.expected < 0 ? line : "");  // and no record of entering
  }
  EXPECT_EQ(formatted_password_length(133, INT_MAX), -1);
}

// ---- Formatting ----

class EachScheme : public testing::TestWithParam<SchemeRow> {};
INSTANTIATE_TEST_SUITE_P(Schemes, EachScheme, testing::ValuesIn(kSchemes),
                         [](const auto& row) { return row.param.name; });

TEST_P(EachScheme, FormatsVerifiesAndReversesTextsOfAllLengths) {
  const SchemeRow& scheme = GetParam();
  Lines texts{"ab\0cd"s, "twenty letters and a \0 nul"s, "\0"s};
  for (const size_t n : {0U, 1U, 7U, 8U, 9U, 15U, 16U, 17U, 46U, 47U, 60U, 255U, 256U, 300U})
    texts.push_back(letters(n));
  for (const std::string& clear : texts) {
    SCOPED_TRACE(toHex(clear.data(), clear.size()));
    const int clearLength = static_cast<int>(clear.size());
    const int least = formatted_password_length(scheme.code, clearLength);
    const auto length = static_cast<size_t>(scheme.code == 3 ? 29 : least);
    const bool cut = scheme.code == 128;
    char salt[] = "ab";
    Guarded in(clear);
    Guarded out(std::string(length, '!'));  // no room for a NUL
    ASSERT_EQ(format_password(scheme.code, salt, keys(), in.data(), clearLength, out.data(), static_cast<int>(length)),
              static_cast<int>(length));
    const std::string value(out.data(), length);
    EXPECT_EQ(value.substr(0, scheme.tag.size()), scheme.tag);
    EXPECT_TRUE(isPayload(scheme, clear, value.substr(scheme.tag.size()))) << value;
    EXPECT_EQ(verify(clear, value, 1), cut && clear != upToNul(clear) ? 99 : 0);
    EXPECT_NE(verify("!" + clear, value, 1), 0);
    if (scheme.code >= 128) {
      char* text = nullptr;
      int textLength = 0;
      ASSERT_EQ(unformat_password(value.c_str(), &text, keys(), &textLength), 1);
      EXPECT_EQ(std::string(text, static_cast<size_t>(textLength)), cut ? upToNul(clear.substr(0, 46)) : clear);
      EXPECT_EQ(text[textLength], '\0');
      _morva_utils_decode_buffer_free(&text);
    }
    if (least == 0) continue;
    std::string tooSmall(static_cast<size_t>(least), '!');
    EXPECT_EQ(format_password(scheme.code, salt, keys(), in.data(), clearLength, tooSmall.data(), least - 1), 0);
    EXPECT_EQ(tooSmall, std::string(static_cast<size_t>(least) - 1, '\0') + "!");
  }
}

TEST_P(EachScheme, FormatsAndMatchesNothingWhenMemoryRunsOut) {
  const SchemeRow& scheme = GetParam();
  const std::string clear = letters(297) + "\0ab"s;  // long enough for copies on the heap
  char salt[] = "ab";
  std::string out(1024, '!');
  sweepAllocations([&] { return format_password(scheme.code, salt, keys(), clear.data(), 300, out.data(), 1024); },
                   [&](int length, bool failed) {
                     EXPECT_EQ(length == 0, failed);
                     const std::string left = scheme.tag + std::string(1024, '\0');
                     EXPECT_TRUE(!failed || out == left.substr(0, 1024));
                   });
  const std::string value = format(scheme.code, upToNul(clear));
  const auto check = [&](const std::string& presented) {
    return verify_password(presented.data(), 297, value.data(), static_cast<int>(value.size()), 0, keys());
  };
  sweepAllocations([&] { return check(clear); }, [](int rc, bool failed) { EXPECT_EQ(rc != 0, failed) << rc; });
  sweepAllocations([&] { return check("!" + clear); }, [](int rc, bool) { EXPECT_NE(rc, 0); });
}

TEST(FormatPassword, RefusesAndLeavesAtMostTheTag) {
  char salt[] = "ab";
  const Failure none = [](const Body& body) { body(); };
  const struct {
    const char* name;
    int scheme;
    char* salt;
    AesKeyData* keyData;
    int clearLength, outSize;
    std::string left, line;
    Failure failure;
  } rows[] = {
      {"VLDL", 8, salt, keys(), 3, 64, "", "Error - format_password: Format-UNKNOWN pwd encoding 8\n", none},
      {"unused", 5, salt, keys(), 3, 64, "", "Error - format_password: Format-UNKNOWN pwd encoding 5\n", none},
      {"negative", -1, salt, keys(), 3, 64, "", "Error - format_password: Format-UNKNOWN pwd encoding -1\n", none},
      {"crypt without a salt", 4, nullptr, keys(), 3, 64, "", "", none},
      {"AES-192 without a key", 134, salt, nullptr, 3, 64, "{AES192}", "", none},
      {"AES-128 without a key", 135, salt, nullptr, 3, 64, "{AES128}", "", none},
      {"no room for the masked form of AES-256", 133, salt, nullptr, 3, 170, "", "", none},
      {"clear text longer than out", 1, salt, keys(), 3, 2, "", "", none},
      {"negative length", 2, salt, keys(), -1, 64, "", "", none},
      {"MD5, digest fails", 3, salt, keys(), 3, 64, "{MD5}", "",
       replacing(pQEL_EVP_DigestUpdate, [](auto...) { return 0; })},
      {"SSHA, no random bytes", 9, salt, keys(), 3, 64, "{SSHA}", "",
       replacing(pQEL_RAND_bytes, [](auto...) { return 0; })},
      {"AES, cipher fails", 133, salt, keys(), 3, 64, "{AES256}", "",
       replacing(pQEL_EVP_EncryptInit, [](auto...) { return 0; })},
      {"masking fails", 128, salt, keys(), 3, 200, "{qVEIL}", "", replacing(encryptionType, 5)},
  };
  void* context = nullptr;
  ASSERT_EQ(initQelCrypto(&context), 0);  // loading would put replaced entries back
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const TraceCapture trace;
    std::string out(static_cast<size_t>(row.outSize), '!');
    row.failure([&] {
      const int size = row.outSize;
      EXPECT_EQ(format_password(row.scheme, row.salt, row.keyData, "abc", row.clearLength, out.data(), size), 0);
    });
    EXPECT_EQ(out, row.left + std::string(out.size() - row.left.size(), '\0'));
    EXPECT_EQ(linesOf(trace, 0x04090200), row.line);
  }
  char both[64] = "same buffer";
  EXPECT_EQ(format_password(1, salt, keys(), both, 11, both, sizeof both), 0);
  EXPECT_STREQ(both, "same buffer");
  EXPECT_EQ(format_password(2, salt, keys(), nullptr, 0, both, sizeof both), 0);
  EXPECT_EQ(format_password(2, salt, keys(), "abc", 3, nullptr, 64), 0);
  char masked[256];
  ASSERT_EQ(format_password(133, nullptr, nullptr, "abc", 3, masked, sizeof masked),
            171);  // this one alone has another way
  EXPECT_EQ(unformat(masked, nullptr), "abc");
}

TEST(FormatPassword, TakesTaggedShaAsAlreadyHashed) {
  const char final[] = "format_password: This pwd update is in SHA format and is from an ORVEX supplier. Do nothing.\n";
  const char raw[] =
      "format_password: This pwd update is in SHA format and is NOT from an ORVEX supplier. Base64 it.\n";
  const std::string bytes = opensslDigest("SHA1", "abc");
  const std::string value = "{SHA}" + opensslBase64(bytes);
  const std::string seven = bytes.substr(0, 7);
  const struct {
    const char* name;
    std::string clear, value;
    Lines lines;
  } rows[] = {
      {"final form", "{sha}" + value.substr(5), "", {final}},
      {"any 33 bytes", "{SHA}" + std::string(28, '*'), "", {final}},
      {"raw digest", "{SHA}" + bytes, value, {raw}},
      {"more than a digest", "{Sha}" + bytes + "surplus", value, {raw}},
      {"less than one", "{SHA}" + seven, "{SHA}" + opensslBase64(seven + std::string(13, '\0')), {raw}},
      {"tag alone", "{SHA}", "{SHA}" + opensslBase64(std::string(20, '\0')), {raw}},
      {"less than the tag", "{SHA", "{SHA}" + opensslBase64(opensslDigest("SHA1", "{SHA")), {}},
      {"untagged", "abc", "{SHA}qZk+NkcGgWq6PiVxeFDCbJzQ2J0=", {}},  // FIPS 180-1, appendix A
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const TraceCapture trace;
    EXPECT_EQ(format(2, row.clear), row.value);
    EXPECT_EQ(trace.messages(), row.lines);
  }
}

// ---- Verification ----

// Each scheme's value of one password presented against each other's, stored: '=' matches, '9' cannot be compared, '<'
// and '>' are the signs of the first difference, '1' is the salted digest's refusal of what is no digest.
TEST(VerifyPassword, DecidesByThePairOfSchemes) {
  const std::pair<const char*, const char*> presented[] = {
      {"clear", "=====9===="},  {"SHA", "==99999999"},   {"MD5", "=9=9999999"},   {"crypt", "=99=999999"},
      {"SSHA", "1999=99999"},   {"VLDL", "99999=9999"},  {"qVEIL", "=99999=999"}, {"AES256", "=999999=>>"},
      {"AES192", "=999999<=>"}, {"AES128", "=999999<<="}};
  const auto valuesOf = [](const std::string& clear) {
    Lines values;
    for (const SchemeRow& scheme : kSchemes) values.push_back(format(scheme.code, clear));
    values.insert(values.begin() + 5, "{VLDL}" + clear);
    return values;
  };
  const Lines values = valuesOf("Sw0rdf1sh");
  const Lines others = valuesOf("sw0rdf1sh");
  for (size_t p = 0; p < values.size(); ++p) {
    for (size_t s = 0; s < values.size(); ++s) {
      SCOPED_TRACE(presented[p].first + " presented, "s + presented[s].first + " stored");
      const char decision = presented[p].second[s];
      EXPECT_EQ(verify(values[p], values[s]), decision == '=' ? 0 : decision == '9' ? 99 : decision == '<' ? -1 : 1);
      EXPECT_NE(verify(values[p], others[s]), 0);
    }
  }
}

TEST_P(EachScheme, ComparesTagsWithoutCaseAndPayloadsExactly) {
  const SchemeRow& scheme = GetParam();
  const std::string value = format(scheme.code, "secret word");
  const auto changedAt = [&](size_t at) {
    std::string changed = value;
    changed[at] = static_cast<char>(changed[at] ^ 0x20);
    return verify("secret word", changed);
  };
  for (size_t i = 1; i + 1 < scheme.tag.size(); ++i) {
    EXPECT_TRUE(std::isdigit(value[i]) != 0 || changedAt(i) == 0) << i;
  }
  if (scheme.code == 128) return;  // most of its payload is background
  size_t letter = scheme.tag.size() + 2;
  while (std::isalpha(value[letter]) == 0) ++letter;
  EXPECT_EQ(std::abs(changedAt(letter)), scheme.code == 9 ? 49 : 1);
}

TEST(VerifyPassword, TreatsTheOddPairsAsPromised) {
  constexpr int kDiffers = INT_MIN;  // any result but a match
  const std::string text46 = letters(46);
  const std::string sha = format(2, "secret");
  const std::string rawSha = "{SHA}" + opensslDigest("SHA1", "secret");
  const std::string masked = format(128, "secret");
  const std::string noAlphabet = "{qVEIL}>1\x7f====<";
  const std::string tooShort = masked.substr(0, 10) + "AAAA<";
  const std::string salted8 = "{SSHA}" + saltedPayload("secret", "8 bytes!");
  AesKeyData* other = nullptr;
  ASSERT_EQ(initAesKeyData(&other), 0);
  const struct {
    const char* name;
    std::string presented, stored;
    int expected, isClear;
    AesKeyData* keyData;
  } rows[] = {
      {"empty texts", "", "", 0, 0, keys()},
      {"alike in the first 46", text46 + "a", text46 + "bcd", 0, 0, keys()},
      {"different in the 46th", text46.substr(0, 45) + "a", text46.substr(0, 45) + "b", -1, 0, keys()},
      {"bytes are unsigned", "\x80", "\x7f", 1, 0, keys()},
      {"the first difference counts", "bz", "cy", -1, 0, keys()},
      {"another length", "secret", "secre", 99, 0, keys()},
      {"a tagged text is clear on demand", sha, format(3, sha), 0, 1, keys()},
      {"a raw digest presented", rawSha, sha, 0, 0, keys()},
      {"a raw digest stored", sha, rawSha, 99, 0, keys()},
      {"two raw digests", rawSha, rawSha, 99, 0, keys()},
      {"crypt takes the stored salt", "secret", "{crypt}" + systemCrypt("secret", "Z/"), 0, 0, keys()},
      {"crypt with half a salt", "secret", "{crypt}a", 99, 0, keys()},
      {"AES-256 without a key", "secret", format(133, "secret"), 99, 0, nullptr},
      {"AES-128 without a key", "secret", format(135, "secret"), 99, 0, nullptr},
      {"AES under another key", "secret", format(135, "secret"), kDiffers, 0, other},
      {"two masked texts", masked, format(128, "secret"), 0, 0, keys()},
      {"masked texts are cut", text46 + "x", format(128, text46 + "yz"), 0, 0, keys()},
      {"an unknown alphabet stands for itself", noAlphabet, noAlphabet, 0, 1, keys()},
      {"what cannot be unmasked matches nothing", tooShort, tooShort, 99, 1, keys()},
      {"an untagged masked text loses its beginning", "secret", masked.substr(7), kDiffers, 0, keys()},
      {"on both sides", masked.substr(7), masked.substr(7), 0, 0, keys()},
      {"wrong for the salted digest", "Secret", salted8, 49, 0, keys()},
      {"less than a digest", "secret", "{SSHA}" + opensslBase64(std::string(19, 'x')), 1, 0, keys()},
      {"no base64", "secret", "{SSHA}" + std::string(56, '!'), 1, 0, keys()},
      {"a salted value presented stays the password", salted8, "skip 6" + saltedPayload(salted8, "salt"), 0, 0, keys()},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const int result = verify(row.presented, row.stored, row.isClear, row.keyData);
    EXPECT_EQ(row.expected == kDiffers && result != 0 ? kDiffers : result, row.expected);
  }
  freeAesKeyData(other);
  EXPECT_EQ(verify_password(nullptr, 0, "x", 1, 0, nullptr), 99);
  EXPECT_EQ(verify_password("x", 1, nullptr, 0, 0, nullptr), 99);
  EXPECT_EQ(verify_password("x", -1, "x", 1, 0, nullptr), 99);
  EXPECT_EQ(verify_password("x", 1, "x", -1, 1, nullptr), 99);
}

// ---- Reversal ----

TEST(Reversal, GivesTheClearTextOrNothing) {
  const Clear none;
  const std::string masked = format(128, "secret");
  const std::string aes = format(135, "secret");
  const std::string sha = format(2, "secret");
  AesKeyData* other = nullptr;
  ASSERT_EQ(initAesKeyData(&other), 0);
  const struct {
    const char* name;
    std::string value;
    AesKeyData* keyData;
    Clear unformatted;  // by unformat_password
    std::string line;   // of it
    int rc;             // of morva_decodePW
    Clear decoded;
  } rows[] = {
      {"masked", masked, nullptr, "secret", "", 0, "secret"},
      {"masked, untagged", masked.substr(7), nullptr, "secret", "", 0, "secret"},
      {"clear under the tag", "{qVEIL}hello", nullptr, "hello", "", 0, "hello"},
      {"older form under the tag", "{qVEIL}>0BFoE<", nullptr, "abc", "", 0, "abc"},
      {"unknown alphabet", "{qVEIL}>1\x7f====<", nullptr, none, "", 80, none},
      {"too short a record", masked.substr(0, 10) + "AAAA<", nullptr, none, "", 80, none},
      {"AES", aes, keys(), "secret", "", 0, "secret"},
      {"AES without a key", aes, nullptr, none, "", 80, none},
      {"AES under another key", aes, other, none, "", 80, none},
      {"AES, damaged", "{AES256}AAAA", keys(), none, "", 80, none},
      {"AES, no base64", "{AES256}********", keys(), none, "", 80, none},
      {"SHA", sha, keys(), none, "Format:UNIMPLEMENTED pwd encoding 2\n", 0, sha},
      {"VLDL", "{VLDL}x", keys(), none, "Format:UNIMPLEMENTED pwd encoding 8\n", 0, "{VLDL}x"},
      {"clear", "hello", keys(), none, "Format:UNIMPLEMENTED pwd encoding 1\n", 0, "hello"},
      {"empty", "", keys(), none, "Format:UNIMPLEMENTED pwd encoding 1\n", 0, ""},
      {"unknown alphabet, short", ">1\x7f<", keys(), none, "Format:UNIMPLEMENTED pwd encoding 1\n", 90, none},
      {"older form, short", ">0BFoE<", keys(), none, "Format:UNIMPLEMENTED pwd encoding 1\n", 0, "abc"},
      {"unmasked form, short", ">xYWJj<", keys(), none, "Format:UNIMPLEMENTED pwd encoding 1\n", 0, "abc"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const TraceCapture trace;
    EXPECT_EQ(unformat(row.value, row.keyData), row.unformatted);
    EXPECT_EQ(linesOf(trace, 0x04090400), row.line);
    int rc = -1;
    EXPECT_EQ(decodePW(row.value, row.keyData, rc), row.decoded);
    EXPECT_EQ(rc, row.rc);
  }
  freeAesKeyData(other);
  char* clear = nullptr;
  EXPECT_EQ(unformat_password(nullptr, &clear, nullptr, nullptr), 0);
  EXPECT_EQ(unformat_password("{qVEIL}x", nullptr, nullptr, nullptr), 0);
  EXPECT_EQ(morva_decodePW(&clear, nullptr, nullptr), 1);
  EXPECT_EQ(morva_decodePW(nullptr, "x", nullptr), 1);
  EXPECT_EQ(clear, nullptr);
}

TEST(Reversal, ReportsWhenMemoryRunsOut) {
  const struct {
    const char* name;
    std::string value;
    int code;
  } rows[] = {{"masked", format(128, "secret"), 80}, {"AES", format(134, "secret"), 80}, {"clear", letters(300), 90}};
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    int rc = -1;
    sweepAllocations([&] { return decodePW(row.value, keys(), rc); },
                     [&](const Clear& clear, bool failed) {
                       EXPECT_EQ(rc, failed ? row.code : 0);
                       EXPECT_EQ(clear.has_value(), !failed);
                     });
  }
}

// ---- Tracing ----

std::string recordsOf(const TraceCapture& trace) {
  std::string all;
  for (const Record& r : trace.records()) {
    char text[256];
    if (r.kind == LDTR_ENTRY) std::snprintf(text, sizeof text, "> %08x %u %#x\n", r.id, r.level, r.mask);
    if (r.kind == LDTR_EXIT) std::snprintf(text, sizeof text, "< %08x %d\n", r.id, r.rc);
    if (r.kind == LDTR_LINE) std::snprintf(text, sizeof text, "%d %08x %s", r.severity, r.id, r.text.c_str());
    all += text;
  }
  return all;
}

TEST(Tracing, RecordsTheNestedCallsThatTheMaskAsksFor) {
  const std::string sha = format(2, "{XYZ}x");
  int rc = 0;
  const Body verifySha = [&] { verify("{XYZ}x", sha); };
  const std::string line = "0 04090100 "s + kUnknownTag;
  const std::string checks = "> 04090100 43 0x10000\n< 04090100 2\n> 04090100 43 0x10000\n";
  const std::string rest = "< 04090100 1\n> 04090200 43 0x10000\n< 04090200 33\n";
  const struct {
    const char* name;
    unsigned events;
    Body act;
    std::string records;
  } rows[] = {
      {"all", TraceCapture::kEverything, verifySha, "> 04090300 33 0x1000\n" + checks + line + rest + "< 04090300 0\n"},
      {"operations", 0x10000, verifySha, checks + rest},
      {"small ones", 0x1000, [] { verify("x", "{VLDL}x"); }, "> 04090300 33 0x1000\n< 04090300 99\n"},
      {"lines", TraceCapture::kLinesOnly, verifySha, line},
      {"nothing", 0, verifySha, ""},
      {"reversal", 0x10000, [&] { unformat("hello", nullptr); },
       "> 04090400 43 0x10000\n> 04090100 43 0x10000\n< 04090100 1\n< 04090400 0\n"},
      {"untraced", 0x11000, [&] { decodePW("hello", nullptr, rc); }, "> 04090100 43 0x10000\n< 04090100 1\n"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    const TraceCapture trace(row.events);
    row.act();
    EXPECT_EQ(recordsOf(trace), row.records);
  }
}

// ---- Secrets ----

const std::string kSecret = "Zq7#kW2!";  // as much as the shortest scheme looks at

// Single operations on texts that begin with the secret; each releases what it is given.
std::vector<Body> secretUses() {
  std::vector<Body> uses;
  for (const std::string& clear : {kSecret, kSecret + letters(300), kSecret + '\0' + letters(300)}) {
    for (const SchemeRow& scheme : kSchemes) {
      if (scheme.code == 1) continue;  // its value is the secret
      const std::string value = format(scheme.code, clear);
      const auto reverse = [value] {
        char* text = nullptr;
        morva_decodePW(&text, value.c_str(), keys());
        _morva_utils_decode_buffer_free(&text);
      };
      uses.emplace_back([scheme, clear] { format(scheme.code, clear); });
      uses.emplace_back([clear, value] { verify(clear, value, 1); });
      uses.emplace_back(reverse);
      uses.emplace_back([reverse] { replacing(pQEL_EVP_DecryptFinal, [](auto...) { return 0; })(reverse); });
    }
  }
  return uses;
}

TEST(Secrets, AreGoneFromMemoryThatIsReleased) {
  const ReleaseWatch watch(kSecret);
  std::free(strdup((kSecret + "unwiped").c_str()));
  ASSERT_EQ(watch.withSecret(), 1) << "the watch sees nothing";
  for (const Body& use : secretUses()) use();
  EXPECT_GT(watch.releases(), 10);
  EXPECT_EQ(watch.withSecret(), 1);
}

__attribute__((noinline)) void leaveOnStack() {
  char copy[64];
  std::memcpy(copy, kSecret.data(), kSecret.size());
  __asm__ volatile("" : : "r"(copy) : "memory");
}

// Whether the secret lies on the stack of a thread that has run the function.
bool leftOnStack(const Body& run) {
  constexpr size_t kBytes = size_t{1} << 20U;
  void* stack = mmap(nullptr, kBytes, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_STACK, -1, 0);
  pthread_attr_t attributes;
  pthread_attr_init(&attributes);
  pthread_attr_setstack(&attributes, stack, kBytes);
  pthread_t thread;
  const auto start = [](void* body) -> void* {
    char depth[32768];  // the end of the thread uses what is above
    __asm__ volatile("" : : "r"(depth) : "memory");
    return (*static_cast<const Body*>(body))(), nullptr;
  };
  EXPECT_EQ(pthread_create(&thread, &attributes, start, const_cast<Body*>(&run)), 0);
  pthread_join(thread, nullptr);
  pthread_attr_destroy(&attributes);
  const bool found = memmem(stack, kBytes, kSecret.data(), kSecret.size()) != nullptr;
  munmap(stack, kBytes);
  return found;
}

TEST(Secrets, AreGoneFromTheStack) {
#ifndef __OPTIMIZE__
  GTEST_SKIP() << "without optimisation words of a secret pass through the stack instead of registers";
#endif
  EXPECT_TRUE(leftOnStack(leaveOnStack)) << "the search sees nothing";
  const std::vector<Body> uses = secretUses();
  for (const Body& use : uses) use();  // resolves the symbols, which saves registers on the stack
  for (size_t i = 0; i < uses.size(); ++i) EXPECT_FALSE(leftOnStack(uses[i])) << i;
}

TEST(Threads, FormatVerifyAndReverseAllSchemesAtOnce) {
  keys();
  std::atomic<int> wrong{0};
  std::vector<std::thread> threads;
  for (int number = 0; number < 8; ++number) {
    threads.emplace_back([number, &wrong] {
      const std::string own = std::to_string(number) + ". thread's password";  // crypt looks at eight characters
      const std::string salt{"./abcdef"[number], 'x'};
      for (int round = 0; round < 20; ++round) {
        for (const SchemeRow& scheme : kSchemes) {
          const std::string value = format(scheme.code, own, salt);
          if (verify(own, value) != 0 || verify("!" + own, value) == 0) ++wrong;
          if (scheme.code == 4 && value != "{crypt}" + systemCrypt(own, salt)) ++wrong;
          if (scheme.code >= 128 && unformat(value, keys()) != own) ++wrong;
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(wrong, 0);
}

}  // namespace
