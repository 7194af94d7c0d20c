// SPDX-License-Identifier: Apache-2.0
// The contexts of ciphers and digests over provider entries that note how they are called, and provider statuses.
#include <gtest/gtest.h>

#include "failures.h"

namespace {

using test::Lines;
using test::TraceCapture;

char provider, madeContext, algorithmObject;
std::string calls;

// What the entries give.
struct Outcome {
  void* made = &madeContext;
  const void* found = &algorithmObject;
  int started = 0, cleaned = 1, freed = 1;
};
Outcome outcome;

struct Pair {
  std::string name, entry, byName;
  unsigned id;  // of the creation; the release has the next
  int (*init)(void*, void**, const char*, void**);
  int (*release)(void*, void*);
};

class ProviderPairs : public testing::TestWithParam<Pair> {
 protected:
  void SetUp() override {  // the entries of the other pair are not to be called
    const bool cipher = pair.init == initQelCipher;
    pQEL_EVP_CIPHER_CTX_new = pQEL_EVP_MD_CTX_new = nullptr;
    pQEL_EVP_CIPHER_CTX_init = pQEL_EVP_CIPHER_CTX_cleanup = pQEL_EVP_CIPHER_CTX_free = nullptr;
    pQEL_EVP_MD_CTX_init = pQEL_EVP_MD_CTX_cleanup = pQEL_EVP_MD_CTX_free = nullptr;
    pQEL_EVP_get_cipherbyname = pQEL_EVP_get_digestbyname = nullptr;
    (cipher ? pQEL_EVP_CIPHER_CTX_new : pQEL_EVP_MD_CTX_new) = [](void*) { return calls += 'n', outcome.made; };
    (cipher ? pQEL_EVP_CIPHER_CTX_init : pQEL_EVP_MD_CTX_init) = noting<'i', &Outcome::started>;
    (cipher ? pQEL_EVP_CIPHER_CTX_cleanup : pQEL_EVP_MD_CTX_cleanup) = noting<'c', &Outcome::cleaned>;
    (cipher ? pQEL_EVP_CIPHER_CTX_free : pQEL_EVP_MD_CTX_free) = noting<'f', &Outcome::freed>;
    (cipher ? pQEL_EVP_get_cipherbyname : pQEL_EVP_get_digestbyname) = [](void*, const char* name) {
      return calls += name, outcome.found;
    };
  }
  template <char kNote, int Outcome::*kResult>
  static int noting(void*, void* context) {
    return calls += context == &madeContext ? kNote : '?', outcome.*kResult;
  }
  std::string line(const char* operation, const std::string& what) const {
    return std::string("Error - ") + operation + "Qel" + pair.name + ": " + what + "\n";
  }
  const Pair pair = GetParam();
  void *context = nullptr, *algorithm = nullptr;
};

TEST_P(ProviderPairs, FollowTheProvider) {
  const struct {
    void (*breaks)();
    const char *calls, *scopes;  // entries as i> and f>, exits as their codes
    Lines lines;
  } rows[] = {
      {[] {}, "ni-name-cf", "i>0f>0", {}},
      {[] { outcome.made = nullptr; }, "n", "i>1f>0", {line("init", pair.entry + "_new() failed. rc = 1")}},
      {[] { outcome.found = nullptr; }, "ni-name-cf", "i>f>01f>0", {line("init", pair.byName + "() failed. rc = 1")}},
      {[] { outcome.cleaned = 0; }, "ni-name-c", "i>0f>1", {line("free", pair.entry + "_cleanup() failed. rc = 0")}},
      {[] { outcome.freed = 2; }, "ni-name-cf", "i>0f>1", {line("free", pair.entry + "_free() failed. rc = 2")}},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.scopes);
    outcome = {};
    row.breaks();
    calls.clear();
    context = algorithm = nullptr;
    const TraceCapture trace;
    const int created = pair.init(&provider, &context, "-name-", &algorithm);
    EXPECT_EQ(context, created == 0 ? &madeContext : nullptr);
    EXPECT_EQ(algorithm, created == 0 ? &algorithmObject : nullptr);
    const int released = pair.release(&provider, context);
    EXPECT_EQ(calls, row.calls);
    std::string scopes;
    for (const test::Record& r : trace.records()) {
      if (r.kind == LDTR_ENTRY) scopes += r.id == pair.id ? "i>" : r.id == pair.id + 0x100 ? "f>" : "?>";
      if (r.kind == LDTR_EXIT) scopes += std::to_string(r.rc);
    }
    EXPECT_EQ(scopes, row.scopes);
    EXPECT_EQ(std::to_string(created) + "f>" + std::to_string(released), scopes.substr(scopes.size() - 4));
    EXPECT_EQ(trace.messages(), row.lines);
    test::expectErrorClasses(trace);
  }
}

TEST_P(ProviderPairs, RefuseNulls) {
  calls.clear();
  const TraceCapture trace;
  EXPECT_EQ(pair.init(nullptr, &context, "name", &algorithm), 1);
  EXPECT_EQ(pair.init(&provider, nullptr, "name", &algorithm), 1);
  EXPECT_EQ(pair.init(&provider, &context, nullptr, &algorithm), 1);
  EXPECT_EQ(pair.init(&provider, &context, "name", nullptr), 1);
  EXPECT_EQ(pair.release(nullptr, &madeContext), 1);
  EXPECT_EQ(pair.release(nullptr, nullptr), 1);
  EXPECT_EQ(calls, "");
  Lines expected(4, line("init", "Invalid parameter. rc = 1"));
  expected.resize(6, line("free", "Invalid parameter. rc = 1"));
  EXPECT_EQ(trace.messages(), expected);
}

INSTANTIATE_TEST_SUITE_P(Both, ProviderPairs,
                         testing::Values(Pair{"Cipher", "QEL_EVP_CIPHER_CTX", "QEL_EVP_get_cipherbyname", 0x50010600,
                                              initQelCipher, freeQelCipher},
                                         Pair{"Digest", "QEL_EVP_MD_CTX", "QEL_EVP_get_digestbyname", 0x50010800,
                                              initQelDigest, freeQelDigest}));

QelStatus known;

TEST(ProviderStatus, MapsToAnLdapCodeAndShowsItselfGivenOrAskedFor) {
  const std::string longest(sizeof known.desc, 'x');
  const struct {
    int major, minor, rc;
    std::string description, output;
  } rows[] = {
      {0, 15, 0, "unseen", ""},
      {3, 14, 1, "what happened", "QEL Status - \nmajRC: 3\nminRC: 14\ndesc: what happened\n"},
      {-1, 16, 1, "", "QEL Status - \nmajRC: -1\nminRC: 16\ndesc: \n"},
      {1, 15, 90, longest, "QEL Status - \nmajRC: 1\nminRC: 15\ndesc: " + longest + "\n"},
  };
  const test::Replaced asked(
      pQEL_GetStatus, +[](void* context, QelStatus* status) {
        EXPECT_EQ(context, &provider);
        EXPECT_EQ(test::toHex(status, sizeof *status), std::string(536, '0'));
        return *status = known, 0;
      });
  for (const auto& row : rows) {
    known = {row.major, row.minor, ""};
    row.description.copy(known.desc, sizeof known.desc);
    testing::internal::CaptureStdout();
    EXPECT_EQ(qelStatusToLdap(nullptr, &known), row.rc);
    EXPECT_EQ(qelStatusToLdap(&provider, nullptr), row.rc);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), row.output + row.output);
  }
  const TraceCapture trace;
  EXPECT_EQ(qelStatusToLdap(nullptr, nullptr), 1);
  EXPECT_EQ(trace.messages(), Lines{"Error - qelStatusToLdap: Invalid parameter. rc = 1\n"});
}

}  // namespace
